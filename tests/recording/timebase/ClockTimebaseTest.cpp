#include "platform/runtime/MonotonicClock.h"
#include "records/TickConversion.h"

#include <gtest/gtest.h>

#include <ctime>
#include <cstdint>

using VeltoHost::MonotonicClock;

namespace {

std::uint64_t monotonicNanoseconds()
{
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<std::uint64_t>(ts.tv_sec) * 1'000'000'000u + static_cast<std::uint64_t>(ts.tv_nsec);
}

}  // namespace

TEST(ClockTimebase, TheClockAndTheConversionsAgreeOnTheTick)
{
    // A reading of the clock, converted to nanoseconds, lies between two
    // nanosecond readings taken around it (less one tick of truncation).
    const std::uint64_t before = monotonicNanoseconds();
    const std::uint64_t ticks = MonotonicClock::now();
    const std::uint64_t after = monotonicNanoseconds();
    const std::uint64_t nanoseconds = VeltoTouch::Util::nanosecondsFromMachTime(ticks);
    EXPECT_GE(nanoseconds + 42, before);
    EXPECT_LE(nanoseconds, after);
    EXPECT_LT(ticks, before) << "ticks are longer than nanoseconds here";
}

TEST(ClockTimebase, ATimebaseWithAZeroTermIsRefused)
{
    EXPECT_FALSE(MonotonicClock::setTimebase({0, 3}));
    EXPECT_FALSE(MonotonicClock::setTimebase({125, 0}));
    EXPECT_EQ(MonotonicClock::timebase().numer, 125u);
    EXPECT_EQ(MonotonicClock::timebase().denom, 3u);
}
