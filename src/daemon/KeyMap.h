#pragma once

#include "records/Gesture.h"

#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace VeltoHost {

// The host speaks of gestures in the vocabulary every layer shares.
using VeltoTouch::Gesture;

// Turns the gestures of ONE device into key presses and releases. One map per
// device: it remembers the key that device's hold keeps down.
//
// Two kinds of binding:
// - A click binding (gesture and region to key) sends a press and a release
//   when that gesture arrives in that region. Any gesture that carries a
//   region can have one: may-begin, tap, hold-start, hold-change, hold-end.
// - A hold binding (region to key) presses the key at a hold-start in that
//   region and keeps it down until the touch ends.
//
// What "another key for each hold-change increment" means here: the
// recogniser sends no periodic event while a finger rests; it sends a
// hold-change only in a frame in which the held finger's region changed, and
// the event carries the region it moved INTO. So one increment is one
// hold-change into a region: a slide during a hold from bottom through the
// middle to the top repeats nothing in the middle (no binding by default) and
// sends one more volume-up on arriving at the top; sliding back down sends a
// volume-down. Holding still sends nothing after the hold-start.
//
// The held key belongs to its hold and to its region. It is released when
// the hold moves out of that region (a slow slide starts as a hold wherever
// the finger happens to be after the hold timeout; once it moves on, it is a
// slide, not a long press, and coming back does not press the key again),
// and by every event that ends the touch or begins another one: hold-end,
// cancel, device reset, and also a tap or a may-begin, which can only arrive
// with a key still down when an event was lost. A second hold-start releases
// the first hold's key before pressing its own. So no key is ever left down,
// and no key is pressed twice without a release between. A hold-end with
// nothing held, and events that are no gesture, send nothing of their own.
class KeyMap {
public:
    struct Action {
        unsigned int code = 0;  // a Linux key code (KEY_..., BTN_...)
        bool pressed = false;   // press when true, release when false
        friend bool operator==(const Action&, const Action&) = default;
    };
    using Actions = std::vector<Action>;

    struct Bindings {
        std::map<std::pair<Gesture::Kind, Gesture::Region>, unsigned int> clicks;
        std::map<Gesture::Region, unsigned int> holds;
        friend bool operator==(const Bindings&, const Bindings&) = default;
    };

    // Tap or hold-start at the top: volume up, and one more for every
    // hold-change into the top; the bottom the same with volume down; a tap in
    // the middle: play/pause; a hold in the middle: the voice command key,
    // down for as long as the hold lasts.
    static Bindings defaultBindings();

    // The gestures that can have a click binding.
    static bool isClickable(Gesture::Kind kind) noexcept;

    // Linux key names ("KEY_VOLUMEUP", "BTN_LEFT") to codes and back.
    static std::optional<unsigned int> keyCodeFromName(std::string_view name);
    static std::string keyName(unsigned int code);

    explicit KeyMap(Bindings bindings = defaultBindings());

    // The key actions for the device's next gesture, in the order to send them.
    Actions handle(const Gesture& gesture);
    // Releases the held key, if any: the device went away mid-hold.
    Actions releaseAll();

    // Every key the bindings can send; a virtual keyboard must offer exactly these.
    std::set<unsigned int> keyCodes() const;
    std::optional<unsigned int> heldKey() const noexcept { return _heldKey; }
    const Bindings& bindings() const noexcept { return _bindings; }

private:
    void click(const Gesture& gesture, Actions& actions) const;
    void pressHeld(Gesture::Region region, Actions& actions);
    void releaseHeld(Actions& actions);

    Bindings _bindings;
    std::optional<unsigned int> _heldKey;
    Gesture::Region _heldRegion = Gesture::Region::None;
};

}  // namespace VeltoHost
