#pragma once

#include "algs/PixelRegion.h"

#include <cstdint>

namespace VeltoTouch {

// One pad (or, through VirtualPixel, one group of pads) with its adaptive
// activation state. A plain value: the hand statistics receive copies of the
// whole list every frame.
class Pixel {
public:
    // Readings at or below this level (in scaled `value` units) are sensor noise.
    static constexpr int kNoiseLevel = 75;
    // An active pad releases below this share of its peak, and a released pad
    // must rise by its inverse above the lowest ratio since release.
    static constexpr double kHysteresis = 0.6;

    Pixel(int index, float gain);

    // One frame of the activation state machine for this pad's reading.
    void updatePixelState(int raw, float activationThreshold);
    PixelRegion getPixelRegion() const noexcept { return regionOfPad(index); }
    // Forgets what happened during the touch that just ended; the activation
    // state itself carries over.
    void resetGlobalStats() noexcept;

    // The surface region a pad index belongs to (None outside 0..14).
    static PixelRegion regionOfPad(int padIndex) noexcept;

    std::int32_t value = 0;
    float gain = 0.0f;
    float ratio = 0.0f;
    float peakRatio = 0.0f;
    float floorRatio = 0.0f;
    bool active = false;
    bool aboveNoise = false;
    bool everAboveNoise = false;
    bool everActive = false;
    float maxRatio = 0.0f;
    std::int32_t index = 0;
};

}  // namespace VeltoTouch
