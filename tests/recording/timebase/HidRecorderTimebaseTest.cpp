// A hid-recorder capture on a clock whose tick is 125/3 ns: its events are
// stamped in nanoseconds, as container frames are, and playback turns them
// into ticks once.
#include "recording/RecordingTestSupport.h"

#include "recording/HidRecorderReader.h"

#include <gtest/gtest.h>

TEST(HidRecorderTimebase, EventsPlayAtTheirMicrosecondsOnTheTickTimeLine)
{
    using namespace RecordingTestSupport;
    PipelineRecording::FrameList frames;
    VeltoTouch::HidRecorderReader::read("E: 2.000000 1 01\nE: 3.000003 1 02\n",
                                        [&](Frame&& frame) { frames.push_back(std::move(frame)); }, 0);
    ASSERT_EQ(frames.size(), 2u);
    CallLog log;
    PipelineRecording::PlayClock clock;
    clock.reset();
    for (const Frame& frame : frames) PipelineRecording::playFrame(frame, clock, frames.front().timestampNs, 1, {}, &log);
    ASSERT_EQ(log.times.size(), 2u);
    // 1.000003 s is 1,000,003,000 ns, 24,000,072 ticks of 125/3 ns.
    EXPECT_EQ(log.times[1] - log.times[0], 24'000'072u);
}
