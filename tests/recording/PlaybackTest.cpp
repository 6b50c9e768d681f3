// The playback cursor and the rounding of waits. That every frame reaches
// the pipeline once, in order, on a time line that starts at playReset and
// waits the recorded spacing divided by the speed (a speed of 0 or less as
// 1) is checked for any recording and speed by fuzz/fuzz_playback.cpp, from
// seeds at speeds 2, 0.5, 1, below 0, NaN and tiny; under a clock whose tick
// is not the nanosecond by the timebase tests of hid-recorder playback.
#include "RecordingTestSupport.h"

#include <gtest/gtest.h>

#include <limits>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

namespace {

using namespace RecordingTestSupport;

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
