#include "host/Gesture.h"

#include <array>
#include <utility>

namespace VeltoHost {

namespace {

// The tap is the one digitizer event without a phase; this mask bit is what
// tells it from an event that carries nothing.
constexpr std::uint32_t kTapEventMask = 0x00020000;

constexpr std::array<std::pair<Gesture::Kind, std::string_view>, 8> kKindNames{{
    {Gesture::Kind::MayBegin, "may-begin"},
    {Gesture::Kind::Tap, "tap"},
    {Gesture::Kind::HoldStart, "hold-start"},
    {Gesture::Kind::HoldChange, "hold-change"},
    {Gesture::Kind::HoldEnd, "hold-end"},
    {Gesture::Kind::Cancel, "cancel"},
    {Gesture::Kind::DeviceReset, "device-reset"},
    {Gesture::Kind::Unknown, "unknown"},
}};

constexpr std::array<std::pair<Gesture::Region, std::string_view>, 4> kRegionNames{{
    {Gesture::Region::None, "none"},
    {Gesture::Region::Middle, "middle"},
    {Gesture::Region::Bottom, "bottom"},
    {Gesture::Region::Top, "top"},
}};

Gesture::Kind kindOf(const HidEvent& event) noexcept
{
    if (event.kind() == HidEvent::Kind::VendorDefined) return Gesture::Kind::DeviceReset;
    switch (event.phase()) {
    case HidEvent::kPhaseMayBegin: return Gesture::Kind::MayBegin;
    case HidEvent::kPhaseBegan: return Gesture::Kind::HoldStart;
    case HidEvent::kPhaseChanged: return Gesture::Kind::HoldChange;
    case HidEvent::kPhaseEnded: return Gesture::Kind::HoldEnd;
    case HidEvent::kPhaseCancelled: return Gesture::Kind::Cancel;
    case 0: return (event.digitizer().eventMask & kTapEventMask) ? Gesture::Kind::Tap : Gesture::Kind::Unknown;
    default: return Gesture::Kind::Unknown;
    }
}

Gesture::Region regionOf(const HidEvent& event) noexcept
{
    if (event.kind() != HidEvent::Kind::Digitizer) return Gesture::Region::None;
    const double y = event.digitizer().y;
    for (const auto& [region, name] : kRegionNames) {
        if (y == static_cast<double>(region)) return region;
    }
    return Gesture::Region::None;
}

}  // namespace

Gesture Gesture::of(const HidEvent& event) noexcept { return Gesture{kindOf(event), regionOf(event)}; }

std::string_view Gesture::name(Kind kind) noexcept
{
    for (const auto& [each, name] : kKindNames) {
        if (each == kind) return name;
    }
    return "unknown";
}

std::string_view Gesture::name(Region region) noexcept
{
    for (const auto& [each, name] : kRegionNames) {
        if (each == region) return name;
    }
    return "none";
}

std::optional<Gesture::Kind> Gesture::kindFromName(std::string_view name) noexcept
{
    for (const auto& [kind, each] : kKindNames) {
        if (each == name && kind != Kind::Unknown) return kind;
    }
    return std::nullopt;
}

std::optional<Gesture::Region> Gesture::regionFromName(std::string_view name) noexcept
{
    for (const auto& [region, each] : kRegionNames) {
        if (each == name) return region;
    }
    return std::nullopt;
}

}  // namespace VeltoHost
