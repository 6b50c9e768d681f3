#include "records/TickConversion.h"

#include "records/TimebaseOnce.h"

namespace VeltoTouch::Util {

namespace {

TimebaseOnce& processTimebase()
{
    static TimebaseOnce timebase(&VeltoHost::MonotonicClock::timebase);
    return timebase;
}

}  // namespace

std::uint64_t machTimeFromNanoseconds(std::uint64_t nanoseconds, VeltoHost::Timebase timebase) noexcept
{
    if (timebase.numer == 0) return 0;
    return nanoseconds * timebase.denom / timebase.numer;
}

std::uint64_t nanosecondsFromMachTime(std::uint64_t ticks, VeltoHost::Timebase timebase) noexcept
{
    if (timebase.denom == 0) return 0;
    return ticks * timebase.numer / timebase.denom;
}

std::uint64_t machTimeFromNanoseconds(std::uint64_t nanoseconds)
{
    return machTimeFromNanoseconds(nanoseconds, processTimebase().get());
}

std::uint64_t nanosecondsFromMachTime(std::uint64_t ticks)
{
    return nanosecondsFromMachTime(ticks, processTimebase().get());
}

}  // namespace VeltoTouch::Util
