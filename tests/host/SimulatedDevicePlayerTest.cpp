#include "host/SimulatedDevicePlayer.h"

#include "platform/MonotonicClock.h"

#include <gtest/gtest.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

using namespace VeltoHost;
using VeltoTouch::PipelineRecording;

namespace {

PipelineRecording::Frame report(std::uint8_t id, std::uint64_t timestampNs)
{
    PipelineRecording::Frame frame;
    frame.type = PipelineRecording::Frame::Type::InputReport;
    frame.timestampNs = timestampNs;
    frame.report = {id};
    return frame;
}

}  // namespace

TEST(SimulatedDevicePlayerTest, AStopRequestEndsEveryWait)
{
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();  // never scheduled: nothing is taken
    std::atomic<bool> stop{false};
    std::vector<std::string> notices;
    SimulatedDevicePlayer player(
        device, [](const std::string&, const PropertyValue&) { ADD_FAILURE() << "state written"; },
        [&] { return stop.load(); }, {1.0, 512},
        GapCap(3600.0, [&](const std::string& text) { notices.push_back(text); }));

    ASSERT_TRUE(player.play(report(1, 0)));
    std::thread stopper([&] {
        MonotonicClock::sleepMicroseconds(50'000);
        stop = true;
    });
    // A gap of a year, and a state write that waits for a report nobody takes:
    // both return once the stop is requested.
    EXPECT_FALSE(player.play(report(2, 365ull * 24 * 3600 * 1'000'000'000ull)));
    PipelineRecording::Frame state;
    state.type = PipelineRecording::Frame::Type::State;
    state.key = "K";
    state.value = PropertyValue::uint32(1);
    EXPECT_FALSE(player.play(state));
    EXPECT_FALSE(player.waitUntilTaken());
    stopper.join();
    EXPECT_EQ(player.reportsPushed(), 1u);
    ASSERT_EQ(notices.size(), 1u);
    EXPECT_NE(notices[0].find("--max-gap"), std::string::npos);
}
