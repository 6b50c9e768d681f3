#include "RecordingTestSupport.h"

#include "platform/runtime/MonotonicClock.h"
#include "records/TickConversion.h"

#include <gtest/gtest.h>

#include <limits>
#include <memory>
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

}  // namespace
