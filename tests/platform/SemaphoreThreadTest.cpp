#include "platform/Semaphore.h"
#include "platform/Thread.h"

#include <gtest/gtest.h>

#include <pthread.h>
#include <sched.h>

#include <cerrno>
#include <string>
#include <thread>

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
    Thread::startDetached(
        [&] {
            char name[32] = {};
            pthread_getname_np(pthread_self(), name, sizeof name);
            seenName = name;
            bodyThread = std::this_thread::get_id();
            done.signal();
        },
        "velto.input-report-thread");
    ASSERT_TRUE(done.waitFor(10s));
    EXPECT_EQ(seenName, "velto.input-rep");
    EXPECT_NE(bodyThread, std::this_thread::get_id());
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
