#pragma once

#include "algs/EventStats.h"
#include "algs/PixelRegion.h"
#include "algs/TouchPhase.h"
#include "algs/VirtualImage.h"
#include "platform/plugin/HidEvent.h"
#include "records/InputReport.h"

#include <array>
#include <cstdint>

namespace VeltoTouch {

// Everything the recogniser worked out in one frame, as plain numbers, for
// callers that want to look at a frame without parsing the debug dumps.
struct DecisionRecord {
    static constexpr std::size_t kPadCount = InputReport::kPadCount;
    static constexpr std::size_t kVirtualCount = VirtualImage::kGroupCount;

    std::uint32_t frameNumber = 0;
    std::uint32_t timeMs = 0;

    // Per pad A..O: the reading given to the recogniser, the pad's scaled
    // level and whether it is active (bit i for pad i).
    std::array<std::int16_t, kPadCount> readings{};
    std::array<std::int32_t, kPadCount> levels{};
    std::uint16_t activePads = 0;
    // The same for the virtual pixels, in group order.
    std::array<std::int32_t, kVirtualCount> virtualLevels{};
    std::uint32_t activeVirtualPixels = 0;

    float svmScore = 0.0f;
    float touchScore = 0.0f;
    PixelRegion activeRegion = PixelRegion::None;
    // The strongest excess over noise per region, indexed by PixelRegion.
    std::array<float, 4> regionScores{};

    // Tap-rejection features, the linear tap score and its verdict.
    float signalPerDuration = 0.0f;
    float signalPerTouchDuration = 0.0f;
    float timeDurationRatio = 0.0f;
    std::int32_t nonActivePixels = 0;
    float tapScore = 0.0f;
    bool tapRejected = false;

    // The state machine's flags after this frame.
    bool touching = false;
    bool wasTouching = false;
    bool aboveNoise = false;
    bool holding = false;
    bool wasHolding = false;
    bool holdSuppressed = false;
    bool tapCandidate = false;
    bool tapAccepted = false;

    // The word of the per-frame description and the milliseconds it prints
    // (time since the touch began, or the touch's duration at a release).
    TouchPhase phase = TouchPhase::Idle;
    std::int32_t phaseMs = 0;

    // The event emitted in this frame, if any, and the event counters before
    // and after it: the counters this frame moved are those that differ.
    VeltoHost::HidEventRef event;
    EventStats countersBefore;
    EventStats counters;
};

}  // namespace VeltoTouch
