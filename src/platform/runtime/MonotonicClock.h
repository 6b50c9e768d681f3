#pragma once

#include <cstdint>

namespace VeltoHost {

// Ratio that converts the clock's ticks to nanoseconds:
// nanoseconds = ticks * numer / denom.
struct Timebase {
    std::uint32_t numer = 0;
    std::uint32_t denom = 0;
};

// The host's monotonic tick clock. On Linux its tick is the CLOCK_MONOTONIC
// nanosecond, so the timebase is 1/1; callers never assume that and always
// convert with the timebase.
class MonotonicClock {
public:
    static std::uint64_t now() noexcept;
    static Timebase timebase() noexcept;
    // Blocks the calling thread for at least `microseconds`.
    static void sleepMicroseconds(std::uint64_t microseconds) noexcept;

    // Gives the clock another tick for the rest of the process: afterwards a
    // tick lasts numer/denom nanoseconds, for now() and timebase() alike. With
    // the nanosecond tick a mix-up of ticks and nanoseconds goes unnoticed, so
    // test programs call this first thing, before anything has read the
    // timebase (the time conversions read it once per process). A timebase
    // with a zero term is refused (false) and changes nothing.
    static bool setTimebase(Timebase timebase) noexcept;
};

}  // namespace VeltoHost
