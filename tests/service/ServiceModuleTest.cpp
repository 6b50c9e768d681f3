// The real module, loaded by the host's event system from its file, with a
// simulated device: a tap and a device reset come out at a subscriber.

#include "platform/HidEvent.h"
#include "platform/HostEventSystem.h"
#include "platform/PropertyDictionary.h"
#include "platform/SimulatedHostDevice.h"
#include "service/ServiceHarness.h"

#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <vector>

using namespace VeltoHost;
using namespace VeltoTouch::Test;

namespace {

constexpr int kPadK = 'K' - 'A';
constexpr std::uint32_t kFrameIntervalMs = 10;

}  // namespace

TEST(ServiceModule, HostLoadsTheModuleAndItsSubscribersSeeGesturesAndResets)
{
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    std::mutex lock;
    std::condition_variable arrived;
    std::vector<HidEventRef> events;

    HostEventSystem host;
    host.subscribe([&](const HidEventRef& event) {
        std::lock_guard<std::mutex> guard(lock);
        events.push_back(event);
        arrived.notify_all();
    });
    host.start(VELTO_SERVICE_MODULE_PATH, "VeltoTouchHIDServiceFactory", device);
    ASSERT_TRUE(host.isRunning());
    EXPECT_EQ(host.copyProperty("Version"),
              PropertyValue::array({PropertyValue::int32(28), PropertyValue::int32(0), PropertyValue::int32(0)}));

    // Three idle frames, a finger on pad K for ten frames, the release, and
    // then the device announces a reset.
    std::uint32_t frame = 1;
    auto push = [&](std::initializer_list<std::pair<int, std::int16_t>> readings) {
        device->pushInputReport(imageReport(frame, 1000 + kFrameIntervalMs * (frame - 1), readings));
        ++frame;
    };
    for (int i = 0; i < 3; ++i) push({});
    for (int i = 0; i < 10; ++i) push({{kPadK, 300}});
    push({});
    device->pushInputReport(deviceResetReport());

    {
        std::unique_lock<std::mutex> guard(lock);
        ASSERT_TRUE(arrived.wait_for(guard, std::chrono::seconds(30), [&] { return events.size() >= 3; }));
    }
    host.drain();
    std::vector<HidEventRef> seen;
    {
        std::lock_guard<std::mutex> guard(lock);
        seen = events;
    }
    // may-begin and tap in the middle region, then the reset's vendor event.
    ASSERT_EQ(seen.size(), 3u);
    EXPECT_EQ(seen[0]->type(), HidEvent::kTypeDigitizer);
    EXPECT_EQ(seen[0]->phase(), HidEvent::kPhaseMayBegin);
    EXPECT_EQ(seen[0]->digitizer().y, 1.0);
    EXPECT_EQ(seen[1]->type(), HidEvent::kTypeDigitizer);
    EXPECT_EQ(seen[1]->digitizer().y, 1.0);
    EXPECT_EQ(seen[2]->type(), HidEvent::kTypeVendorDefined);
    EXPECT_EQ(seen[2]->vendorDefined().usagePage, 0xFF60u);
    EXPECT_LE(seen[0]->timeStamp(), seen[1]->timeStamp());
    EXPECT_LE(seen[1]->timeStamp(), seen[2]->timeStamp());

    // The recogniser's counters saw the tap; its settings are reachable.
    PropertyValue stats = host.copyProperty("Pipeline.DebugInfo");
    EXPECT_EQ(stats.asDictionary().get("ResetCount"), PropertyValue::uint32(1));
    EXPECT_TRUE(host.setProperty("Pipeline.Algs.HoldTimeoutMilliseconds", PropertyValue::uint32(450)));
    EXPECT_EQ(host.copyProperty("Pipeline.Algs.HoldTimeoutMilliseconds"), PropertyValue::uint32(450));
    host.stop();
    EXPECT_FALSE(device->isScheduled());
    EXPECT_FALSE(device->hasCallback());
}
