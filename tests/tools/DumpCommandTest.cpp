#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>

using namespace VeltoTool::Testing;

namespace {

TEST(DumpCommand, DrawsTheChosenFrames)
{
    const std::string file = std::string(VELTO_EXAMPLES_DIR) + "/taps.json";
    ToolRun run = runTool({"dump", file, "--frames", "25:26"});
    ASSERT_EQ(run.status, 0) << run.err;
    EXPECT_EQ(run.out.rfind("# Image frame 25    time 1240 ms\n\n", 0), 0u);
    EXPECT_NE(run.out.find("# Image frame 26    time 1250 ms"), std::string::npos);
    EXPECT_EQ(run.out.find("# Image frame 27"), std::string::npos);
    // 2 headers, 2 blank lines after them, 13 rows each, a blank line after each drawing.
    EXPECT_EQ(std::count(run.out.begin(), run.out.end(), '\n'), 2 * (2 + 13 + 1));
}

TEST(DumpCommand, RangesThatAreNotRangesAreUsageErrors)
{
    const std::string file = std::string(VELTO_EXAMPLES_DIR) + "/taps.json";
    struct Case {
        const char* range;
        const char* message;
    };
    const Case cases[] = {
        {"x", "veltotouch: --frames: invalid frame range \"x\" (expected A:B with frame numbers) (see 'veltotouch help dump')\n"},
        {"a:b", "veltotouch: --frames: invalid frame range \"a:b\" (expected A:B with frame numbers) (see 'veltotouch help dump')\n"},
        {"9:3", "veltotouch: --frames: invalid frame range \"9:3\" (first frame after last) (see 'veltotouch help dump')\n"},
        {"-1:", "veltotouch: --frames: invalid frame range \"-1:\" (expected A:B with frame numbers) (see 'veltotouch help dump')\n"},
    };
    for (const Case& c : cases) {
        const ToolRun run = runTool({"dump", file, "--frames", c.range});
        EXPECT_EQ(run.status, 2) << c.range;
        EXPECT_EQ(run.err, c.message);
    }
}

}  // namespace
