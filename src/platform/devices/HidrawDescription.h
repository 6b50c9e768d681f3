#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace VeltoHost {

// What a hidraw node tells about the device behind it: its HID name and
// physical path, its bus and ids, and its report descriptor. That is all a
// player needs to make the same device again through uhid, so a capture
// written with it can be played as the device it came from.
class HidrawDescription {
public:
    std::string name;
    std::string phys;
    std::uint32_t bus = 0;  // BUS_USB and the others of linux/input.h
    std::uint16_t vendor = 0;
    std::uint16_t product = 0;
    std::vector<std::uint8_t> reportDescriptor;

    // Asked of an open hidraw descriptor. A descriptor that is not one (or
    // whose device is gone) raises std::system_error naming what could not
    // be read.
    static HidrawDescription of(int fd);
};

}  // namespace VeltoHost
