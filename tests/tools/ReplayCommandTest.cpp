#include "SynthCommand.h"
#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"
#include "recording/PipelineRecording.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <optional>
#include <string>
#include <vector>

using namespace VeltoTool;
using namespace VeltoTool::Testing;
using VeltoTouch::PipelineRecording;

namespace {

// A tap, then input reports whose clock jumps ahead (a corrupt or reset
// clock): played at its own pace, the jump would be a wait of decades.
std::string tapThenClockJumps(std::uint64_t jumpNs, int jumps)
{
    const std::string tap = SynthCommand::containerFor("tap top", 10, 7);
    PipelineRecording recording{std::string_view(tap)};
    std::uint64_t last = recording.frames().back().timestampNs;
    for (int i = 0; i < jumps; ++i) {
        PipelineRecording::Frame frame = recording.frames().back();
        last += jumpNs;
        frame.timestampNs = last;
        recording.appendFrame(frame);
    }
    return recording.json();
}

TEST(ReplayCommand, SettingsApplyBeforeTheFirstFrameAndConversionsAreWarnedOf)
{
    // With a hold timeout longer than every touch, the holds example holds nothing.
    const ToolRun run = runTool({"replay", kExamples + "/holds.json", "--set", "Algs.HoldTimeoutMilliseconds=5000",
                                 "--get", "Algs.HoldTimeoutMilliseconds"});
    ASSERT_EQ(run.status, 0) << run.err;
    EXPECT_EQ(run.out.find("hold-start"), std::string::npos);
    EXPECT_NE(run.out.find("Algs.HoldTimeoutMilliseconds = 5000"), std::string::npos);
    EXPECT_EQ(run.err, "") << "a setting that took as written is not remarked on";

    // The pipeline stores a string as 0: said, and the 0 still applies.
    const ToolRun zero = runTool({"replay", kExamples + "/taps.json", "--set", "Algs.ActivationThreshold=abc", "--get",
                                  "Algs.ActivationThreshold"});
    EXPECT_EQ(zero.status, 0);
    EXPECT_EQ(zero.err,
              "veltotouch: warning: Algs.ActivationThreshold was set to a string (\"abc\") but reads back a number (0)\n");
    EXPECT_NE(zero.out.find("Algs.ActivationThreshold = 0"), std::string::npos) << zero.out;
}

TEST(ReplayCommand, RecordingsThatCannotBeReadAreNamedWithWhatWasFoundInstead)
{
    TempDir dir;
    struct Case {
        std::string name;
        std::string content;
        std::string message;  // after "veltotouch: " and the path
    };
    const Case cases[] = {
        {"empty.json", "", ": empty file, expected a recording (JSON container)"},
        {"blank.json", " \n\t\n", ": empty file (only blank space), expected a recording (JSON container)"},
        {"text.json", "not json", ": not JSON (migrateSerializedContainer failed: invalid container)"},
        {"array.json", "[1, 2]",
         ": JSON, but not an object at the top level, expected a recording (JSON container) "
         "(migrateSerializedContainer failed: invalid container)"},
        // The container's own messages, named with the file.
        {"v2.json", R"({"Version": 2})", ": migrateSerializedContainer failed: invalid container version: 2"},
    };
    for (const Case& c : cases) {
        const fs::path file = dir.file(c.name);
        std::ofstream(file) << c.content;
        for (const char* command : {"replay", "dump"}) {
            SCOPED_TRACE(std::string(command) + " " + c.name);
            const ToolRun run = runTool({command, file.string()});
            EXPECT_EQ(run.status, 1);
            EXPECT_EQ(run.err, "veltotouch: " + file.string() + c.message + "\n");
        }
    }
    for (const char* command : {"replay", "dump"}) {
        const ToolRun directory = runTool({command, kExamples});
        EXPECT_EQ(directory.status, 1);
        EXPECT_EQ(directory.err, "veltotouch: " + kExamples + ": is a directory, expected a recording (JSON container)\n");
        const ToolRun missing = runTool({command, dir.file("absent.json").string()});
        EXPECT_EQ(missing.status, 1);
        EXPECT_EQ(missing.err, "veltotouch: " + dir.file("absent.json").string() + ": No such file or directory\n");
    }
}

TEST(ReplayCommand, AFaultAfterGoodFramesIsReportedAfterTheirEventsAlsoWhenHosted)
{
    // taps.json with a faulty frame in place of its closing: read as it
    // arrives, every event before the fault is out before the error.
    TempDir dir;
    std::string text = readFile(kExamples + "/taps.json");
    text.resize(text.rfind(']'));
    text += R"(, {"Type": "Gesture", "Timestamp": 1}]})";
    const fs::path file = dir.file("faulty.json", text);
    const std::vector<std::string> expected = eventsOf(runTool({"replay", kExamples + "/taps.json", "--jsonl"}).out);
    ASSERT_FALSE(expected.empty());
    for (const std::vector<std::string>& arguments :
         {std::vector<std::string>{"replay", file.string(), "--jsonl"},
          std::vector<std::string>{"host", "--device", "sim:" + file.string(), "--speed", "0", "--jsonl"}}) {
        SCOPED_TRACE(arguments[0]);
        const ToolRun run = runTool(arguments);
        EXPECT_EQ(run.status, 1);
        EXPECT_EQ(run.err, "veltotouch: " + file.string() + ": invalid frame type\n");
        EXPECT_EQ(eventsOf(run.out), expected);
    }
}

TEST(ReplayCommand, JsonLinesWithDumpsGiveOneRecordPerFrameThatAgreesWithEventsAndCounters)
{
    const std::string file = kExamples + "/demo.json";
    const ToolRun plain = runTool({"replay", file, "--jsonl"});
    const ToolRun dumped = runTool({"replay", file, "--jsonl", "--dump", "--get", "Algs.EventStats"});
    ASSERT_EQ(dumped.status, 0) << dumped.err;
    EXPECT_EQ(eventsOf(dumped.out), eventsOf(plain.out)) << "the records leave the events as they were";

    // Every event line follows the record of the frame that emitted it, and
    // the counters the records say were moved add up to the final ones.
    std::vector<std::string> recordEvents;
    std::vector<std::string> eventLines;
    json counters = json::object();
    std::optional<std::int64_t> previousFrame;
    int records = 0;
    for (const json& line : jsonLinesOf(dumped.out)) {
        if (line.contains("readings")) {
            ++records;
            const std::int64_t frame = line["frame"];
            if (previousFrame && frame != 0) {
                EXPECT_GT(frame, *previousFrame);
            }
            previousFrame = frame;
            if (line.contains("event")) {
                recordEvents.push_back(line["event"]["gesture"].get<std::string>() + " " +
                                       line["event"]["region"].get<std::string>() + " " + std::to_string(frame));
            }
            counters.merge_patch(line["counters"]);
        } else if (line.contains("gesture") && line["gesture"] != "device-reset") {
            eventLines.push_back(line["gesture"].get<std::string>() + " " + line["region"].get<std::string>() + " " +
                                 std::to_string(line["frame"].get<std::int64_t>()));
        } else if (line.contains("key")) {
            for (const auto& [group, values] : line["value"].items()) {
                for (const auto& [name, value] : values.items()) {
                    if (value != 0) {
                        EXPECT_EQ(counters[group][name], value) << group << "." << name;
                    }
                }
            }
        }
    }
    EXPECT_GT(records, 500);
    ASSERT_FALSE(eventLines.empty());
    EXPECT_EQ(recordEvents, eventLines);
    // The readable dump is pinned, frame by frame, by the examples' digests.
}

// A jump of the recording's clock is waited out only up to --max-gap, said
// once; time stamps beyond 64 bits of nanoseconds are jumps like any other.
TEST(ReplayCommand, PacedPlaybackShortensClockJumpsAndSaysSoOnce)
{
    TempDir dir;
    const fs::path file = dir.file("jumps.json", tapThenClockJumps(1'000'000'000'000'000'000u, 3));
    const ToolRun fast = runTool({"replay", file.string(), "--jsonl"});
    // At 1000 times the pace the usual 10 ms between frames are 10 us, well below the limit.
    const ToolRun paced = runTool({"replay", file.string(), "--jsonl", "--speed", "1000", "--max-gap", "0.001"});
    ASSERT_EQ(paced.status, 0) << paced.err;
    EXPECT_EQ(eventsOf(paced.out), eventsOf(fast.out));
    EXPECT_EQ(paced.err,
              "veltotouch: note: a wait of 1e+06 s between two reports is shortened to 0.001 s, as is every wait "
              "longer than that (--max-gap SECONDS sets the limit)\n");

    const fs::path far = dir.file("far.json", R"({"Version": 1, "Frames": [
        {"Type": "InputReport", "Timestamp": 1000, "Report": "02 00 00 00 00 00 00 00 00 00 "},
        {"Type": "InputReport", "Timestamp": 1e300, "Report": "02 00 00 00 00 00 00 00 00 00 "}]})");
    const ToolRun run = runTool({"replay", far.string(), "--jsonl", "--speed", "1", "--max-gap", "0"});
    ASSERT_EQ(run.status, 0) << run.err;
    EXPECT_EQ(eventsOf(run.out).size(), 2u) << run.out;
    EXPECT_NE(run.err.find("is shortened to 0 s"), std::string::npos) << run.err;
}

