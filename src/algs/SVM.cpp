#include "algs/SVM.h"

#include <algorithm>
#include <cmath>
#include <functional>
#include <limits>
#include <utility>

namespace VeltoTouch {

namespace {

using RankTable = std::array<float, SVM::kRankCount>;

// Mean of each rank of the sorted profile over the training frames.
constexpr RankTable kMeans = {
    559.2485f, 458.1396f, 409.6764f, 376.5288f, 339.7854f, 302.5308f, 281.1469f, 258.9062f, 234.2004f, 215.7817f,
    199.7768f, 184.8617f, 172.0251f, 160.0365f, 148.0888f, 135.208f,  124.4527f, 114.4343f, 104.0568f, 93.4508f,
    83.6343f,  74.3161f,  65.3713f,  57.6177f,  50.8842f,  43.4918f,  37.2454f,  31.5491f,  26.5578f,  22.2556f,
    18.6728f,  15.4697f,  12.7815f,  10.1925f,  7.6475f,   5.3422f,   3.7211f,   2.1581f};

// Standard deviation of each rank over the training frames.
constexpr RankTable kScales = {
    319.631f,  264.2479f, 238.355f,  222.3886f, 211.1872f, 206.0873f, 198.0056f, 189.2092f, 182.5528f, 177.034f,
    170.0103f, 163.5788f, 157.3571f, 151.1289f, 144.6578f, 138.2757f, 131.4855f, 124.7151f, 116.673f,  107.0524f,
    98.8414f,  91.5114f,  84.5376f,  78.8144f,  72.6408f,  64.3881f,  58.6809f,  51.8691f,  45.1187f,  39.4927f,
    35.9957f,  32.8257f,  29.4461f,  25.6704f,  20.1275f,  15.8161f,  11.7617f,  10.0508f};

// Weight of each standardised rank.
constexpr RankTable kWeights = {
    2.0791f,  0.577f,   -0.0003f, 1.7971f,  0.8896f,  -0.194f,  -1.7877f, 1.9933f,  0.5968f,  -0.6801f,
    -0.1372f, -0.4558f, 0.3444f,  0.1195f,  0.2427f,  0.2738f,  -0.7458f, -0.2226f, -0.95f,   -0.238f,
    0.0785f,  -1.6108f, -0.4774f, 0.3914f,  -0.0379f, -0.5014f, 0.2391f,  0.5287f,  -0.3405f, 0.2821f,
    0.8225f,  -0.5142f, -1.1009f, 0.3262f,  -1.7422f, 0.4487f,  0.0877f,  -0.2101f};

// Offset of the decision function.
constexpr float kBias = 2.0083f;

// The largest and second largest of the first kRankCount element values
// (pads, then groups), as in the profile. Branch-free: min and max keep the
// same pair as comparing and shifting.
std::pair<std::int32_t, std::int32_t> twoLargest(const std::vector<Pixel>& pixels,
                                                 const std::vector<VirtualPixel>& virtualPixels)
{
    std::int32_t first = std::numeric_limits<std::int32_t>::min();
    std::int32_t second = first;
    std::size_t count = 0;
    const auto take = [&](std::int32_t value) {
        second = std::max(second, std::min(first, value));
        first = std::max(first, value);
    };
    for (const Pixel& pixel : pixels) {
        if (count++ < SVM::kRankCount) take(pixel.value);
    }
    for (const VirtualPixel& pixel : virtualPixels) {
        if (count++ < SVM::kRankCount) take(pixel.value);
    }
    return {first, second};
}

struct Profile {
    const std::int32_t* values;
    std::size_t count;
    const float* means;
    const float* scales;
    const float* weights;
};

// One fused multiply-add per rank. std::fma rounds once wherever it runs,
// so the copy built for processors with the instruction gives the very same
// score as the portable one, which calls the C library for it.
[[gnu::always_inline]] inline float weightedSum(const Profile& profile)
{
    float sum = 0.0f;
    for (std::size_t rank = 0; rank < profile.count; ++rank) {
        const float standardised =
            (static_cast<float>(profile.values[rank]) - profile.means[rank]) / profile.scales[rank];
        sum = std::fma(standardised, profile.weights[rank], sum);
    }
    return sum;
}

[[gnu::target("fma")]] float weightedSumWithFmaInstruction(const Profile& profile) { return weightedSum(profile); }

float weightedSumPortable(const Profile& profile) { return weightedSum(profile); }

}  // namespace

SVM::SVM() : means(kMeans), scales(kScales), weights(kWeights), bias(kBias) {}

void SVM::updateSVMScore(const std::vector<Pixel>& pixels, const std::vector<VirtualPixel>& virtualPixels,
                         float activationThreshold, unsigned int /*frameTime*/)
{
    score = 0.0f;
    const std::size_t count = std::min(pixels.size() + virtualPixels.size(), kRankCount);
    if (count < 2) return;

    // Nothing on the surface worth judging: no element past the activation
    // level and fewer than two above noise. Most frames are idle, so this is
    // decided from the two largest values before any profile is built.
    const auto [largest, secondLargest] = twoLargest(pixels, virtualPixels);
    if (!(static_cast<float>(largest) > activationThreshold) && secondLargest <= Pixel::kNoiseLevel) return;

    // Only the values take part, so sorting them alone gives the same profile
    // as sorting copies of the elements.
    std::array<std::int32_t, kRankCount> profile{};
    std::size_t filled = 0;
    for (const Pixel& pixel : pixels) {
        if (filled < kRankCount) profile[filled++] = pixel.value;
    }
    for (const VirtualPixel& pixel : virtualPixels) {
        if (filled < kRankCount) profile[filled++] = pixel.value;
    }

    std::sort(profile.begin(), profile.begin() + static_cast<std::ptrdiff_t>(count), std::greater<>());

    static const bool hasFmaInstruction = __builtin_cpu_supports("fma");
    const Profile sorted{profile.data(), count, means.data(), scales.data(), weights.data()};
    score = hasFmaInstruction ? weightedSumWithFmaInstruction(sorted) : weightedSumPortable(sorted);
    score += bias;
}

}  // namespace VeltoTouch
