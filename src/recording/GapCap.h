#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace VeltoHost {

// Caps the wait for one gap between input reports when a recording is played
// at its own pace. A recording may hold a clock jump (a time stamp of 10^18 ns
// after one of 10^9, or a corrupt 1e300) that, played as recorded, would stall
// the run for years with nothing printed. The pipeline is given the recorded
// time line whatever the wait, so shortening a wait changes when results
// appear, never what they are.
//
// The first shortened wait is told once through `note`, with the sizes, so
// that a user who sees playback hurry knows why.
class GapCap {
public:
    static constexpr double kDefaultMaxSeconds = 1.0;

    using Note = std::function<void(const std::string& text)>;

    // `maxSeconds` is finite and not negative (the command line checks it);
    // 0 plays without waiting.
    explicit GapCap(double maxSeconds = kDefaultMaxSeconds, Note note = {});

    // How long to wait instead of `microseconds`.
    std::uint64_t operator()(std::uint64_t microseconds);

    std::uint64_t maxMicroseconds() const noexcept { return _maxMicroseconds; }

    // A wait computed in floating point, as a whole number of microseconds:
    // truncated, 0 for what is not positive, saturated at the largest count.
    static std::uint64_t wholeMicroseconds(double microseconds) noexcept;

private:
    std::uint64_t _maxMicroseconds;
    double _maxSeconds;
    Note _note;
    bool _noted = false;
};

}  // namespace VeltoHost
