#include "host/Gesture.h"

#include "algs/Algs.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

using VeltoHost::Gesture;
using VeltoHost::HidEvent;
using VeltoHost::HidEventRef;
using VeltoTouch::Algs;
using VeltoTouch::PixelRegion;
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

TEST(GestureTest, ClassifiesTheEventsTheRecogniserAndThePipelineCreate)
{
    struct Case {
        std::string name;
        HidEventRef event;
        Gesture expected;
    };
    const std::vector<Case> cases = {
        {"may-begin", Algs::createMayBeginEvent(PixelRegion::Top), {Kind::MayBegin, Region::Top}},
        {"tap", Algs::createTapEvent(PixelRegion::Middle), {Kind::Tap, Region::Middle}},
        {"hold start", Algs::createHoldStartEvent(PixelRegion::Bottom), {Kind::HoldStart, Region::Bottom}},
        {"hold change", Algs::createHoldChangeEvent(PixelRegion::Top), {Kind::HoldChange, Region::Top}},
        {"hold end", Algs::createHoldEndEvent(PixelRegion::Middle), {Kind::HoldEnd, Region::Middle}},
        {"hold start in no region", Algs::createHoldStartEvent(PixelRegion::None), {Kind::HoldStart, Region::None}},
        {"cancel", Algs::createCancelEvent(), {Kind::Cancel, Region::None}},
        {"device reset", HidEvent::createVendorDefinedEvent(0, 0xFF60, 2, 0, nullptr, 0, 0),
         {Kind::DeviceReset, Region::None}},
        // Not from this recogniser: a phase-less event without the tap bit,
        // two phase bits at once, a y between regions or beyond them.
        {"no phase, no tap bit", digitizer(0, 3, 0), {Kind::Unknown, Region::Top}},
        {"two phases", digitizer(2, 1, HidEvent::kPhaseBegan | HidEvent::kPhaseEnded), {Kind::Unknown, Region::Middle}},
        {"y between regions", digitizer(0x20000, 2.5, 0), {Kind::Tap, Region::None}},
        {"y beyond the top", digitizer(0x20000, 4, 0), {Kind::Tap, Region::None}},
        {"negative y", digitizer(0x20000, -1, 0), {Kind::Tap, Region::None}},
    };
    for (const Case& each : cases) {
        const Gesture gesture = Gesture::of(*each.event);
        EXPECT_EQ(gesture, each.expected) << each.name << ": " << Gesture::name(gesture.kind) << " "
                                          << Gesture::name(gesture.region);
    }
}

TEST(GestureTest, NamesParseBackAndNothingElseDoes)
{
    for (Kind kind : {Kind::MayBegin, Kind::Tap, Kind::HoldStart, Kind::HoldChange, Kind::HoldEnd, Kind::Cancel,
                      Kind::DeviceReset}) {
        EXPECT_EQ(Gesture::kindFromName(Gesture::name(kind)), kind) << Gesture::name(kind);
    }
    for (Region region : {Region::None, Region::Middle, Region::Bottom, Region::Top}) {
        EXPECT_EQ(Gesture::regionFromName(Gesture::name(region)), region) << Gesture::name(region);
    }
    for (const char* name : {"unknown", "", "Tap", "hold", "tap ", "hold_start"}) {
        EXPECT_EQ(Gesture::kindFromName(name), std::nullopt) << '"' << name << '"';
    }
    for (const char* name : {"", "Top", "left", "upper"}) {
        EXPECT_EQ(Gesture::regionFromName(name), std::nullopt) << '"' << name << '"';
    }
}
