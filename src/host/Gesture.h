#pragma once

#include "records/Gesture.h"

namespace VeltoHost {

// The host speaks of gestures in the shared vocabulary (records/Gesture.h).
using VeltoTouch::Gesture;

}  // namespace VeltoHost
