#include "recording/SimulatedDevicePlayer.h"

#include "platform/plugin/HostEventSystem.h"
#include "platform/runtime/MonotonicClock.h"
#include "recording/RecordingTestSupport.h"
#include "records/TickConversion.h"

#include <gtest/gtest.h>

#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <memory>
#include <string>
#include <thread>
#include <vector>

using namespace VeltoHost;
using VeltoTouch::PipelineRecording;

namespace {

using namespace RecordingTestSupport;

PipelineRecording::Frame report(std::uint8_t id, std::uint64_t timestampNs) { return reportFrame(timestampNs, {id}); }

SimulatedDevicePlayer atSpeedZero(const SimulatedHostDevice::Ref& device)
{
    return SimulatedDevicePlayer(
        device, [](const std::string&, const PropertyValue&) {}, [] { return false; }, {.speed = 0});
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
    EXPECT_FALSE(player.play(stateFrame(0, "K", PropertyValue::uint32(1))));
    EXPECT_FALSE(player.waitUntilTaken());
    stopper.join();
    EXPECT_EQ(player.reportsPushed(), 1u);
    ASSERT_EQ(notices.size(), 1u);
    EXPECT_NE(notices[0].find("--max-gap"), std::string::npos);
}

// A stream's frames before its fault are played before the fault is raised,
// and a stop, also one the reader took for a fault, ends it as a stop: through
// host, ReplayCommandTest (a fault after good frames) and HostCommandTest (a
// stop while the flow goes on, and one while loading).
TEST(SimulatedDevicePlayerTest, ReadAheadPlaysAContainerFileAndTheNamedDeviceOfAHidRecorderFile)
{
    const TempFile container(R"({"Version": 1, "Frames": [)"
                             R"({"Type": "InputReport", "Timestamp": 5, "Report": "02 01"},)"
                             R"({"Type": "InputReport", "Timestamp": 7, "Report": "02 02"}]})");
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    SimulatedDevicePlayer player = atSpeedZero(device);
    EXPECT_EQ(player.playStream(SimulatedDevicePlayer::readAhead(container.fd())),
              SimulatedDevicePlayer::Ending::Finished);
    EXPECT_EQ(device->pendingReportCount(), 2u);

    // Device 0 of the example is a keyboard with 5 events, device 1 the
    // surface with 133, the one read when none is named.
    const std::string example = std::string(VELTO_EXAMPLES_DIR) + "/hid-recorder-two-devices.hid";
    for (const auto& [hidDevice, reports] :
         {std::pair{std::optional<std::uint32_t>(0), 5u}, std::pair{std::optional<std::uint32_t>(), 133u}}) {
        std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::fopen(example.c_str(), "rbe"), &std::fclose);
        ASSERT_TRUE(file) << example;
        SimulatedHostDevice::Ref hidRecorded = SimulatedHostDevice::create();
        SimulatedDevicePlayer hidPlayer = atSpeedZero(hidRecorded);
        hidPlayer.playStream(SimulatedDevicePlayer::readAhead(::fileno(file.get()), hidDevice));
        EXPECT_EQ(hidRecorded->pendingReportCount(), reports);
    }
}

// The plug-in records a report at the time the device stamped it (here,
// when it was pushed), not when its turn came on the plug-in's thread.
TEST(SimulatedDevicePlayerTest, ThePlugInRecordsEachReportAtItsDeviceTimeStamp)
{
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    SimulatedDevicePlayer player = atSpeedZero(device);
    const std::uint64_t beforePush = VeltoTouch::Util::nanosecondsFromMachTime(MonotonicClock::now());
    for (std::uint8_t i = 0; i < 3; ++i) ASSERT_TRUE(player.play(report(2, i)));
    const std::uint64_t afterPush = VeltoTouch::Util::nanosecondsFromMachTime(MonotonicClock::now());
    // Only now does a plug-in take the device: the reports waited for it.
    HostEventSystem host;
    host.start(VELTO_SERVICE_MODULE_PATH, "VeltoTouchHIDServiceFactory", device);
    ASSERT_TRUE(player.waitUntilTaken());
    host.unschedule();
    const PipelineRecording recording(std::string_view(host.copyProperty("Recording").asString()));
    host.stop();
    ASSERT_EQ(recording.frames().size(), 3u);
    for (const PipelineRecording::Frame& frame : recording.frames()) {
        EXPECT_GE(frame.timestampNs, beforePush);
        EXPECT_LE(frame.timestampNs, afterPush);
    }
}
