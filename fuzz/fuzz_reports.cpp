// Any bytes as a device would hand them over: as an input report, as the
// factory-reset feature report, and as a hidraw report descriptor. The parsers
// must read nothing past the bytes they were given (AddressSanitizer sees
// every buffer at its exact size), accept exactly the reports of their ID and
// length, and a parsed record must encode back to the bytes it came from.
#include "FuzzInput.h"
#include "platform/devices/HidrawHostDevice.h"
#include "records/FeatureReport.h"
#include "records/InputReport.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <vector>

namespace {

using VeltoHost::HidrawHostDevice;
namespace InputReport = VeltoTouch::InputReport;
namespace FeatureReport = VeltoTouch::FeatureReport;

bool sameImage(const InputReport::Image& a, const InputReport::Image& b)
{
    return a.frameNumber == b.frameNumber && a.timeMs == b.timeMs && a.aux0 == b.aux0 && a.aux1 == b.aux1 &&
           a.aux2 == b.aux2 && a.aux3 == b.aux3 && a.levels == b.levels && a.readings == b.readings;
}

// The bytes a record came from, as far as its layout reaches.
std::vector<std::uint8_t> head(const std::uint8_t* data, std::size_t count) { return {data, data + count}; }

void checkImage(const std::uint8_t* data, std::size_t size)
{
    const auto image = InputReport::Image::parse(data, size);
    const bool expected = size >= InputReport::Image::kLength && data[0] == InputReport::Image::kReportID;
    VELTO_FUZZ_CHECK(image.has_value() == expected);
    if (!image) return;
    const std::vector<std::uint8_t> report = image->toReport();
    VELTO_FUZZ_CHECK(report == head(data, InputReport::Image::kLength));
    const auto again = InputReport::Image::parse(report.data(), report.size());
    VELTO_FUZZ_CHECK(again && sameImage(*again, *image));
    // A report a byte short is no image, and the parser must not look.
    const std::vector<std::uint8_t> shorter(report.begin(), report.end() - 1);
    VELTO_FUZZ_CHECK(!InputReport::Image::parse(shorter.data(), shorter.size()));
}

void checkFirmwareEvent(const std::uint8_t* data, std::size_t size)
{
    const auto event = InputReport::FirmwareEvent::parse(data, size);
    const bool expected =
        size >= InputReport::FirmwareEvent::kLength && data[0] == InputReport::FirmwareEvent::kReportID;
    VELTO_FUZZ_CHECK(event.has_value() == expected);
    if (!event) return;
    const std::vector<std::uint8_t> report = event->toReport();
    VELTO_FUZZ_CHECK(report == head(data, InputReport::FirmwareEvent::kLength));
    const auto again = InputReport::FirmwareEvent::parse(report.data(), report.size());
    VELTO_FUZZ_CHECK(again && again->event == event->event && again->context == event->context);
    // Diagnostics print the context as one number, its first byte highest.
    std::uint64_t context = 0;
    for (std::size_t i = 2; i < InputReport::FirmwareEvent::kLength; ++i) context = context << 8 | data[i];
    VELTO_FUZZ_CHECK(event->contextValue() == context);
    const std::vector<std::uint8_t> shorter(report.begin(), report.end() - 1);
    VELTO_FUZZ_CHECK(!InputReport::FirmwareEvent::parse(shorter.data(), shorter.size()));
}

void checkHoldDuration(const std::uint8_t* data, std::size_t size)
{
    using Report = FeatureReport::FactoryResetHoldDuration;
    const auto report = Report::parse(data, size);
    VELTO_FUZZ_CHECK(report.has_value() == (size >= Report::kLength && data[0] == Report::kReportID));
    if (!report) return;
    const std::uint32_t duration = data[1] | data[2] << 8 | data[3] << 16 | static_cast<std::uint32_t>(data[4]) << 24;
    VELTO_FUZZ_CHECK(report->holdDuration == duration);
}

void checkDescriptor(const std::uint8_t* data, std::size_t size)
{
    const bool numbered = HidrawHostDevice::descriptorUsesReportIDs(data, size);
    // Items are read front to back, so a report ID item found in the first
    // part of a descriptor is still found when the rest follows. Each prefix
    // is its own exact-size buffer, so a read past its end is caught.
    for (std::size_t length : {size / 2, size > 0 ? size - 1 : 0}) {
        const std::vector<std::uint8_t> prefix(data, data + length);
        if (HidrawHostDevice::descriptorUsesReportIDs(prefix.data(), prefix.size())) VELTO_FUZZ_CHECK(numbered);
    }
    // A descriptor that opens with a report ID item declares report IDs,
    // whatever follows.
    std::vector<std::uint8_t> withID{0x85, 0x01};
    withID.insert(withID.end(), data, data + size);
    VELTO_FUZZ_CHECK(HidrawHostDevice::descriptorUsesReportIDs(withID.data(), withID.size()));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    // Nothing at all is no report of any kind, and no byte may be read.
    VELTO_FUZZ_CHECK(!InputReport::Image::parse(nullptr, 0));
    VELTO_FUZZ_CHECK(!InputReport::FirmwareEvent::parse(nullptr, 0));
    VELTO_FUZZ_CHECK(!FeatureReport::FactoryResetHoldDuration::parse(nullptr, 0));
    VELTO_FUZZ_CHECK(!HidrawHostDevice::descriptorUsesReportIDs(nullptr, 0));

    checkImage(data, size);
    checkFirmwareEvent(data, size);
    checkHoldDuration(data, size);
    checkDescriptor(data, size);
    return 0;
}
