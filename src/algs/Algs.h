#pragma once

#include "algs/PixelRegion.h"
#include "pipeline/InputReport.h"
#include "platform/HidEvent.h"
#include "platform/PropertyValue.h"

#include <string>

namespace VeltoTouch {

using VeltoHost::PropertyValue;

// The gesture recogniser. One frame in, at most one gesture event out.
class Algs {
public:
    // Integer field of every emitted event that carries its frame number.
    static constexpr std::uint32_t kFrameNumberField = 0x000B001B;

    VeltoHost::HidEventList handleImage(const InputReport::Image& image);
    // One frame of all-zero readings with frame number 0 and time 0.
    VeltoHost::HidEventList handleReset();

    PropertyValue getState(const std::string& key);
    void setState(const std::string& key, PropertyValue value);

    static VeltoHost::HidEventRef createMayBeginEvent(PixelRegion region);
    static VeltoHost::HidEventRef createHoldStartEvent(PixelRegion region);
    static VeltoHost::HidEventRef createHoldChangeEvent(PixelRegion region);
    static VeltoHost::HidEventRef createHoldEndEvent(PixelRegion region);
    static VeltoHost::HidEventRef createTapEvent(PixelRegion region);
    static VeltoHost::HidEventRef createCancelEvent();
};

}  // namespace VeltoTouch
