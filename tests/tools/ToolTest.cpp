#include "ToolTestSupport.h"

#include <gtest/gtest.h>

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
    ASSERT_EQ(lines.size(), 8u) << "six events, the counters and the pipeline's DebugInfo";
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
        {"event after values", joined(eventAfterValues), "expected.jsonl:9: an event after the values read at the end"},
        {"neither", "{\"frame\":1}\n", "expected.jsonl:1: neither an event"},
    };
    TempDir dir;
    for (const Case& c : cases) {
        const std::string path = dir.file("expected.jsonl", c.text).string();
        const ToolRun run = runTool({"replay", recording, "--check", path});
        if (c.message.empty()) {
            EXPECT_EQ(run.status, 0) << c.name << ": " << run.err;
            EXPECT_EQ(run.out, recording + ": 6 events and 2 values as expected\n");
        } else {
            EXPECT_EQ(run.status, 1) << c.name;
            EXPECT_NE(run.err.find(c.message), std::string::npos) << c.name << ": " << run.err;
        }
    }
}

TEST(Tool, PropertiesDocumentIsCurrent)
{
    const ToolRun run = runTool({"properties", "--markdown"});
    ASSERT_EQ(run.status, 0) << run.err;
    EXPECT_EQ(run.out, readFile(std::string(VELTO_DOCS_DIR) + "/properties.md"))
        << "docs/properties.md is out of date; write it again with: veltotouch properties --markdown > "
           "docs/properties.md";
}
