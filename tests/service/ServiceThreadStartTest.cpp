// When the input-report thread cannot be started, scheduling must come back
// with an error line instead of waiting for a thread that never runs, and
// everything after it (unschedule, a later scheduling, stop) must go on as
// for a service that was never scheduled. That stop and the last release do
// not wait either is the thread's own guarantee (InputReportThreadTest).

#include "platform/devices/SimulatedHostDevice.h"
#include "platform/log/CaptureLogSink.h"
#include "platform/log/Log.h"
#include "platform/runtime/Semaphore.h"
#include "platform/runtime/Thread.h"
#include "platform/values/PropertyDictionary.h"
#include "service/ServiceHarness.h"

#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <string>
#include <thread>

using namespace VeltoHost;
using namespace VeltoTouch::Test;

namespace {

constexpr const char* kThreadNotStarted = "input report thread could not be started; no reports will be received";

// Runs `call` on a thread of its own and says whether it came back. A call
// that hangs is left waiting; whatever it uses must then be leaked by the
// caller, not destroyed under it.
bool returns(std::function<void()> call)
{
    auto done = Semaphore::create(0);
    std::thread([call = std::move(call), done] {
        call();
        done->signal();
    }).detach();
    return done->waitFor(std::chrono::seconds(20));
}

// Ends the injected failures whatever way a test ends.
struct InjectedStartFailures {
    explicit InjectedStartFailures(unsigned count) { Thread::failNextStarts(count); }
    ~InjectedStartFailures() { Thread::failNextStarts(0); }
};

}  // namespace

TEST(ServiceThreadStart, SchedulingFailsSoftlyAndTheServiceCanBeScheduledLater)
{
    CaptureLogSink::Scope capture(LogLevel::Debug);
    // Leaked on purpose should scheduling hang: the hung call still uses it.
    auto* harness = new ServiceHarness;
    harness->start();
    harness->setCallback(harness->collector);

    {
        InjectedStartFailures failures(1);
        ASSERT_TRUE(returns([harness] { harness->schedule(); })) << "scheduling waits for a thread that never ran";
    }
    // Said where the operator looks: an error in the log.
    bool told = false;
    for (const LogRecord& record : capture.sink().records()) {
        told = told || (record.level == LogLevel::Error && record.message == kThreadNotStarted);
    }
    EXPECT_TRUE(told);

    // Nobody receives reports: the device is neither scheduled nor called.
    EXPECT_FALSE(harness->device()->isScheduled());
    EXPECT_FALSE(harness->device()->hasCallback());
    harness->push(ReportBytes::deviceReset());
    EXPECT_EQ(harness->device()->pendingReportCount(), 1u);

    ASSERT_TRUE(returns([harness] { harness->unschedule(); })) << "unscheduling waits for a thread that never ran";

    // The next scheduling starts the thread, which takes the waiting report.
    harness->schedule();
    ASSERT_TRUE(harness->collector.waitFor(1));
    harness->tearDown();
    EXPECT_EQ(harness->collector.events().size(), 1u);
    delete harness;
}
