#include "recording/HidRecorderReader.h"

#include "records/HexText.h"
#include "records/InputReport.h"
#include "recording/ReportDescriptor.h"

#include <array>
#include <cstring>
#include <utility>

namespace VeltoTouch {

namespace {

constexpr std::uint64_t kNanosecondsPerSecond = 1'000'000'000;
constexpr std::uint64_t kNanosecondsPerMicrosecond = 1'000;
constexpr std::size_t kMicrosecondDigits = 6;
constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";


bool isBlank(char c) { return c == ' ' || c == '\t'; }
bool isDigit(char c) { return c >= '0' && c <= '9'; }

void skipBlanks(std::string_view& text)
{
    std::size_t blanks = 0;
    while (blanks < text.size() && isBlank(text[blanks])) ++blanks;
    text.remove_prefix(blanks);
}

// The next run of characters up to a blank, taken off the front.
std::string_view takeWord(std::string_view& text)
{
    skipBlanks(text);
    std::size_t length = 0;
    while (length < text.size() && !isBlank(text[length])) ++length;
    const std::string_view word = text.substr(0, length);
    text.remove_prefix(length);
    return word;
}

// A decimal number with nothing else in the word, that fits.
std::optional<std::uint64_t> decimal(std::string_view word, std::uint64_t largest)
{
    if (word.empty()) return std::nullopt;
    std::uint64_t value = 0;
    for (char c : word) {
        if (!isDigit(c)) return std::nullopt;
        const auto digit = static_cast<std::uint64_t>(c - '0');
        if (value > (largest - digit) / 10) return std::nullopt;
        value = value * 10 + digit;
    }
    return value;
}

// A hex number of one to eight digits.
std::optional<std::uint32_t> hex(std::string_view word)
{
    if (word.empty() || word.size() > 8) return std::nullopt;
    std::uint32_t value = 0;
    for (char c : word) {
        const int digit = Util::hexDigit(c);
        if (digit < 0) return std::nullopt;
        value = value << 4 | static_cast<std::uint32_t>(digit);
    }
    return value;
}

// Blank-separated bytes of two hex digits each, to the end of the text.
// False at the first that is not one.
bool hexBytes(std::string_view text, std::vector<std::uint8_t>& bytes)
{
    const char* at = text.data();
    const char* const end = at + text.size();
    for (;;) {
        while (at < end && isBlank(*at)) ++at;
        if (at == end) return true;
        if (end - at < 2 || (end - at > 2 && !isBlank(at[2]))) return false;
        const int high = Util::hexDigit(at[0]);
        const int low = Util::hexDigit(at[1]);
        if ((high | low) < 0) return false;
        bytes.push_back(static_cast<std::uint8_t>(high << 4 | low));
        at += 2;
    }
}

// SECONDS.MICROSECONDS as nanoseconds: fewer than six decimals are a decimal
// fraction as written ("1.5" is 1.500000), more are refused, since a capture
// holds whole microseconds.
std::optional<std::uint64_t> eventTime(std::string_view word)
{
    const std::size_t point = word.find('.');
    if (point == std::string_view::npos) return std::nullopt;
    const std::string_view fraction = word.substr(point + 1);
    if (fraction.empty() || fraction.size() > kMicrosecondDigits) return std::nullopt;
    constexpr std::uint64_t kMost = ~std::uint64_t{0};
    const auto seconds = decimal(word.substr(0, point), kMost / kNanosecondsPerSecond);
    auto microseconds = decimal(fraction, kMost);
    if (!seconds || !microseconds) return std::nullopt;
    for (std::size_t digits = fraction.size(); digits < kMicrosecondDigits; ++digits) *microseconds *= 10;
    const std::uint64_t whole = *seconds * kNanosecondsPerSecond;
    const std::uint64_t part = *microseconds * kNanosecondsPerMicrosecond;
    if (whole > kMost - part) return std::nullopt;
    return whole + part;
}

// A name as it may appear in a message: what the terminal would act on is
// shown as '?', and a long one is cut.
std::string shown(const std::string& name)
{
    constexpr std::size_t kLongest = 60;
    std::string text = name.substr(0, kLongest);
    for (char& c : text) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) c = '?';
    }
    return '"' + text + (name.size() > kLongest ? "...\"" : "\"");
}

