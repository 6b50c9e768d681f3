#include "records/Gesture.h"

#include <array>
#include <utility>

namespace VeltoTouch {

using VeltoHost::HidEvent;

namespace {

constexpr std::uint32_t kTransducerFinger = 2;

// Each kind's name and the phase and mask of its digitizer event. A
// digitizer event is told by its phase alone; the tap, whose phase is 0, by
// its mask bit. The two kinds without a digitizer event have neither, so no
// event decodes to them this way.
struct KindEntry {
    Gesture::Kind kind;
    std::string_view name;
    std::uint16_t phase;
    std::uint32_t eventMask;
};
constexpr std::array<KindEntry, 8> kKinds{{
    {Gesture::Kind::MayBegin, "may-begin", HidEvent::kPhaseMayBegin, 0},
    {Gesture::Kind::Tap, "tap", 0, Gesture::kTapEventMask},
    {Gesture::Kind::HoldStart, "hold-start", HidEvent::kPhaseBegan, Gesture::kHoldEventMask},
    {Gesture::Kind::HoldChange, "hold-change", HidEvent::kPhaseChanged, Gesture::kHoldEventMask},
    {Gesture::Kind::HoldEnd, "hold-end", HidEvent::kPhaseEnded, Gesture::kHoldEventMask},
    {Gesture::Kind::Cancel, "cancel", HidEvent::kPhaseCancelled, 0},
    {Gesture::Kind::DeviceReset, "device-reset", 0, 0},
    {Gesture::Kind::Unknown, "unknown", 0, 0},
}};

constexpr std::array<std::pair<Gesture::Region, std::string_view>, 4> kRegionNames{{
    {Gesture::Region::None, "none"},
    {Gesture::Region::Middle, "middle"},
    {Gesture::Region::Bottom, "bottom"},
    {Gesture::Region::Top, "top"},
}};

const KindEntry& entryOf(Gesture::Kind kind) noexcept
{
    for (const KindEntry& entry : kKinds) {
        if (entry.kind == kind) return entry;
    }
    return kKinds.back();
}

Gesture::Kind kindOf(const HidEvent& event) noexcept
{
    if (event.kind() == HidEvent::Kind::VendorDefined) return Gesture::Kind::DeviceReset;
    const std::uint16_t phase = event.phase();
    for (const KindEntry& entry : kKinds) {
        if (entry.phase == phase && (phase != 0 || (event.digitizer().eventMask & entry.eventMask) != 0)) {
            return entry.kind;
        }
    }
    return Gesture::Kind::Unknown;
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

VeltoHost::HidEventRef Gesture::event() const
{
    if (kind == Kind::DeviceReset || kind == Kind::Unknown) return nullptr;
    const KindEntry& entry = entryOf(kind);
    VeltoHost::HidEventRef made =
        HidEvent::createDigitizerEvent(0, kTransducerFinger, 0, 0, entry.eventMask, 0, 0.0,
                                       static_cast<double>(region), 0.0, 0.0, 0.0, false, false, 0);
    made->setPhase(entry.phase);
    return made;
}

Gesture Gesture::of(const HidEvent& event) noexcept { return Gesture{kindOf(event), regionOf(event)}; }

std::string_view Gesture::name(Kind kind) noexcept { return entryOf(kind).name; }

std::string_view Gesture::name(Region region) noexcept
{
    for (const auto& [each, name] : kRegionNames) {
        if (each == region) return name;
    }
    return "none";
}

std::optional<Gesture::Kind> Gesture::kindFromName(std::string_view name) noexcept
{
    for (const KindEntry& entry : kKinds) {
        if (entry.name == name && entry.kind != Kind::Unknown) return entry.kind;
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

}  // namespace VeltoTouch
