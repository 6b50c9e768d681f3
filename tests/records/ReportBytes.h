#pragma once

#include "records/InputReport.h"

#include <array>
#include <cstdint>
#include <initializer_list>
#include <utility>
#include <vector>

// Raw report bytes for the tests, made by the report records' own encoders.
namespace ReportBytes {

inline std::vector<std::uint8_t> image(std::uint32_t frameNumber, std::uint32_t timeMs,
                                       const std::array<std::int16_t, 15>& readings = {})
{
    VeltoTouch::InputReport::Image image;
    image.frameNumber = frameNumber;
    image.timeMs = timeMs;
    image.readings = readings;
    return image.toReport();
}

// An image whose listed pads (index, reading) read something and the rest 0.
inline std::vector<std::uint8_t> imageWithPads(std::uint32_t frameNumber, std::uint32_t timeMs,
                                               std::initializer_list<std::pair<int, std::int16_t>> pads)
{
    std::array<std::int16_t, 15> readings{};
    for (const auto& [pad, reading] : pads) readings.at(static_cast<std::size_t>(pad)) = reading;
    return image(frameNumber, timeMs, readings);
}

// Diagnostics read the context as one number, first byte most significant.
inline std::vector<std::uint8_t> firmwareEvent(std::uint8_t code, std::uint64_t context = 0)
{
    VeltoTouch::InputReport::FirmwareEvent event{code, {}};
    for (std::size_t i = 0; i < event.context.size(); ++i) {
        event.context[i] = static_cast<std::uint8_t>(context >> (8 * (event.context.size() - 1 - i)));
    }
    return event.toReport();
}

inline std::vector<std::uint8_t> deviceReset(std::uint64_t context = 0) { return firmwareEvent(0, context); }

}  // namespace ReportBytes
