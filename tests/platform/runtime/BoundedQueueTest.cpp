#include "platform/runtime/BoundedQueue.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <optional>
#include <thread>
#include <vector>

using namespace VeltoHost;

namespace {

// Until `done`; the test program's own time limit catches a queue that never gets there.
template <typename Done>
void waitFor(Done done)
{
    while (!done()) std::this_thread::yield();
}

}  // namespace

TEST(BoundedQueueTest, ItemsArriveInPushOrderThroughASmallQueue)
{
    BoundedQueue<int> queue(2);
    constexpr int kItems = 10'000;
    std::thread producer([&] {
        for (int i = 0; i < kItems; ++i) EXPECT_TRUE(queue.push(i));
        queue.close();
    });
    std::vector<int> taken;
    while (std::optional<int> item = queue.pop()) {
        EXPECT_LE(queue.size(), queue.capacity());
        taken.push_back(*item);
    }
    producer.join();
    ASSERT_EQ(taken.size(), static_cast<std::size_t>(kItems));
    for (int i = 0; i < kItems; ++i) ASSERT_EQ(taken[static_cast<std::size_t>(i)], i);
}

TEST(BoundedQueueTest, AProducerWaitsForRoomAndACloseEndsTheWaitWithNothingTaken)
{
    BoundedQueue<std::unique_ptr<int>> queue(3);
    std::vector<bool> pushed;
    std::atomic<bool> finished{false};
    std::thread producer([&] {
        for (int i = 0; i < 4; ++i) pushed.push_back(queue.push(std::make_unique<int>(i)));
        finished = true;
    });
    // Three fit; the fourth waits, and the consumer that gives up wakes it.
    waitFor([&] { return queue.size() == 3; });
    EXPECT_FALSE(finished.load());
    queue.close();
    producer.join();
    EXPECT_EQ(pushed, (std::vector<bool>{true, true, true, false}));
    EXPECT_EQ(queue.size(), 3u);
    EXPECT_TRUE(queue.closed());
    EXPECT_FALSE(queue.push(std::make_unique<int>(9)));
    // What was queued before the close is still handed out, in order.
    for (int i = 0; i < 3; ++i) {
        std::optional<std::unique_ptr<int>> item = queue.pop();
        ASSERT_TRUE(item && *item);
        EXPECT_EQ(**item, i);
    }
    EXPECT_FALSE(queue.pop().has_value());
}

TEST(BoundedQueueTest, RoomMadeByAPopLetsTheWaitingProducerOn)
{
    BoundedQueue<int> queue(1);
    ASSERT_TRUE(queue.push(1));
    std::atomic<bool> second{false};
    std::thread producer([&] { second = queue.push(2); });
    EXPECT_EQ(queue.pop(), 1);
    EXPECT_EQ(queue.pop(), 2);
    producer.join();
    EXPECT_TRUE(second.load());
}

TEST(BoundedQueueTest, ACloseWakesAConsumerWaitingOnAnEmptyQueue)
{
    BoundedQueue<int> queue(4);
    std::atomic<bool> started{false};
    std::optional<int> taken = 7;
    std::thread consumer([&] {
        started = true;
        taken = queue.pop();
    });
    waitFor([&] { return started.load(); });
    queue.close();
    consumer.join();
    EXPECT_FALSE(taken.has_value());
}
