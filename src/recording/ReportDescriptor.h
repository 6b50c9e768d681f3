#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <vector>

namespace VeltoTouch {

// What a HID report descriptor says of its input reports, as much as telling
// the surface from other devices in a capture needs.
class ReportDescriptor {
public:
    // The length in bytes of each input report the descriptor declares, by
    // report ID, the ID byte counted; ID 0 stands for the reports of a
    // descriptor without report IDs, which carry none. An item cut short at
    // the end is ignored, as are pushes past a depth no real device needs.
    static std::map<std::uint8_t, std::size_t> inputReportLengths(const std::vector<std::uint8_t>& descriptor);

    // Whether it declares the surface's two input reports at the lengths the
    // plug-in parses: Image (0x01, 73 bytes) and FirmwareEvent (0x02, 10).
    // Other reports beside them do not matter.
    static bool declaresSurfaceReports(const std::vector<std::uint8_t>& descriptor);
};

}  // namespace VeltoTouch
