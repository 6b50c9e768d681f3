#include "platform/CaptureLogSink.h"
#include "platform/Semaphore.h"
#include "platform/Thread.h"

#include <gtest/gtest.h>

#include <pthread.h>
#include <sched.h>

#include <cerrno>
#include <functional>
#include <string>
#include <thread>
#include <vector>

using namespace VeltoHost;
using namespace std::chrono_literals;

TEST(SemaphoreTest, CountsSignalsAcrossThreads)
{
    Semaphore::Ref semaphore = Semaphore::create(2);
    semaphore->wait();
    EXPECT_TRUE(semaphore->waitFor(0ns));
    EXPECT_FALSE(semaphore->waitFor(0ns));  // both initial counts used up

    std::thread signaller([semaphore] {
        for (int i = 0; i < 3; ++i) semaphore->signal();
    });
    for (int i = 0; i < 3; ++i) semaphore->wait();
    signaller.join();
    EXPECT_FALSE(semaphore->waitFor(0ns));
}

TEST(ThreadTest, InjectedStartFailuresReportFalseAndLogWithoutRunningTheBody)
{
    CaptureLogSink::Scope capture(LogLevel::Error);
    Semaphore ran;
    const std::function<void()> body = [&ran] { ran.signal(); };

    Thread::failNextStarts(2);
    EXPECT_FALSE(Thread::startDetached(body, "first"));
    EXPECT_FALSE(Thread::startDetached(body, "second"));
    EXPECT_TRUE(Thread::startDetached(body, "third")) << "only the next two starts fail";
    ASSERT_TRUE(ran.waitFor(10s));
    EXPECT_FALSE(ran.waitFor(100ms)) << "the failed starts never ran their bodies";
    EXPECT_EQ(capture.sink().messages("Thread"),
              (std::vector<std::string>{"cannot start thread first: failure injected by failNextStarts",
                                        "cannot start thread second: failure injected by failNextStarts"}));

    Thread::failNextStarts(3);
    Thread::failNextStarts(0);
    EXPECT_TRUE(Thread::startDetached(body)) << "0 ends a failure run";
    ASSERT_TRUE(ran.waitFor(10s));
}
