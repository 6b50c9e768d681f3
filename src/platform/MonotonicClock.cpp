#include "platform/MonotonicClock.h"

#include <cerrno>
#include <ctime>

namespace VeltoHost {

std::uint64_t MonotonicClock::now() noexcept
{
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<std::uint64_t>(ts.tv_sec) * 1'000'000'000u + static_cast<std::uint64_t>(ts.tv_nsec);
}

Timebase MonotonicClock::timebase() noexcept { return Timebase{1, 1}; }

void MonotonicClock::sleepMicroseconds(std::uint64_t microseconds) noexcept
{
    timespec remaining{static_cast<time_t>(microseconds / 1'000'000u),
                       static_cast<long>((microseconds % 1'000'000u) * 1000u)};
    // A signal may cut the sleep short; go on sleeping for what is left.
    while (nanosleep(&remaining, &remaining) == -1 && errno == EINTR) {
    }
}

}  // namespace VeltoHost
