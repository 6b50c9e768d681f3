#pragma once

#include <array>
#include <cstdint>
#include <vector>

// Raw report bytes for the pipeline tests.
namespace ReportBytes {

inline std::vector<std::uint8_t> image(std::uint32_t frameNumber, std::uint32_t timeMs,
                                       const std::array<std::int16_t, 15>& readings = {})
{
    std::vector<std::uint8_t> bytes(73, 0);
    bytes[0] = 0x01;
    for (int i = 0; i < 4; ++i) {
        bytes[1 + i] = static_cast<std::uint8_t>(frameNumber >> (8 * i));
        bytes[5 + i] = static_cast<std::uint8_t>(timeMs >> (8 * i));
    }
    for (int pad = 0; pad < 15; ++pad) {
        auto value = static_cast<std::uint16_t>(readings[pad]);
        bytes[43 + 2 * pad] = static_cast<std::uint8_t>(value);
        bytes[44 + 2 * pad] = static_cast<std::uint8_t>(value >> 8);
    }
    return bytes;
}

inline std::vector<std::uint8_t> firmwareEvent(std::uint8_t code, std::array<std::uint8_t, 8> context = {})
{
    std::vector<std::uint8_t> bytes{0x02, code};
    bytes.insert(bytes.end(), context.begin(), context.end());
    return bytes;
}

}  // namespace ReportBytes
