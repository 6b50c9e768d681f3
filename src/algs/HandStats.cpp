#include "algs/HandStats.h"

#include <algorithm>
#include <cmath>
#include <numeric>
#include <utility>

namespace VeltoTouch {

namespace {

// Time bias: within 0.3 s of the last tap or hold end a runner-up in that
// gesture's region needs only 0.65 of the leader's strength (the user is
// probably repeating the gesture); from 1 s on it needs all of it.
constexpr float kTimeBiasStartSeconds = 0.3f;
constexpr float kTimeBiasEndSeconds = 1.0f;
constexpr float kTimeBiasMin = 0.65f;
constexpr float kTimeBiasMax = 1.0f;

// Region switch while holding: the more the current region has just weakened
// (a finger lifting as it slides), the larger the jump the new region needs.
constexpr float kSwitchDropStart = 0.2f;
constexpr float kSwitchDropEnd = 0.5f;
constexpr float kSwitchFactorMin = HandStats::kRegionSwitchFactorDefault;
constexpr float kSwitchFactorMax = 5.0f;

// Share of the centre pad K that the "KLM" or "IJK" group must reach for a
// touch on K to count as the bottom or top region.
constexpr float kCentreFactor = 0.7f;
constexpr int kPadI = 8;
constexpr int kPadK = 10;
constexpr int kPadM = 12;
constexpr std::size_t kGroupIJK = 18;
constexpr std::size_t kGroupKLM = 19;

// Tap-rejection features and their linear score.
constexpr float kSignalPerDurationOffset = 0.51f;
constexpr float kSignalPerTouchDurationOffset = 0.65f;
constexpr float kTimeDurationRatioOffset = 0.25f;
constexpr float kTimeDurationRatioWeight = 2.7205f;
constexpr float kSignalPerDurationWeight = 0.2772f;
constexpr float kNonActivePixelsWeight = 0.1886f;
constexpr float kTapScoreOffset = 2.4116f;
// More elements than this above noise without ever activating is a palm or a
// wet surface, not a tap.
constexpr int kNonActiveElementLimit = 21;

// The first two pads of `pixels` stably sorted by falling maxRatio, found in
// one pass: this runs on every frame of a touch, where a copy and a sort
// cost more than the rest of the decision. A ratio that is not a number
// (possible only with a threshold that is not one) makes no strict order;
// then the sort itself decides, on the pads' positions.
std::pair<const Pixel*, const Pixel*> strongestTwo(const std::vector<Pixel>& pixels)
{
    const auto byRatio = [](const Pixel& a, const Pixel& b) { return a.maxRatio > b.maxRatio; };
    if (std::none_of(pixels.begin(), pixels.end(), [](const Pixel& pad) { return std::isnan(pad.maxRatio); })) {
        std::size_t top = 0;
        for (std::size_t i = 1; i < pixels.size(); ++i) {
            if (byRatio(pixels[i], pixels[top])) top = i;
        }
        std::size_t second = top == 0 ? 1 : 0;
        for (std::size_t i = second + 1; i < pixels.size(); ++i) {
            if (i != top && byRatio(pixels[i], pixels[second])) second = i;
        }
        if (second < pixels.size()) return {&pixels[top], &pixels[second]};
    }
    std::vector<std::size_t> order(pixels.size());
    std::iota(order.begin(), order.end(), std::size_t{0});
    std::stable_sort(order.begin(), order.end(),
                     [&](std::size_t a, std::size_t b) { return byRatio(pixels[a], pixels[b]); });
    return {&pixels.at(order.at(0)), &pixels.at(order.at(1))};
}

}  // namespace

void HandStats::Reset() noexcept
{
    touchScore = 0.0f;
    peakSignal = 0.0f;
    maxActiveRatio = 0.0f;
    maxActiveIndex = 0;
}

void HandStats::updateHandState(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels,
                                unsigned int frameTime)
{
    const FrameScan scan = scanFrame(pixels, virtualPixels);
    wasTouching = touching;
    touching = scan.anyActive;
    wasAboveNoise = aboveNoise;
    aboveNoise = scan.anyAboveNoise;

    // While holding, the region only moves when another region clearly takes
    // over; otherwise it is chosen afresh from the touch so far.
    if (touching) {
        activeRegion = holding ? changeActiveRegion(pixels, scan.strongestIndex)
                               : updateActiveRegion(pixels, virtualPixels, frameTime);
    }

    updateEdgeTimes(frameTime);
    updateTouchScore(pixels, virtualPixels, frameTime);
    updateTapRejection(pixels, virtualPixels);

    wasHolding = holding;
    wasHoldTimeExceeded = holdTimeExceeded;
    wasHoldSuppressed = holdSuppressed;
    updateHoldDecision(frameTime);
    updateTapDecision();

    if (tapAccepted || (wasHolding && !holding)) {
        lastEventTime = frameTime;
        lastEventRegion = activeRegion;
    }
}

HandStats::FrameScan HandStats::scanFrame(const std::vector<Pixel>& pixels,
                                          const std::vector<VirtualPixel>& virtualPixels)
{
    FrameScan scan;
    float strongestRatio = 0.0f;
    for (const Pixel& pixel : pixels) scanElement(pixel, scan, strongestRatio);
    for (const VirtualPixel& pixel : virtualPixels) scanElement(pixel, scan, strongestRatio);
    return scan;
}

void HandStats::scanElement(const Pixel& element, FrameScan& scan, float& strongestRatio)
{
    // Negative ratios (and one that is not a number) count as 0.
    const float ratio = element.ratio > 0.0f ? element.ratio : 0.0f;
    if (element.active) {
        if (ratio > maxActiveRatio) {
            maxActiveRatio = ratio;
            maxActiveIndex = element.index;
        }
        scan.anyActive = true;
    }
    if (element.aboveNoise) scan.anyAboveNoise = true;
    // Strictly greater: the first element holding the frame's maximum wins.
    if (ratio > strongestRatio) {
        strongestRatio = ratio;
        scan.strongestIndex = element.index;
    }
}

void HandStats::updateEdgeTimes(std::uint32_t frameTime)
{
    if (aboveNoise && !wasAboveNoise) aboveNoiseStartTime = frameTime;
    if (!aboveNoise && wasAboveNoise) aboveNoiseEndTime = frameTime;
    if (touching && !wasTouching) touchStartTime = frameTime;
    if (!touching && wasTouching) touchEndTime = frameTime;
}

void HandStats::updateTouchScore(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels,
                                 unsigned int frameTime)
{
    svm.updateSVMScore(pixels, virtualPixels, activationThreshold, frameTime);
    if (aboveNoise && !wasAboveNoise && touchScore != 0.0f) decayTouchScore(frameTime);
    touchScore += svm.score;
    if (touchScore > touchScoreLimit) {
        touchScore = touchScoreLimit;
    } else if (touchScore < -touchScoreLimit) {
        touchScore = -touchScoreLimit;
    }
}

void HandStats::decayTouchScore(unsigned int frameTime)
{
    // A contact that comes straight back is the same touch continuing, so its
    // score carries over; a few milliseconds of quiet end it.
    const std::uint32_t gap = frameTime - aboveNoiseEndTime - 1u;
    const double factor = 1.0 - std::exp(static_cast<double>(gap)) / (scoreDecayBase - 1.0);
    const double magnitude = std::max(factor * std::fabs(static_cast<double>(touchScore)), 0.0);
    touchScore = static_cast<float>(std::copysign(magnitude, static_cast<double>(touchScore)));
}

float HandStats::fuzzify(float x, float x0, float x1, float y0, float y1)
{
    const float u = (x - x0) / (x1 - x0);
    return std::fma(u, y1, (1.0f - u) * y0);
}

float HandStats::fuzzifyAndClip(float x, float x0, float x1, float y0, float y1)
{
    if (x <= x0) return y0;
    if (x >= x1) return y1;
    return fuzzify(x, x0, x1, y0, y1);
}

float HandStats::updateTimeBiasFactor(unsigned int frameTime) const
{
    const std::uint32_t sinceLastEvent = frameTime - lastEventTime;
    const auto seconds = static_cast<float>(static_cast<double>(sinceLastEvent) * 0.001);
    return fuzzifyAndClip(seconds, kTimeBiasStartSeconds, kTimeBiasEndSeconds, kTimeBiasMin, kTimeBiasMax);
}

void HandStats::updateRegionMax(const std::vector<Pixel>& pixels)
{
    regionMax.fill(0.0f);
    for (const Pixel& pad : pixels) {
        const PixelRegion region = pad.getPixelRegion();
        const float excess = static_cast<float>(pad.value) - static_cast<float>(Pixel::kNoiseLevel);
        if (excess > 0.0f && region != PixelRegion::None) regionMaxOf(region) = std::max(regionMaxOf(region), excess);
    }
}

PixelRegion HandStats::updateActiveRegion(const std::vector<Pixel>& pixels,
                                          const std::vector<VirtualPixel>& virtualPixels, unsigned int frameTime)
{
    PixelRegion candidate = Pixel::regionOfPad(maxActiveIndex);

    // The two strongest pads of the touch so far; equal pads keep pad order.
    const auto [topPad, secondPad] = strongestTwo(pixels);
    const Pixel& top = *topPad;
    const Pixel& second = *secondPad;

    const float bias = updateTimeBiasFactor(frameTime);
    const float noise = static_cast<float>(Pixel::kNoiseLevel) / activationThreshold;

    // A repeated gesture that lands between two regions goes back to the
    // region of the previous one when the runner-up there is strong enough.
    if (candidate != lastEventRegion && second.maxRatio > noise && top.getPixelRegion() == candidate) {
        if (second.maxRatio > top.maxRatio * bias && second.getPixelRegion() == lastEventRegion) {
            candidate = lastEventRegion;
        }
    }

    // The centre pad K borders top and bottom: a touch centred on K that leans
    // far enough towards M or I belongs to that region instead.
    if (maxActiveIndex == kPadK && second.maxRatio > noise && top.index == kPadK) {
        const float padKMaxRatio = pixels.at(kPadK).maxRatio;
        if (second.index == kPadM) {
            const float factor = lastEventRegion == PixelRegion::Bottom ? std::min(bias, kCentreFactor) : kCentreFactor;
            if (virtualPixels.at(kGroupKLM).maxRatio > factor * padKMaxRatio) candidate = PixelRegion::Bottom;
        } else if (second.index == kPadI) {
            const float factor = lastEventRegion == PixelRegion::Top ? std::min(bias, kCentreFactor) : kCentreFactor;
            if (virtualPixels.at(kGroupIJK).maxRatio > factor * padKMaxRatio) candidate = PixelRegion::Top;
        }
    }

    updateRegionMax(pixels);
    return candidate;
}

PixelRegion HandStats::changeActiveRegion(const std::vector<Pixel>& pixels, int strongestIndex)
{
    previousActiveRegion = activeRegion;
    const PixelRegion current = activeRegion;
    const PixelRegion next = Pixel::regionOfPad(strongestIndex);
    if (next == current) return current;
    if (current == PixelRegion::None || next == PixelRegion::None) return next;

    // Compare the new region's share of the current one before and after this frame.
    const float before = regionMaxOf(current);
    const float previousShare = before > 0.0f ? regionMaxOf(next) / before : 0.0f;
    updateRegionMax(pixels);
    const float now = regionMaxOf(current);
    if (now <= 0.0f) return next;

    float factor = kSwitchFactorMin;
    if (before > 0.0f) {
        const float drop = std::max(before - now, 0.0f) / before;
        factor = fuzzifyAndClip(drop, kSwitchDropStart, kSwitchDropEnd, kSwitchFactorMin, kSwitchFactorMax);
    }
    regionSwitchFactor = factor;

    const float share = regionMaxOf(next) / regionMaxOf(current);
    return share < previousShare * factor ? current : next;
}

void HandStats::updateTapRejection(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels)
{
    peakSignal = maxActiveRatio * activationThreshold;

    const std::uint32_t touchDuration = touchEndTime - touchStartTime;
    const std::uint32_t sinceSignalStart =
        std::min(touchEndTime - aboveNoiseStartTime, touchEndTime - lastEventTime);

    signalPerDuration = 0.0f;
    signalPerTouchDuration = 0.0f;
    timeDurationRatio = 0.0f;
    nonActivePixels = 0;
    if (sinceSignalStart != 0) {
        signalPerDuration = peakSignal / static_cast<float>(sinceSignalStart) - kSignalPerDurationOffset;
        timeDurationRatio =
            static_cast<float>(touchDuration) / static_cast<float>(sinceSignalStart) - kTimeDurationRatioOffset;
    }
    if (touchDuration != 0) {
        signalPerTouchDuration = peakSignal / static_cast<float>(touchDuration) - kSignalPerTouchDurationOffset;
    }

    int neverActive = 0;
    for (const Pixel& pixel : pixels) neverActive += pixel.everAboveNoise && !pixel.everActive;
    for (const VirtualPixel& pixel : virtualPixels) neverActive += pixel.everAboveNoise && !pixel.everActive;
    nonActivePixels = kNonActiveElementLimit - neverActive;

    float score = timeDurationRatio * kTimeDurationRatioWeight;
    score = std::fma(signalPerDuration, kSignalPerDurationWeight, score);
    score = std::fma(static_cast<float>(nonActivePixels), kNonActivePixelsWeight, score);
    tapSVMScore = score - kTapScoreOffset;

    tapRejected = signalPerTouchDuration <= 0.0f || signalPerDuration < 0.0f || neverActive > kNonActiveElementLimit ||
                  timeDurationRatio < 0.0f || tapSVMScore < 0.0f;
}

void HandStats::updateHoldDecision(std::uint32_t frameTime)
{
    const bool longTouch = frameTime - touchStartTime > holdTimeoutMs;
    if (!enableHoldSuppression) {
        // Without suppression every long touch is a hold; the suppression
        // flags keep whatever they last held.
        holding = touching && longTouch;
        return;
    }
    const bool scoreTooLow = touchScore < holdScoreThreshold;
    auto set = [this](bool hold, bool suppressed, bool exceeded) {
        holding = hold;
        holdSuppressed = suppressed;
        holdTimeExceeded = exceeded;
    };
    if (!touching) {
        set(false, false, false);
    } else if (!longTouch) {
        set(false, false, false);
    } else if (!scoreTooLow) {
        set(true, false, true);
    } else if (wasHolding) {
        set(true, false, true);  // a started hold lasts for the rest of the touch
    } else {
        set(false, true, true);  // may still become a hold once the score recovers
    }
}

void HandStats::updateTapDecision()
{
    const bool releaseFrame = !touching && wasTouching;
    auto set = [this](bool candidate, bool accepted) {
        tapCandidate = candidate;
        tapAccepted = accepted;
    };
    if (enableTapSuppression) {
        if (!releaseFrame) {
            set(false, false);
            tapRejected = false;
        } else if (wasHoldTimeExceeded) {
            set(false, false);
            tapRejected = false;
        } else {
            set(true, !tapRejected);
        }
    } else {
        if (releaseFrame && !wasHoldTimeExceeded) {
            set(true, true);
        } else {
            set(false, false);
        }
    }
}

}  // namespace VeltoTouch
