#pragma once

#include "platform/plugin/HidEvent.h"
#include "records/Gesture.h"

#include <cstdint>
#include <string>

namespace VeltoHost {

// The host speaks of gestures in the vocabulary every layer shares.
using VeltoTouch::Gesture;

// One event the plug-in delivered, in the terms a person or a script reads
// it in: a gesture name, a region name and the numbers that tell two events
// apart. Everything that shows events outside the process (the command-line
// tool's lines, the bus signals) takes them from here, so that the same event
// carries the same names and values wherever it is watched.
struct GestureFields {
    // "may-begin", "tap", "hold-start", "hold-change", "hold-end", "cancel",
    // "device-reset", or "unknown" for a digitizer event of no known phase.
    std::string gesture;
    // "none", "middle", "bottom" or "top" (digitizer events only).
    std::string region;
    bool isDeviceReset = false;

    // Digitizer events.
    std::int64_t frame = 0;
    std::uint16_t phase = 0;
    std::uint32_t eventMask = 0;
    std::int64_t y = 0;

    // Vendor-defined (device-reset) events.
    std::uint32_t usagePage = 0;
    std::uint32_t usage = 0;

    // Host clock ticks, as the pipeline stamped the event.
    std::uint64_t timestamp = 0;

    // The fields of an event whose gesture is decoded already, named as
    // Gesture names them: the daemon decodes each event once, for its keys
    // and its signals.
    static GestureFields of(const HidEvent& event, const Gesture& gesture);
    static GestureFields of(const HidEvent& event) { return of(event, Gesture::of(event)); }
};

}  // namespace VeltoHost
