#include "recording/HidRecorderWriter.h"

#include <charconv>
#include <iterator>
#include <stdexcept>

namespace VeltoTouch {

namespace {

constexpr std::uint64_t kNanosecondsPerSecond = 1'000'000'000;
constexpr std::uint64_t kNanosecondsPerMicrosecond = 1'000;
constexpr char kDigits[] = "0123456789abcdef";

void appendDecimal(std::string& line, std::uint64_t number, int width = 0)
{
    char digits[24];
    char* end = std::to_chars(std::begin(digits), std::end(digits), number).ptr;
    for (auto length = end - digits; length < width; ++length) line += '0';
    line.append(digits, end);
}

void appendHex(std::string& line, std::uint32_t number)
{
    char digits[12];
    char* end = std::to_chars(std::begin(digits), std::end(digits), number, 16).ptr;
    line.append(digits, end);
}

// " xx" per byte, after the length.
void appendBytes(std::string& line, const std::uint8_t* data, std::size_t length)
{
    appendDecimal(line, length);
    const std::size_t start = line.size();
    line.resize(start + 3 * length);
    char* at = line.data() + start;
    for (std::size_t i = 0; i < length; ++i, at += 3) {
        at[0] = ' ';
        at[1] = kDigits[data[i] >> 4];
        at[2] = kDigits[data[i] & 0xF];
    }
}

// Text of the name and path on one line each: a line break in them would
// start a line of its own when read back.
std::string oneLine(std::string text)
{
    for (char& c : text) {
        if (c == '\n' || c == '\r') c = ' ';
    }
    return text;
}

}  // namespace

HidRecorderWriter::HidRecorderWriter(std::ostream& out, const Device& device, std::optional<std::uint64_t> originNs)
    : _out(out), _originNs(originNs)
{
    _line = "R: ";
    appendBytes(_line, device.reportDescriptor.data(), device.reportDescriptor.size());
    _line += "\nN: " + oneLine(device.name) + "\nP: " + oneLine(device.phys) + "\nI: ";
    appendHex(_line, device.bus);
    _line += ' ';
    appendHex(_line, device.vendor);
    _line += ' ';
    appendHex(_line, device.product);
    _line += '\n';
    _out << _line;
}

void HidRecorderWriter::writeReport(std::uint64_t timestampNs, const std::uint8_t* data, std::size_t length)
{
    if (!_originNs) _originNs = timestampNs;
    if (timestampNs < *_originNs) {
        throw std::invalid_argument("an input report at " + std::to_string(timestampNs) +
                                    " ns comes before the recording's start at " + std::to_string(*_originNs) + " ns");
    }
    // Whole microseconds, truncated: what the format holds.
    const std::uint64_t sinceStartNs = timestampNs - *_originNs;
    _line = "E: ";
    appendDecimal(_line, sinceStartNs / kNanosecondsPerSecond, 6);
    _line += '.';
    appendDecimal(_line, sinceStartNs % kNanosecondsPerSecond / kNanosecondsPerMicrosecond, 6);
    _line += ' ';
    appendBytes(_line, data, length);
    _line += '\n';
    _out.write(_line.data(), static_cast<std::streamsize>(_line.size()));
    ++_reportsWritten;
}

bool HidRecorderWriter::write(const PipelineRecording::Frame& frame)
{
    if (frame.type != PipelineRecording::Frame::Type::InputReport) return false;
    writeReport(frame.timestampNs, frame.report.data(), frame.report.size());
    return true;
}

}  // namespace VeltoTouch
