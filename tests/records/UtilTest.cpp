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

TEST(Util, TimeConversionsWithoutATimebaseGiveZero)
{
    // The conversions at a tick of 125/3 ns: the recorder, playback and
    // hid-recorder tests again under that clock (recording/timebase/). A
    // timebase that was never filled in gives 0.
    EXPECT_EQ(Util::nanosecondsFromMachTime(5, Timebase{}), 0u);
    EXPECT_EQ(Util::machTimeFromNanoseconds(5, Timebase{}), 0u);
}

// Report bytes as the recordings hold them: two hex digits and a blank per
// byte, read back exactly; a number too large for a byte is an error, and
// the reading stops at the first thing that is not a number.
TEST(Util, HexTextRoundTripsEveryByteAndRefusesNumbersBeyondAByte)
{
    EXPECT_EQ(Util::hexStringFromBytes({0x00, 0x0A, 0xFF}), "00 0a ff ");
    std::vector<std::uint8_t> every(256);
    for (int i = 0; i < 256; ++i) every[i] = static_cast<std::uint8_t>(i);
    EXPECT_EQ(Util::bytesFromHexString(Util::hexStringFromBytes(every)), every);
    EXPECT_TRUE(Util::bytesFromHexString("").empty());
    EXPECT_EQ(Util::bytesFromHexString("0A ff\n 0b"), (std::vector<std::uint8_t>{0x0A, 0xFF, 0x0B}));
    EXPECT_EQ(Util::bytesFromHexString("01 zz 02"), (std::vector<std::uint8_t>{0x01}));
    for (const char* bad : {"100", "0a0b", "ff 1ff"}) {
        EXPECT_THROW(Util::bytesFromHexString(bad), std::invalid_argument) << bad;
    }
}
