// The diagnostic texts, to the character.
#include "algs/PipelineHarness.h"

#include <gtest/gtest.h>

namespace VeltoTouch::Test {
namespace {

std::vector<std::string> lines(const std::string& text)
{
    std::vector<std::string> result;
    std::size_t start = 0;
    for (std::size_t end; (end = text.find('\n', start)) != std::string::npos; start = end + 1) {
        result.push_back(text.substr(start, end - start));
    }
    result.push_back(text.substr(start));
    return result;
}


TEST(StateDescriptions, PadsGroupsAndThePhaseOfTheTouch)
{
    PipelineHarness harness(970);
    harness.idle(3);
    harness.press({{'K', 248}, {'A', 12}}, 1);  // starts at 1000
    const Algs& algs = harness.algs();
    Algs::Readings readings{};
    readings[0] = 12;
    readings[10] = 248;
    std::string touch = algs.touchStateDescription(readings, 1000);
    EXPECT_NE(touch.find(", K= 248  599<==ON, "), std::string::npos) << touch;
    EXPECT_EQ(touch.rfind("[A=  12   23, B=   0    0, ", std::string::npos), touch.find('[')) << touch;
    EXPECT_EQ(touch.substr(touch.find(']')), "] STARTTOUCH 0ms ActiveRegion=1") << touch;
    EXPECT_EQ(touch.rfind("ts=", 0), 0u);
    EXPECT_NE(touch.find(", NonActivePixels=21, "), std::string::npos) << touch;

    const std::string groups = algs.virtualStateDescription(readings, 1000);
    EXPECT_NE(groups.find("[ABE=   0, ABF=   0, "), std::string::npos) << groups;
    EXPECT_NE(groups.find(", IJK= 239<==ON, KLM= 239<==ON, "), std::string::npos) << groups;
    EXPECT_NE(groups.find(", MNO=   0] STARTTOUCH"), std::string::npos) << groups;

    harness.press({{'K', 248}}, 17);
    harness.release();  // at 1180
    EXPECT_EQ(lines(algs.touchStateDescription(readings, 1180)).size(), 1u);
    const std::string tap = algs.touchStateDescription(readings, 1180);
    EXPECT_EQ(tap.substr(tap.find(']')), "] TAP 180ms ActiveRegion=1 BELOWNOISE");
    EXPECT_NE(tap.find(", K= 248    0, "), std::string::npos);  // the reading given, the value of the frame

    harness.idle(100);
    const std::string quiet = algs.touchStateDescription(readings, 2200);
    EXPECT_EQ(quiet.substr(quiet.size() - 2), "] ");
}

}  // namespace
}  // namespace VeltoTouch::Test
