#include "platform/HidEvent.h"

#include <gtest/gtest.h>

using VeltoHost::HidEvent;

TEST(HidEvent, DigitizerEventKeepsItsFieldsAndDescribesThem)
{
    auto event = HidEvent::createDigitizerEvent(5, 2, 0, 0, 0x20000, 0, 0.0, 3.0, 0.0, 0.0, 0.0, false, false, 0);
    EXPECT_EQ(event->kind(), HidEvent::Kind::Digitizer);
    EXPECT_EQ(event->type(), HidEvent::kTypeDigitizer);
    EXPECT_EQ(event->timeStamp(), 5u);
    EXPECT_EQ(event->digitizer().eventMask, 0x20000u);
    EXPECT_EQ(event->digitizer().y, 3.0);
    EXPECT_EQ(event->phase(), 0);
    EXPECT_FALSE(event->integerValue(0x000B001B).has_value());

    event->setPhase(HidEvent::kPhaseMayBegin);
    event->setTimeStamp(77);
    event->setIntegerValue(0x000B001B, 1234);
    EXPECT_EQ(event->phase(), 0x80);
    EXPECT_EQ(event->integerValue(0x000B001B), 1234);

    std::string text = event->description();
    EXPECT_NE(text.find("digitizer"), std::string::npos);
    EXPECT_NE(text.find("timestamp=77"), std::string::npos);
    EXPECT_NE(text.find("phase=0x80"), std::string::npos);
    EXPECT_NE(text.find("field[0x000b001b]=1234"), std::string::npos);
}

TEST(HidEvent, VendorDefinedEventCopiesItsPayload)
{
    std::uint8_t payload[] = {1, 2, 3};
    auto event = HidEvent::createVendorDefinedEvent(0, 0xFF60, 2, 0, payload, sizeof payload, 0);
    payload[0] = 9;
    EXPECT_EQ(event->type(), HidEvent::kTypeVendorDefined);
    EXPECT_EQ(event->vendorDefined().usagePage, 0xFF60u);
    EXPECT_EQ(event->vendorDefined().payload, (std::vector<std::uint8_t>{1, 2, 3}));
    EXPECT_NE(event->description().find("usagePage=0xff60"), std::string::npos);

    auto empty = HidEvent::createVendorDefinedEvent(0, 0xFF60, 2, 0, nullptr, 0, 0);
    EXPECT_TRUE(empty->vendorDefined().payload.empty());
}
