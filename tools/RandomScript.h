#pragma once

#include "GestureScript.h"

#include <cstdint>
#include <vector>

namespace VeltoTool {

// Draws a gesture script of `count` touches for a corpus that covers the
// space rather than one perfect finger: taps, holds, slides, palms, noise
// bursts and resets in random order, each touch with its own duration,
// position within its region, contact size and strength and sensor noise,
// separated by idle gaps of random length. The same count and seed give the
// same script.
class RandomScript {
public:
    static std::vector<GestureScript::Step> generate(std::uint32_t count, std::uint32_t seed);
};

}  // namespace VeltoTool
