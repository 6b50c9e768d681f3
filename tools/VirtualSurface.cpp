#include "VirtualSurface.h"

#include "records/FeatureReport.h"
#include "records/InputReport.h"
#include "service/VeltoTouchHIDService.h"

#include <linux/input.h>

namespace VeltoTool {

namespace {

using Service = VeltoTouch::VeltoTouchHIDService;
using HoldDuration = VeltoTouch::FeatureReport::FactoryResetHoldDuration;

// Report descriptor short items: tag and type, with the number of data bytes
// that follow in the low two bits.
constexpr std::uint8_t kUsagePage16 = 0x06;
constexpr std::uint8_t kUsage8 = 0x09;
constexpr std::uint8_t kCollection8 = 0xA1;
constexpr std::uint8_t kEndCollection = 0xC0;
constexpr std::uint8_t kLogicalMinimum8 = 0x15;
constexpr std::uint8_t kLogicalMaximum16 = 0x26;
constexpr std::uint8_t kReportSize8 = 0x75;
constexpr std::uint8_t kReportID8 = 0x85;
constexpr std::uint8_t kReportCount16 = 0x96;
constexpr std::uint8_t kInput8 = 0x81;
constexpr std::uint8_t kFeature8 = 0xB1;
constexpr std::uint8_t kApplicationCollection = 0x01;
constexpr std::uint8_t kDataVariableAbsolute = 0x02;

// One application collection on the vendor-defined usage page 0xFF00, usage
// 0x01: no input driver of the kernel takes such a device, so its reports
// reach readers through hidraw alone, as the real surface's do.
constexpr std::uint16_t kVendorUsagePage = 0xFF00;
constexpr std::uint8_t kSurfaceUsage = 0x01;

// One report: a run of bytes (8-bit fields, 0 to 255) whose usage is its ID.
// `length` counts the ID, as the plug-in's lengths do.
void appendReport(std::vector<std::uint8_t>& descriptor, std::uint8_t mainItem, std::uint8_t reportID,
                  std::size_t length)
{
    const auto count = static_cast<std::uint16_t>(length - 1);
    // Byte by byte: GCC 12's link-time optimiser warns, wrongly, that an
    // insert of an initializer list here reads past its source.
    for (std::uint8_t byte : {kReportID8, reportID, kUsage8, reportID, kReportCount16, static_cast<std::uint8_t>(count),
                              static_cast<std::uint8_t>(count >> 8), mainItem, kDataVariableAbsolute}) {
        descriptor.push_back(byte);
    }
}

}  // namespace

// The kernel drops input reports whose ID the descriptor does not declare,
// and pads shorter ones: both input reports are declared at the length the
// plug-in parses. The feature reports are declared at the length the plug-in
// reads them with (its buffer for the debug reports, the parsed layout for
// the hold duration), so that hidraw readers see what the device would send.
std::vector<std::uint8_t> VirtualSurface::reportDescriptor()
{
    constexpr auto kPageLow = static_cast<std::uint8_t>(kVendorUsagePage);
    constexpr auto kPageHigh = static_cast<std::uint8_t>(kVendorUsagePage >> 8);
    std::vector<std::uint8_t> descriptor = {
        kUsagePage16,      kPageLow, kPageHigh,
        kUsage8,           kSurfaceUsage,
        kCollection8,      kApplicationCollection,
        kLogicalMinimum8,  0x00,
        kLogicalMaximum16, 0xFF, 0x00,
        kReportSize8,      8,
    };
    using namespace VeltoTouch::InputReport;
    appendReport(descriptor, kInput8, Image::kReportID, Image::kLength);
    appendReport(descriptor, kInput8, FirmwareEvent::kReportID, FirmwareEvent::kLength);
    appendReport(descriptor, kFeature8, HoldDuration::kReportID, HoldDuration::kLength);
    for (std::uint8_t reportID : Service::kFirmwareDebugReportIDs) {
        appendReport(descriptor, kFeature8, reportID, Service::kFirmwareDebugReportBufferSize);
    }
    descriptor.push_back(kEndCollection);
    return descriptor;
}

VeltoTouch::HidRecorderWriter::Device VirtualSurface::hidRecorderDevice(std::uint16_t vendor, std::uint16_t product)
{
    VeltoTouch::HidRecorderWriter::Device device;
    device.name = kName;
    device.bus = BUS_USB;
    device.vendor = vendor;
    device.product = product;
    device.reportDescriptor = reportDescriptor();
    return device;
}

}  // namespace VeltoTool
