#include "recording/ContainerFrames.h"

#include "pipeline/Util.h"
#include "platform/PropertyDictionary.h"

#include <stdexcept>
#include <string>
#include <utility>

namespace VeltoTouch {

using VeltoHost::PropertyDictionary;

namespace {

constexpr std::string_view kTypeKey = "Type";
constexpr std::string_view kTimestampKey = "Timestamp";
constexpr std::string_view kKeyKey = "Key";
constexpr std::string_view kValueKey = "Value";
constexpr std::string_view kReportKey = "Report";
constexpr std::string_view kStateType = "State";
constexpr std::string_view kInputReportType = "InputReport";
constexpr std::string_view kReportDataKey = "ReportData";

[[noreturn]] void reject(const char* message) { throw std::invalid_argument(message); }

int hexDigit(char c)
{
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

// Report text as the writer produces it (two hex digits and a blank per byte)
// is decoded directly; anything else goes to the general hex reader, which
// accepts more forms. A stream extraction per byte would make reading a full
// recording several times slower.
std::vector<std::uint8_t> bytesFromReportText(const std::string& text)
{
    std::vector<std::uint8_t> bytes;
    if (text.size() % 3 == 0) {
        bytes.reserve(text.size() / 3);
        for (std::size_t i = 0; i < text.size(); i += 3) {
            const int high = hexDigit(text[i]);
            const int low = hexDigit(text[i + 1]);
            if (high < 0 || low < 0 || text[i + 2] != ' ') return Util::bytesFromHexString(text);
            bytes.push_back(static_cast<std::uint8_t>(high << 4 | low));
        }
        return bytes;
    }
    return Util::bytesFromHexString(text);
}

}  // namespace

PropertyValue ContainerFrames::fromVersion0(const PropertyValue& element)
{
    if (!element.isDictionary()) reject("report is not an object");
    const PropertyDictionary& report = element.asDictionary();
    // Presence only: the kinds are checked by the frame reader.
    if (!report.contains(kTimestampKey)) reject("frame lacks Timestamp");
    if (!report.contains(kReportDataKey)) reject("frame lacks ReportData");
    PropertyDictionary frame;
    frame.set(std::string(kTimestampKey), report.get(kTimestampKey));
    frame.set(std::string(kTypeKey), PropertyValue::string(std::string(kInputReportType)));
    frame.set(std::string(kReportKey), report.get(kReportDataKey));
    return PropertyValue::dictionary(std::move(frame));
}

PipelineRecording::Frame ContainerFrames::read(const PropertyValue& element)
{
    using Frame = PipelineRecording::Frame;
    if (!element.isDictionary()) reject("frame is not an object");
    const PropertyDictionary& object = element.asDictionary();

    // The checks run in this order, so the first missing piece is reported.
    const PropertyValue type = object.get(kTypeKey);
    if (!type.isString()) reject("invalid frame type");
    const PropertyValue timestamp = object.get(kTimestampKey);
    if (!timestamp.isNumberOrBoolean()) reject("invalid frame timestamp");

    Frame frame;
    frame.timestampNs = timestamp.toUInt64();
    if (type.asString() == kStateType) {
        const PropertyValue key = object.get(kKeyKey);
        if (!key.isString()) reject("invalid state key");
        frame.type = Frame::Type::State;
        frame.key = key.asString();
        // Absent means "no value"; a present entry must hold a value (JSON
        // null included), which every parsed entry does.
        if (object.contains(kValueKey)) {
            frame.value = object.get(kValueKey);
            if (!frame.value.hasValue()) reject("invalid state value class");
        }
    } else if (type.asString() == kInputReportType) {
        const PropertyValue report = object.get(kReportKey);
        if (!report.isString()) reject("invalid report");
        frame.type = Frame::Type::InputReport;
        frame.report = bytesFromReportText(report.asString());
    } else {
        reject("invalid frame type");
    }
    return frame;
}

}  // namespace VeltoTouch
