#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace VeltoTouch::Util {

// Each byte as two lower-case hex digits and a blank: {0x00, 0x0a} -> "00 0a ".
std::string hexStringFromBytes(const std::vector<std::uint8_t>& bytes);
std::string hexStringFromBytes(const std::uint8_t* bytes, std::size_t length);
// Reads blank-separated hex numbers until the text ends or stops being a
// number. Throws std::invalid_argument("invalid hex string") for a number of
// 256 or more.
std::vector<std::uint8_t> bytesFromHexString(const std::string& text);

// The value of each hex digit character, -1 for every other byte: one
// lookup per character instead of three range tests, for the readers of
// recordings, whose text is mostly hex report bytes.
inline constexpr std::array<std::int8_t, 256> kHexDigits = [] {
    std::array<std::int8_t, 256> digits{};
    digits.fill(-1);
    for (int c = '0'; c <= '9'; ++c) digits[c] = static_cast<std::int8_t>(c - '0');
    for (int c = 'a'; c <= 'f'; ++c) digits[c] = static_cast<std::int8_t>(c - 'a' + 10);
    for (int c = 'A'; c <= 'F'; ++c) digits[c] = static_cast<std::int8_t>(c - 'A' + 10);
    return digits;
}();

inline int hexDigit(char c) { return kHexDigits[static_cast<unsigned char>(c)]; }

}  // namespace VeltoTouch::Util
