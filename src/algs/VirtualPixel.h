#pragma once

#include "algs/Pixel.h"

#include <string>

namespace VeltoTouch {

// The activation state machine of a pad, run on the sum of a group of
// neighbouring pads. Its index follows the group's strongest member.
class VirtualPixel : public Pixel {
public:
    VirtualPixel(std::string name, float gain);

    void updatePixelState(int raw, float activationThreshold, int strongestPadIndex);

    std::string name;
};

}  // namespace VeltoTouch
