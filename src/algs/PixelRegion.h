#pragma once

#include <cstdint>

namespace VeltoTouch {

// Regions of the surface; the value travels in a gesture event's y.
enum class PixelRegion : std::uint32_t {
    None = 0,
    Middle = 1,
    Bottom = 2,
    Top = 3,
};

}  // namespace VeltoTouch