std::string byteCount(std::size_t count) { return std::to_string(count) + (count == 1 ? " byte" : " bytes"); }

const std::string kSurfaceReports = [] {
    using namespace InputReport;
    return "the surface's input reports (Image 0x01 of " + std::to_string(Image::kLength) +
           " bytes, FirmwareEvent 0x02 of " + std::to_string(FirmwareEvent::kLength) + ")";
}();

}  // namespace

HidRecorderReader::Fault::Fault(std::size_t line, const std::string& reason)
    : std::invalid_argument(line == 0 ? reason : "line " + std::to_string(line) + ": " + reason),
      _line(line),
      _reason(reason)
{
}

bool HidRecorderReader::opensWith(char first) noexcept
{
    // JSON's literals are lower case: these letters and '#' start no JSON text.
    switch (first) {
    case '#':
    case 'D':
    case 'R':
    case 'N':
    case 'P':
    case 'I':
    case 'E': return true;
    default: return false;
    }
}

bool HidRecorderReader::opens(std::string_view text) noexcept
{
    if (text.starts_with(kByteOrderMark)) text.remove_prefix(kByteOrderMark.size());
    const std::size_t first = text.find_first_not_of(" \t\r\n");
    return first != std::string_view::npos && opensWith(text[first]);
}

HidRecorderReader::HidRecorderReader(FrameHandler onFrame, std::optional<std::uint32_t> device)
    : _onFrame(std::move(onFrame)), _named(device)
{
    // A named device is read from its first event on; whether the file has
    // it at all is known only at the end.
    if (_named) _chosen = _named;
}

void HidRecorderReader::read(std::string_view text, const FrameHandler& onFrame, std::optional<std::uint32_t> device)
{
    HidRecorderReader reader(onFrame, device);
    reader.feed(text);
    reader.finish();
}

void HidRecorderReader::feed(std::string_view piece)
{
    if (!_partial.empty()) {
        const std::size_t end = piece.find('\n');
        const std::size_t taken = end == std::string_view::npos ? piece.size() : end;
        if (_partial.size() + taken > kLongestLine) {
            ++_line;
            fail("longer than " + std::to_string(kLongestLine) + " bytes");
        }
        _partial.append(piece.substr(0, taken));
        if (end == std::string_view::npos) return;
        piece.remove_prefix(end + 1);
        const std::string line = std::exchange(_partial, {});
        readLine(line);
    }
    for (;;) {
        const void* found = std::memchr(piece.data(), '\n', piece.size());
        if (!found) break;
        const auto end = static_cast<std::size_t>(static_cast<const char*>(found) - piece.data());
        readLine(piece.substr(0, end));
        piece.remove_prefix(end + 1);
    }
    if (piece.size() > kLongestLine) {
        ++_line;
        fail("longer than " + std::to_string(kLongestLine) + " bytes");
    }
    _partial.assign(piece);
}

void HidRecorderReader::finish()
{
    if (!_partial.empty()) readLine(std::exchange(_partial, {}));
    if (_named) {
        if (!find(*_named)) {
            _line = 0;
            fail("no device " + std::to_string(*_named) + " in it (" + devicesListed() + ")");
        }
        return;
    }
    if (!_chosen) {
        _line = 0;
        choose(false);
    }
}

void HidRecorderReader::readLine(std::string_view line)
{
    ++_line;
    if (line.size() > kLongestLine) fail("longer than " + std::to_string(kLongestLine) + " bytes");
    // A byte order mark is no part of the first line.
    if (_line == 1 && line.starts_with(kByteOrderMark)) line.remove_prefix(kByteOrderMark.size());
    // A carriage return is blank space at either end of a line, as the
    // streaming reader takes one before the first line.
    while (!line.empty() && (isBlank(line.back()) || line.back() == '\r')) line.remove_suffix(1);
    while (!line.empty() && (isBlank(line.front()) || line.front() == '\r')) line.remove_prefix(1);
    if (line.empty() || line.front() == '#') return;
    if (line.size() < 2 || line[1] != ':') fail("unknown line (expected D:, R:, N:, P:, I:, E: or a # comment)");
    std::string_view fields = line.substr(2);
    switch (line.front()) {
    case 'E': readEvent(fields); return;
    case 'D': {
        const auto number = decimal(takeWord(fields), ~std::uint32_t{0});
        skipBlanks(fields);
        if (!number || !fields.empty()) fail("invalid device number");
        _current = static_cast<std::uint32_t>(*number);
        current();
        return;
    }
    case 'R': readDescriptor(fields); return;
    case 'N':
        skipBlanks(fields);
        current().name.assign(fields);
        return;
    case 'P': current(); return;
    case 'I': readIds(fields); return;
    default: fail("unknown line (expected D:, R:, N:, P:, I:, E: or a # comment)");
    }
}

