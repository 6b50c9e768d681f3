#include "RecordingTestSupport.h"

#include "platform/values/PropertyDictionary.h"
#include "recording/ContainerWriter.h"
#include "recording/JsonValue.h"
#include "records/HexText.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <cmath>
#include <limits>
#include <sstream>
#include <string>
#include <vector>

namespace {

using namespace RecordingTestSupport;
using VeltoHost::PropertyDictionary;
using VeltoTouch::ContainerWriter;
using VeltoTouch::JsonValue;

// The container built the obvious way, as one JSON tree written at once: the
// text a streamed container has to match byte for byte.
std::string wholeTreeContainer(const std::vector<Frame>& frames)
{
    nlohmann::ordered_json list = nlohmann::ordered_json::array();
    for (const Frame& frame : frames) {
        nlohmann::ordered_json object = nlohmann::ordered_json::object();
        if (frame.type == Frame::Type::State) {
            object["Type"] = "State";
            object["Timestamp"] = frame.timestampNs;
            object["Key"] = frame.key;
            if (frame.value.hasValue()) object["Value"] = JsonValue::toJson(frame.value);
        } else if (frame.type == Frame::Type::InputReport) {
            object["Type"] = "InputReport";
            object["Timestamp"] = frame.timestampNs;
            object["Report"] = VeltoTouch::Util::hexStringFromBytes(frame.report);
        } else {
            continue;
        }
        list.push_back(std::move(object));
    }
    nlohmann::ordered_json container = nlohmann::ordered_json::object();
    container["Version"] = 1;
    container["Frames"] = std::move(list);
    return JsonValue::dump(container, true);
}

std::string streamed(const std::vector<Frame>& frames)
{
    std::ostringstream text;
    ContainerWriter writer(text);
    for (const Frame& frame : frames) writer.write(frame);
    writer.finish();
    return text.str();
}

std::string writtenWhole(const std::vector<Frame>& frames)
{
    PipelineRecording recording;
    for (const Frame& frame : frames) recording.appendFrame(frame);
    return recording.json();
}

std::vector<Frame> framesWithEveryKindOfValue()
{
    PropertyDictionary inner;
    inner.set("z first", PropertyValue::int32(-7));
    inner.set("", PropertyValue::array({}));
    PropertyDictionary outer;
    outer.set("nested", PropertyValue::dictionary(inner));
    outer.set("empty", PropertyValue::dictionary(PropertyDictionary()));
    outer.set("list", PropertyValue::array({PropertyValue::null(), PropertyValue::boolean(false),
                                            PropertyValue::array({PropertyValue::float64(2.5)})}));

    Frame unknownType = stateFrame(99, "never written", PropertyValue::null());
    unknownType.type = static_cast<Frame::Type>(7);

    return {
        stateFrame(1, "Algs.NoValue", PropertyValue()),
        stateFrame(2, "null", PropertyValue::null()),
        stateFrame(3, "true", PropertyValue::boolean(true)),
        stateFrame(4, "int32", PropertyValue::int32(std::numeric_limits<std::int32_t>::min())),
        stateFrame(5, "int64", PropertyValue::int64(std::numeric_limits<std::int64_t>::min())),
        stateFrame(6, "uint32", PropertyValue::uint32(std::numeric_limits<std::uint32_t>::max())),
        stateFrame(7, "uint64", PropertyValue::uint64(std::numeric_limits<std::uint64_t>::max())),
        stateFrame(8, "float32", PropertyValue::float32(0.1f)),
        stateFrame(9, "float64", PropertyValue::float64(-1.0e-300)),
        stateFrame(10, "nan", PropertyValue::float64(std::nan(""))),
        stateFrame(11, "inf", PropertyValue::float32(std::numeric_limits<float>::infinity())),
        stateFrame(12, "text \"quoted\"\n\t\\ \xc3\xa9 \x01", PropertyValue::string("line\nbreak \"q\" \xe2\x82\xac")),
        stateFrame(13, "bad \xff utf8", PropertyValue::string("\xc3")),
        stateFrame(14, "bytes", PropertyValue::bytes({0x00, 0x0A, 0xFF})),
        stateFrame(15, "", PropertyValue::dictionary(outer)),
        stateFrame(16, "empty array", PropertyValue::array({})),
        unknownType,
        reportFrame(17, {}),
        reportFrame(18, {0x01, 0xA0, 0xFF}),
        reportFrame(std::numeric_limits<std::uint64_t>::max(), ReportBytes::image(4, 1030, {300, -300, 32767, -32768})),
        reportFrame(0, ReportBytes::firmwareEvent(0)),
    };
}

TEST(ContainerWriter, StreamsTheSameBytesAsTheWholeContainerWrittenAtOnce)
{
    const std::vector<Frame> everyKind = framesWithEveryKindOfValue();
    struct Case {
        const char* name;
        std::vector<Frame> frames;
    };
    const Case cases[] = {
        {"no frames", {}},
        {"one report", {reportFrame(5, {0x02, 0x00})}},
        {"one state without value", {stateFrame(5, "k", PropertyValue())}},
        {"only a frame of unknown type", {everyKind[16]}},
        {"every kind of value", everyKind},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const std::string expected = wholeTreeContainer(c.frames);
        EXPECT_EQ(streamed(c.frames), expected);
        EXPECT_EQ(writtenWhole(c.frames), expected);
        // Read back by either reader, the frames write the same text again:
        // nothing was lost or changed in kind on the way.
        EXPECT_EQ(PipelineRecording{std::string_view(expected)}.json(), expected);
        const PipelineRecording::FrameList streamedBack = streamFrames(expected);
        EXPECT_EQ(writtenWhole({streamedBack.begin(), streamedBack.end()}), expected);
    }
}

TEST(ContainerWriter, FinishClosesTheContainerOnceAndNumbersIgnoreTheStreamsFormatting)
{
    // A stream set up for people (hexadecimal, base prefix) must not leak
    // into the time stamps of a container.
    std::ostringstream text;
    text << std::hex << std::showbase;
    ContainerWriter writer(text);
    writer.write(reportFrame(1234567, {0x01}));
    writer.finish();
    writer.finish();
    writer.write(reportFrame(2, {0x02}));
    EXPECT_EQ(writer.framesWritten(), 1u);
    EXPECT_EQ(text.str(), wholeTreeContainer({reportFrame(1234567, {0x01})}));
}

}  // namespace
