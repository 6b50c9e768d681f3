#pragma once

#include <cstdint>

namespace VeltoTouch {

// What a frame is in the life of a touch, as the recogniser's per-frame
// description names it (STARTTOUCH, HOLDING, ...). Idle frames have no word.
enum class TouchPhase : std::uint8_t {
    Idle = 0,
    StartTouch,
    Holding,
    StartHold,
    SuppressHold,
    Touching,
    EndHold,
    Tap,
    SuppressTap,
    EndTouch,
};

}  // namespace VeltoTouch
