#include "platform/HostDeviceRegistry.h"
#include "platform/RunLoop.h"
#include "platform/Semaphore.h"
#include "platform/SimulatedHostDevice.h"

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
        ASSERT_TRUE(device->open(0x5));
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
    EXPECT_EQ(receiver.deliveries[0].reportID, 0x01u);
    EXPECT_TRUE(receiver.deliveries[1].bytes.empty());
    EXPECT_EQ(receiver.deliveries[1].reportID, 0u);
    std::uint64_t previousTime = 0;
    for (std::size_t i = 0; i < receiver.deliveries.size(); ++i) {
        const Delivery& delivery = receiver.deliveries[i];
        EXPECT_EQ(delivery.thread, loopThread);
        EXPECT_EQ(delivery.sender, device.get());
        EXPECT_EQ(delivery.type, HidReportType::Input);
        EXPECT_GE(delivery.timeStamp, previousTime);
        EXPECT_GT(delivery.timeStamp, 0u);
        previousTime = delivery.timeStamp;
        if (i >= 2) {
            // Truncated to the four-byte buffer, ID from the first byte.
            EXPECT_EQ(delivery.bytes, (std::vector<std::uint8_t>{static_cast<std::uint8_t>(i), 1, 2, 3}));
            EXPECT_EQ(delivery.reportID, i);
        }
    }
    SimulatedHostDevice::Counters counters = device->counters();
    EXPECT_EQ(counters.reportsDelivered, 6u);
    EXPECT_EQ(counters.reportsDropped, 0u);
    EXPECT_EQ(counters.opens, 1u);
    EXPECT_EQ(counters.lastOpenOptions, 0x5u);
    EXPECT_EQ(counters.schedules, 1u);
    EXPECT_EQ(counters.unschedules, 1u);
    EXPECT_FALSE(device->isScheduled());
    EXPECT_FALSE(device->hasCallback());
    EXPECT_TRUE(device->waitUntilIdle(10s));

    // Unscheduled: a new report waits again.
    device->pushInputReport({7});
    EXPECT_EQ(device->pendingReportCount(), 1u);
}

TEST(SimulatedHostDeviceTest, FeatureReportsPropertiesAndInjectedFailures)
{
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    device->setFeatureReport(0x1F, {0x1F, 0x10, 0x27, 0, 0});
    device->setFeatureReport(0x04, {0x04, 0xAB});
    std::array<std::uint8_t, 32> buffer{};
    std::size_t length = buffer.size();

    EXPECT_EQ(device->getReport(HidReportType::Feature, 0x1F, buffer.data(), length), kHostDeviceNotOpen);
    device->failOpen(true);
    EXPECT_FALSE(device->open(0));
    device->failOpen(false);
    ASSERT_TRUE(device->open(0));

    EXPECT_EQ(device->getReport(HidReportType::Feature, 0x1F, buffer.data(), length), kHostDeviceSuccess);
    EXPECT_EQ(length, 5u);
    EXPECT_EQ(buffer[0], 0x1F);
    EXPECT_EQ(buffer[2], 0x27);
    length = buffer.size();
    EXPECT_EQ(device->getReport(HidReportType::Feature, 0x33, buffer.data(), length), kHostDeviceError);
    EXPECT_EQ(device->getReport(HidReportType::Input, 0x1F, buffer.data(), length), kHostDeviceError);
    length = 2;
    EXPECT_EQ(device->getReport(HidReportType::Feature, 0x1F, buffer.data(), length), kHostDeviceBadArgument);

    // A failure for one ID leaves the others alone; a failure for all wins
    // only where no ID has its own.
    device->failGetReport(0x04u, kHostDeviceNoDevice);
    length = buffer.size();
    EXPECT_EQ(device->getReport(HidReportType::Feature, 0x04, buffer.data(), length), kHostDeviceNoDevice);
    EXPECT_EQ(device->getReport(HidReportType::Feature, 0x1F, buffer.data(), length), kHostDeviceSuccess);
    device->failGetReport(kHostDeviceError);
    length = buffer.size();
    EXPECT_EQ(device->getReport(HidReportType::Feature, 0x1F, buffer.data(), length), kHostDeviceError);
    device->failGetReport(kHostDeviceSuccess);
    device->failGetReport(0x04u, kHostDeviceSuccess);
    length = buffer.size();
    EXPECT_EQ(device->getReport(HidReportType::Feature, 0x04, buffer.data(), length), kHostDeviceSuccess);
    EXPECT_EQ(length, 2u);

    EXPECT_FALSE(device->getProperty("Product").hasValue());
    EXPECT_TRUE(device->setProperty("Product", PropertyValue::string("Touch Surface")));
    EXPECT_EQ(device->getProperty("Product"), PropertyValue::string("Touch Surface"));
    device->refusePropertyWrites(true);
    EXPECT_FALSE(device->setProperty("Product", PropertyValue::string("Other")));
    EXPECT_EQ(device->getProperty("Product"), PropertyValue::string("Touch Surface"));

    device->close(0x3);
    EXPECT_FALSE(device->isOpen());
    EXPECT_EQ(device->counters().lastCloseOptions, 0x3u);
    EXPECT_EQ(device->counters().opens, 2u);
}

