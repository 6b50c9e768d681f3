#include "algs/VirtualPixel.h"

#include <utility>

namespace VeltoTouch {

// The index is only known once the first frame has named the strongest member.
VirtualPixel::VirtualPixel(std::string name, float gain) : Pixel(0, gain), name(std::move(name)) {}

void VirtualPixel::updatePixelState(int raw, float activationThreshold, int strongestPadIndex)
{
    Pixel::updatePixelState(raw, activationThreshold);
    index = strongestPadIndex;
}

}  // namespace VeltoTouch
