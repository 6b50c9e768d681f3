#pragma once

#include "algs/PixelRegion.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace VeltoTool {

// A small language for synthetic gestures, one step per statement, statements
// separated by ';' or new lines, '#' starting a comment:
//   tap REGION [DURATION]        a short touch (default 120ms)
//   hold REGION DURATION [reset@TIME]
//                                a long touch in one place; with reset@TIME the
//                                device reports a reset TIME into the touch
//   slide FROM TO DURATION       a touch that moves from one region to another
//   palm DURATION                a large flat contact over most of the surface
//   idle DURATION                no touch
//   noise DURATION               no touch, with heavy sensor noise
//   reset                        the device reports that it has reset
// REGION is top, middle or bottom; DURATION a number with ms or s ("600ms", "1.2s").
class GestureScript {
public:
    enum class Action { Tap, Hold, Slide, Palm, Idle, Noise, Reset };

    struct Step {
        Action action = Action::Idle;
        VeltoTouch::PixelRegion from = VeltoTouch::PixelRegion::None;
        VeltoTouch::PixelRegion to = VeltoTouch::PixelRegion::None;
        std::uint32_t durationMs = 0;
        // Hold only: when the device reports a reset during the touch.
        std::optional<std::uint32_t> resetAtMs;
        // How this touch differs from the standard finger (or palm): where in
        // its region it lands (pad pitches), how broad and how strong the
        // contact is, and the sensor noise during it (also for noise steps).
        // Scripts always give the standard; RandomScript varies them.
        double offsetX = 0;
        double offsetY = 0;
        double sizeScale = 1;
        double strengthScale = 1;
        std::optional<double> noise;
        int line = 0;  // 1-based, for messages
    };

    // Throws ToolError with the statement's line and what was wrong.
    static std::vector<Step> parse(const std::string& text);

    static std::uint32_t parseDuration(const std::string& text);  // throws ToolError
};

}  // namespace VeltoTool