TEST(SimulatedHostDeviceTest, UnplugEndsDeliveryAndEveryOperation)
{
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    device->setFeatureReport(0x1F, {0x1F});
    device->setProperty("VendorID", PropertyValue::uint32(0x1234));
    Receiver receiver;
    std::thread loop([&] {
        ASSERT_TRUE(device->open(0));
        device->registerInputReportWithTimeStampCallback(receiver.buffer.data(), receiver.buffer.size(),
                                                         &Receiver::callback, &receiver);
        device->scheduleWithRunLoop(RunLoop::current(), kMode);
        device->pushInputReport({1});
        ASSERT_EQ(RunLoop::run(kMode, std::nullopt, true), RunLoop::RunResult::HandledSource);

        device->pushInputReport({2});
        device->unplug();
        device->pushInputReport({3});
        // The source stays attached until unscheduled, but nothing arrives.
        RunLoop::run(kMode, 0ns, false);
        device->unscheduleFromRunLoop(RunLoop::current(), kMode);
        EXPECT_EQ(RunLoop::run(kMode, std::nullopt, false), RunLoop::RunResult::Finished);
    });
    loop.join();

    ASSERT_EQ(receiver.deliveries.size(), 1u);
    EXPECT_EQ(receiver.deliveries[0].reportID, 1u);
    EXPECT_TRUE(device->waitUntilIdle(10s));
    SimulatedHostDevice::Counters counters = device->counters();
    EXPECT_EQ(counters.reportsDelivered, 1u);
    EXPECT_EQ(counters.reportsDropped, 2u);

    std::array<std::uint8_t, 8> buffer{};
    std::size_t length = buffer.size();
    EXPECT_EQ(device->getReport(HidReportType::Feature, 0x1F, buffer.data(), length), kHostDeviceNoDevice);
    EXPECT_FALSE(device->open(0));
    EXPECT_FALSE(device->getProperty("VendorID").hasValue());
    EXPECT_FALSE(device->setProperty("VendorID", PropertyValue::uint32(1)));
}

TEST(HostDeviceRegistryTest, ServiceHandlesFindTheirDevices)
{
    HostDeviceRegistry& registry = HostDeviceRegistry::shared();
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    std::uint32_t service = registry.add(device);
    EXPECT_NE(service, 0u);
    EXPECT_EQ(HostDevice::createWithService(service), device);

    int made = 0;
    std::uint32_t factoryService = registry.addFactory([&made]() -> HostDevice::Ref {
        ++made;
        return SimulatedHostDevice::create();
    });
    EXPECT_NE(factoryService, service);
    HostDevice::Ref first = HostDevice::createWithService(factoryService);
    HostDevice::Ref second = HostDevice::createWithService(factoryService);
    EXPECT_NE(first, nullptr);
    EXPECT_NE(first, second);
    EXPECT_EQ(made, 2);

    registry.set(0xFFFFFF00u, device);
    EXPECT_EQ(HostDevice::createWithService(0xFFFFFF00u), device);
    registry.remove(0xFFFFFF00u);
    registry.remove(service);
    registry.remove(factoryService);
    EXPECT_EQ(HostDevice::createWithService(service), nullptr);
    EXPECT_EQ(HostDevice::createWithService(0xFFFFFF00u), nullptr);
    EXPECT_EQ(HostDevice::createWithService(0), nullptr);
}
