#pragma once

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

}  // namespace VeltoTouch::Util
