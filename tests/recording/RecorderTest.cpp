#include "RecordingTestSupport.h"

#include "platform/runtime/MonotonicClock.h"
#include "records/TickConversion.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <random>
#include <sstream>
#include <string>

namespace {

using namespace RecordingTestSupport;
using VeltoHost::MonotonicClock;

// Frames written compactly, oldest first: "Sa1" is a state frame of key a
// with value 1, "R1" an input report whose single byte is 1.
PipelineRecording::FrameList framesFrom(const std::string& notation)
{
    PipelineRecording::FrameList frames;
    std::istringstream words(notation);
    std::string word;
    while (words >> word) {
        if (word[0] == 'S') {
            frames.push_back(stateFrame(0, word.substr(1, 1), PropertyValue::uint64(std::stoull(word.substr(2)))));
        } else {
            frames.push_back(reportFrame(0, {static_cast<std::uint8_t>(std::stoul(word.substr(1)))}));
        }
    }
    return frames;
}

std::string notationOf(const PipelineRecording::FrameList& frames)
{
    std::string text;
    for (const Frame& frame : frames) {
        if (!text.empty()) text += ' ';
        if (frame.type == Frame::Type::State) {
            text += "S" + frame.key + std::to_string(frame.value.toUInt64());
        } else {
            text += "R" + std::to_string(frame.report.at(0));
        }
    }
    return text;
}

TEST(RecordingTrim, KeepsNewestReportsAndTheStateThatStillMatters)
{
    struct Row {
        const char* frames;
        std::uint64_t limit;
        const char* result;
    };
    const Row rows[] = {
        {"Sa1 R1 Sa2 Sa3 R2 R3", 2, "Sa3 R2 R3"},
        {"Sb1 R1 Sa1 R2", 1, "Sb1 Sa1 R2"},
        {"Sa1 R1 Sa2 R2 Sa3 R3", 2, "Sa2 R2 Sa3 R3"},
        {"Sa1 Sa2 Sb1", 5, "Sa2 Sb1"},
        {"R1 R2 R3", 5, "R1 R2 R3"},
        // State after the newest report is kept per key as well.
        {"R1 Sa1 Sb1 Sa2", 1, "R1 Sb1 Sa2"},
        // Once the limit is reached, older frames of any key seen since the
        // oldest kept report go, even across dropped reports.
        {"Sa1 R1 Sb1 R2 Sa2 R3", 1, "Sb1 Sa2 R3"},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.frames);
        PipelineRecording::FrameList frames = framesFrom(row.frames);
        PipelineRecording::trimFrames(frames, row.limit);
        EXPECT_EQ(notationOf(frames), row.result);
    }
}

// The reference rhythm of trimming: after every append that brings the list
// to twice the limit. The recorder may trim at other moments, but what it
// keeps must never differ from this.
struct TrimAtTwiceTheLimit {
    explicit TrimAtTwiceTheLimit(std::uint64_t limit) : limit(limit) {}
    void append(const Frame& frame)
    {
        frames.push_back(frame);
        if (frames.size() / 2 >= limit) PipelineRecording::trimFrames(frames, limit);
    }
    // The container as json() writes it: trimmed first.
    std::string json()
    {
        PipelineRecording::trimFrames(frames, limit);
        return containerOf(frames);
    }
    std::string jsonOfCopy() const
    {
        PipelineRecording::FrameList copy = frames;
        PipelineRecording::trimFrames(copy, limit);
        return containerOf(copy);
    }
    static std::string containerOf(const PipelineRecording::FrameList& frames)
    {
        PipelineRecording unlimited;
        for (const Frame& frame : frames) unlimited.appendFrame(frame);
        return unlimited.json();
    }

    std::uint64_t limit;
    PipelineRecording::FrameList frames;
};

