#include "GestureScript.h"
#include "ToolError.h"
#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <string>
#include <vector>

using namespace VeltoTool;
using namespace VeltoTool::Testing;

namespace {

const std::string kExamples = VELTO_EXAMPLES_DIR;

// Name and script of each example, as scripts/make-examples reads them.
std::vector<std::pair<std::string, std::string>> exampleScripts()
{
    std::vector<std::pair<std::string, std::string>> out;
    std::ifstream in(kExamples + "/gestures.txt");
    for (std::string line; std::getline(in, line);) {
        if (line.empty() || line[0] == '#') continue;
        const auto colon = line.find(':');
        if (colon == std::string::npos) continue;
        std::string script = line.substr(colon + 1);
        if (!script.empty() && script[0] == ' ') script.erase(0, 1);
        out.emplace_back(line.substr(0, colon), script);
    }
    return out;
}

TEST(SynthCommand, ExamplesRegenerateByteForByte)
{
    TempDir dir;
    const auto scripts = exampleScripts();
    ASSERT_GE(scripts.size(), 5u);
    for (const auto& [name, script] : scripts) {
        const fs::path output = dir.file(name + ".json");
        const ToolRun run = runTool({"synth", script, "-o", output.string()});
        ASSERT_EQ(run.status, 0) << name << ": " << run.err;
        EXPECT_TRUE(readFile(output) == readFile(kExamples + "/" + name + ".json")) << name;
    }
}

TEST(SynthCommand, DurationsThatAreNotLengthsOfTimeAreScriptErrors)
{
    const char* scripts[] = {"tap top nanms", "tap top infs", "idle -1s", "idle -0.5ms", "idle 1e30s",
                             "idle 1e-400s", "palm nans",  "hold top 1s reset@nanms", "hold top 1s reset@-1ms"};
    TempDir dir;
    for (const char* script : scripts) {
        const ToolRun run = runTool({"synth", script, "-o", dir.file("out.json").string()});
        EXPECT_EQ(run.status, 1) << script;
        EXPECT_EQ(run.err.rfind("veltotouch: script line 1: invalid duration \"", 0), 0u) << script << ": " << run.err;
        EXPECT_FALSE(fs::exists(dir.file("out.json"))) << script << ": a faulty script writes nothing";
    }
}

TEST(SynthCommand, AScriptErrorLeavesAnExistingOutputAlone)
{
    TempDir dir;
    const fs::path output = dir.file("kept.json", "previous content");
    const ToolRun run = runTool({"synth", "tap left", "-o", output.string()});
    EXPECT_EQ(run.status, 1);
    EXPECT_EQ(readFile(output), "previous content");
}

// The tool runs with 64 MiB of address space: holding a five-minute script
// at 1 ms frames took five times that before the container was streamed.
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
    // The lead-in, the hold, and the release gap after it.
    const std::string text = readFile(output);
    EXPECT_EQ(static_cast<std::size_t>(std::count(text.begin(), text.end(), '{')), 1u + 200 + 300'000 + 150);
    EXPECT_EQ(text.substr(text.size() - 6), "\n  ]\n}");
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

TEST(SynthCommand, AWriteThatFailsHalfwayLeavesNoHalfContainer)
{
    TempDir dir;
    const fs::path output = dir.file("cut.json");
    // Writes past 64 KiB fail with "File too large".
    ToolProcess tool({"synth", "hold top 60s", "-o", output.string()}, ProcessSetup::fileSize(64u << 10));
    ASSERT_TRUE(tool.started());
    const ToolProcess::Result result = tool.finish(ToolProcess::Seconds(120));
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.err, "veltotouch: " + output.string() + ": File too large\n");
    EXPECT_FALSE(fs::exists(output));
}

}  // namespace
