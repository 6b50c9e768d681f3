#include "recording/GapCap.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <string>
#include <vector>

using VeltoHost::GapCap;

namespace {

// Waits well below the limit, and a limit of 0, through replay:
// ReplayCommandTest.
TEST(GapCap, WaitsUpToTheLimitAreKeptAndLongerOnesCut)
{
    constexpr std::uint64_t kMax = std::numeric_limits<std::uint64_t>::max();
    struct Case {
        double maxSeconds;
        std::uint64_t wait;
        std::uint64_t expected;
    };
    const Case cases[] = {
        {1.0, 1'000'000, 1'000'000},
        {1.0, 1'000'001, 1'000'000},
        {1.0, kMax, 1'000'000},
        {0.25, 10'000'000, 250'000},
        // A limit beyond what 64 bits of microseconds hold cuts nothing.
        {1e300, kMax, kMax},
        {1.8446744073709552e13, kMax, kMax},
    };
    for (const Case& c : cases) {
        GapCap cap(c.maxSeconds);
        EXPECT_EQ(cap(c.wait), c.expected) << c.maxSeconds << " s, wait " << c.wait;
    }
}

}  // namespace