void HidRecorderReader::readEvent(std::string_view fields)
{
    // The choice is made at the first event, from the devices described by then.
    if (!_chosen) choose(true);
    const std::uint32_t number = current().number;
    const auto timeNs = eventTime(takeWord(fields));
    if (!timeNs) fail("invalid event time (expected SECONDS.MICROSECONDS)");
    const auto length = decimal(takeWord(fields), kLongestLine);
    if (!length) fail("invalid event length");

    const bool wanted = number == *_chosen;
    PipelineRecording::Frame frame;
    std::vector<std::uint8_t>& bytes = wanted ? frame.report : _scratch;
    bytes.clear();
    bytes.reserve(*length);
    if (!hexBytes(fields, bytes)) fail("invalid hex byte in the event");
    if (bytes.size() != *length) fail("event length " + std::to_string(*length) + " but " + byteCount(bytes.size()));
    if (!wanted) return;
    frame.type = PipelineRecording::Frame::Type::InputReport;
    frame.timestampNs = *timeNs;
    _onFrame(std::move(frame));
}

void HidRecorderReader::readDescriptor(std::string_view fields)
{
    Device& device = current();
    if (device.described) fail("a second report descriptor for device " + std::to_string(device.number));
    const auto length = decimal(takeWord(fields), kLongestLine);
    if (!length) fail("invalid report descriptor length");
    std::vector<std::uint8_t> descriptor;
    descriptor.reserve(*length);
    if (!hexBytes(fields, descriptor)) fail("invalid hex byte in the report descriptor");
    if (descriptor.size() != *length) {
        fail("report descriptor length " + std::to_string(*length) + " but " + byteCount(descriptor.size()));
    }
    device.described = true;
    device.surface = ReportDescriptor::declaresSurfaceReports(descriptor);
}

void HidRecorderReader::readIds(std::string_view fields)
{
    current();
    for (int id = 0; id < 3; ++id) {
        if (!hex(takeWord(fields))) fail("invalid ids (expected I: BUS VENDOR PRODUCT in hex)");
    }
    skipBlanks(fields);
    if (!fields.empty()) fail("invalid ids (expected I: BUS VENDOR PRODUCT in hex)");
}

HidRecorderReader::Device& HidRecorderReader::current()
{
    if (Device* device = find(_current)) return *device;
    Device& added = _devices.emplace_back();
    added.number = _current;
    return added;
}

HidRecorderReader::Device* HidRecorderReader::find(std::uint32_t number)
{
    // The device of the last lines is looked up first: it nearly always is the one.
    if (!_devices.empty() && _devices.back().number == number) return &_devices.back();
    for (Device& device : _devices) {
        if (device.number == number) return &device;
    }
    return nullptr;
}

void HidRecorderReader::choose(bool atFirstEvent)
{
    for (const Device& device : _devices) {
        if (device.surface) {
            _chosen = device.number;
            return;
        }
    }
    fail(std::string(atFirstEvent ? "no device described before the first event has " : "no device has ") +
         kSurfaceReports + " (" + devicesListed() + ")");
}

std::string HidRecorderReader::devicesListed() const
{
    if (_devices.empty()) return "it describes no device";
    std::string listed = _devices.size() == 1 ? "device " : "devices ";
    for (const Device& device : _devices) {
        if (&device != &_devices.front()) listed += ", ";
        listed += std::to_string(device.number);
        if (!device.name.empty()) listed += " " + shown(device.name);
    }
    return listed;
}

void HidRecorderReader::fail(const std::string& reason) const { throw Fault(_line, reason); }

}  // namespace VeltoTouch
