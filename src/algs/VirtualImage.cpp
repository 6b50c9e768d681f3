#include "algs/VirtualImage.h"

#include <array>
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

VirtualImage::VirtualImage()
{
    groups.assign(kGroupNames.begin(), kGroupNames.end());
    values.reserve(kGroupCount);
    maxIndex.reserve(kGroupCount);
    normalizationFactors.reserve(kGroupCount);
    for (std::size_t j = 0; j < kGroupCount; ++j) {
        GroupPads& members = _groupPads[j];
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
    for (std::size_t j = 0; j < kGroupCount; ++j) {
        std::int32_t sum = 0;
        std::int32_t& strongest = maxIndex[j];
        const GroupPads& members = _groupPads[j];
        for (std::size_t m = 0; m < members.count; ++m) {
            const int pad = members.pads[m];
            // Without branches: whether a pad is above noise changes from
            // frame to frame and would be mispredicted often.
            const std::int32_t padValue = pads[pad].value;
            const bool counts = padValue > Pixel::kNoiseLevel;
            sum += counts ? padValue : 0;
            // The first strongest member wins a tie, and the one already
            // recorded keeps it, so the index does not flicker between equals.
            strongest = counts && padValue > pads[strongest].value ? pad : strongest;
        }
        values[j] = sum;
    }
}

}  // namespace VeltoTouch
