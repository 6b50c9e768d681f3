// veltotouch report end to end through the tool: what the page carries for
// the browser, its size for a long recording, and bad input.
#include "tools/ToolTestSupport.h"

#include <gtest/gtest.h>

namespace VeltoTool::Testing {
namespace {

// The data the page draws from, as embedded in it.
nlohmann::json payloadOf(const std::string& html)
{
    const std::string open = R"(<script type="application/json" id="data">)";
    const std::size_t start = html.find(open);
    if (start == std::string::npos) return {};
    const std::size_t end = html.find("</script>", start);
    return nlohmann::json::parse(html.substr(start + open.size(), end - start - open.size()));
}

std::vector<std::string> eventsOfPayload(const nlohmann::json& payload)
{
    std::vector<std::string> out;
    for (const auto& event : payload["events"]) {
        const std::string gesture = event["gesture"];
        out.push_back(gesture == "device-reset" ? "device-reset  0"
                                                : gesture + " " + event["region"].get<std::string>() + " " +
                                                      std::to_string(event["frame"].get<std::int64_t>()));
    }
    return out;
}

// Thirty minutes of frames every 10 ms: the demo's gestures over and over,
// then idle up to 180,000 reports.
TEST(ReportCommandTest, ThirtyMinuteRecordingFitsTheSizeLimit)
{
    TempDir dir;
    const std::string cycle = "tap middle; idle 600ms; hold top 1.2s; slide top bottom 800ms; palm 1.5s; reset; "
                              "noise 300ms; tap bottom; idle 400ms; hold bottom 900ms; ";
    std::string script;
    for (int i = 0; i < 262; ++i) script += cycle;
    script += "idle 5100ms";
    const fs::path recording = dir.file("long.json");
    ASSERT_EQ(runTool({"synth", script, "-o", recording}).status, 0);

    const fs::path page = dir.file("long.html");
    const ToolRun report = runTool({"report", recording, "-o", page});
    ASSERT_EQ(report.status, 0) << report.err;
    EXPECT_LE(fs::file_size(page), 25u * 1000 * 1000);

    const nlohmann::json payload = payloadOf(readFile(page));
    EXPECT_EQ(payload["facts"]["reports"], 180000);
    // Every image and every reset is a frame of the recogniser.
    EXPECT_EQ(payload["frameCount"], 180000);
    const ToolRun replay = runTool({"replay", recording, "--jsonl"});
    EXPECT_EQ(eventsOfPayload(payload), eventsOf(replay.out));
}

TEST(ReportCommandTest, FramesLimitThePageToTheirFramesAndEvents)
{
    TempDir dir;
    const fs::path page = dir.file("taps.html");
    const ToolRun report = runTool({"report", kExamples + "/taps.json", "-o", page, "--frames", "21:32", "--title",
                                    "</script><b>{{data}}</b>", "--set", "Algs.HoldTimeoutMilliseconds=600"});
    ASSERT_EQ(report.status, 0) << report.err;
    const std::string html = readFile(page);
    const nlohmann::json payload = payloadOf(html);
    EXPECT_EQ(payload["frameCount"], 12);
    EXPECT_EQ(eventsOfPayload(payload), (std::vector<std::string>{"may-begin top 21", "tap top 32"}));
    EXPECT_EQ(payload["title"], "</script><b>{{data}}</b>");
    EXPECT_EQ(payload["facts"]["settings"], nlohmann::json::parse(R"([["Algs.HoldTimeoutMilliseconds","600"]])"));
    EXPECT_EQ(html.find("<b>"), std::string::npos) << "the title reached the page unescaped";
    EXPECT_EQ(payload["facts"]["format"], "container version 1");

    const fs::path captured = dir.file("captured.html");
    ASSERT_EQ(runTool({"report", kExamples + "/hid-recorder-two-devices.hid", "-o", captured}).status, 0);
    EXPECT_EQ(payloadOf(readFile(captured))["facts"]["format"], "hid-recorder text");
}

TEST(ReportCommandTest, BadInputIsRefusedWithAMessage)
{
    TempDir dir;
    struct Case {
        std::vector<std::string> arguments;
        int status;
        std::string message;
    };
    // Good frames, then a fault: found only while the page is being made.
    std::string faulty = readFile(kExamples + "/taps.json");
    faulty.resize(faulty.rfind(']'));
    faulty += R"(, {"Type": "Gesture", "Timestamp": 1}]})";
    const std::string faultyFile = dir.file("faulty.json", faulty);
    const std::vector<Case> cases = {
        {{"report", (dir.path() / "missing.json").string(), "-o", dir.file("a.html")}, 1, "missing.json"},
        {{"report", faultyFile, "-o", dir.file("a.html")}, 1, "faulty.json: invalid frame type"},
        {{"report", kExamples + "/taps.json", "-o", (dir.path() / "no/such/dir/a.html").string()}, 1, "a.html"},
        {{"report", kExamples + "/taps.json", "-o", dir.file("a.html"), "--frames", "x:y"}, 2, "--frames"},
        {{"report", kExamples + "/taps.json"}, 2, "--output"},
    };
    for (const Case& c : cases) {
        const ToolRun run = runTool(c.arguments);
        EXPECT_EQ(run.status, c.status) << c.arguments[1];
        EXPECT_NE(run.err.find(c.message), std::string::npos) << run.err;
        EXPECT_FALSE(fs::exists(dir.file("a.html"))) << "a page was left behind: " << c.arguments[1];
    }
}

}  // namespace
}  // namespace VeltoTool::Testing