TEST(RecordingTrim, KeepsWhatTrimmingAtTwiceTheLimitKeptForAnyPatternOfFrames)
{
    // Each row draws a frame pattern: `stateShare` in 1000 frames are state
    // writes over `keys` keys, the rest reports. Now and then the container
    // is written from a copy (the "Recording" property) or from the recorder
    // itself (which trims it), and compared with the reference rhythm's. Where
    // state is rare, even the moments of trimming stay those of the old
    // rhythm (`sameMoments`: the list has the same length after every frame).
    struct Row {
        std::uint64_t limit;
        int frames;
        int stateShare;
        int keys;
        unsigned seed;
        bool sameMoments;
    };
    const Row rows[] = {
        {1, 400, 500, 1, 1, false},     {1, 400, 900, 3, 2, false},    {2, 600, 500, 1, 3, false},
        {3, 600, 0, 1, 4, true},        {3, 800, 700, 2, 5, false},    {5, 1500, 500, 1, 6, false},
        {5, 1500, 950, 4, 7, false},    {8, 2000, 300, 2, 8, false},   {8, 2000, 1000, 3, 9, false},
        {13, 3000, 500, 1, 10, false},  {13, 3000, 600, 6, 11, false}, {40, 4000, 500, 1, 12, false},
        {40, 4000, 800, 20, 13, false}, {64, 5000, 50, 2, 14, true},   {100, 6000, 500, 2, 15, false},
        {200, 3000, 0, 1, 16, true},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE("limit " + std::to_string(row.limit) + ", seed " + std::to_string(row.seed));
        std::mt19937 random(row.seed);
        std::uniform_int_distribution<int> share(0, 999);
        std::uniform_int_distribution<int> key(0, row.keys - 1);
        std::uniform_int_distribution<int> checkpoint(0, 99);

        PipelineRecording recording;
        recording.setMaxFrameCount(row.limit);
        TrimAtTwiceTheLimit reference(row.limit);
        for (int i = 0; i < row.frames; ++i) {
            const auto stamp = static_cast<std::uint64_t>(i);
            const Frame frame =
                share(random) < row.stateShare
                    ? stateFrame(stamp, "k" + std::to_string(key(random)), PropertyValue::uint64(stamp))
                    : reportFrame(stamp, {static_cast<std::uint8_t>(i), static_cast<std::uint8_t>(i >> 8)});
            recording.appendFrame(frame);
            reference.append(frame);
            if (row.sameMoments) {
                ASSERT_EQ(recording.frames().size(), reference.frames.size()) << "frame " << i;
            }
            const int draw = checkpoint(random);
            if (draw < 3) {
                PipelineRecording copy(recording);
                ASSERT_EQ(copy.json(), reference.jsonOfCopy()) << "copy after frame " << i;
            } else if (draw < 4) {
                ASSERT_EQ(recording.json(), reference.json()) << "after frame " << i;
            }
        }
        EXPECT_EQ(recording.json(), reference.json());
    }
}

TEST(RecordingTrim, WithAStateWritePerReportTrimmingIsPaidOncePerLimitAppends)
{
    // Every trim keeps the limit's reports plus about as many state frames,
    // so a rhythm bound to twice the limit would trim after nearly every
    // append. Trims show as appends after which the list is shorter.
    constexpr std::uint64_t kLimit = 100;
    constexpr std::uint64_t kAppends = 40 * kLimit;
    PipelineRecording recording;
    recording.setMaxFrameCount(kLimit);
    const auto report = ReportBytes::image(1, 0);
    std::uint64_t trims = 0;
    std::size_t longest = 0;
    for (std::uint64_t i = 0; i < kAppends; ++i) {
        const std::size_t before = recording.frames().size();
        if (i % 2 == 0) {
            recording.setState("Algs.HoldTimeoutMilliseconds", PropertyValue::uint64(i));
        } else {
            recording.handleInputReport(report.data(), report.size());
        }
        if (recording.frames().size() <= before) ++trims;
        longest = std::max(longest, recording.frames().size());
    }
    EXPECT_LE(trims, kAppends / kLimit);
    EXPECT_LE(longest, 5 * kLimit) << "the list stays bounded";
    EXPECT_GE(trims, kAppends / (5 * kLimit)) << "and is trimmed all the same";
}

// Only the service sets a limit, on its new recorder; a recording read from a
// file keeps every frame.
TEST(RecordingTrim, ANewRecorderHasNoLimit)
{
    PipelineRecording unlimited;
    for (int i = 0; i < 3000; ++i) unlimited.appendFrame(reportFrame(0, {1}));
    EXPECT_EQ(unlimited.frames().size(), 3000u);
}

