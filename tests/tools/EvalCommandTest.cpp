#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>

using namespace VeltoTool::Testing;

// The evaluation of the sample recordings is pinned by examples/corpus.eval.
TEST(EvalCommand, RefusesWhatItCannotDoInOneLine)
{
    TempDir dir;
    const std::string recording = dir.file("taps.json").string();
    ASSERT_EQ(runTool({"synth", "tap top", "-o", recording}).status, 0);
    const std::string truth = dir.file("taps.truth.jsonl", "{\"kind\":\"tap\",\"region\":\"top\",\"start\":5}\n").string();
    struct Case {
        std::vector<std::string> arguments;
        int status;
        std::string says;
    };
    const Case cases[] = {
        {{"eval", recording, "--sweep", "Algs.HoldTimeoutMilliseconds=300:700"}, 2, "KEY=FROM:TO:STEP"},
        {{"eval", recording, "--sweep", "Algs.HoldTimeoutMilliseconds=700:300:100"}, 2, "TO must not be less than FROM"},
        {{"eval", recording, "--sweep", "Algs.HoldTimeoutMilliseconds=1:1000:1", "--sweep",
          "Algs.ActivationThreshold=1:1000:1"},
         2, "--sweep: the grid has more than 100000 settings"},
        {{"eval", recording, "--shard", "3/3"}, 2, "0 <= I < N"},
        {{"eval", recording, recording, "--truth", truth}, 2, "--truth PATH"},
        {{"eval", "--merge", recording, "--sweep", "A=1:2:1"}, 2, "--merge"},
        {{"eval", recording, "--truth", (dir.path() / "absent.jsonl").string()}, 1, "no truth for " + recording},
        {{"eval", recording}, 1, "taps.truth.jsonl: truth line 1: \"end\" must be a whole number of ticks"},
        {{"eval", "--merge", truth}, 1, "\"settings\" is missing"},
        {{"synth", "-o", recording}, 1, "SCRIPT or --random"},
    };
    for (const Case& c : cases) {
        const ToolRun run = runTool(c.arguments);
        EXPECT_EQ(run.status, c.status) << c.arguments[1] << " " << run.err;
        EXPECT_NE(run.err.find(c.says), std::string::npos) << run.err;
        EXPECT_EQ(std::count(run.err.begin(), run.err.end(), '\n'), 1) << run.err;
        EXPECT_EQ(run.out, "");
    }
}

TEST(EvalCommand, RandomScriptsCoverEveryKindAndRepeatWithTheirSeed)
{
    TempDir dir;
    const auto synth = [&](const std::string& name, const char* seed) {
        const std::string recording = dir.file(name + ".json").string();
        const ToolRun run = runTool({"synth", "--random", "60", "--seed", seed, "-o", recording, "--truth", "auto"});
        EXPECT_EQ(run.status, 0) << run.err;
        return std::make_pair(readFile(recording), readFile(dir.path() / (name + ".truth.jsonl")));
    };
    const auto first = synth("first", "11");
    EXPECT_EQ(synth("again", "11"), first);
    EXPECT_NE(synth("other", "12").second, first.second);
    for (const char* kind : {"tap", "hold", "slide", "palm", "noise", "reset"}) {
        EXPECT_NE(first.second.find(std::string("{\"kind\":\"") + kind + "\""), std::string::npos) << kind;
    }
    // One line per touch.
    EXPECT_EQ(std::count(first.second.begin(), first.second.end(), '\n'), 60);
}
