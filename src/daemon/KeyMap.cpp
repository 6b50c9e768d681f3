#include "daemon/KeyMap.h"

#include <libevdev/libevdev.h>
#include <linux/input-event-codes.h>

namespace VeltoHost {

using Kind = Gesture::Kind;
using Region = Gesture::Region;

KeyMap::Bindings KeyMap::defaultBindings()
{
    Bindings bindings;
    for (Kind kind : {Kind::Tap, Kind::HoldStart, Kind::HoldChange}) {
        bindings.clicks[{kind, Region::Top}] = KEY_VOLUMEUP;
        bindings.clicks[{kind, Region::Bottom}] = KEY_VOLUMEDOWN;
    }
    bindings.clicks[{Kind::Tap, Region::Middle}] = KEY_PLAYPAUSE;
    bindings.holds[Region::Middle] = KEY_VOICECOMMAND;
    return bindings;
}

bool KeyMap::isClickable(Kind kind) noexcept
{
    switch (kind) {
    case Kind::MayBegin:
    case Kind::Tap:
    case Kind::HoldStart:
    case Kind::HoldChange:
    case Kind::HoldEnd: return true;
    case Kind::Cancel:
    case Kind::DeviceReset:
    case Kind::Unknown: return false;
    }
    return false;
}

std::optional<unsigned int> KeyMap::keyCodeFromName(std::string_view name)
{
    // libevdev needs a terminated string, and a name with an embedded NUL
    // must not match its prefix.
    const std::string terminated(name);
    if (terminated.size() != std::string(terminated.c_str()).size()) return std::nullopt;
    const int code = libevdev_event_code_from_name(EV_KEY, terminated.c_str());
    if (code < 0) return std::nullopt;
    return static_cast<unsigned int>(code);
}

std::string KeyMap::keyName(unsigned int code)
{
    const char* name = libevdev_event_code_get_name(EV_KEY, code);
    return name ? name : "key " + std::to_string(code);
}

KeyMap::KeyMap(Bindings bindings) : _bindings(std::move(bindings)) {}

KeyMap::Actions KeyMap::handle(const Gesture& gesture)
{
    Actions actions;
    switch (gesture.kind) {
    case Kind::MayBegin:
    case Kind::Tap:
    case Kind::HoldEnd:
        releaseHeld(actions);
        click(gesture, actions);
        break;
    case Kind::HoldStart:
        releaseHeld(actions);
        click(gesture, actions);
        pressHeld(gesture.region, actions);
        break;
    case Kind::HoldChange:
        if (gesture.region != _heldRegion) releaseHeld(actions);
        click(gesture, actions);
        break;
    case Kind::Cancel:
    case Kind::DeviceReset: releaseHeld(actions); break;
    case Kind::Unknown: break;
    }
    return actions;
}

KeyMap::Actions KeyMap::releaseAll()
{
    Actions actions;
    releaseHeld(actions);
    return actions;
}

std::set<unsigned int> KeyMap::keyCodes() const
{
    std::set<unsigned int> codes;
    for (const auto& [trigger, code] : _bindings.clicks) codes.insert(code);
    for (const auto& [region, code] : _bindings.holds) codes.insert(code);
    return codes;
}

void KeyMap::click(const Gesture& gesture, Actions& actions) const
{
    const auto binding = _bindings.clicks.find({gesture.kind, gesture.region});
    if (binding == _bindings.clicks.end()) return;
    actions.push_back({binding->second, true});
    actions.push_back({binding->second, false});
}

void KeyMap::pressHeld(Region region, Actions& actions)
{
    const auto binding = _bindings.holds.find(region);
    if (binding == _bindings.holds.end()) return;
    actions.push_back({binding->second, true});
    _heldKey = binding->second;
    _heldRegion = region;
}

void KeyMap::releaseHeld(Actions& actions)
{
    if (!_heldKey) return;
    actions.push_back({*_heldKey, false});
    _heldKey.reset();
}

}  // namespace VeltoHost
