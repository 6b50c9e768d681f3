#pragma once

#include "platform/runtime/MonotonicClock.h"

#include <cstdint>

namespace VeltoTouch::Util {

// Tick <-> nanosecond conversions with the clock's timebase, read once per
// process. The product wraps modulo 2^64 and the quotient truncates; a
// timebase with a zero divisor gives 0.
std::uint64_t machTimeFromNanoseconds(std::uint64_t nanoseconds);
std::uint64_t nanosecondsFromMachTime(std::uint64_t ticks);
// The same arithmetic with an explicit timebase.
std::uint64_t machTimeFromNanoseconds(std::uint64_t nanoseconds, VeltoHost::Timebase timebase) noexcept;
std::uint64_t nanosecondsFromMachTime(std::uint64_t ticks, VeltoHost::Timebase timebase) noexcept;

}  // namespace VeltoTouch::Util
