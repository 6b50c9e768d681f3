// The numbers of the recogniser that are easy to get wrong by one step or one
// rounding, where the examples do not reach. The pads' hysteresis, the
// groups' sums and strongest members, the SVM, the region switch while
// holding and the tap features show in every frame of the examples' dumps
// (scripts/check-dump) or in their events.
#include "algs/Algs.h"
#include "algs/HandStats.h"
#include "algs/Pixel.h"
#include "algs/VirtualImage.h"
#include "algs/VirtualPixel.h"

#include <gtest/gtest.h>

namespace VeltoTouch {
namespace {

// The noise level is an edge the examples never land on.
TEST(Pixel, TheNoiseLevelIsNotAboveNoise)
{
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

}  // namespace
}  // namespace VeltoTouch