// A copy of the recorder (the "Recording" property is written from one) has
// frames of its own, under the same limit: fuzz_pipeline writes one from a
// live recorder that goes on recording, and ServicePropertiesTest counts the
// frames of the property while reports flow.
TEST(Recorder, RecordsEachCallWithOneClockReadingAndForwardsIt)
{
    auto log = std::make_shared<CallLog>();
    PipelineRecording recording;
    recording.pipeline = log;

    const PropertyValue value = PropertyValue::string("shared");
    const std::uint64_t before = MonotonicClock::now();
    recording.setState("Algs.Key", value);
    recording.setState("Algs.Empty", PropertyValue());
    const auto image = ReportBytes::image(1, 2);
    recording.handleInputReport(image.data(), image.size());
    recording.handleInputReport(nullptr, 0);
    recording.setTime(123456);
    const std::uint64_t after = MonotonicClock::now();

    EXPECT_EQ(log->calls, (std::vector<std::string>{"time", "state Algs.Key", "time", "state Algs.Empty", "time",
                                                    "report 73", "time", "report 0"}))
        << "setTime on the recorder forwards nothing";
    ASSERT_EQ(recording.frames().size(), 4u);
    std::size_t i = 0;
    for (const Frame& frame : recording.frames()) {
        EXPECT_EQ(frame.timestampNs, VeltoTouch::Util::nanosecondsFromMachTime(log->times[i]))
            << "frame " << i << " and the forwarded time come from one reading";
        EXPECT_GE(log->times[i], before);
        EXPECT_LE(log->times[i], after);
        if (i > 0) {
            EXPECT_GE(log->times[i], log->times[i - 1]);
        }
        ++i;
    }

    const Frame& state = recording.frames().front();
    EXPECT_EQ(state.type, Frame::Type::State);
    EXPECT_EQ(state.value.identity(), value.identity()) << "the value is shared, not copied";
    EXPECT_EQ(log->values[0].identity(), value.identity());
    EXPECT_FALSE(std::next(recording.frames().begin())->value.hasValue());
    EXPECT_FALSE(log->values[1].hasValue());
    EXPECT_EQ(std::next(recording.frames().begin(), 2)->report, image);
    EXPECT_EQ(log->reports[0], image);
    EXPECT_TRUE(recording.frames().back().report.empty());
    EXPECT_EQ(recording.frames().back().type, Frame::Type::InputReport);
}

TEST(Recorder, RecordsAStampedReportAtItsStampAndNeverBeforeTheNewestFrame)
{
    auto log = std::make_shared<CallLog>();
    PipelineRecording recording;
    recording.pipeline = log;
    const auto image = ReportBytes::image(1, 2);

    // A stamp from the device: the frame and the forwarded time are that
    // stamp, not a reading of the clock.
    const std::uint64_t stamp = MonotonicClock::now() - 1000;
    recording.handleInputReportAt(stamp, image.data(), image.size());
    recording.handleInputReportAt(stamp + 250, image.data(), image.size());
    // A state written while a report stamped before it waited for its turn:
    // the report takes the state's time.
    recording.setState("Algs.Key", PropertyValue::uint32(1));
    const std::uint64_t stateTime = log->times.back();
    recording.handleInputReportAt(stamp + 500, image.data(), image.size());

    ASSERT_EQ(log->times.size(), 4u);
    EXPECT_EQ(log->times[0], stamp);
    EXPECT_EQ(log->times[1], stamp + 250);
    EXPECT_GE(stateTime, stamp + 1000);
    EXPECT_EQ(log->times[3], stateTime);
    ASSERT_EQ(recording.frames().size(), 4u);
    std::size_t i = 0;
    for (const Frame& frame : recording.frames()) {
        EXPECT_EQ(frame.timestampNs, VeltoTouch::Util::nanosecondsFromMachTime(log->times[i])) << "frame " << i;
        ++i;
    }
    EXPECT_EQ(log->reports.size(), 3u);
}

}  // namespace
