#include "records/Gesture.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

using VeltoTouch::Gesture;
using VeltoHost::HidEvent;
using VeltoHost::HidEventRef;
using Kind = Gesture::Kind;
using Region = Gesture::Region;

namespace {

HidEventRef digitizer(std::uint32_t eventMask, double y, std::uint16_t phase)
{
    HidEventRef event = HidEvent::createDigitizerEvent(0, 2, 0, 0, eventMask, 0, 0, y, 0, 0, 0, false, false, 0);
    event->setPhase(phase);
    return event;
}

}  // namespace

// What the recogniser creates is classified end to end wherever events are
// printed; these are events it does not create: a phase-less event without
// the tap bit, two phase bits at once, a y between regions or beyond them.
TEST(GestureTest, EventsNotFromThisRecogniserAreUnknownOrInNoRegion)
{
    struct Case {
        std::string name;
        HidEventRef event;
        Gesture expected;
    };
    const std::vector<Case> cases = {
        {"no phase, no tap bit", digitizer(0, 3, 0), {Kind::Unknown, Region::Top}},
        {"two phases", digitizer(2, 1, HidEvent::kPhaseBegan | HidEvent::kPhaseEnded), {Kind::Unknown, Region::Middle}},
        {"y between regions", digitizer(Gesture::kTapEventMask, 2.5, 0), {Kind::Tap, Region::None}},
        {"y beyond the top", digitizer(Gesture::kTapEventMask, 4, 0), {Kind::Tap, Region::None}},
        {"negative y", digitizer(Gesture::kTapEventMask, -1, 0), {Kind::Tap, Region::None}},
    };
    for (const Case& each : cases) {
        const Gesture gesture = Gesture::of(*each.event);
        EXPECT_EQ(gesture, each.expected) << each.name << ": " << Gesture::name(gesture.kind) << " "
                                          << Gesture::name(gesture.region);
    }
}

// Every gesture the recogniser can make reads back as itself.
TEST(GestureTest, EveryDigitizerGestureDecodesAsEncoded)
{
    for (Kind kind : {Kind::MayBegin, Kind::Tap, Kind::HoldStart, Kind::HoldChange, Kind::HoldEnd, Kind::Cancel}) {
        for (Region region : {Region::None, Region::Middle, Region::Bottom, Region::Top}) {
            const HidEventRef event = Gesture{kind, region}.event();
            ASSERT_TRUE(event) << Gesture::name(kind);
            EXPECT_EQ(Gesture::of(*event), (Gesture{kind, region})) << Gesture::name(kind) << " " << Gesture::name(region);
        }
    }
    EXPECT_FALSE((Gesture{Kind::DeviceReset, Region::None}.event()));
    EXPECT_FALSE((Gesture{Kind::Unknown, Region::None}.event()));
}
