#pragma once

#include "algs/Pixel.h"
#include "algs/VirtualPixel.h"

#include <array>
#include <cstddef>
#include <vector>

namespace VeltoTouch {

// Fixed linear classifier of a frame's contact profile: the values of all pads
// and virtual pixels sorted largest first, so it judges how concentrated the
// contact is, not where it lies. Positive scores look like a finger.
class SVM {
public:
    // 15 pads and 23 virtual pixels.
    static constexpr std::size_t kRankCount = 38;

    SVM();

    void updateSVMScore(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels,
                        float activationThreshold, unsigned int frameTime);
    float getSVMScore() const noexcept { return score; }

    float score = 0.0f;
    std::array<float, kRankCount> means;
    std::array<float, kRankCount> scales;
    std::array<float, kRankCount> weights;
    float bias;
};

}  // namespace VeltoTouch
