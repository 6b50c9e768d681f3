#include "report/ColumnEncoder.h"

#include <bit>
#include <cstring>

namespace VeltoTouch {

void ColumnEncoder::pushInteger(std::int64_t value)
{
    // Unsigned arithmetic: the difference of two extreme values wraps instead
    // of overflowing, and the page adds it back the same way.
    const std::uint64_t delta = static_cast<std::uint64_t>(value) - static_cast<std::uint64_t>(_previous);
    _previous = value;
    std::uint64_t zigzag = (delta << 1) ^ (static_cast<std::int64_t>(delta) < 0 ? ~std::uint64_t{0} : 0);
    while (zigzag >= 0x80) {
        _bytes += static_cast<char>((zigzag & 0x7F) | 0x80);
        zigzag >>= 7;
    }
    _bytes += static_cast<char>(zigzag);
    ++_count;
}

void ColumnEncoder::pushFloat(float value)
{
    const std::uint32_t bits = std::bit_cast<std::uint32_t>(value);
    for (int shift = 0; shift < 32; shift += 8) _bytes += static_cast<char>((bits >> shift) & 0xFF);
    ++_count;
}

std::string ColumnEncoder::toBase64(const std::string& bytes)
{
    static constexpr char kAlphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string out;
    out.reserve((bytes.size() + 2) / 3 * 4);
    std::size_t i = 0;
    for (; i + 2 < bytes.size(); i += 3) {
        const std::uint32_t n = (static_cast<std::uint8_t>(bytes[i]) << 16) |
                                (static_cast<std::uint8_t>(bytes[i + 1]) << 8) | static_cast<std::uint8_t>(bytes[i + 2]);
        out += kAlphabet[(n >> 18) & 63];
        out += kAlphabet[(n >> 12) & 63];
        out += kAlphabet[(n >> 6) & 63];
        out += kAlphabet[n & 63];
    }
    if (const std::size_t rest = bytes.size() - i; rest > 0) {
        std::uint32_t n = static_cast<std::uint8_t>(bytes[i]) << 16;
        if (rest == 2) n |= static_cast<std::uint8_t>(bytes[i + 1]) << 8;
        out += kAlphabet[(n >> 18) & 63];
        out += kAlphabet[(n >> 12) & 63];
        out += rest == 2 ? kAlphabet[(n >> 6) & 63] : '=';
        out += '=';
    }
    return out;
}

}  // namespace VeltoTouch
