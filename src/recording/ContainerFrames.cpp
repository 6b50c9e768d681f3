#include "recording/ContainerFrames.h"

#include "platform/values/PropertyDictionary.h"
#include "records/HexText.h"

#include <array>
#include <cstdint>
#include <stdexcept>
#include <string>
#include <utility>

namespace VeltoTouch {

using VeltoHost::PropertyDictionary;

using Util::hexDigit;

namespace {

[[noreturn]] void reject(const char* message) { throw std::invalid_argument(message); }

// Report text as the writer produces it (two hex digits and a blank per byte)
// is decoded directly; anything else goes to the general hex reader, which
// accepts more forms. A stream extraction per byte would make reading a full
// recording several times slower.
std::vector<std::uint8_t> bytesFromReportText(const std::string& text)
{
    if (text.size() % 3 == 0) {
        std::vector<std::uint8_t> bytes(text.size() / 3);
        for (std::size_t i = 0, b = 0; i < text.size(); i += 3, ++b) {
            const int high = hexDigit(text[i]);
            const int low = hexDigit(text[i + 1]);
            if ((high | low) < 0 || text[i + 2] != ' ') return Util::bytesFromHexString(text);
            bytes[b] = static_cast<std::uint8_t>(high << 4 | low);
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

ContainerFrames::Field ContainerFrames::Field::of(PropertyValue value)
{
    Field field;
    field.present = true;
    if (value.isString()) {
        field.isText = true;
        field.text = value.asString();
    }
    field.value = std::move(value);
    return field;
}

ContainerFrames::Field& ContainerFrames::Fields::named(std::string_view name)
{
    if (name == kTypeKey) return type;
    if (name == kTimestampKey) return timestamp;
    if (name == kKeyKey) return key;
    if (name == kValueKey) return value;
    if (name == kReportKey) return report;
    return other;
}

PipelineRecording::Frame ContainerFrames::read(const PropertyValue& element)
{
    if (!element.isDictionary()) reject("frame is not an object");
    Fields fields;
    for (const auto& [name, value] : element.asDictionary()) {
        Field& field = fields.named(name);
        if (&field != &fields.other) field = Field::of(value);
    }
    return read(std::move(fields));
}

PipelineRecording::Frame ContainerFrames::read(Fields&& fields)
{
    using Frame = PipelineRecording::Frame;
    // The checks run in this order, so the first missing piece is reported.
    if (!fields.type.isText) reject("invalid frame type");
    if (!fields.timestamp.present || !fields.timestamp.value.isNumberOrBoolean()) reject("invalid frame timestamp");

    Frame frame;
    frame.timestampNs = fields.timestamp.value.toUInt64();
    if (fields.type.text == kStateType) {
        if (!fields.key.isText) reject("invalid state key");
        frame.type = Frame::Type::State;
        frame.key = std::move(fields.key.text);
        // Absent means "no value"; a present entry must hold a value (JSON
        // null included), which every parsed entry does.
        if (fields.value.present) {
            frame.value = fields.value.isText ? PropertyValue::string(std::move(fields.value.text))
                                              : std::move(fields.value.value);
            if (!frame.value.hasValue()) reject("invalid state value class");
        }
    } else if (fields.type.text == kInputReportType) {
        if (!fields.report.isText) reject("invalid report");
        frame.type = Frame::Type::InputReport;
        frame.report = bytesFromReportText(fields.report.text);
    } else {
        reject("invalid frame type");
    }
    return frame;
}

}  // namespace VeltoTouch
