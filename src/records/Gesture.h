#pragma once

#include "platform/plugin/HidEvent.h"

#include <cstdint>
#include <optional>
#include <string_view>

namespace VeltoTouch {

// One gesture as every layer speaks of it: which moment of a touch an event
// marks and where on the surface. The recogniser encodes its events from
// here, and everything that reads them (the daemon's key map, log and bus
// signals, the tool's output, the evaluation, the report) decodes and names
// them from here, so that a kind or a region has one number, one set of event
// fields and one name:
//   kinds   "may-begin", "tap", "hold-start", "hold-change", "hold-end",
//           "cancel", "device-reset" (and "unknown" for anything else)
//   regions "none", "middle", "bottom", "top"
struct Gesture {
    enum class Kind : std::uint8_t { MayBegin, Tap, HoldStart, HoldChange, HoldEnd, Cancel, DeviceReset, Unknown };
    // The region's number travels in a gesture event's y; the recogniser's
    // per-region tables are indexed by it.
    enum class Region : std::uint32_t { None = 0, Middle = 1, Bottom = 2, Top = 3 };

    // Event mask bits of a digitizer gesture event. The tap is the one gesture
    // without a phase: its bit is what tells it from an event that carries
    // nothing.
    static constexpr std::uint32_t kHoldEventMask = 0x00000002;
    static constexpr std::uint32_t kTapEventMask = 0x00020000;

    Kind kind = Kind::Unknown;
    Region region = Region::None;

    // The digitizer event of this gesture: a finger, the kind's phase and
    // mask, the region's number in y, time 0. The device reset is a
    // vendor-defined event the pipeline makes, and Unknown has no event:
    // both give a null reference.
    VeltoHost::HidEventRef event() const;
    // Reads phase, event mask and y. A vendor-defined event is the device
    // reset; a digitizer event that matches no gesture is Unknown. Any y other
    // than the four region numbers reads as None.
    static Gesture of(const VeltoHost::HidEvent& event) noexcept;

    static std::string_view name(Kind kind) noexcept;
    static std::string_view name(Region region) noexcept;
    // The inverse of name(); "unknown" is not a gesture one can ask for, so it
    // does not parse.
    static std::optional<Kind> kindFromName(std::string_view name) noexcept;
    static std::optional<Region> regionFromName(std::string_view name) noexcept;

    friend bool operator==(const Gesture&, const Gesture&) = default;
};

}  // namespace VeltoTouch
