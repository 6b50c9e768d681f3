// Scheduling and unscheduling: the thread's start and exit handshake, many
// times over, the callback taken at scheduling, and deliveries that are still
// queued when the thread goes.

#include "platform/devices/SimulatedHostDevice.h"
#include "platform/runtime/Semaphore.h"
#include "platform/values/PropertyDictionary.h"
#include "service/ServiceHarness.h"

#include <gtest/gtest.h>

using namespace VeltoHost;
using namespace VeltoTouch::Test;

TEST(ServiceScheduling, RepeatedCyclesDeliverWithTheCallbackOfTheirScheduling)
{
    ServiceHarness harness;
    harness.start();

    // Unscheduling what never ran returns at once.
    harness.unschedule();
    // Scheduled before any callback was set: the report is processed, its
    // event dropped.
    harness.schedule();
    harness.push(ReportBytes::deviceReset());
    ASSERT_TRUE(harness.waitForResetCount(1));
    harness.unschedule();

    constexpr int kCycles = 60;
    int refcons[kCycles];
    for (int cycle = 0; cycle < kCycles; ++cycle) {
        harness.setCallback(harness.collector, &refcons[cycle]);
        harness.schedule();
        // A callback set while the thread runs waits for the next scheduling.
        if (cycle + 1 < kCycles) harness.setCallback(harness.collector, &refcons[cycle + 1]);
        harness.push(ReportBytes::deviceReset(static_cast<std::uint64_t>(cycle)));
        ASSERT_TRUE(harness.collector.waitFor(static_cast<std::size_t>(cycle) + 1)) << cycle;
        harness.unschedule();
        EXPECT_FALSE(harness.device()->isScheduled()) << cycle;
        EXPECT_FALSE(harness.device()->hasCallback()) << cycle;
    }
    harness.queue()->drain();
    std::vector<DeliveredEvent> events = harness.collector.events();
    ASSERT_EQ(events.size(), static_cast<std::size_t>(kCycles));
    for (int cycle = 0; cycle < kCycles; ++cycle) {
        EXPECT_EQ(events[static_cast<std::size_t>(cycle)].refcon, &refcons[cycle]) << cycle;
        EXPECT_EQ(events[static_cast<std::size_t>(cycle)].sender, harness.serviceRef());
    }

    // After the last cycle nothing listens: a report is not processed.
    harness.push(ReportBytes::deviceReset());
    PropertyValue info = harness.copyProperty("Pipeline.DebugInfo");
    EXPECT_EQ(info.asDictionary().get("ResetCount"), PropertyValue::uint32(kCycles + 1));
    harness.service().close(harness.serviceRef(), 0);
    EXPECT_EQ(harness.plugin().Stop(harness.pluginRef()), kVeltoSuccess);
}

TEST(ServiceScheduling, DeliveriesQueuedBeforeUnschedulingStillArrive)
{
    ServiceHarness harness;
    harness.bringUp();

    // Hold the host's queue so that the batches stay queued. A report is
    // handled whole under the lock that the counter's read takes, so once the
    // count shows both, both batches are queued.
    Semaphore::Ref gate = Semaphore::create(0);
    harness.queue()->async([gate] { gate->wait(); });
    harness.push(ReportBytes::deviceReset());
    harness.push(ReportBytes::deviceReset());
    ASSERT_TRUE(harness.waitForResetCount(2));
    harness.unschedule();
    EXPECT_EQ(harness.collector.events().size(), 0u);
    gate->signal();
    ASSERT_TRUE(harness.collector.waitFor(2));
    harness.queue()->drain();
    EXPECT_EQ(harness.collector.events().size(), 2u);
    harness.service().close(harness.serviceRef(), 0);
    harness.plugin().Stop(harness.pluginRef());
}

TEST(ServiceScheduling, ALastReleaseWhileScheduledEndsTheThreadFirst)
{
    std::shared_ptr<SimulatedHostDevice> device;
    SerialQueue::Ref queue;
    {
        ServiceHarness harness;
        harness.bringUp();
        harness.push(ReportBytes::deviceReset());
        ASSERT_TRUE(harness.collector.waitFor(1));
        device = harness.device();
        queue = harness.queue();
        // No unscheduling: the host's last release comes at once.
    }
    EXPECT_FALSE(device->isScheduled());
    EXPECT_FALSE(device->hasCallback());
    // Reports pushed after the last release are kept by the device, not processed.
    device->pushInputReport(ReportBytes::deviceReset());
    EXPECT_EQ(device->pendingReportCount(), 1u);
    queue->drain();
}
