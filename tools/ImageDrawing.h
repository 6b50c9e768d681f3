#pragma once

#include "records/InputReport.h"

#include <string>

namespace VeltoTouch::Util {

// Draws one image report over the pad layout: each pad's number (its level
// when useLevels is set, else its reading) in place of its letters, under a
// header line with the frame number and time.
std::string stringFromImage(const InputReport::Image& image, bool useLevels);

}  // namespace VeltoTouch::Util
