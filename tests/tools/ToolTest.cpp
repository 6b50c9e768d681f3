#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <map>
#include <string>

using namespace VeltoTool::Testing;

TEST(Tool, ReplayOfEveryExampleMatchesItsExpectedEvents)
{
    const std::vector<std::string> names = exampleNames();
    ASSERT_GE(names.size(), 5u);
    for (const std::string& name : names) {
        const ToolRun run = runTool({"replay", kExamples + "/" + name + ".json"});
        EXPECT_EQ(run.status, 0) << run.err;
        EXPECT_EQ(run.out, readFile(kExamples + "/" + name + ".expected")) << name;
    }
}

// Every field the host sees of each kind of event (the demo has them all),
// and the state reads after the events.
TEST(Tool, JsonLinesCarryTheEventFieldsAndStateReads)
{
    const ToolRun run =
        runTool({"replay", kExamples + "/demo.json", "--jsonl", "--get", "Algs.EventStats", "--get", "DebugInfo"});
    ASSERT_EQ(run.status, 0) << run.err;
    const std::vector<json> lines = jsonLinesOf(run.out);
    ASSERT_GE(lines.size(), 3u);
    std::map<std::string, std::string> firstOfKind;
    for (json line : lines) {
        if (!line.contains("gesture")) continue;
        EXPECT_TRUE(line["timestamp"].is_number_unsigned()) << line;
        line.erase("timestamp");
        firstOfKind.emplace(line["gesture"], line.dump());
    }
    const std::map<std::string, std::string> expected = {
        {"may-begin", R"({"eventMask":0,"frame":21,"gesture":"may-begin","phase":128,"region":"middle","y":1})"},
        {"tap", R"({"eventMask":131072,"frame":32,"gesture":"tap","phase":0,"region":"middle","y":1})"},
        {"hold-start", R"({"eventMask":2,"frame":159,"gesture":"hold-start","phase":1,"region":"top","y":3})"},
        {"hold-change", R"({"eventMask":2,"frame":304,"gesture":"hold-change","phase":2,"region":"bottom","y":2})"},
        {"hold-end", R"({"eventMask":2,"frame":227,"gesture":"hold-end","phase":4,"region":"top","y":3})"},
        {"cancel", R"({"eventMask":0,"frame":487,"gesture":"cancel","phase":8,"region":"none","y":0})"},
        {"device-reset", R"({"gesture":"device-reset","usage":2,"usagePage":65376})"},
    };
    EXPECT_EQ(firstOfKind, expected);

    const json& stats = lines[lines.size() - 2];
    EXPECT_EQ(stats["key"], "Algs.EventStats");
    EXPECT_EQ(stats["value"]["Dispatched"]["numTaps"], 2);
    EXPECT_EQ(lines.back()["key"], "DebugInfo");
    EXPECT_EQ(lines.back()["value"]["ResetCount"], 1);
}
