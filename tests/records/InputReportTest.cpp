#include "records/InputReport.h"

#include <gtest/gtest.h>

#include <vector>

using namespace VeltoTouch;

// Here the image's layout, field by field. Which reports each parser takes
// (ID and length, extra bytes ignored), that none reads past its bytes, and
// the firmware event's and the factory-reset report's layouts are checked by
// fuzz/fuzz_reports.cpp; resets written out byte by byte by the examples.
TEST(InputReport, ImageParsesEveryFieldAtItsOffset)
{
    std::vector<std::uint8_t> bytes(73);
    for (std::size_t i = 0; i < bytes.size(); ++i) bytes[i] = static_cast<std::uint8_t>(i);
    bytes[0] = 0x01;
    auto image = InputReport::Image::parse(bytes.data(), bytes.size());
    ASSERT_TRUE(image);
    EXPECT_EQ(image->frameNumber, 0x04030201u);
    EXPECT_EQ(image->timeMs, 0x08070605u);
    EXPECT_EQ(image->aux0, 9);
    EXPECT_EQ(image->aux3, 12);
    EXPECT_EQ(image->levels[0], 0x0E0D);
    EXPECT_EQ(image->levels[14], 0x2A29);
    EXPECT_EQ(image->readings[0], 0x2C2B);
    EXPECT_EQ(image->readings[14], 0x4847);

    bytes[1] = 0x34;
    bytes[2] = 0x12;
    bytes[3] = bytes[4] = 0;
    bytes[43] = bytes[44] = 0xFF;
    bytes[13] = bytes[14] = 0xFF;
    image = InputReport::Image::parse(bytes.data(), bytes.size());
    EXPECT_EQ(image->frameNumber, 0x1234u);
    EXPECT_EQ(image->readings[0], -1);
    EXPECT_EQ(image->levels[0], 65535);
}
