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

TEST(ThreadTest, DetachedThreadRunsTheBodyUnderItsShortenedName)
{
    Semaphore done;
    std::string seenName;
    std::thread::id bodyThread;
    const bool started = Thread::startDetached(
        [&] {
            char name[32] = {};
            pthread_getname_np(pthread_self(), name, sizeof name);
            seenName = name;
            bodyThread = std::this_thread::get_id();
            done.signal();
        },
        "velto.input-report-thread");
    EXPECT_TRUE(started);
    ASSERT_TRUE(done.waitFor(10s));
    EXPECT_EQ(seenName, "velto.input-rep");
    EXPECT_NE(bodyThread, std::this_thread::get_id());
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

TEST(ThreadTest, SchedulingReportsTheErrorNumber)
{
    std::thread([] {
        // Without the privilege the call fails with EPERM; either way it
        // reports through its result, never by throwing.
        int result = Thread::setCurrentScheduling(SCHED_RR, 63);
        EXPECT_TRUE(result == 0 || result == EPERM) << result;
        EXPECT_EQ(Thread::setCurrentScheduling(SCHED_RR, 1000), EINVAL);
        EXPECT_EQ(Thread::setCurrentScheduling(SCHED_OTHER, 0), 0);
    }).join();
}
