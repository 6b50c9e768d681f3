#include "platform/Trace.h"

#include <gtest/gtest.h>

#include <mutex>
#include <thread>
#include <vector>

using VeltoHost::Trace;
using VeltoHost::TracePoint;

TEST(Trace, ObserverSeesEveryPointFromEveryThread)
{
    std::mutex lock;
    std::vector<TracePoint> seen;
    Trace::setObserver([&](const TracePoint& point) {
        std::lock_guard guard(lock);
        seen.push_back(point);
    });

    Trace::emit(0x2B150180, 1, 2, 3, 4);
    std::thread other([] {
        for (int i = 0; i < 100; ++i) Trace::emit(0x2B150188, static_cast<std::uint64_t>(i));
    });
    other.join();
    auto previous = Trace::setObserver({});
    EXPECT_TRUE(static_cast<bool>(previous));
    Trace::emit(0x2B15018C);  // no observer: only the probe fires

    ASSERT_EQ(seen.size(), 101u);
    EXPECT_EQ(seen[0].code, 0x2B150180u);
    EXPECT_EQ(seen[0].arg4, 4u);
    EXPECT_EQ(seen[100].arg1, 99u);
}

TEST(Trace, ThrowingObserverDoesNotEscape)
{
    Trace::setObserver([](const TracePoint&) { throw std::runtime_error("observer failed"); });
    EXPECT_NO_THROW(Trace::emit(1));
    Trace::setObserver({});
}
