#include "RecordingTestSupport.h"

#include "pipeline/Pipeline.h"
#include "pipeline/Util.h"
#include "platform/MonotonicClock.h"
#include "platform/PropertyDictionary.h"

#include <gtest/gtest.h>

#include <array>
#include <limits>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

namespace {

using namespace RecordingTestSupport;
using VeltoHost::MonotonicClock;

// A recorder whose waits are collected instead of slept.
struct PlaybackFixture {
    PlaybackFixture()
    {
        recording.pipeline = log;
        recording.sleepMicroseconds = [this](std::uint64_t microseconds) { sleeps.push_back(microseconds); };
    }

    std::shared_ptr<CallLog> log = std::make_shared<CallLog>();
    PipelineRecording recording;
    std::vector<std::uint64_t> sleeps;
};

void expectFinished(PipelineRecording& recording)
{
    EXPECT_FALSE(recording.playCanContinue());
    try {
        recording.playNextFrame(1.0f);
        ADD_FAILURE() << "played past the end";
    } catch (const std::runtime_error& error) {
        EXPECT_STREQ(error.what(), "playback finished");
    }
}

TEST(Playback, CursorIsNotValidPlayingOrFinished)
{
    PlaybackFixture f;
    f.recording.playReset();
    expectFinished(f.recording);  // empty recording: finished at once

    f.recording.appendFrame(reportFrame(100, {1}));
    f.recording.appendFrame(reportFrame(200, {2}));
    expectFinished(f.recording);  // appending made the cursor not valid
    EXPECT_TRUE(f.log->calls.empty());

    f.recording.playReset();
    EXPECT_TRUE(f.recording.playCanContinue());
    f.recording.playNextFrame(1.0f);
    EXPECT_TRUE(f.recording.playCanContinue());
    f.recording.playNextFrame(1.0f);
    expectFinished(f.recording);
    EXPECT_EQ(f.log->reports, (std::vector<std::vector<std::uint8_t>>{{1}, {2}}));

    // Restart, then record while playing: the next frame cannot be played.
    f.recording.playReset();
    f.recording.playNextFrame(1.0f);
    f.recording.setState("k", PropertyValue::null());
    expectFinished(f.recording);

    // A trim that erases frames invalidates the cursor; one that erases
    // nothing leaves it playing.
    f.recording.playReset();
    f.recording.setMaxFrameCount(5);
    EXPECT_TRUE(f.recording.playCanContinue());
    f.recording.setMaxFrameCount(1);
    expectFinished(f.recording);
    f.recording.playReset();
    f.recording.json();
    EXPECT_TRUE(f.recording.playCanContinue()) << "nothing left to trim";
}

TEST(Playback, WaitsFollowTheReportSpacingDividedBySpeed)
{
    struct Case {
        float speed;
        std::vector<std::uint64_t> sleeps;
    };
    const Case cases[] = {
        {1.0f, {10000, 20000}}, {2.0f, {5000, 10000}}, {0.0f, {10000, 20000}},
        {-3.0f, {10000, 20000}}, {0.5f, {20000, 40000}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.speed);
        PlaybackFixture f;
        f.recording.appendFrame(stateFrame(1'000'000, "before", PropertyValue::null()));
        f.recording.appendFrame(reportFrame(5'000'000, {1}));           // first report: no wait
        f.recording.appendFrame(reportFrame(15'000'000, {2}));          // 10 ms after
        f.recording.appendFrame(stateFrame(30'000'000, "k", PropertyValue::null()));  // states never wait
        f.recording.appendFrame(reportFrame(35'000'000, {3}));          // 20 ms after the previous report
        f.recording.appendFrame(reportFrame(35'000'000, {4}));          // not later: no wait
        f.recording.appendFrame(reportFrame(1'000'000, {5}));           // earlier: no wait
        f.recording.playReset();
        while (f.recording.playCanContinue()) f.recording.playNextFrame(c.speed);
        EXPECT_EQ(f.sleeps, c.sleeps);
        EXPECT_EQ(f.log->reports.size(), 5u);
    }
}

TEST(Playback, WaitArithmeticIsSinglePrecision)
{
    PlaybackFixture f;
    f.recording.appendFrame(reportFrame(0, {1}));
    // 999,999,999 ns is 1e9 in single precision: 1,000,000 us, where double
    // arithmetic would truncate 999,999.999 to 999,999.
    f.recording.appendFrame(reportFrame(999'999'999, {2}));
    f.recording.playReset();
    f.recording.playNextFrame(1.0f);
    f.recording.playNextFrame(1.0f);
    EXPECT_EQ(f.sleeps, (std::vector<std::uint64_t>{1'000'000}));

    f.sleeps.clear();
    f.recording.playReset();
    f.recording.playNextFrame(1e-30f);
    f.recording.playNextFrame(1e-30f);
    EXPECT_EQ(f.sleeps, (std::vector<std::uint64_t>{std::numeric_limits<std::uint64_t>::max()}))
        << "a wait beyond 64 bits saturates";
}

TEST(Playback, TimeLineStartsAtResetAndKeepsTheRecordedSpacingAtAnySpeed)
{
    PlaybackFixture f;
    const std::uint64_t t0 = 7'000'000'000;
    f.recording.appendFrame(stateFrame(t0, "Algs.A", PropertyValue::uint64(3)));
    f.recording.appendFrame(reportFrame(t0 + 1'000'000, {1}));
    f.recording.appendFrame(stateFrame(t0 + 1'500'000, "Algs.B", PropertyValue()));
    f.recording.appendFrame(reportFrame(t0 + 11'000'000, {2}));

    const std::uint64_t before = MonotonicClock::now();
    f.recording.playReset();
    const std::uint64_t after = MonotonicClock::now();
    while (f.recording.playCanContinue()) f.recording.playNextFrame(2.0f);

    EXPECT_EQ(f.log->calls, (std::vector<std::string>{"time", "state Algs.A", "time", "report 1", "time",
                                                      "state Algs.B", "time", "report 1"}));
    ASSERT_EQ(f.log->times.size(), 4u);
    const std::uint64_t start = f.log->times[0];
    EXPECT_GE(start, before);
    EXPECT_LE(start, after);
    using VeltoTouch::Util::machTimeFromNanoseconds;
    EXPECT_EQ(f.log->times[1], start + machTimeFromNanoseconds(1'000'000));
    EXPECT_EQ(f.log->times[2], start + machTimeFromNanoseconds(1'500'000));
    EXPECT_EQ(f.log->times[3], start + machTimeFromNanoseconds(11'000'000));
    EXPECT_EQ(f.sleeps, (std::vector<std::uint64_t>{5000}));
    EXPECT_EQ(f.log->values[0], PropertyValue::uint64(3));
    EXPECT_FALSE(f.log->values[1].hasValue()) << "a frame without value is delivered without value";
    EXPECT_EQ(f.recording.frames().size(), 4u) << "playing does not record";
}

TEST(Playback, WithoutAWrappedInputFramesAreConsumedAndWaitedFor)
{
    PlaybackFixture f;
    f.recording.pipeline.reset();
    f.recording.appendFrame(reportFrame(0, {1}));
    f.recording.appendFrame(reportFrame(3'000'000, {2}));
    f.recording.playReset();
    f.recording.playNextFrame(1.0f);
    f.recording.playNextFrame(1.0f);
    expectFinished(f.recording);
    EXPECT_EQ(f.sleeps, (std::vector<std::uint64_t>{3000}));
    EXPECT_TRUE(f.log->calls.empty());
}

// Collects what a pipeline emits, with times relative to the first time it
// was given, so that a live run and a replay started later can be compared.
// An event's description with its absolute time stamp masked, since replays
// run at another time than the recording.
std::string withoutTimestamp(std::string description)
{
    const std::string label = "timestamp=";
    const auto start = description.find(label);
    if (start == std::string::npos) return description;
    const auto digits = start + label.size();
    const auto end = description.find_first_not_of("0123456789", digits);
    description.replace(digits, (end == std::string::npos ? description.size() : end) - digits, "T");
    return description;
}

struct EventCollector {
    explicit EventCollector(VeltoTouch::Pipeline& pipeline)
    {
        pipeline.setTimeProbe = [this](std::uint64_t time) {
            if (!origin) origin = time;
        };
        pipeline.hidEventsProbe = [this](const VeltoHost::HidEventList& list) {
            for (const auto& event : list) {
                events.push_back(withoutTimestamp(event->description()));
                times.push_back(event->timeStamp() - origin.value_or(0));
            }
        };
    }

