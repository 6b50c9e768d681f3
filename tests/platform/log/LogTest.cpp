#include "platform/log/CaptureLogSink.h"
#include "platform/log/Log.h"
#include "platform/values/PropertyValue.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

using VeltoHost::CaptureLogSink;
using VeltoHost::formatLog;
using VeltoHost::Log;
using VeltoHost::LogLevel;
using VeltoHost::PropertyValue;

// How each argument is taken for the conversions the code uses. What the C
// library then prints is its own; the recogniser's dumps, pinned frame by
// frame, go through "%u" and "%@" with text.
TEST(LogFormat, FollowsTheCLibraryConversions)
{
    // Without a length modifier an integer prints as its low 32 bits, as in C.
    EXPECT_EQ(formatLog("%d", std::uint32_t{0xFFFFFFFFu}), "-1");
    EXPECT_EQ(formatLog("%u", -1), "4294967295");
    EXPECT_EQ(formatLog("0x%02jx", 4u), "0x04");
    EXPECT_EQ(formatLog("0x%jx", std::uint64_t{0x0102030405060708ull}), "0x102030405060708");
    EXPECT_EQ(formatLog("%ju", std::uint64_t{18446744073709551615ull}), "18446744073709551615");
    EXPECT_EQ(formatLog("%*jd|", 3, std::int64_t{-5}), " -5|");
    EXPECT_EQ(formatLog("%@%*s|", std::string("12"), -2, ""), "12  |");
    EXPECT_EQ(formatLog("%d and %d", 1), "1 and (missing)");
    // %@ describes an object.
    EXPECT_EQ(formatLog("value %@", PropertyValue::uint32(28)), "value 28");
    EXPECT_EQ(formatLog("%@", PropertyValue::array({PropertyValue::int32(28), PropertyValue::int32(0)})), "[28, 0]");
}

TEST(Log, BuildsLinesOnlyForEnabledLevels)
{
    CaptureLogSink::Scope capture(LogLevel::Default);
    Log log("HIDService");
    EXPECT_FALSE(log.isEnabled(LogLevel::Debug));
    EXPECT_TRUE(log.isEnabled(LogLevel::Error));

    int described = 0;
    struct Costly {
        int* counter;
        std::string description() const
        {
            ++*counter;
            return "costly";
        }
    };
    log.debug("not written %@", Costly{&described});
    log.log("written %d", 1);
    log.error("also %s", "written");
    Log("Algs").log("other category");

    auto records = capture.sink().records();
    ASSERT_EQ(records.size(), 3u);  // debug line dropped
    EXPECT_EQ(records[0].message, "written 1");
    EXPECT_EQ(records[0].level, LogLevel::Default);
    EXPECT_EQ(records[1].level, LogLevel::Error);
    EXPECT_EQ(capture.sink().messages("Algs"), std::vector<std::string>{"other category"});
    // Objects are described only for lines that are written.
    EXPECT_EQ(described, 0);
    log.log("now %@", Costly{&described});
    EXPECT_EQ(described, 1);
}

TEST(Log, TheStandardErrorSinkWritesOneLinePerMessage)
{
    // Messages whose text ends in line breaks of their own (the disjoint
    // image line ends in two) still take exactly one line each; line breaks
    // inside a message (the recogniser's dumps) are its own.
    const int threshold = Log::threshold();
    Log::setThreshold(LogLevel::Debug);
    auto previous = Log::setSink(nullptr);
    testing::internal::CaptureStderr();
    {
        Log log("HIDService", "org.example.hid.VeltoTouch");
        log.error("Disjoint image (frame number: %ju -> %ju)\n\n", 7u, 9u);
        log.log("Received image frame: %ju", 9u);
        log.debug("%s", "\n");
        log.debug("dump\nsecond row\n");
    }
    const std::string written = testing::internal::GetCapturedStderr();
    Log::setSink(previous);
    Log::setThreshold(threshold);
    EXPECT_EQ(written,
              "[org.example.hid.VeltoTouch:HIDService] error: Disjoint image (frame number: 7 -> 9)\n"
              "[org.example.hid.VeltoTouch:HIDService] default: Received image frame: 9\n"
              "[org.example.hid.VeltoTouch:HIDService] debug: \n"
              "[org.example.hid.VeltoTouch:HIDService] debug: dump\nsecond row\n");
}
