#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <map>
#include <string>

using namespace VeltoTool::Testing;

// Each example is checked by a test of its own (registered from examples/);
// here: a changed expected file is caught at its first difference, with the
// frame, and a faulty one is refused.
TEST(Tool, CheckFindsTheFirstDifferenceAndRefusesAFaultyExpectedFile)
{
    const std::string recording = kExamples + "/taps.json";
    const std::string expected = readFile(kExamples + "/taps.expected");
    std::vector<std::string> lines;
    for (std::size_t at = 0; at < expected.size();) {
        const std::size_t end = expected.find('\n', at);
        lines.push_back(expected.substr(at, end - at + 1));
        at = end + 1;
    }
    ASSERT_EQ(lines.size(), 7u) << "six events and the counters";
    const auto joined = [](const std::vector<std::string>& parts) {
        std::string text;
        for (const std::string& part : parts) text += part;
        return text;
    };
    auto tapChanged = lines;
    tapChanged[1].replace(tapChanged[1].find("\"tap\""), 5, "\"cancel\"");
    auto lastEventDropped = lines;
    lastEventDropped.erase(lastEventDropped.begin() + 5);
    auto eventAdded = lines;
    eventAdded.insert(eventAdded.begin() + 6, lines[0]);
    auto countChanged = lines;
    countChanged[6].replace(countChanged[6].find("\"numTaps\":3"), 11, "\"numTaps\":4");
    auto eventAfterValues = lines;
    eventAfterValues.push_back(lines[0]);

    struct Case {
        std::string name;
        std::string text;
        std::string message;
    };
    const std::vector<Case> cases = {
        {"unchanged", expected, ""},
        {"tap changed", joined(tapChanged), "taps.json: frame 32: expected cancel top, got tap top (event 2, line 2)"},
        {"last event dropped", joined(lastEventDropped), "frame 186: got tap bottom, expected no more events (5 in all)"},
        {"event added", joined(eventAdded), "frame 21: expected may-begin top, got no more events (6 in all)"},
        {"count changed", joined(countChanged), "Algs.EventStats.Dispatched.numTaps: expected 4, got 3 (line 7)"},
        {"not JSON", "tap top\n", "expected.jsonl:1: not JSON"},
        {"event after values", joined(eventAfterValues), "expected.jsonl:8: an event after the values read at the end"},
        {"neither", "{\"frame\":1}\n", "expected.jsonl:1: neither an event"},
    };
    TempDir dir;
    for (const Case& c : cases) {
        const std::string path = dir.file("expected.jsonl", c.text).string();
        const ToolRun run = runTool({"replay", recording, "--check", path});
        if (c.message.empty()) {
            EXPECT_EQ(run.status, 0) << c.name << ": " << run.err;
            EXPECT_EQ(run.out, recording + ": 6 events and 1 value as expected\n");
        } else {
            EXPECT_EQ(run.status, 1) << c.name;
            EXPECT_NE(run.err.find(c.message), std::string::npos) << c.name << ": " << run.err;
        }
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

TEST(Tool, PropertiesDocumentIsCurrent)
{
    const ToolRun run = runTool({"properties", "--markdown"});
    ASSERT_EQ(run.status, 0) << run.err;
    EXPECT_EQ(run.out, readFile(std::string(VELTO_DOCS_DIR) + "/properties.md"))
        << "docs/properties.md is out of date; write it again with: veltotouch properties --markdown > "
           "docs/properties.md";
}
