// The numbers of the recogniser that are easy to get wrong by one step or one
// rounding, where the examples do not reach. The groups' sums above noise,
// their strongest members and the SVM's gate, ranks and bias show in every
// frame of the examples' dumps (scripts/check-dump).
#include "algs/Algs.h"
#include "algs/HandStats.h"
#include "algs/Pixel.h"
#include "algs/VirtualImage.h"
#include "algs/VirtualPixel.h"

#include <gtest/gtest.h>

#include <vector>

namespace VeltoTouch {
namespace {

TEST(Pixel, ActivationHysteresisAndNoise)
{
    Pixel pad(0, 1.0f);
    pad.updatePixelState(200, 200.0f);  // ratio exactly 1.0: not above the threshold
    EXPECT_FALSE(pad.active);
    pad.updatePixelState(600, 200.0f);  // peak 3.0
    EXPECT_TRUE(pad.active);
    pad.updatePixelState(380, 200.0f);  // 1.9 > 0.6 * 3.0
    EXPECT_TRUE(pad.active);
    pad.updatePixelState(360, 200.0f);  // 1.8 is not above 1.8
    EXPECT_FALSE(pad.active);
    pad.updatePixelState(180, 200.0f);  // floor 0.9: re-activation needs more than 1.5
    pad.updatePixelState(296, 200.0f);  // 1.48
    EXPECT_FALSE(pad.active);
    pad.updatePixelState(302, 200.0f);
    EXPECT_TRUE(pad.active);
    EXPECT_TRUE(pad.everActive);

    Pixel fine(0, 1.0f);
    fine.updatePixelState(10001, 10000.0f);
    EXPECT_TRUE(fine.active);

    Pixel scaled(0, 1.9219f);
    scaled.updatePixelState(100, 200.0f);
    EXPECT_EQ(scaled.value, 192);
    scaled.updatePixelState(-100, 200.0f);
    EXPECT_EQ(scaled.value, -192);  // toward zero, not down

    Pixel noise(0, 1.0f);
    noise.updatePixelState(75, 200.0f);
    EXPECT_FALSE(noise.aboveNoise);
    EXPECT_FALSE(noise.everAboveNoise);
    EXPECT_EQ(noise.maxRatio, 0.0f);
    noise.updatePixelState(76, 200.0f);
    EXPECT_TRUE(noise.aboveNoise);
    EXPECT_EQ(noise.maxRatio, 0.38f);
    noise.resetGlobalStats();
    EXPECT_FALSE(noise.everAboveNoise);
    EXPECT_EQ(noise.maxRatio, 0.0f);
    EXPECT_EQ(noise.floorRatio, 0.0f);  // the activation state carries over
}

std::vector<Pixel> padsWithValues(std::initializer_list<std::pair<char, int>> values)
{
    std::vector<Pixel> pads;
    for (int i = 0; i < 15; ++i) pads.emplace_back(i, 1.0f);
    for (const auto& [letter, value] : values) pads[static_cast<std::size_t>(letter - 'A')].value = value;
    return pads;
}

TEST(VirtualImage, GroupSumReachesItsPixelAsASigned16BitReading)
{
    Algs algs;
    Algs::Readings readings{};
    readings[0] = readings[1] = readings[4] = 20000;  // A, B, E: values 38438 + 37666 + 38326
    VeltoHost::HidEventList events;
    algs.processTouchFrame(readings, 1, 1000, events);
    EXPECT_EQ(algs.virtualImage.values[0], 114430);
    // 114430 keeps its low 16 bits: -16642, times the "ABE" gain 0.6667.
    EXPECT_EQ(algs.virtualPixels[0].value, -11095);
    EXPECT_EQ(algs.virtualPixels[0].index, 0);
}

std::vector<VirtualPixel> quietGroups()
{
    return std::vector<VirtualPixel>(VirtualImage::kGroupCount, VirtualPixel("X", 1.0f));
}

TEST(HandStats, ScoreDecayAcrossAQuietGap)
{
    HandStats hand;
    hand.aboveNoiseEndTime = 1000;
    auto decayedAt = [&](float score, unsigned int time) {
        hand.touchScore = score;
        hand.decayTouchScore(time);
        return hand.touchScore;
    };
    EXPECT_FLOAT_EQ(decayedAt(10.0f, 1001), 8.434824f);
    EXPECT_FLOAT_EQ(decayedAt(-10.0f, 1001), -8.434824f);
    EXPECT_FLOAT_EQ(decayedAt(10.0f, 1002), 5.745409f);
    EXPECT_EQ(decayedAt(10.0f, 1003), 0.0f);
    EXPECT_EQ(decayedAt(10.0f, 1000), 0.0f);  // the gap wraps to 2^32 - 1
}

TEST(HandStats, TimeBiasAndFuzzify)
{
    HandStats hand;
    hand.lastEventTime = 5000;
    EXPECT_EQ(hand.updateTimeBiasFactor(5200), 0.65f);
    EXPECT_EQ(hand.updateTimeBiasFactor(6500), 1.0f);
    EXPECT_FLOAT_EQ(hand.updateTimeBiasFactor(5650), 0.825f);
    EXPECT_EQ(hand.updateTimeBiasFactor(4000), 1.0f);  // wrapped: a long time ago
    EXPECT_FLOAT_EQ(HandStats::fuzzify(2.0f, 0.0f, 1.0f, 1.0f, 3.0f), 5.0f);  // no clipping
}

TEST(HandStats, RegionSwitchWhileHoldingNeedsAGrowingShare)
{
    HandStats hand;
    auto switchTo = [&](int topValue, int middleValue) {
        hand.activeRegion = PixelRegion::Top;
        hand.regionMax = {0.0f, 50.0f, 0.0f, 100.0f};
        return hand.changeActiveRegion(padsWithValues({{'G', topValue}, {'K', middleValue}}), 10);
    };
    // Top weakens by 0.1: factor 1.3, so Middle needs 0.5 * 1.3 of Top.
    EXPECT_EQ(switchTo(165, 135), PixelRegion::Middle);  // 60 / 90
    EXPECT_EQ(hand.regionSwitchFactor, 1.3f);
    EXPECT_EQ(hand.previousActiveRegion, PixelRegion::Top);
    EXPECT_EQ(switchTo(165, 130), PixelRegion::Top);  // 55 / 90
    // Top weakens by 0.4: factor 1.3 + 2/3 of 3.7.
    EXPECT_EQ(switchTo(135, 135), PixelRegion::Top);  // share 1.0 < 0.5 * 3.77
    EXPECT_FLOAT_EQ(hand.regionSwitchFactor, 3.7666667f);
    EXPECT_EQ(switchTo(75, 135), PixelRegion::Middle);  // Top is gone

    HandStats fresh;
    fresh.regionMax = {0.0f, 0.0f, 0.0f, 0.0f};
    fresh.updateRegionMax(padsWithValues({{'G', 300}, {'H', 200}, {'M', 75}}));
    EXPECT_EQ(fresh.regionMax[3], 225.0f);
    EXPECT_EQ(fresh.regionMax[2], 0.0f);
}

TEST(HandStats, TapRejectionFeatures)
{
    HandStats hand;
    hand.maxActiveRatio = 2.0f;  // peak signal 400
    hand.aboveNoiseStartTime = 1000;
    hand.touchStartTime = 1020;
    hand.touchEndTime = 1100;
    auto pads = padsWithValues({});
    for (std::size_t i = 0; i < 3; ++i) pads[i].everAboveNoise = true;
    pads[3].everAboveNoise = pads[3].everActive = true;
    hand.updateTapRejection(pads, quietGroups());
    EXPECT_EQ(hand.peakSignal, 400.0f);
    EXPECT_FLOAT_EQ(hand.signalPerDuration, 3.49f);
    EXPECT_FLOAT_EQ(hand.timeDurationRatio, 0.55f);
    EXPECT_FLOAT_EQ(hand.signalPerTouchDuration, 4.35f);
    EXPECT_EQ(hand.nonActivePixels, 18);
    EXPECT_FLOAT_EQ(hand.tapSVMScore, 3.4469028f);
    EXPECT_FALSE(hand.tapRejected);

    // The time since the last event counts when it is shorter.
    hand.lastEventTime = 1060;
    hand.updateTapRejection(pads, quietGroups());
    EXPECT_FLOAT_EQ(hand.timeDurationRatio, 1.75f);

    // Too many elements above noise that never activated.
    hand.lastEventTime = 0;
    auto groups = quietGroups();
    for (std::size_t i = 0; i < 19; ++i) groups[i].everAboveNoise = true;
    hand.updateTapRejection(pads, groups);
    EXPECT_EQ(hand.nonActivePixels, -1);
    EXPECT_TRUE(hand.tapRejected);

    // Start and end on the same frame time.
    hand.touchStartTime = hand.touchEndTime;
    hand.updateTapRejection(pads, quietGroups());
    EXPECT_EQ(hand.signalPerTouchDuration, 0.0f);
    EXPECT_TRUE(hand.tapRejected);
}

}  // namespace
}  // namespace VeltoTouch
