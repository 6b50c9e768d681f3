#include "records/HexText.h"

#include <sstream>
#include <stdexcept>

namespace VeltoTouch::Util {

std::string hexStringFromBytes(const std::uint8_t* bytes, std::size_t length)
{
    static const char kDigits[] = "0123456789abcdef";
    std::string text;
    text.reserve(length * 3);
    for (std::size_t i = 0; i < length; ++i) {
        text += kDigits[bytes[i] >> 4];
        text += kDigits[bytes[i] & 0xF];
        text += ' ';
    }
    return text;
}

std::string hexStringFromBytes(const std::vector<std::uint8_t>& bytes)
{
    return hexStringFromBytes(bytes.data(), bytes.size());
}

std::vector<std::uint8_t> bytesFromHexString(const std::string& text)
{
    std::istringstream stream(text);
    stream >> std::hex;
    std::vector<std::uint8_t> bytes;
    std::uint16_t value = 0;
    // The stream's own integer extraction decides what a number is: blanks
    // skipped, optional 0x, either case; the first thing that is not a number
    // ends the text quietly.
    while (stream >> value) {
        if (value >= 256) throw std::invalid_argument("invalid hex string");
        bytes.push_back(static_cast<std::uint8_t>(value));
    }
    return bytes;
}

}  // namespace VeltoTouch::Util
