#include "records/FeatureReport.h"
#include "records/InputReport.h"

#include <gtest/gtest.h>

using namespace VeltoTouch;

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

    // Extra bytes are ignored; too short or another ID is no image.
    std::vector<std::uint8_t> longer = bytes;
    longer.resize(100, 0xEE);
    auto fromLonger = InputReport::Image::parse(longer.data(), longer.size());
    ASSERT_TRUE(fromLonger);
    EXPECT_EQ(fromLonger->readings, image->readings);
    EXPECT_FALSE(InputReport::Image::parse(bytes.data(), 72));
    bytes[0] = 0x02;
    EXPECT_FALSE(InputReport::Image::parse(bytes.data(), 73));
}

TEST(InputReport, FirmwareEventBoundariesAndEmptyReports)
{
    // Written out by hand, so that the layout is checked independently of the encoder.
    const std::vector<std::uint8_t> bytes{0x02, 0x00, 1, 2, 3, 4, 5, 6, 7, 8};
    auto event = InputReport::FirmwareEvent::parse(bytes.data(), bytes.size());
    ASSERT_TRUE(event);
    EXPECT_EQ(event->event, 0);
    EXPECT_EQ(event->context, (std::array<std::uint8_t, 8>{1, 2, 3, 4, 5, 6, 7, 8}));
    EXPECT_EQ(event->contextValue(), 0x0102030405060708ull);
    EXPECT_FALSE(InputReport::FirmwareEvent::parse(bytes.data(), 9));

    // Length zero touches no byte: a null buffer must be safe.
    EXPECT_FALSE(InputReport::Image::parse(nullptr, 0));
    EXPECT_FALSE(InputReport::FirmwareEvent::parse(nullptr, 0));
    EXPECT_FALSE(FeatureReport::FactoryResetHoldDuration::parse(nullptr, 0));
}
