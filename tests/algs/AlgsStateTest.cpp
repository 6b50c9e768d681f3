// State keys and gesture counters, read and written through the pipeline's "Algs" domain.
#include "algs/FrameBuilder.h"
#include "platform/PropertyDictionary.h"

#include <gtest/gtest.h>

namespace VeltoTouch::Test {
namespace {

using VeltoHost::PropertyDictionary;
using VeltoHost::PropertyValue;

PropertyValue get(PipelineHarness& harness, const std::string& key) { return harness.pipeline.getState("Algs." + key); }

TEST(AlgsState, SettingsConvertTheirValues)
{
    PipelineHarness harness;
    EXPECT_EQ(get(harness, "EnableHoldSuppression"), PropertyValue::boolean(true));
    EXPECT_EQ(get(harness, "EnableTapSuppression"), PropertyValue::boolean(true));
    EXPECT_EQ(get(harness, "HoldTimeoutMilliseconds"), PropertyValue::uint32(500));
    EXPECT_EQ(get(harness, "ActivationThreshold"), PropertyValue::float32(200.0f));

    harness.setState("HoldTimeoutMilliseconds", PropertyValue::uint64(4294967796ull));
    EXPECT_EQ(get(harness, "HoldTimeoutMilliseconds"), PropertyValue::uint32(500));
    harness.setState("HoldTimeoutMilliseconds", PropertyValue::boolean(true));
    EXPECT_EQ(get(harness, "HoldTimeoutMilliseconds"), PropertyValue::uint32(1));
    harness.setState("ActivationThreshold", PropertyValue::float64(250.5));
    EXPECT_EQ(get(harness, "ActivationThreshold"), PropertyValue::float32(250.5f));
    harness.setState("ActivationThreshold", PropertyValue::string("300"));
    EXPECT_EQ(get(harness, "ActivationThreshold"), PropertyValue::float32(0.0f));
    harness.setState("EnableTapSuppression", PropertyValue::int32(0));
    EXPECT_EQ(get(harness, "EnableTapSuppression"), PropertyValue::boolean(false));
    harness.setState("EnableTapSuppression", PropertyValue::int32(2));
    EXPECT_EQ(get(harness, "EnableTapSuppression"), PropertyValue::boolean(true));
    harness.setState("EnableTapSuppression", PropertyValue::string("yes"));
    EXPECT_EQ(get(harness, "EnableTapSuppression"), PropertyValue::boolean(false));
    harness.setState("EnableHoldSuppression", PropertyValue::float64(0.5));
    EXPECT_EQ(get(harness, "EnableHoldSuppression"), PropertyValue::boolean(true));

    // Keys are exact.
    harness.setState("activationthreshold", PropertyValue::float32(1.0f));
    EXPECT_TRUE(get(harness, "activationthreshold").isNull());
    EXPECT_EQ(get(harness, "ActivationThreshold"), PropertyValue::float32(0.0f));
    EXPECT_TRUE(get(harness, "").isNull());
}

TEST(AlgsState, NormalizationFactorsByIndex)
{
    PipelineHarness harness;
    const std::string domain = "VirtualNormalizationFactors";
    EXPECT_EQ(get(harness, domain + ".7"), PropertyValue::float32(0.4651f));
    EXPECT_EQ(get(harness, domain + ".7abc"), PropertyValue::float32(0.4651f));
    EXPECT_EQ(get(harness, domain + ". 22"), PropertyValue::float32(0.6667f));
    EXPECT_EQ(get(harness, domain + ".x"), PropertyValue::float32(0.6667f));
    EXPECT_EQ(get(harness, domain + "."), PropertyValue::float32(0.6667f));
    EXPECT_TRUE(get(harness, domain + ".23").isNull());
    EXPECT_TRUE(get(harness, domain).isNull());

    harness.setState(domain + ".7", PropertyValue::float64(0.5));
    EXPECT_EQ(get(harness, domain + ".7"), PropertyValue::float32(0.5f));
    // The table changes; the group's virtual pixel keeps the gain it was built with.
    EXPECT_EQ(harness.algs().virtualPixels[7].gain, 0.4651f);
    harness.setState(domain + ".99", PropertyValue::float64(0.5));
    harness.setState(domain, PropertyValue::float64(0.5));
    EXPECT_EQ(get(harness, domain + ".0"), PropertyValue::float32(0.6667f));
}

std::uint64_t counter(const PropertyValue& stats, const char* outer, const char* inner)
{
    const PropertyValue value = stats.asDictionary().get(outer).asDictionary().get(inner);
    EXPECT_EQ(value.numberType(), PropertyValue::NumberType::UInt64) << inner;
    return value.toUInt64();
}

TEST(AlgsState, CountersOfTapsHoldsAndSuppressedHolds)
{
    PipelineHarness harness;
    const PropertyValue fresh = get(harness, "EventStats");
    ASSERT_TRUE(fresh.isDictionary());
    ASSERT_EQ(fresh.asDictionary().size(), 2u);
    for (const char* outer : {"Dispatched", "Rejected"}) {
        const PropertyDictionary& inner = fresh.asDictionary().get(outer).asDictionary();
        EXPECT_EQ(inner.size(), 12u);
        for (const auto& [key, value] : inner) EXPECT_EQ(value, PropertyValue::uint64(0)) << key;
    }
    EXPECT_EQ(fresh.asDictionary().get("Dispatched").asDictionary().begin()->first, "numTaps");
    EXPECT_TRUE(fresh.asDictionary().get("Dispatched").asDictionary().contains("numHolding2Suppressed"));
    EXPECT_TRUE(fresh.asDictionary().get("Rejected").asDictionary().contains("numSuppressed2Holding"));

    harness.idle(3);
    harness.press({{'G', 400}}, 1);
    EXPECT_EQ(counter(get(harness, "EventStats"), "Dispatched", "numTaps"), 0u);  // the first frame counts nothing
    harness.press({{'G', 400}}, 4);
    harness.release();
    PropertyValue stats = get(harness, "EventStats");
    EXPECT_EQ(counter(stats, "Dispatched", "numTaps"), 1u);
    EXPECT_EQ(counter(stats, "Dispatched", "numVolumeUp"), 1u);

    // A hold in Bottom lasting 10 frames after its start.
    harness.idle(100);
    harness.press({{'M', 300}}, 61);
    harness.release();
    stats = get(harness, "EventStats");
    EXPECT_EQ(counter(stats, "Dispatched", "numBeginHold"), 1u);
    EXPECT_EQ(counter(stats, "Dispatched", "numIncrementHold"), 9u);
    EXPECT_EQ(counter(stats, "Dispatched", "numVolumeDecrement"), 10u);
    EXPECT_EQ(counter(stats, "Dispatched", "numEndHold"), 1u);
    EXPECT_EQ(counter(stats, "Dispatched", "numOvriCall"), 0u);

    // A palm past the timeout in Middle: suppressed from its first long frame on.
    harness.idle(100);
    harness.press({{'A', 120}, {'B', 120}, {'C', 120}, {'D', 120}, {'E', 120}, {'F', 120}, {'K', 100}, {'J', 100},
                   {'L', 100}},
                  60);
    harness.release();
    stats = get(harness, "EventStats");
    EXPECT_EQ(counter(stats, "Rejected", "numRejectedBeginHold"), 1u);
    EXPECT_EQ(counter(stats, "Rejected", "numRejectedIncrementHold"), 8u);
    EXPECT_EQ(counter(stats, "Rejected", "numRejectedOvriCall"), 1u);
    EXPECT_EQ(counter(stats, "Rejected", "numRejectedOvriCallIncrement"), 8u);
    EXPECT_EQ(counter(stats, "Rejected", "numRejectedEndHold"), 1u);
    EXPECT_EQ(counter(stats, "Rejected", "numRejectedTap"), 0u);

    // A weak touch that is suppressed, then pressed into a hold.
    harness.idle(100);
    harness.press({{'K', 100}}, 60);
    harness.press({{'K', 300}}, 4);
    harness.release();
    stats = get(harness, "EventStats");
    EXPECT_EQ(counter(stats, "Rejected", "numSuppressed2Holding"), 1u);
    EXPECT_EQ(counter(stats, "Dispatched", "numBeginHold"), 2u);
    EXPECT_EQ(counter(stats, "Dispatched", "numOvriCall"), 1u);

    // A suppressed tap in Middle.
    harness.idle(100);
    harness.tap({{'K', 91}}, 400);
    stats = get(harness, "EventStats");
    EXPECT_EQ(counter(stats, "Rejected", "numRejectedTap"), 1u);
    EXPECT_EQ(counter(stats, "Rejected", "numRejectedPlayPause"), 1u);

    EXPECT_EQ(get(harness, "DebugInfo").asDictionary().get("EventStats"), stats);
    harness.setState("ResetEventStats", PropertyValue::null());
    EXPECT_EQ(get(harness, "EventStats"), fresh);
    EXPECT_TRUE(get(harness, "ResetEventStats").isNull());
}

}  // namespace
}  // namespace VeltoTouch::Test
