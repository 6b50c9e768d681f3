// Frames in, events out, through the real pipeline.
#include "algs/PipelineHarness.h"

#include <gtest/gtest.h>

namespace VeltoTouch::Test {
namespace {

using Events = std::vector<std::string>;

// A fingertip on the centre pad: clearly a finger to the classifier.
const Contact kFingerOnK = {{'K', 300}};
// A faint contact on K: barely past the activation level.
const Contact kFaintOnK = {{'K', 91}};
// A weak contact on K whose profile the classifier scores slightly negative.
const Contact kWeakOnK = {{'K', 100}};
// A flat, spread contact across the middle ring: the classifier's picture of
// a palm rather than a fingertip.
const Contact kPalmOnMiddle = {{'A', 120}, {'B', 120}, {'C', 120}, {'D', 120}, {'E', 120},
                               {'F', 120}, {'K', 100}, {'J', 100}, {'L', 100}};
const Contact kFingerOnM = {{'M', 300}};

TEST(AlgsEndToEnd, SlowFaintTouchIsASuppressedTapUnlessSuppressionIsOff)
{
    PipelineHarness harness;
    harness.idle(3);
    // 400 ms at barely over the activation level: too little signal per
    // millisecond of touch to be a deliberate tap.
    harness.tap(kFaintOnK, 400);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #4", "cancel #44"}));
    EXPECT_EQ(harness.counter("Rejected", "numRejectedTap"), 1u);
    EXPECT_EQ(harness.counter("Rejected", "numRejectedPlayPause"), 1u);

    // The next touch begins with a may-begin again; a quick one is a tap.
    harness.idle(200);
    harness.tap(kFaintOnK, 50);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #245", "tap Middle #250"}));

    harness.setState("EnableTapSuppression", VeltoHost::PropertyValue::boolean(false));
    harness.idle(200);
    harness.tap(kFaintOnK, 400);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #451", "tap Middle #491"}));
}

TEST(AlgsEndToEnd, HoldWithTooLowAScoreIsSuppressedUntilTheScoreRecovers)
{
    PipelineHarness harness;
    harness.idle(3);
    harness.press(kWeakOnK, 60);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #4"}));
    EXPECT_TRUE(harness.algs().handStats.holdSuppressed);
    EXPECT_LT(harness.algs().handStats.touchScore, 0.0f);
    // Pressing firmly makes the profile a finger's; the hold starts in the
    // first frame whose accumulated score reaches the threshold.
    harness.press(kFingerOnK, 3);
    EXPECT_TRUE(harness.takeEvents().empty());
    harness.press(kFingerOnK, 1);
    EXPECT_EQ(harness.takeEvents(), (Events{"hold-start Middle #67"}));
    EXPECT_GE(harness.algs().handStats.touchScore, 0.0f);
    harness.release();
    EXPECT_EQ(harness.takeEvents(), (Events{"hold-end Middle #68"}));
    EXPECT_EQ(harness.counter("Rejected", "numSuppressed2Holding"), 1u);
    EXPECT_EQ(harness.counter("Dispatched", "numOvriCall"), 1u);

    // A palm held past the timeout never becomes a hold and ends in a cancel.
    harness.setState("ResetEventStats", VeltoHost::PropertyValue::null());
    harness.idle(100);
    harness.press(kPalmOnMiddle, 60);
    harness.release();
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #169", "cancel #229"}));
    // Counted as rejected from its first long frame on.
    EXPECT_EQ(harness.counter("Rejected", "numRejectedBeginHold"), 1u);
    EXPECT_EQ(harness.counter("Rejected", "numRejectedIncrementHold"), 8u);
    EXPECT_EQ(harness.counter("Rejected", "numRejectedOvriCall"), 1u);
    EXPECT_EQ(harness.counter("Rejected", "numRejectedOvriCallIncrement"), 8u);
    EXPECT_EQ(harness.counter("Rejected", "numRejectedEndHold"), 1u);

    // Without hold suppression the palm holds like anything else.
    harness.setState("EnableHoldSuppression", VeltoHost::PropertyValue::boolean(false));
    harness.idle(100);
    harness.press(kPalmOnMiddle, 60);
    harness.release();
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #330", "hold-start Middle #381", "hold-end Middle #390"}));
}

TEST(AlgsEndToEnd, TouchSoonAfterATapLeansTowardsTheTapsRegion)
{
    // E leads, M is a strong runner-up (ratio 1.54 against E's 1.92).
    const Contact betweenMiddleAndBottom = {{'E', 200}, {'M', 200}};

    PipelineHarness harness;
    harness.idle(3);
    harness.tap(kFingerOnM, 50);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Bottom #4", "tap Bottom #9"}));
    // 200 ms after the tap the runner-up only needs 0.65 of the leader.
    harness.idle(19);
    harness.tap(betweenMiddleAndBottom, 50);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Bottom #29", "tap Bottom #34"}));
    // 1.5 s after the last tap the leader's region wins.
    harness.idle(150);
    harness.tap(betweenMiddleAndBottom, 50);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #185", "tap Middle #190"}));
}

}  // namespace
}  // namespace VeltoTouch::Test
