#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <string>

using namespace VeltoTool::Testing;

namespace {

// Address-space limits cannot work under the sanitizers, which reserve
// terabytes of shadow memory up front.
constexpr bool kAddressSpaceLimitsWork = !VELTO_SANITIZED;

// Each line NAME: SCRIPT of the examples' list, as scripts/make-examples reads it, with its truth.
TEST(SynthCommand, ExamplesRegenerateByteForByte)
{
    TempDir dir;
    std::ifstream in(kExamples + "/gestures.txt");
    int examples = 0;
    for (std::string line; std::getline(in, line);) {
        const auto colon = line.find(':');
        if (line.empty() || line[0] == '#' || colon == std::string::npos) continue;
        const std::string name = line.substr(0, colon);
        const fs::path output = dir.file(name + ".json");
        const ToolRun run = runTool(
            {"synth", line.substr(line.find_first_not_of(' ', colon + 1)), "-o", output.string(), "--truth", "auto"});
        ASSERT_EQ(run.status, 0) << name << ": " << run.err;
        EXPECT_TRUE(readFile(output) == readFile(kExamples + "/" + name + ".json")) << name;
        EXPECT_EQ(readFile(dir.file(name + ".truth.jsonl")), readFile(kExamples + "/" + name + ".truth.jsonl")) << name;
        ++examples;
    }
    EXPECT_GE(examples, 5);
}

TEST(SynthCommand, ScriptErrorsNameTheLineAndTheProblemAndWriteNothing)
{
    const auto longer = [](const std::string& duration) {
        return "script line 1: invalid duration \"" + duration + "\" (for example 600ms or 1.2s, at most an hour)";
    };
    const std::pair<const char*, std::string> cases[] = {
        {"tap left", "script line 1: unknown region \"left\" (top, middle or bottom)"},
        {"tap top\nwave 2s", "script line 2: unknown gesture \"wave\" (tap, hold, slide, palm, idle, noise, reset)"},
        {"idle 5", "script line 1: invalid duration \"5\" (for example 600ms or 1.2s)"},
        {"hold top", "script line 1: expected \"hold REGION DURATION [reset@TIME]\""},
        {"hold top 1s reset@2s", "script line 1: reset@ must fall within the hold"},
        // Durations that are not lengths of time.
        {"tap top nanms", longer("nanms")},
        {"idle -1s", longer("-1s")},
        {"idle 1e30s", longer("1e30s")},
        {"hold top 1s reset@-1ms", longer("-1ms")},
    };
    TempDir dir;
    const fs::path output = dir.file("out.json");
    for (const auto& [script, message] : cases) {
        const ToolRun run = runTool({"synth", script, "-o", output.string()});
        EXPECT_EQ(run.status, 1) << script;
        EXPECT_EQ(run.err, "veltotouch: " + message + "\n");
        EXPECT_FALSE(fs::exists(output)) << script << ": a faulty script writes nothing";
    }
    std::ofstream(output) << "previous content";
    EXPECT_EQ(runTool({"synth", "tap left", "-o", output.string()}).status, 1);
    EXPECT_EQ(readFile(output), "previous content");

    EXPECT_EQ(runTool({"synth", "# comment only\n\n tap top ; idle 1.5s # trailing", "-o", output.string()}).status, 0);
}

// The tool runs with 64 MiB of address space: a five-minute script at 1 ms
// frames, held whole in memory, would need five times that.
TEST(SynthCommand, LongScriptsAreWrittenInBoundedMemory)
{
    if (!kAddressSpaceLimitsWork) GTEST_SKIP() << "address-space limits do not work under the sanitizers";
    TempDir dir;
    const fs::path output = dir.file("long.json");
    ToolProcess tool({"synth", "hold top 300s", "--frame-period", "1", "-o", output.string()},
                     ProcessSetup::addressSpace(64u << 20));
    ASSERT_TRUE(tool.started());
    const ToolProcess::Result result = tool.finish(ToolProcess::Seconds(120));
    EXPECT_EQ(result.status, 0) << result.err;
    EXPECT_EQ(result.err, "");
    // The whole hold is in it: it replays to its end.
    const std::vector<std::string> events = eventsOf(runTool({"replay", output.string(), "--jsonl"}).out);
    ASSERT_EQ(events.size(), 3u);
    EXPECT_EQ(events.back().substr(0, 12), "hold-end top");
}

// A bad output fails before anything is generated: the script would need
// gigabytes held in memory or written before a late failure.
TEST(SynthCommand, OutputsThatCannotBeWrittenFailAtOnce)
{
    if (!kAddressSpaceLimitsWork) GTEST_SKIP() << "address-space limits do not work under the sanitizers";
    TempDir dir;
    struct Case {
        std::string output;
        std::string message;
    };
    const Case cases[] = {
        {(dir.path() / "missing" / "out.json").string(), ": No such file or directory"},
        {dir.path().string(), ": is a directory"},
        {"/dev/full", ": No space left on device"},
    };
    for (const Case& c : cases) {
        ToolProcess tool({"synth", "hold top 3600s", "--frame-period", "1", "-o", c.output},
                         ProcessSetup::addressSpace(64u << 20));
        ASSERT_TRUE(tool.started());
        const ToolProcess::Result result = tool.finish(ToolProcess::Seconds(120));
        EXPECT_EQ(result.status, 1) << c.output;
        EXPECT_EQ(result.err, "veltotouch: " + c.output + c.message + "\n");
    }
}

// Run as a process: a write past a file-size limit fails (File too large)
// where an in-process run would fail nothing.
TEST(SynthCommand, AWriteThatFailsHalfwayLeavesThePreviousOutputAndNoTemporaryFile)
{
    TempDir dir;
    const fs::path output = dir.file("cut.json", "previous output\n");
    // Writes past 64 KiB fail with "File too large".
    ToolProcess tool({"synth", "hold top 60s", "-o", output.string()}, ProcessSetup::fileSize(64u << 10));
    ASSERT_TRUE(tool.started());
    const ToolProcess::Result result = tool.finish(ToolProcess::Seconds(120));
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.err, "veltotouch: " + output.string() + ": File too large\n");
    EXPECT_EQ(readFile(output), "previous output\n");
    EXPECT_EQ(std::distance(fs::directory_iterator(dir.path()), fs::directory_iterator()), 1);
}

}  // namespace
