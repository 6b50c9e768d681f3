// The drawing of an image report over the pad layout, to the character.
#include "ImageDrawing.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace VeltoTouch::Util {
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

std::string blanks(std::size_t n) { return std::string(n, ' '); }

TEST(StringFromImage, DrawsEachPadsNumberOverTheLayout)
{
    InputReport::Image image;
    image.frameNumber = 7;
    image.timeMs = 1234;
    std::vector<std::string> drawn = lines(Util::stringFromImage(image, false));
    ASSERT_EQ(drawn.size(), 16u);  // header, empty line, 13 rows, and nothing after the last "\n"
    EXPECT_EQ(drawn[0], "# Image frame 7    time 1234 ms");
    EXPECT_EQ(drawn[1], "");
    EXPECT_EQ(drawn[2], blanks(12) + "0" + blanks(8) + "0" + blanks(12));
    EXPECT_EQ(drawn[7], blanks(2) + "0" + blanks(28) + "0" + blanks(2));  // A and B at the sides
    EXPECT_EQ(drawn[15], "");

    image.readings[7] = 5;     // H
    image.readings[6] = -123;  // G
    image.readings[8] = 12345; // I
    image.levels[6] = 65535;
    drawn = lines(Util::stringFromImage(image, false));
    EXPECT_EQ(drawn[2], blanks(12) + "5" + blanks(7) + "-123" + blanks(10));
    EXPECT_EQ(drawn[3], blanks(16) + "12345" + blanks(16));
    drawn = lines(Util::stringFromImage(image, true));
    EXPECT_EQ(drawn[2], blanks(12) + "0" + blanks(7) + "65535" + blanks(11));
}

}  // namespace
}  // namespace VeltoTouch::Util
