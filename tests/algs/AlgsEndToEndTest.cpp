// Frames in, events out, through the real pipeline.
#include "algs/FrameBuilder.h"

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
const Contact kFingerOnG = {{'G', 400}};
const Contact kFingerOnM = {{'M', 300}};

TEST(AlgsEndToEnd, ShortTouchIsATapCarryingItsRegionAndFrameNumbers)
{
    PipelineHarness harness;
    harness.idle(3);                  // frames 1..3
    harness.tap(kFingerOnK, 100);     // frames 4..13, release at 14
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #4", "tap Middle #14"}));
    EXPECT_EQ(harness.algs().lastEventPhase, 0);
    harness.idle(5);
    EXPECT_TRUE(harness.takeEvents().empty());

    harness.tap(kFingerOnG, 50);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Top #20", "tap Top #25"}));
    // Every event leaves the pipeline stamped with the pipeline's time, not the device's.
    harness.tap(kFingerOnM, 50);
    ASSERT_EQ(harness.events.size(), 2u);
    EXPECT_EQ(harness.events[1]->timeStamp(), 31u);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Bottom #26", "tap Bottom #31"}));
}

TEST(AlgsEndToEnd, SlowFaintTouchIsASuppressedTapUnlessSuppressionIsOff)
{
    PipelineHarness harness;
    harness.idle(3);
    // 400 ms at barely over the activation level: too little signal per
    // millisecond of touch to be a deliberate tap.
    harness.tap(kFaintOnK, 400);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #4", "cancel #44"}));
    EXPECT_EQ(harness.algs().lastEventPhase, 0x0008);

    // The next touch begins with a may-begin again; a quick one is a tap.
    harness.idle(200);
    harness.tap(kFaintOnK, 50);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #245", "tap Middle #250"}));

    harness.setState("EnableTapSuppression", VeltoHost::PropertyValue::boolean(false));
    harness.idle(200);
    harness.tap(kFaintOnK, 400);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #451", "tap Middle #491"}));
}

TEST(AlgsEndToEnd, LongTouchIsAHoldStartingAfterTheTimeout)
{
    PipelineHarness harness;
    harness.idle(3);
    // Touch starts at frame 4 (time 1030); 500 ms later is not yet long, 510 ms is.
    harness.press(kFingerOnK, 51);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #4"}));
    harness.press(kFingerOnK, 1);
    EXPECT_EQ(harness.takeEvents(), (Events{"hold-start Middle #55"}));
    EXPECT_EQ(harness.algs().handStats.touchScore, 100.0f);  // clipped at the limit
    harness.press(kFingerOnK, 20);
    EXPECT_TRUE(harness.takeEvents().empty());
    harness.release();
    EXPECT_EQ(harness.takeEvents(), (Events{"hold-end Middle #76"}));
    // The release reset the touch's statistics.
    EXPECT_EQ(harness.algs().handStats.touchScore, 0.0f);
    EXPECT_EQ(harness.algs().handStats.maxActiveRatio, 0.0f);

    harness.setState("HoldTimeoutMilliseconds", VeltoHost::PropertyValue::uint32(100));
    harness.idle(10);
    harness.press(kFingerOnK, 12);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #87", "hold-start Middle #98"}));
}

TEST(AlgsEndToEnd, HoldFollowsTheFingerToAnotherRegionAndBack)
{
    PipelineHarness harness;
    harness.idle(3);
    harness.press(kFingerOnK, 60);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #4", "hold-start Middle #55"}));
    // The finger slides up: K empties while G fills.
    harness.press(kFingerOnG, 5);
    EXPECT_EQ(harness.takeEvents(), (Events{"hold-change Top #64"}));
    harness.press(kFingerOnK, 5);
    EXPECT_EQ(harness.takeEvents(), (Events{"hold-change Middle #69"}));
    harness.release();
    EXPECT_EQ(harness.takeEvents(), (Events{"hold-end Middle #74"}));
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

    // A palm held past the timeout never becomes a hold and ends in a cancel.
    harness.idle(100);
    harness.press(kPalmOnMiddle, 60);
    harness.release();
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #169", "cancel #229"}));

    // Without hold suppression the palm holds like anything else.
    harness.setState("EnableHoldSuppression", VeltoHost::PropertyValue::boolean(false));
    harness.idle(100);
    harness.press(kPalmOnMiddle, 60);
    harness.release();
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #330", "hold-start Middle #381", "hold-end Middle #390"}));
}

TEST(AlgsEndToEnd, DeviceResetEndsAHoldWithFrameNumberZero)
{
    PipelineHarness harness;
    harness.idle(3);
    harness.deviceReset();
    EXPECT_EQ(harness.takeEvents(), (Events{"vendor"}));

    harness.press(kFingerOnK, 60);
    EXPECT_EQ(harness.takeEvents(), (Events{"may-begin Middle #4", "hold-start Middle #55"}));
    harness.deviceReset();
    ASSERT_EQ(harness.events.size(), 2u);
    EXPECT_EQ(harness.events[0]->timeStamp(), harness.events[1]->timeStamp());
    EXPECT_EQ(harness.takeEvents(), (Events{"hold-end Middle #0", "vendor"}));
    EXPECT_EQ(harness.algs().handStats.maxActiveRatio, 0.0f);
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
