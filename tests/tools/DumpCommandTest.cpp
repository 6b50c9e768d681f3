#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>

using namespace VeltoTool::Testing;

TEST(DumpCommand, DrawsTheChosenFrames)
{
    ToolRun run = runTool({"dump", kExamples + "/taps.json", "--frames", "25:26"});
    ASSERT_EQ(run.status, 0) << run.err;
    EXPECT_EQ(run.out.rfind("# Image frame 25    time 1240 ms\n\n", 0), 0u);
    EXPECT_NE(run.out.find("# Image frame 26    time 1250 ms"), std::string::npos);
    EXPECT_EQ(run.out.find("# Image frame 27"), std::string::npos);
    // 2 headers, 2 blank lines after them, 13 rows each, a blank line after each drawing.
    EXPECT_EQ(std::count(run.out.begin(), run.out.end(), '\n'), 2 * (2 + 13 + 1));
}
