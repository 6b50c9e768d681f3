#include "host/GestureFields.h"

#include "algs/Algs.h"

namespace VeltoHost {

namespace {

// A tap is the one gesture without a phase; the recogniser marks it in the
// event mask instead.
constexpr std::uint32_t kTapEventMask = 0x00020000;

}  // namespace

GestureFields GestureFields::of(const HidEvent& event)
{
    GestureFields fields;
    fields.gesture = gestureName(event);
    fields.timestamp = event.timeStamp();
    if (event.kind() == HidEvent::Kind::VendorDefined) {
        fields.isDeviceReset = true;
        fields.usagePage = event.vendorDefined().usagePage;
        fields.usage = event.vendorDefined().usage;
        return fields;
    }
    const HidEvent::Digitizer& digitizer = event.digitizer();
    fields.region = regionName(digitizer.y);
    fields.frame = event.integerValue(VeltoTouch::Algs::kFrameNumberField).value_or(0);
    fields.phase = event.phase();
    fields.eventMask = digitizer.eventMask;
    fields.y = static_cast<std::int64_t>(digitizer.y);
    return fields;
}

std::string GestureFields::gestureName(const HidEvent& event)
{
    if (event.kind() == HidEvent::Kind::VendorDefined) return "device-reset";
    switch (event.phase()) {
    case HidEvent::kPhaseMayBegin: return "may-begin";
    case HidEvent::kPhaseBegan: return "hold-start";
    case HidEvent::kPhaseChanged: return "hold-change";
    case HidEvent::kPhaseEnded: return "hold-end";
    case HidEvent::kPhaseCancelled: return "cancel";
    case 0: return (event.digitizer().eventMask & kTapEventMask) ? "tap" : "unknown";
    default: return "unknown";
    }
}

std::string GestureFields::regionName(double y)
{
    if (y == 1.0) return "middle";
    if (y == 2.0) return "bottom";
    if (y == 3.0) return "top";
    return "none";
}

}  // namespace VeltoHost
