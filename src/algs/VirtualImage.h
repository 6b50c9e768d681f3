#pragma once

#include "algs/Pixel.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace VeltoTouch {

// Sums of fixed groups of neighbouring pads: a contact between pads, or a
// broad one such as a palm, shows up as a strong group where every single pad
// is weak. Each sum feeds one VirtualPixel kept by the recogniser.
class VirtualImage {
public:
    static constexpr std::size_t kGroupCount = 23;

    VirtualImage();

    // The letters of group `group`'s pads, "ABE" to "MNO".
    static std::string_view groupName(std::size_t group);

    // Recomputes the group sums and strongest members from this frame's pads.
    void updateValues(const std::vector<Pixel>& pixels);

    std::vector<std::int32_t> values;
    std::vector<std::string> groups;
    std::vector<std::int32_t> maxIndex;
    std::vector<float> normalizationFactors;

private:
    // The pads A..O, and the index that fills a three-pad group's fourth slot.
    static constexpr std::size_t kNoPad = 15;
    // The pads of each group as indices, in the order of its letters.
    struct GroupPads {
        std::array<std::int8_t, 4> pads{};
        std::size_t count = 0;
    };
    std::array<GroupPads, kGroupCount> _groupPads{};
};

}  // namespace VeltoTouch
