#include "recording/ContainerWriter.h"

#include "records/HexText.h"
#include "recording/ContainerFrames.h"
#include "recording/JsonValue.h"

#include <nlohmann/json.hpp>

#include <charconv>
#include <iterator>
#include <string>
#include <string_view>

namespace VeltoTouch {

namespace {

using Names = ContainerFrames;

// The container is indented two blanks per level; a frame object sits two
// levels deep, inside the top-level object and its frame array.
constexpr std::string_view kFrameIndent = "    ";
constexpr std::string_view kClosingAfterFrames = "\n  ]\n}";
constexpr std::string_view kClosingWithoutFrames = "]\n}";

// A name as JSON text; the container's names have nothing to escape.
std::string quoted(std::string_view name) { return '"' + std::string(name) + '"'; }

// The fixed text around the numbers and the report bytes, made once from the
// names the readers take (ContainerFrames). A report frame is written as it
// stands, without the JSON library: its type name and hex text need no
// escaping, and this is most of a recording.
struct FixedText {
    std::string openingHead = "{\n  " + quoted(Names::kVersionKey) + ": ";
    std::string openingTail = ",\n  " + quoted(Names::kFramesKey) + ": [";
    std::string reportFrameHead = "{\n      " + quoted(Names::kTypeKey) + ": " + quoted(Names::kInputReportType) +
                                  ",\n      " + quoted(Names::kTimestampKey) + ": ";
    std::string reportFrameReport = ",\n      " + quoted(Names::kReportKey) + ": \"";
    std::string reportFrameTail = "\"\n    }";
};

const FixedText& fixedText()
{
    static const FixedText text;
    return text;
}

// Digits as the JSON library writes them, whatever locale or base the
// stream was set up with.
void writeDecimal(std::ostream& out, std::uint64_t number)
{
    char digits[24];
    const char* end = std::to_chars(std::begin(digits), std::end(digits), number).ptr;
    out.write(digits, end - digits);
}

}  // namespace

ContainerWriter::ContainerWriter(std::ostream& out) : _out(out)
{
    const FixedText& text = fixedText();
    _out << text.openingHead;
    writeDecimal(_out, kVersion);
    _out << text.openingTail;
}

void ContainerWriter::write(const PipelineRecording::Frame& frame)
{
    if (_finished) return;
    switch (frame.type) {
    case PipelineRecording::Frame::Type::State:
        beginFrame();
        writeStateFrame(frame);
        break;
    case PipelineRecording::Frame::Type::InputReport:
        beginFrame();
        writeReportFrame(frame);
        break;
    default:
        break;
    }
}

void ContainerWriter::finish()
{
    if (_finished) return;
    _finished = true;
    _out << (_framesWritten > 0 ? kClosingAfterFrames : kClosingWithoutFrames);
}

void ContainerWriter::beginFrame()
{
    _out << (_framesWritten > 0 ? ",\n" : "\n") << kFrameIndent;
    ++_framesWritten;
}

void ContainerWriter::writeStateFrame(const PipelineRecording::Frame& frame)
{
    // Keys and values may hold anything a property write can carry, so the
    // JSON library does their escaping; its indented text of the frame is
    // moved to the frame's depth line by line. Raw line breaks occur only
    // between JSON tokens (strings escape theirs), so no string is touched.
    nlohmann::ordered_json object = nlohmann::ordered_json::object();
    object[std::string(Names::kTypeKey)] = std::string(Names::kStateType);
    object[std::string(Names::kTimestampKey)] = frame.timestampNs;
    object[std::string(Names::kKeyKey)] = frame.key;
    // Values JSON cannot hold are written as JsonValue::toJson says: byte
    // data as hex text, non-finite numbers as null; invalid UTF-8 becomes
    // U+FFFD. Writing never fails.
    if (frame.value.hasValue()) object[std::string(Names::kValueKey)] = JsonValue::toJson(frame.value);
    const std::string text = JsonValue::dump(object, true);
    std::string::size_type start = 0;
    for (auto lineBreak = text.find('\n'); lineBreak != std::string::npos; lineBreak = text.find('\n', start)) {
        _out.write(text.data() + start, static_cast<std::streamsize>(lineBreak + 1 - start));
        _out << kFrameIndent;
        start = lineBreak + 1;
    }
    _out.write(text.data() + start, static_cast<std::streamsize>(text.size() - start));
}

void ContainerWriter::writeReportFrame(const PipelineRecording::Frame& frame)
{
    const FixedText& text = fixedText();
    _out << text.reportFrameHead;
    writeDecimal(_out, frame.timestampNs);
    _out << text.reportFrameReport << Util::hexStringFromBytes(frame.report) << text.reportFrameTail;
}

}  // namespace VeltoTouch
