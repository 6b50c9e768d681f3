#pragma once

#include "records/Gesture.h"

namespace VeltoTouch {

// The recogniser's name for the regions of the surface: the gesture regions.
using PixelRegion = Gesture::Region;

}  // namespace VeltoTouch
