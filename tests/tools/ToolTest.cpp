#include "Cli.h"
#include "ToolTestSupport.h"
#include "GestureScript.h"
#include "SynthCommand.h"
#include "ToolError.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

namespace fs = std::filesystem;
using namespace VeltoTool;
using namespace VeltoTool::Testing;

namespace {

// Gesture names of a replay, one per event.
std::vector<std::string> gesturesOf(const std::string& script)
{
    TempDir dir;
    fs::path recording = dir.file("synth.json");
    std::ofstream(recording) << SynthCommand::containerFor(script, 10, 7);
    ToolRun run = runTool({"replay", recording.string(), "--jsonl"});
    EXPECT_EQ(run.status, 0) << run.err;
    std::vector<std::string> out;
    std::istringstream lines(run.out);
    for (std::string line; std::getline(lines, line);) {
        auto json = nlohmann::json::parse(line);
        std::string gesture = json["gesture"];
        if (json.contains("region")) gesture += "/" + json["region"].get<std::string>();
        out.push_back(gesture);
    }
    return out;
}

}  // namespace

TEST(Tool, ReplayOfEveryExampleMatchesItsExpectedEvents)
{
    int examples = 0;
    for (const auto& entry : fs::directory_iterator(VELTO_EXAMPLES_DIR)) {
        if (entry.path().extension() != ".json") continue;
        fs::path expected = entry.path();
        expected.replace_extension(".expected");
        ASSERT_TRUE(fs::exists(expected)) << expected;
        ToolRun run = runTool({"replay", entry.path().string()});
        EXPECT_EQ(run.status, 0) << run.err;
        EXPECT_EQ(run.out, readFile(expected)) << entry.path();
        ++examples;
    }
    EXPECT_GE(examples, 5);
}

TEST(Tool, JsonLinesCarryTheEventFieldsAndStateReads)
{
    ToolRun run = runTool({"replay", std::string(VELTO_EXAMPLES_DIR) + "/reset-mid-hold.json", "--jsonl", "--get",
                       "Algs.EventStats", "--get", "DebugInfo"});
    ASSERT_EQ(run.status, 0) << run.err;
    std::vector<nlohmann::json> lines;
    std::istringstream text(run.out);
    for (std::string line; std::getline(text, line);) lines.push_back(nlohmann::json::parse(line));
    ASSERT_GE(lines.size(), 6u);

    const auto& first = lines[0];
    EXPECT_EQ(first["gesture"], "may-begin");
    EXPECT_EQ(first["region"], "middle");
    EXPECT_EQ(first["phase"], 128);
    EXPECT_EQ(first["eventMask"], 0);
    EXPECT_EQ(first["y"], 1);
    EXPECT_TRUE(first["frame"].is_number_unsigned());
    EXPECT_TRUE(first["timestamp"].is_number_unsigned());

    // The hold ends with frame 0 in the reset frame, followed by the vendor event.
    auto reset = std::find_if(lines.begin(), lines.end(), [](const auto& l) { return l["gesture"] == "device-reset"; });
    ASSERT_NE(reset, lines.end());
    EXPECT_EQ((*reset)["usagePage"], 65376);
    EXPECT_EQ((*reset)["usage"], 2);
    EXPECT_EQ((*(reset - 1))["gesture"], "hold-end");
    EXPECT_EQ((*(reset - 1))["frame"], 0);
    EXPECT_EQ((*(reset - 1))["eventMask"], 2);

    const auto& stats = lines[lines.size() - 2];
    EXPECT_EQ(stats["key"], "Algs.EventStats");
    EXPECT_TRUE(stats["value"]["Dispatched"]["numTaps"].is_number());
    EXPECT_EQ(lines.back()["key"], "DebugInfo");
    EXPECT_EQ(lines.back()["value"]["ResetCount"], 1);
}

TEST(Tool, SynthesisedGesturesAreRecognisedAsMeant)
{
    using V = std::vector<std::string>;
    EXPECT_EQ(gesturesOf("tap top"), (V{"may-begin/top", "tap/top"}));
    EXPECT_EQ(gesturesOf("tap bottom 80ms"), (V{"may-begin/bottom", "tap/bottom"}));
    EXPECT_EQ(gesturesOf("hold middle 1s"), (V{"may-begin/middle", "hold-start/middle", "hold-end/middle"}));
    EXPECT_EQ(gesturesOf("palm 1.5s"), (V{"may-begin/middle", "cancel/none"}));
    V slide = gesturesOf("slide top bottom 900ms");
    ASSERT_GE(slide.size(), 4u);
    EXPECT_EQ(slide.front(), "may-begin/top");
    EXPECT_EQ(std::count(slide.begin(), slide.end(), "hold-change/bottom"), 1);
    EXPECT_EQ(slide.back(), "hold-end/bottom");
}

TEST(Tool, ScriptErrorsNameTheLineAndTheProblem)
{
    auto message = [](const std::string& script) {
        try {
            GestureScript::parse(script);
        } catch (const ToolError& error) {
            return std::string(error.what());
        }
        return std::string("no error");
    };
    EXPECT_EQ(message("tap left"), "script line 1: unknown region \"left\" (top, middle or bottom)");
    EXPECT_EQ(message("tap top\nwave 2s"),
              "script line 2: unknown gesture \"wave\" (tap, hold, slide, palm, idle, noise, reset)");
    EXPECT_EQ(message("idle 5"), "script line 1: invalid duration \"5\" (for example 600ms or 1.2s)");
    EXPECT_EQ(message("hold top"), "script line 1: expected \"hold REGION DURATION [reset@TIME]\"");
    EXPECT_EQ(message("hold top 1s reset@2s"), "script line 1: reset@ must fall within the hold");
    EXPECT_EQ(message("# comment only\n\n tap top ; idle 1.5s # trailing"), "no error");
    EXPECT_EQ(GestureScript::parse("idle 1.5s; idle 20ms")[0].durationMs, 1500u);
}

TEST(Tool, HostReportsWhatItCannotStart)
{
    const std::string taps = std::string(VELTO_EXAMPLES_DIR) + "/taps.json";
    ToolRun noPlugin = runTool({"host", "--device", "sim:" + taps, "--plugin", "/nonexistent/plugin.so"});
    EXPECT_EQ(noPlugin.status, 1);
    EXPECT_NE(noPlugin.err.find("cannot load plug-in module /nonexistent/plugin.so"), std::string::npos);

    ToolRun noRecording = runTool({"host", "--device", "sim:/nonexistent.json"});
    EXPECT_EQ(noRecording.status, 1);
    EXPECT_EQ(noRecording.err, "veltotouch: /nonexistent.json: No such file or directory\n");
}
