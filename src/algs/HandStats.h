#pragma once

#include "algs/Pixel.h"
#include "algs/PixelRegion.h"
#include "algs/SVM.h"
#include "algs/VirtualPixel.h"

#include <array>
#include <cstdint>
#include <vector>

namespace VeltoTouch {

// The state of the hand, condensed from one frame of pads and virtual pixels:
// touch and noise edges with their times, the region of the touch, the
// accumulated touch score, the tap-rejection features, and the tap and hold
// flags with their suppression. The recogniser turns the flags into events.
class HandStats {
public:
    // e squared: with it the score left from the previous touch shrinks to
    // 84% one millisecond after it ended, 57% after two, and is gone after three.
    static constexpr float kScoreDecayBase = 7.389056f;
    static constexpr float kActivationThresholdDefault = 200.0f;
    static constexpr std::uint32_t kHoldTimeoutDefaultMs = 500;
    static constexpr float kTouchScoreLimitDefault = 100.0f;
    static constexpr float kRegionSwitchFactorDefault = 1.3f;

    HandStats() = default;

    void SetDecayParameters() noexcept { scoreDecayBase = kScoreDecayBase; }
    // Forgets the touch that just ended.
    void Reset() noexcept;

    void updateHandState(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels,
                         unsigned int frameTime);
    void updateTouchScore(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels,
                          unsigned int frameTime);
    void decayTouchScore(unsigned int frameTime);

    static float fuzzify(float x, float x0, float x1, float y0, float y1);
    static float fuzzifyAndClip(float x, float x0, float x1, float y0, float y1);
    float updateTimeBiasFactor(unsigned int frameTime) const;

    void updateRegionMax(const std::vector<Pixel>& pixels);
    PixelRegion updateActiveRegion(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels,
                                   unsigned int frameTime);
    PixelRegion changeActiveRegion(const std::vector<Pixel>& pixels, int strongestIndex);
    void updateTapRejection(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels);

    SVM svm;
    float touchScore = 0.0f;
    float scoreDecayBase = kScoreDecayBase;
    float activationThreshold = kActivationThresholdDefault;
    std::uint32_t holdTimeoutMs = kHoldTimeoutDefaultMs;
    float holdScoreThreshold = 0.0f;
    float touchScoreLimit = kTouchScoreLimitDefault;
    float peakSignal = 0.0f;
    bool enableHoldSuppression = true;
    bool enableTapSuppression = true;
    bool touching = false;
    bool wasTouching = false;
    bool aboveNoise = false;
    bool wasAboveNoise = false;
    bool holding = false;
    bool wasHolding = false;
    bool holdSuppressed = false;
    bool wasHoldSuppressed = false;
    bool tapCandidate = false;
    bool tapAccepted = false;
    bool tapRejected = false;
    bool holdTimeExceeded = false;
    bool wasHoldTimeExceeded = false;
    std::uint32_t touchStartTime = 0;
    std::uint32_t touchEndTime = 0;
    std::uint32_t aboveNoiseStartTime = 0;
    std::uint32_t aboveNoiseEndTime = 0;
    std::uint32_t lastEventTime = 0;
    float signalPerDuration = 0.0f;
    float signalPerTouchDuration = 0.0f;
    float timeDurationRatio = 0.0f;
    std::int32_t nonActivePixels = 0;
    float tapSVMScore = 0.0f;
    PixelRegion activeRegion = PixelRegion::None;
    PixelRegion previousActiveRegion = PixelRegion::None;
    PixelRegion lastEventRegion = PixelRegion::None;
    float maxActiveRatio = 0.0f;
    std::int32_t maxActiveIndex = 0;
    std::array<float, 4> regionMax{};
    float regionSwitchFactor = kRegionSwitchFactorDefault;

private:
    struct FrameScan {
        bool anyActive = false;
        bool anyAboveNoise = false;
        int strongestIndex = 0;
    };
    FrameScan scanFrame(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels);
    void scanElement(const Pixel& element, FrameScan& scan, float& strongestRatio);
    void updateEdgeTimes(std::uint32_t frameTime);
    void updateHoldDecision(std::uint32_t frameTime);
    void updateTapDecision();
    float& regionMaxOf(PixelRegion region) { return regionMax[static_cast<std::size_t>(region)]; }
};

}  // namespace VeltoTouch
