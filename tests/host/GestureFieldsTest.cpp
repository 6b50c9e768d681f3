#include "host/GestureFields.h"

#include "algs/Algs.h"

#include <gtest/gtest.h>

using namespace VeltoHost;

namespace {

HidEventRef digitizer(std::uint16_t phase, std::uint32_t eventMask, double y, std::int64_t frame)
{
    HidEventRef event = HidEvent::createDigitizerEvent(1234, 0, 0, 0, eventMask, 0, 0, y, 0, 0, 0, false, false, 0);
    event->setPhase(phase);
    event->setIntegerValue(VeltoTouch::Algs::kFrameNumberField, frame);
    return event;
}

}  // namespace

TEST(GestureFieldsTest, DigitizerEventsAreNamedByPhaseAndRegion)
{
    struct Case {
        std::uint16_t phase;
        std::uint32_t eventMask;
        double y;
        const char* gesture;
        const char* region;
    };
    const Case cases[] = {
        {HidEvent::kPhaseMayBegin, 0, 1, "may-begin", "middle"},
        {0, 0x00020000, 3, "tap", "top"},
        {0, 0x00020001, 2, "tap", "bottom"},
        {0, 0x00000001, 2, "unknown", "bottom"},
        {HidEvent::kPhaseBegan, 0, 1, "hold-start", "middle"},
        {HidEvent::kPhaseChanged, 0, 2, "hold-change", "bottom"},
        {HidEvent::kPhaseEnded, 0, 3, "hold-end", "top"},
        {HidEvent::kPhaseCancelled, 0, 0, "cancel", "none"},
        {HidEvent::kPhaseBegan | HidEvent::kPhaseEnded, 0, 1, "unknown", "middle"},
        {HidEvent::kPhaseBegan, 0, 1.5, "hold-start", "none"},
    };
    for (const Case& c : cases) {
        const GestureFields fields = GestureFields::of(*digitizer(c.phase, c.eventMask, c.y, 77));
        EXPECT_EQ(fields.gesture, c.gesture) << "phase " << c.phase << " mask " << c.eventMask;
        EXPECT_EQ(fields.region, c.region) << "y " << c.y;
        EXPECT_FALSE(fields.isDeviceReset);
        EXPECT_EQ(fields.phase, c.phase);
        EXPECT_EQ(fields.eventMask, c.eventMask);
        EXPECT_EQ(fields.y, static_cast<std::int64_t>(c.y));
        EXPECT_EQ(fields.frame, 77);
        EXPECT_EQ(fields.timestamp, 1234u);
    }
}

TEST(GestureFieldsTest, AnEventWithoutAFrameNumberReadsFrameZero)
{
    HidEventRef event = HidEvent::createDigitizerEvent(5, 0, 0, 0, 0, 0, 0, 1, 0, 0, 0, false, false, 0);
    event->setPhase(HidEvent::kPhaseCancelled);
    EXPECT_EQ(GestureFields::of(*event).frame, 0);
}

TEST(GestureFieldsTest, AVendorEventIsADeviceReset)
{
    const std::uint8_t payload[] = {1, 2};
    const GestureFields fields =
        GestureFields::of(*HidEvent::createVendorDefinedEvent(99, 0xFF60, 2, 0, payload, sizeof payload, 0));
    EXPECT_TRUE(fields.isDeviceReset);
    EXPECT_EQ(fields.gesture, "device-reset");
    EXPECT_EQ(fields.usagePage, 0xFF60u);
    EXPECT_EQ(fields.usage, 2u);
    EXPECT_EQ(fields.timestamp, 99u);
    EXPECT_EQ(fields.region, "");
}
