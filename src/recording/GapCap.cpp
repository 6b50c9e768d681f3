#include "recording/GapCap.h"

#include <cstdio>
#include <limits>
#include <utility>

namespace VeltoHost {

namespace {

// The largest double below 2^64, so that the conversion cannot overflow.
constexpr double kLongestMicroseconds = 18446744073709549568.0;

std::string secondsText(double seconds)
{
    char text[32];
    std::snprintf(text, sizeof text, "%g s", seconds);
    return text;
}

}  // namespace

std::uint64_t GapCap::wholeMicroseconds(double microseconds) noexcept
{
    if (!(microseconds > 0)) return 0;
    if (microseconds >= kLongestMicroseconds) return std::numeric_limits<std::uint64_t>::max();
    return static_cast<std::uint64_t>(microseconds);
}

GapCap::GapCap(double maxSeconds, Note note)
    : _maxMicroseconds(wholeMicroseconds(maxSeconds * 1e6)), _maxSeconds(maxSeconds), _note(std::move(note))
{
}

std::uint64_t GapCap::operator()(std::uint64_t microseconds)
{
    if (microseconds <= _maxMicroseconds) return microseconds;
    if (!_noted && _note) {
        _noted = true;
        _note("a wait of " + secondsText(static_cast<double>(microseconds) / 1e6) +
              " between two reports is shortened to " + secondsText(_maxSeconds) +
              ", as is every wait longer than that (--max-gap SECONDS sets the limit)");
    }
    return _maxMicroseconds;
}

}  // namespace VeltoHost
