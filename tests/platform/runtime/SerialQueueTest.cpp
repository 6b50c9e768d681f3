#include "platform/runtime/Semaphore.h"
#include "platform/runtime/SerialQueue.h"

#include <gtest/gtest.h>

#include <atomic>
#include <vector>

using namespace VeltoHost;
using namespace std::chrono_literals;

TEST(SerialQueueTest, JobsQueuedByJobsRunAfterThem)
{
    SerialQueue::Ref queue = SerialQueue::create("test.nested");
    EXPECT_FALSE(queue->isCurrent());
    std::vector<int> order;
    queue->async([&] {
        EXPECT_TRUE(queue->isCurrent());
        order.push_back(1);
        queue->async([&] { order.push_back(3); });
        order.push_back(2);
    });
    queue->drain();  // covers the outer job, which queued the inner one
    queue->drain();  // covers the inner job
    EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
}

TEST(SerialQueueTest, DestructionRunsEverythingQueuedThenJoins)
{
    Semaphore gate;
    std::atomic<int> ran{0};
    std::atomic<int> ranFromJob{0};
    {
        SerialQueue::Ref queue = SerialQueue::create("test.destroy");
        SerialQueue* raw = queue.get();
        queue->async([&] { gate.wait(); });
        for (int i = 0; i < 10; ++i) queue->async([&] { ++ran; });
        // A job queued by a job during destruction still runs.
        queue->async([&, raw] { raw->async([&] { ++ranFromJob; }); });
        gate.signal();
    }
    EXPECT_EQ(ran.load(), 10);
    EXPECT_EQ(ranFromJob.load(), 1);
}

TEST(SerialQueueTest, LastReferenceDroppedByItsOwnJobDoesNotDeadlock)
{
    Semaphore finished;
    {
        SerialQueue::Ref queue = SerialQueue::create("test.self");
        // The job owns the only other reference, as a delivery job does.
        queue->async([held = queue]() mutable { held.reset(); });
        queue->async([&] { finished.signal(); });
    }
    // The worker finishes the remaining job on its own.
    EXPECT_TRUE(finished.waitFor(10s));
}
