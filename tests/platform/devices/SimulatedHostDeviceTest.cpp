#include "platform/devices/SimulatedHostDevice.h"
#include "platform/runtime/RunLoop.h"
#include "platform/runtime/Semaphore.h"

#include <gtest/gtest.h>

#include <array>
#include <thread>
#include <vector>

using namespace VeltoHost;
using namespace std::chrono_literals;

namespace {

constexpr const char* kMode = "TestDeviceMode";

struct Delivery {
    std::thread::id thread;
    void* sender;
    HidReportType type;
    std::uint32_t reportID;
    std::vector<std::uint8_t> bytes;
    std::uint64_t timeStamp;
};

// What the callback writes; owned by the loop thread while it runs.
struct Receiver {
    std::array<std::uint8_t, 4> buffer{};
    std::vector<Delivery> deliveries;

    static void callback(void* context, std::int32_t result, void* sender, HidReportType type, std::uint32_t reportID,
                         std::uint8_t* report, std::size_t length, std::uint64_t timeStamp)
    {
        auto* self = static_cast<Receiver*>(context);
        EXPECT_EQ(result, kHostDeviceSuccess);
        EXPECT_EQ(report, self->buffer.data());
        self->deliveries.push_back(
            {std::this_thread::get_id(), sender, type, reportID, {report, report + length}, timeStamp});
    }
};

}  // namespace

TEST(SimulatedHostDeviceTest, DeliversPushedReportsInOrderOnTheLoopThread)
{
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    // Kept while nobody listens, delivered once scheduled and registered.
    device->pushInputReport({0x01, 0xA0});
    device->pushInputReport({});
    EXPECT_EQ(device->pendingReportCount(), 2u);

    Receiver receiver;
    Semaphore scheduled;
    std::thread::id loopThread;
    std::thread loop([&] {
        loopThread = std::this_thread::get_id();
        ASSERT_TRUE(device->open(0));
        device->registerInputReportWithTimeStampCallback(receiver.buffer.data(), receiver.buffer.size(),
                                                         &Receiver::callback, &receiver);
        device->scheduleWithRunLoop(RunLoop::current(), kMode);
        scheduled.signal();
        // One handled source is one report.
        while (receiver.deliveries.size() < 6) {
            ASSERT_EQ(RunLoop::run(kMode, std::nullopt, true), RunLoop::RunResult::HandledSource);
        }
        device->unscheduleFromRunLoop(RunLoop::current(), kMode);
        device->registerInputReportWithTimeStampCallback(receiver.buffer.data(), receiver.buffer.size(), nullptr,
                                                         nullptr);
    });
    scheduled.wait();
    for (std::uint8_t i = 2; i < 6; ++i) device->pushInputReport({i, 1, 2, 3, 4, 5});
    loop.join();

    ASSERT_EQ(receiver.deliveries.size(), 6u);
    EXPECT_EQ(receiver.deliveries[0].bytes, (std::vector<std::uint8_t>{0x01, 0xA0}));
    EXPECT_TRUE(receiver.deliveries[1].bytes.empty());
    EXPECT_EQ(receiver.deliveries[1].reportID, 0u);
    for (std::size_t i = 0; i < receiver.deliveries.size(); ++i) {
        const Delivery& delivery = receiver.deliveries[i];
        EXPECT_EQ(delivery.thread, loopThread);
        EXPECT_EQ(delivery.sender, device.get());
        EXPECT_EQ(delivery.type, HidReportType::Input);
        EXPECT_GT(delivery.timeStamp, 0u);
        if (i >= 2) {
            // Truncated to the four-byte buffer, ID from the first byte.
            EXPECT_EQ(delivery.bytes, (std::vector<std::uint8_t>{static_cast<std::uint8_t>(i), 1, 2, 3}));
            EXPECT_EQ(delivery.reportID, i);
        }
    }
    // The open options it was given, and that reports wait again once it is
    // unscheduled: the host event system's tests.
}
