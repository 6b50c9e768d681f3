#include "algs/Pixel.h"

#include <algorithm>

namespace VeltoTouch {

namespace {

constexpr std::uint32_t kTopPads = 0x03C0;     // G, H, I, J
constexpr std::uint32_t kBottomPads = 0x7800;  // L, M, N, O
constexpr std::uint32_t kMiddlePads = 0x043F;  // A..F and the centre pad K

}  // namespace

Pixel::Pixel(int index, float gain) : gain(gain), index(index) {}

void Pixel::updatePixelState(int raw, float activationThreshold)
{
    value = static_cast<std::int32_t>(static_cast<float>(raw) * gain);

    ratio = static_cast<float>(value) / activationThreshold;

    // A pad that is on stays on until it falls well below its peak; a pad that
    // is off must climb well above its lowest level since release. Together
    // these ride out slow baseline drift without chattering at the threshold.
    // The reactivation level is never below 1.0 (a floor quotient that is not
    // a number leaves it at 1.0), so an idle pad at or below 1.0 stays off
    // without the division: this runs for every pad and group every frame.
    if (active) {
        active = ratio > peakRatio * kHysteresis;
    } else {
        active = ratio > 1.0 && !(ratio <= floorRatio / static_cast<float>(kHysteresis));
    }
    if (active) {
        peakRatio = std::max(ratio, peakRatio);
        floorRatio = ratio;
        everActive = true;
    } else {
        peakRatio = ratio;
        floorRatio = std::min(ratio, floorRatio);
    }

    aboveNoise = value > kNoiseLevel;
    if (value > kNoiseLevel) {
        everAboveNoise = true;
        maxRatio = std::max(ratio, maxRatio);
    }
}

void Pixel::resetGlobalStats() noexcept
{
    everAboveNoise = false;
    everActive = false;
    maxRatio = 0.0f;
}

PixelRegion Pixel::regionOfPad(int padIndex) noexcept
{
    if (padIndex < 0 || padIndex >= 32) return PixelRegion::None;
    const std::uint32_t bit = 1u << padIndex;
    if (bit & kTopPads) return PixelRegion::Top;
    if (bit & kBottomPads) return PixelRegion::Bottom;
    if (bit & kMiddlePads) return PixelRegion::Middle;
    return PixelRegion::None;
}

}  // namespace VeltoTouch
