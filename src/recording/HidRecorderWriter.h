#pragma once

#include "platform/devices/HidrawDescription.h"
#include "recording/PipelineRecording.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

namespace VeltoTouch {

// Writes one device's input reports in the text format of hid-recorder
// (HidRecorderReader reads it back): the device's description once, then
// each report as it comes, so that a capture of any length is written
// without holding it, and a recorder can write reports as they arrive.
//
// Times are written in whole microseconds from the capture's start, as the
// format has them: the origin given, or else the first report's time. The
// writer never throws for the stream's sake; the owner checks the stream.
class HidRecorderWriter {
public:
    // What a player needs to make the device again (through uhid): what a
    // hidraw node tells of its device.
    using Device = VeltoHost::HidrawDescription;

    // Writes the device's lines at once.
    HidRecorderWriter(std::ostream& out, const Device& device, std::optional<std::uint64_t> originNs = std::nullopt);
    HidRecorderWriter(const HidRecorderWriter&) = delete;
    HidRecorderWriter& operator=(const HidRecorderWriter&) = delete;
    ~HidRecorderWriter() = default;

    // One input report, stamped `timestampNs` on the recording's time line.
    // A time before the origin cannot be written: std::invalid_argument.
    void writeReport(std::uint64_t timestampNs, const std::uint8_t* data, std::size_t length);
    // A frame of a recording: its input report, or false for a frame with no
    // place in the format (a state frame), which is left out.
    bool write(const PipelineRecording::Frame& frame);

    std::uint64_t reportsWritten() const noexcept { return _reportsWritten; }

private:
    std::ostream& _out;
    std::optional<std::uint64_t> _originNs;
    std::uint64_t _reportsWritten = 0;
    std::string _line;  // reused, so that a report costs no allocation
};

}  // namespace VeltoTouch
