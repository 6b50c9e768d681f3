#include "algs/VirtualImage.h"

#include <algorithm>
#include <array>
#include <limits>
#include <string_view>

namespace VeltoTouch {

namespace {

// Pad letters of each group, in group order; the hand statistics address
// "IJK" (18) and "KLM" (19) by position.
constexpr std::array<std::string_view, VirtualImage::kGroupCount> kGroupNames = {
    "ABE", "ABF", "ADEF", "AEGJ", "BCEF", "BFHJ", "CDE", "CDF", "CELN", "DFLO", "EFK", "EJK",
    "EKL", "FJK", "FKL",  "GHI",  "GIJ",  "HIJ",  "IJK", "KLM", "LMN",  "LMO",  "MNO"};

// Gain of each group's virtual pixel, roughly the inverse of how many of its
// pads a typical fingertip covers.
constexpr std::array<float, VirtualImage::kGroupCount> kNormalizationFactors = {
    0.6667f, 0.4444f, 0.6667f, 0.5714f, 0.6667f, 0.5714f, 0.6667f, 0.4651f, 0.6667f, 0.6667f, 0.4f, 0.4f,
    0.4f,    0.4f,    0.4f,    0.5714f, 0.4f,    0.4f,    0.4f,    0.4f,    0.4444f, 0.5714f, 0.6667f};

int padIndexOfLetter(char letter) { return letter - 'A'; }

}  // namespace

std::string_view VirtualImage::groupName(std::size_t group) { return kGroupNames.at(group); }

VirtualImage::VirtualImage()
{
    groups.assign(kGroupNames.begin(), kGroupNames.end());
    values.reserve(kGroupCount);
    maxIndex.reserve(kGroupCount);
    normalizationFactors.reserve(kGroupCount);
    for (std::size_t j = 0; j < kGroupCount; ++j) {
        GroupPads& members = _groupPads[j];
        members.pads.fill(static_cast<std::int8_t>(kNoPad));
        for (char letter : kGroupNames[j]) {
            members.pads[members.count++] = static_cast<std::int8_t>(padIndexOfLetter(letter));
        }
        maxIndex.push_back(padIndexOfLetter(groups[j].front()));
        values.push_back(0);
        normalizationFactors.push_back(kNormalizationFactors[j]);
    }
}

void VirtualImage::updateValues(const std::vector<Pixel>& pixels)
{
    // Runs every frame: the groups' pads of the fixed layout (A to O) are
    // looked up once, at construction, and need no range checks here.
    const Pixel* pads = pixels.data();
    // Most frames are idle: with no pad above noise every sum is 0 and no
    // member can take over as the strongest, so the groups need no visit.
    const bool anyAboveNoise =
        std::any_of(pixels.begin(), pixels.end(), [](const Pixel& pad) { return pad.value > Pixel::kNoiseLevel; });
    if (!anyAboveNoise) {
        std::fill(values.begin(), values.end(), 0);
        return;
    }
    // Each pad's share of a sum, and its claim to be a group's strongest
    // member: only pads above noise count for either. A claim of the lowest
    // number never beats a value, so the unused fourth slot of a three-pad
    // group (the extra pad at kNoPad) changes nothing.
    std::array<std::int32_t, kNoPad + 1> share{};
    std::array<std::int32_t, kNoPad + 1> claim{};
    std::array<std::int32_t, kNoPad + 1> value{};
    claim[kNoPad] = std::numeric_limits<std::int32_t>::min();
    for (std::size_t pad = 0; pad < kNoPad; ++pad) {
        value[pad] = pads[pad].value;
        const bool counts = value[pad] > Pixel::kNoiseLevel;
        share[pad] = counts ? value[pad] : 0;
        claim[pad] = counts ? value[pad] : std::numeric_limits<std::int32_t>::min();
    }
    for (std::size_t j = 0; j < kGroupCount; ++j) {
        const std::array<std::int8_t, 4>& members = _groupPads[j].pads;
        values[j] = share[members[0]] + share[members[1]] + share[members[2]] + share[members[3]];
        // The first strongest member wins a tie, and the one already recorded
        // keeps it, so the index does not flicker between equals. Without
        // branches: which pad leads changes from frame to frame.
        std::int32_t strongest = maxIndex[j];
        for (const std::int8_t pad : members) strongest = claim[pad] > value[strongest] ? pad : strongest;
        maxIndex[j] = strongest;
    }
}

}  // namespace VeltoTouch
