#include "records/InputReport.h"

#include "records/LittleEndian.h"

#include <algorithm>

namespace VeltoTouch::InputReport {

std::optional<Image> Image::parse(const std::uint8_t* data, std::size_t length) noexcept
{
    if (length < kLength || data[0] != kReportID) return std::nullopt;
    Image image;
    image.frameNumber = LittleEndian::u32(data + 1);
    image.timeMs = LittleEndian::u32(data + 5);
    image.aux0 = data[9];
    image.aux1 = data[10];
    image.aux2 = data[11];
    image.aux3 = data[12];
    for (std::size_t pad = 0; pad < kPadCount; ++pad) {
        image.levels[pad] = LittleEndian::u16(data + 13 + 2 * pad);
        image.readings[pad] = static_cast<std::int16_t>(LittleEndian::u16(data + 43 + 2 * pad));
    }
    return image;
}

std::vector<std::uint8_t> Image::toReport() const
{
    std::vector<std::uint8_t> report(kLength, 0);
    report[0] = kReportID;
    LittleEndian::putU32(&report[1], frameNumber);
    LittleEndian::putU32(&report[5], timeMs);
    report[9] = aux0;
    report[10] = aux1;
    report[11] = aux2;
    report[12] = aux3;
    for (std::size_t pad = 0; pad < kPadCount; ++pad) {
        LittleEndian::putU16(&report[13 + 2 * pad], levels[pad]);
        LittleEndian::putU16(&report[43 + 2 * pad], static_cast<std::uint16_t>(readings[pad]));
    }
    return report;
}

std::uint64_t FirmwareEvent::contextValue() const noexcept
{
    std::uint64_t value = 0;
    for (std::uint8_t byte : context) value = (value << 8) | byte;
    return value;
}

std::optional<FirmwareEvent> FirmwareEvent::parse(const std::uint8_t* data, std::size_t length) noexcept
{
    if (length < kLength || data[0] != kReportID) return std::nullopt;
    FirmwareEvent event;
    event.event = data[1];
    for (std::size_t i = 0; i < event.context.size(); ++i) event.context[i] = data[2 + i];
    return event;
}

std::vector<std::uint8_t> FirmwareEvent::toReport() const
{
    std::vector<std::uint8_t> report(kLength, 0);
    report[0] = kReportID;
    report[1] = event;
    std::copy(context.begin(), context.end(), report.begin() + 2);
    return report;
}

}  // namespace VeltoTouch::InputReport
