#include "algs/Algs.h"

namespace VeltoTouch {

using VeltoHost::HidEvent;
using VeltoHost::HidEventList;
using VeltoHost::HidEventRef;

namespace {

constexpr std::uint32_t kTransducerFinger = 2;
constexpr std::uint32_t kEventMaskNone = 0;
constexpr std::uint32_t kEventMaskHold = 0x00000002;
constexpr std::uint32_t kEventMaskTap = 0x00020000;

HidEventRef createGestureEvent(std::uint32_t eventMask, PixelRegion region)
{
    return HidEvent::createDigitizerEvent(0, kTransducerFinger, 0, 0, eventMask, 0, 0.0,
                                          static_cast<double>(static_cast<std::uint32_t>(region)), 0.0, 0.0, 0.0,
                                          false, false, 0);
}

HidEventRef withPhase(HidEventRef event, std::uint16_t phase)
{
    event->setPhase(phase);
    return event;
}

}  // namespace

HidEventList Algs::handleImage(const InputReport::Image&) { return {}; }

HidEventList Algs::handleReset() { return {}; }

PropertyValue Algs::getState(const std::string&) { return PropertyValue::null(); }

void Algs::setState(const std::string&, PropertyValue) {}

HidEventRef Algs::createMayBeginEvent(PixelRegion region)
{
    return withPhase(createGestureEvent(kEventMaskNone, region), HidEvent::kPhaseMayBegin);
}

HidEventRef Algs::createHoldStartEvent(PixelRegion region)
{
    return withPhase(createGestureEvent(kEventMaskHold, region), HidEvent::kPhaseBegan);
}

HidEventRef Algs::createHoldChangeEvent(PixelRegion region)
{
    return withPhase(createGestureEvent(kEventMaskHold, region), HidEvent::kPhaseChanged);
}

HidEventRef Algs::createHoldEndEvent(PixelRegion region)
{
    return withPhase(createGestureEvent(kEventMaskHold, region), HidEvent::kPhaseEnded);
}

HidEventRef Algs::createTapEvent(PixelRegion region) { return createGestureEvent(kEventMaskTap, region); }

HidEventRef Algs::createCancelEvent()
{
    return withPhase(createGestureEvent(kEventMaskNone, PixelRegion::None), HidEvent::kPhaseCancelled);
}

}  // namespace VeltoTouch
