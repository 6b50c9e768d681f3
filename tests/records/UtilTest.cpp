#include "records/DomainKey.h"
#include "records/TickConversion.h"
#include "records/HexText.h"

#include <gtest/gtest.h>

#include <optional>
#include <stdexcept>

using namespace VeltoTouch;
using VeltoHost::Timebase;

TEST(Util, StripDomainFromKey)
{
    const std::pair<std::string, std::optional<std::string>> cases[] = {
        {"Algs.HoldTimeoutMilliseconds", "HoldTimeoutMilliseconds"},
        {"Algs.", ""},
        {"AlgsHoldTimeoutMilliseconds", std::nullopt},
        {"Alg", std::nullopt},
        {"Algs", std::nullopt},
        {"algs.X", std::nullopt},
    };
    for (const auto& [key, rest] : cases) {
        std::string stripped = key;
        EXPECT_EQ(Util::stripDomainFromKey(stripped, "Algs"), rest.has_value()) << key;
        EXPECT_EQ(stripped, rest.value_or(key)) << "a key outside the domain is left as it was";
    }
}

TEST(Util, TimeConversionsWithTimebases)
{
    const Timebase odd{125, 3};
    EXPECT_EQ(Util::nanosecondsFromMachTime(3, odd), 125u);
    EXPECT_EQ(Util::machTimeFromNanoseconds(1000, odd), 24u);
    // Each direction truncates, so a round trip may lose up to one tick.
    EXPECT_EQ(Util::nanosecondsFromMachTime(Util::machTimeFromNanoseconds(1000, odd), odd), 1000u);
    EXPECT_EQ(Util::nanosecondsFromMachTime(Util::machTimeFromNanoseconds(1001, odd), odd), 1000u);
    // The product wraps in 64 bits rather than widening.
    EXPECT_EQ(Util::nanosecondsFromMachTime(1ull << 62, odd), ((1ull << 62) * 125u) / 3u);
    // A timebase that was never filled in gives 0.
    EXPECT_EQ(Util::nanosecondsFromMachTime(5, Timebase{}), 0u);
    EXPECT_EQ(Util::machTimeFromNanoseconds(5, Timebase{}), 0u);
}

TEST(Util, HexTextRoundTripsAndReadsLikeStreamExtraction)
{
    EXPECT_EQ(Util::hexStringFromBytes({0x00, 0x0A, 0xFF}), "00 0a ff ");
    EXPECT_EQ(Util::hexStringFromBytes(std::vector<std::uint8_t>{}), "");
    EXPECT_EQ(Util::bytesFromHexString("00 0a ff "), (std::vector<std::uint8_t>{0x00, 0x0A, 0xFF}));
    EXPECT_TRUE(Util::bytesFromHexString("").empty());
    EXPECT_TRUE(Util::bytesFromHexString("   \n ").empty());
    EXPECT_EQ(Util::bytesFromHexString("0A 0xff\n\n  0XB"), (std::vector<std::uint8_t>{0x0A, 0xFF, 0x0B}));
    EXPECT_EQ(Util::bytesFromHexString("0a,0b"), (std::vector<std::uint8_t>{0x0A}));
    EXPECT_EQ(Util::bytesFromHexString("01 zz 02"), (std::vector<std::uint8_t>{0x01}));
    // Too large for 16 bits: the extraction fails and the text ends quietly.
    EXPECT_EQ(Util::bytesFromHexString("01 12345"), (std::vector<std::uint8_t>{0x01}));
    EXPECT_EQ(Util::bytesFromHexString("-0"), (std::vector<std::uint8_t>{0x00}));

    for (const char* bad : {"100", "0a0b", "01 -1", "ff 1ff"}) {
        try {
            Util::bytesFromHexString(bad);
            ADD_FAILURE() << "no error for " << bad;
        } catch (const std::invalid_argument& error) {
            EXPECT_STREQ(error.what(), "invalid hex string") << bad;
        }
    }

    std::vector<std::uint8_t> every(256);
    for (int i = 0; i < 256; ++i) every[i] = static_cast<std::uint8_t>(i);
    EXPECT_EQ(Util::bytesFromHexString(Util::hexStringFromBytes(every)), every);
}