    std::optional<std::uint64_t> origin;
    std::vector<std::string> events;
    // In ticks from the first time given.
    std::vector<std::uint64_t> times;
};

// A replayed time goes from ticks to the recording's nanoseconds and back,
// and each direction truncates: unless a tick is a whole number of
// nanoseconds, the replay may see a time one tick short of the live one.
std::uint64_t roundTripShortfall()
{
    const VeltoHost::Timebase tick = MonotonicClock::timebase();
    return tick.numer % tick.denom == 0 ? 0 : 1;
}

TEST(Playback, ReplayIntoAFreshPipelineGivesTheEventsOfTheLiveRun)
{
    auto live = std::make_shared<VeltoTouch::Pipeline>();
    EventCollector liveEvents(*live);
    PipelineRecording recorder;
    recorder.pipeline = live;
    auto feed = [&recorder](const std::vector<std::uint8_t>& report) {
        recorder.handleInputReport(report.data(), report.size());
    };

    recorder.setState("Algs.HoldTimeoutMilliseconds", PropertyValue::uint64(400));
    std::array<std::int16_t, 15> touch{};
    touch.fill(900);
    std::uint32_t frameNumber = 100;
    for (int round = 0; round < 3; ++round) {
        for (int i = 0; i < 20; ++i) {
            ++frameNumber;
            const bool touched = i >= 5 && i < 12;
            feed(imageReport(frameNumber, frameNumber * 8, touched ? touch : std::array<std::int16_t, 15>{}));
        }
        feed(firmwareEventReport(0));  // device reset
        feed(firmwareEventReport(1));  // another firmware notice: ignored
        frameNumber += 3;              // a frame-number gap
    }
    feed({0x7F, 0x00});  // neither a firmware event nor an image
    ASSERT_GE(liveEvents.events.size(), 3u) << "at least the three reset events";

    PipelineRecording replay{std::string_view(recorder.json())};
    auto fresh = std::make_shared<VeltoTouch::Pipeline>();
    EventCollector replayEvents(*fresh);
    replay.pipeline = fresh;
    replay.sleepMicroseconds = [](std::uint64_t) {};
    replay.playReset();
    while (replay.playCanContinue()) replay.playNextFrame(1.0f);

    EXPECT_EQ(replayEvents.events, liveEvents.events);
    ASSERT_EQ(replayEvents.times.size(), liveEvents.times.size());
    for (std::size_t i = 0; i < liveEvents.times.size(); ++i) {
        EXPECT_LE(replayEvents.times[i], liveEvents.times[i]) << i;
        EXPECT_LE(liveEvents.times[i] - replayEvents.times[i], roundTripShortfall()) << i;
    }
    EXPECT_EQ(fresh->getState("DebugInfo"), live->getState("DebugInfo"));
    EXPECT_EQ(fresh->getState("DebugInfo").asDictionary().get("DisjointImageCount"), PropertyValue::uint32(2));
    EXPECT_EQ(fresh->getState("Algs.HoldTimeoutMilliseconds"), live->getState("Algs.HoldTimeoutMilliseconds"));
}

}  // namespace
