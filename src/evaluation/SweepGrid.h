#pragma once

#include "evaluation/PipelineSetting.h"

#include <string>
#include <vector>

namespace VeltoTouch {

// The settings a sweep evaluates: each axis is one key stepped over a range
// ("Algs.HoldTimeoutMilliseconds=300:700:100" is 300, 400, ..., 700), and the
// grid is every combination, the first axis varying slowest.
class SweepGrid {
public:
    struct Axis {
        std::string key;
        std::vector<double> values;
    };

    // More settings than this is a typo, not a sweep.
    static constexpr std::size_t kMaxSettings = 100'000;

    // Throws std::invalid_argument saying what is wrong with the text.
    static Axis parseAxis(const std::string& text);
    static std::vector<PipelineSettings> combinations(const std::vector<Axis>& axes);
};

}  // namespace VeltoTouch
