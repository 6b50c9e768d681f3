#pragma once

#include "recording/HidRecorderWriter.h"

#include <cstdint>
#include <vector>

namespace VeltoTool {

// The surface as a virtual device presents itself: the name and report
// descriptor `veltotouch emulate` makes its uhid device with, and the
// description `veltotouch convert` writes into a hid-recorder file, so that
// a player of such files makes the same device.
class VirtualSurface {
public:
    static constexpr const char* kName = "VeltoTouch virtual surface";

    // On the vendor usage page 0xFF00: the Image and FirmwareEvent input
    // reports and the feature reports the plug-in reads, each a run of bytes
    // at the length the plug-in parses it with (report ID counted).
    static std::vector<std::uint8_t> reportDescriptor();

    // A USB device with these ids, as a hid-recorder file describes it.
    static VeltoTouch::HidRecorderWriter::Device hidRecorderDevice(std::uint16_t vendor, std::uint16_t product);
};

}  // namespace VeltoTool
