#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <string>

using namespace VeltoTool::Testing;

// --frames picks frames out of the whole dump: each chosen frame is drawn as
// it is there, and no other.
TEST(DumpCommand, DrawsTheChosenFramesAsTheWholeDumpDrawsThem)
{
    const std::string taps = kExamples + "/taps.json";
    for (const std::string levels : {"", "--levels"}) {
        SCOPED_TRACE(levels);
        std::vector<std::string> all{"dump", taps}, chosen{"dump", taps, "--frames", "25:26"};
        if (!levels.empty()) {
            all.push_back(levels);
            chosen.push_back(levels);
        }
        const ToolRun whole = runTool(all);
        const ToolRun part = runTool(chosen);
        ASSERT_EQ(part.status, 0) << part.err;
        const std::size_t from = whole.out.find("# Image frame 25 "), to = whole.out.find("# Image frame 27 ");
        ASSERT_NE(to, std::string::npos);
        EXPECT_EQ(part.out, whole.out.substr(from, to - from));
        EXPECT_NE(part.out.find("# Image frame 26 "), std::string::npos);
    }
}
