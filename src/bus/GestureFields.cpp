#include "bus/GestureFields.h"

#include "algs/Algs.h"

namespace VeltoHost {

GestureFields GestureFields::of(const HidEvent& event, const Gesture& gesture)
{
    GestureFields fields;
    fields.gesture = Gesture::name(gesture.kind);
    fields.timestamp = event.timeStamp();
    if (event.kind() == HidEvent::Kind::VendorDefined) {
        fields.isDeviceReset = true;
        fields.usagePage = event.vendorDefined().usagePage;
        fields.usage = event.vendorDefined().usage;
        return fields;
    }
    const HidEvent::Digitizer& digitizer = event.digitizer();
    fields.region = Gesture::name(gesture.region);
    fields.frame = event.integerValue(VeltoTouch::Algs::kFrameNumberField).value_or(0);
    fields.phase = event.phase();
    fields.eventMask = digitizer.eventMask;
    fields.y = static_cast<std::int64_t>(digitizer.y);
    return fields;
}

}  // namespace VeltoHost
