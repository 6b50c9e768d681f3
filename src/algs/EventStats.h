#pragma once

#include "algs/HandStats.h"
#include "platform/values/PropertyValue.h"

#include <array>
#include <cstddef>
#include <cstdint>

namespace VeltoTouch {

// Running counts of dispatched and rejected gestures by kind and region:
// Top is volume up, Bottom volume down, Middle play/pause for taps and the
// voice-assistant call for holds. Hold counters count frames.
class EventStats {
public:
    EventStats() = default;

    void Reset() noexcept { *this = EventStats(); }
    // Adds the outcome of the frame that the hand statistics just described.
    void update(const HandStats& handStats);
    // {"Dispatched": {...}, "Rejected": {...}}, from the counter table.
    VeltoHost::PropertyValue statsDictionary() const;

    // Every counter, declared once, in the order of the dictionary.
    struct Counter {
        const char* group;
        const char* name;
        std::uint64_t EventStats::*member;
    };
    static constexpr std::size_t kCounterCount = 24;
    static const std::array<Counter, kCounterCount>& counters() noexcept;

    std::uint64_t numTaps = 0;
    std::uint64_t numBeginHold = 0;
    std::uint64_t numIncrementHold = 0;
    std::uint64_t numEndHold = 0;
    std::uint64_t numVolumeUp = 0;
    std::uint64_t numVolumeDown = 0;
    std::uint64_t numPlayPause = 0;
    std::uint64_t numOvriCall = 0;
    std::uint64_t numOvriCallIncrement = 0;
    std::uint64_t numVolumeIncrement = 0;
    std::uint64_t numVolumeDecrement = 0;
    std::uint64_t numRejectedTap = 0;
    std::uint64_t numRejectedBeginHold = 0;
    std::uint64_t numRejectedIncrementHold = 0;
    std::uint64_t numRejectedEndHold = 0;
    std::uint64_t numRejectedVolumeUp = 0;
    std::uint64_t numRejectedVolumeDown = 0;
    std::uint64_t numRejectedPlayPause = 0;
    std::uint64_t numRejectedOvriCall = 0;
    std::uint64_t numRejectedOvriCallIncrement = 0;
    std::uint64_t numRejectedVolumeIncrement = 0;
    std::uint64_t numRejectedVolumeDecrement = 0;
    std::uint64_t numSuppressed2Holding = 0;
    std::uint64_t numHolding2Suppressed = 0;

private:
    void updateSuppressedHold(const HandStats& handStats);
    void updateHold(const HandStats& handStats);
};

}  // namespace VeltoTouch
