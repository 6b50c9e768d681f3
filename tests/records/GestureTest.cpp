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
// printed (its phase, event mask and y in the examples' expected files), and
// each such event encodes as its gesture does (fuzz_pipeline); these are
// events it does not create: a phase-less event without
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
