#pragma once

#include "records/InputReport.h"

#include <array>
#include <cstdint>
#include <vector>

// Raw report bytes for the pipeline tests.
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

inline std::vector<std::uint8_t> firmwareEvent(std::uint8_t code, std::array<std::uint8_t, 8> context = {})
{
    return VeltoTouch::InputReport::FirmwareEvent{code, context}.toReport();
}

}  // namespace ReportBytes
