#pragma once

#include "platform/HidEvent.h"

#include <optional>
#include <string_view>

namespace VeltoHost {

// What a gesture event means to someone outside the plug-in: which moment of a
// touch it marks and where on the surface. The daemon's key map, its log and
// its bus signals all speak of gestures by these names, so they are defined
// once here:
//   kinds   "may-begin", "tap", "hold-start", "hold-change", "hold-end",
//           "cancel", "device-reset" (and "unknown" for anything else)
//   regions "none", "middle", "bottom", "top"
struct Gesture {
    enum class Kind { MayBegin, Tap, HoldStart, HoldChange, HoldEnd, Cancel, DeviceReset, Unknown };
    // Same numbering as the recogniser's surface regions, which travel in the
    // event's y.
    enum class Region { None = 0, Middle = 1, Bottom = 2, Top = 3 };

    Kind kind = Kind::Unknown;
    Region region = Region::None;

    // Reads phase, event mask and y. A vendor-defined event is the device
    // reset; a digitizer event that matches no gesture is Unknown. Any y other
    // than the four region numbers reads as None.
    static Gesture of(const HidEvent& event) noexcept;

    static std::string_view name(Kind kind) noexcept;
    static std::string_view name(Region region) noexcept;
    // The inverse of name(); "unknown" is not a gesture one can ask for, so it
    // does not parse.
    static std::optional<Kind> kindFromName(std::string_view name) noexcept;
    static std::optional<Region> regionFromName(std::string_view name) noexcept;

    friend bool operator==(const Gesture&, const Gesture&) = default;
};

}  // namespace VeltoHost
