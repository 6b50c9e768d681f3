#pragma once

#include "pipeline/InputReport.h"
#include "platform/MonotonicClock.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace VeltoTouch::Util {

// Removes "<domain>." from the front of `key` when it is there (exact,
// case-sensitive) and returns true; otherwise leaves `key` alone and returns
// false. Dotted keys are resolved one domain at a time with it.
bool stripDomainFromKey(std::string& key, std::string_view domain);

// Tick <-> nanosecond conversions with the clock's timebase, read once per
// process. The product wraps modulo 2^64 and the quotient truncates; a
// timebase with a zero divisor gives 0.
std::uint64_t machTimeFromNanoseconds(std::uint64_t nanoseconds);
std::uint64_t nanosecondsFromMachTime(std::uint64_t ticks);
// The same arithmetic with an explicit timebase.
std::uint64_t machTimeFromNanoseconds(std::uint64_t nanoseconds, VeltoHost::Timebase timebase) noexcept;
std::uint64_t nanosecondsFromMachTime(std::uint64_t ticks, VeltoHost::Timebase timebase) noexcept;

// Each byte as two lower-case hex digits and a blank: {0x00, 0x0a} -> "00 0a ".
std::string hexStringFromBytes(const std::vector<std::uint8_t>& bytes);
std::string hexStringFromBytes(const std::uint8_t* bytes, std::size_t length);
// Reads blank-separated hex numbers until the text ends or stops being a
// number. Throws std::invalid_argument("invalid hex string") for a number of
// 256 or more.
std::vector<std::uint8_t> bytesFromHexString(const std::string& text);

}  // namespace VeltoTouch::Util

namespace VeltoTouch::Util {

// Draws one image report over the pad layout: each pad's number (its level
// when useLevels is set, else its reading) in place of its letters, under a
// header line with the frame number and time.
std::string stringFromImage(const InputReport::Image& image, bool useLevels);

}  // namespace VeltoTouch::Util
