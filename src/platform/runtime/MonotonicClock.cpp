#include "platform/runtime/MonotonicClock.h"

#include <atomic>
#include <cerrno>
#include <ctime>

namespace VeltoHost {

namespace {

// Both terms in one word, so that a reader never sees half of a change.
std::atomic<std::uint64_t>& packedTimebase()
{
    static std::atomic<std::uint64_t> packed{std::uint64_t{1} << 32 | 1u};
    return packed;
}

Timebase unpack(std::uint64_t packed)
{
    return Timebase{static_cast<std::uint32_t>(packed >> 32), static_cast<std::uint32_t>(packed)};
}

// floor(nanoseconds * denom / numer) without a wider type: the remainder is
// below numer, so its product with denom fits in 64 bits.
std::uint64_t ticksFromNanoseconds(std::uint64_t nanoseconds, Timebase timebase)
{
    const std::uint64_t whole = nanoseconds / timebase.numer;
    const std::uint64_t rest = nanoseconds % timebase.numer;
    return whole * timebase.denom + rest * timebase.denom / timebase.numer;
}

}  // namespace

std::uint64_t MonotonicClock::now() noexcept
{
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    const std::uint64_t nanoseconds =
        static_cast<std::uint64_t>(ts.tv_sec) * 1'000'000'000u + static_cast<std::uint64_t>(ts.tv_nsec);
    const Timebase tick = timebase();
    if (tick.numer == tick.denom) return nanoseconds;
    return ticksFromNanoseconds(nanoseconds, tick);
}

Timebase MonotonicClock::timebase() noexcept { return unpack(packedTimebase().load(std::memory_order_relaxed)); }

bool MonotonicClock::setTimebase(Timebase timebase) noexcept
{
    if (timebase.numer == 0 || timebase.denom == 0) return false;
    packedTimebase().store(std::uint64_t{timebase.numer} << 32 | timebase.denom, std::memory_order_relaxed);
    return true;
}

void MonotonicClock::sleepMicroseconds(std::uint64_t microseconds) noexcept
{
    timespec remaining{static_cast<time_t>(microseconds / 1'000'000u),
                       static_cast<long>((microseconds % 1'000'000u) * 1000u)};
    // A signal may cut the sleep short; go on sleeping for what is left.
    while (nanosleep(&remaining, &remaining) == -1 && errno == EINTR) {
    }
}

}  // namespace VeltoHost