// Through the built tool: a clock jump with the default limit ends in about
// a second instead of never.
TEST(ReplayCommand, TheDefaultLimitEndsAClockJumpWithinSeconds)
{
    TempDir dir;
    const fs::path file = dir.file("jump.json", tapThenClockJumps(1'000'000'000'000'000'000u, 1));
    ToolProcess tool({"replay", file.string(), "--speed", "1"});
    ASSERT_TRUE(tool.started());
    const ToolProcess::Result result = tool.finish(ToolProcess::Seconds(60));
    ASSERT_FALSE(result.timedOut) << "still waiting out the clock jump";
    EXPECT_EQ(result.status, 0) << result.err;
    EXPECT_NE(result.err.find("is shortened to 1 s"), std::string::npos) << result.err;
    EXPECT_NE(result.out.find("tap"), std::string::npos);
}

// Through the built tool with its output into a pipe, as in
// `veltotouch replay --speed 1 FILE | cat`: each event must be out before the
// next wait, not when the buffer fills or the run ends, so that a run stopped
// with Ctrl-C has shown what it found.
TEST(ReplayCommand, PacedEventsReachAPipeBeforeTheNextWait)
{
    TempDir dir;
    // After the tap, a wait of ten minutes.
    const fs::path file = dir.file("wait.json", tapThenClockJumps(600'000'000'000u, 1));
    ToolProcess tool({"replay", file.string(), "--speed", "1", "--max-gap", "600"});
    ASSERT_TRUE(tool.started());
    std::vector<std::string> lines;
    while (auto line = tool.readLine(ToolProcess::Seconds(30))) {
        lines.push_back(*line);
        if (line->find(" tap ") != std::string::npos) break;
    }
    tool.signal(SIGINT);
    const ToolProcess::Result result = tool.finish(ToolProcess::Seconds(30));
    EXPECT_EQ(result.signal, SIGINT) << "stopped while waiting";
    ASSERT_EQ(lines.size(), 2u) << "nothing came through the pipe before Ctrl-C";
    EXPECT_NE(lines[0].find("may-begin    top"), std::string::npos) << lines[0];
    EXPECT_NE(lines[1].find("tap          top"), std::string::npos) << lines[1];
}

}  // namespace
