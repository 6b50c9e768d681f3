#include "RecordingTestSupport.h"

#include "platform/PropertyDictionary.h"
#include "recording/ContainerStream.h"
#include "recording/JsonValue.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <atomic>
#include <chrono>
#include <cmath>
#include <thread>
#include <cstdio>
#include <unistd.h>
#include <limits>
#include <optional>
#include <stdexcept>
#include <string>

namespace {

using namespace RecordingTestSupport;
using VeltoHost::PropertyDictionary;
using VeltoTouch::JsonValue;

// Frames of a container text as ContainerStream hands them over, from a
// file in memory (seekable, like a file on disk).
PipelineRecording::FrameList streamFrames(const std::string& text, std::size_t* handedBeforeFault = nullptr)
{
    std::FILE* file = std::tmpfile();
    std::fwrite(text.data(), 1, text.size(), file);
    std::fflush(file);
    ::lseek(::fileno(file), 0, SEEK_SET);
    PipelineRecording::FrameList frames;
    try {
        VeltoTouch::ContainerStream::read(::fileno(file), [&](Frame&& frame) { frames.push_back(std::move(frame)); });
    } catch (...) {
        std::fclose(file);
        if (handedBeforeFault) *handedBeforeFault = frames.size();
        throw;
    }
    std::fclose(file);
    return frames;
}

void expectSameFrames(const PipelineRecording::FrameList& actual, const PipelineRecording::FrameList& expected)
{
    ASSERT_EQ(actual.size(), expected.size());
    auto a = actual.begin();
    for (const Frame& e : expected) {
        SCOPED_TRACE("frame key '" + e.key + "' at " + std::to_string(e.timestampNs));
        EXPECT_EQ(a->type, e.type);
        EXPECT_EQ(a->timestampNs, e.timestampNs);
        EXPECT_EQ(a->key, e.key);
        EXPECT_EQ(a->value.hasValue(), e.value.hasValue());
        EXPECT_TRUE(a->value == e.value) << a->value.description() << " vs " << e.value.description();
        EXPECT_EQ(a->report, e.report);
        ++a;
    }
}

TEST(RecordingContainer, EmptyRecordingWritesVersionOneWithNoFramesAndReadsBack)
{
    PipelineRecording recording;
    const std::string text = recording.json();
    const auto document = nlohmann::json::parse(text);
    EXPECT_EQ(document.at("Version"), 1);
    EXPECT_TRUE(document.at("Frames").is_array());
    EXPECT_TRUE(document.at("Frames").empty());

    PipelineRecording readBack{std::string_view(text)};
    EXPECT_TRUE(readBack.frames().empty());
    EXPECT_EQ(readBack.maxFrameCount(), 0u);
    EXPECT_EQ(readBack.pipeline, nullptr);
    EXPECT_FALSE(readBack.playCanContinue());
}

TEST(RecordingContainer, FramesRoundTripWithValuesNoValueNullAndReportsOfEveryLength)
{
    PropertyDictionary nested;
    nested.set("z", PropertyValue::string("last"));
    nested.set("a", PropertyValue::array({PropertyValue::boolean(false), PropertyValue::null()}));

    PipelineRecording recording;
    recording.appendFrame(stateFrame(5, "Algs.HoldTimeoutMilliseconds", PropertyValue::uint64(250)));
    recording.appendFrame(stateFrame(6, "Algs.NoValue", PropertyValue()));
    recording.appendFrame(stateFrame(7, "Algs.Null", PropertyValue::null()));
    recording.appendFrame(stateFrame(8, "negative", PropertyValue::int64(-42)));
    recording.appendFrame(stateFrame(9, "fraction", PropertyValue::float64(0.125)));
    recording.appendFrame(stateFrame(10, "text \"quoted\" \xc3\xa9", PropertyValue::string("line\nbreak")));
    recording.appendFrame(stateFrame(11, "", PropertyValue::dictionary(nested)));
    recording.appendFrame(stateFrame(12, "flag", PropertyValue::boolean(true)));
    for (std::size_t length : {0u, 1u, 2u, 9u, 10u, 72u, 73u, 200u}) {
        std::vector<std::uint8_t> bytes(length);
        for (std::size_t i = 0; i < length; ++i) bytes[i] = static_cast<std::uint8_t>(i * 37 + length);
        recording.appendFrame(reportFrame(1000 + length, bytes));
    }
    // Backwards and extreme time stamps are kept as they stand.
    recording.appendFrame(reportFrame(std::numeric_limits<std::uint64_t>::max(), {0x01, 0xA0, 0xFF}));
    recording.appendFrame(reportFrame(0, {0x02}));

    const std::string text = recording.json();
    EXPECT_NE(text.find("\n  "), std::string::npos) << "written indented";
    EXPECT_NE(text.find("\"01 a0 ff \""), std::string::npos);
    EXPECT_NE(text.find("18446744073709551615"), std::string::npos) << "time stamps are written as exact integers";

    const auto document = nlohmann::json::parse(text);
    EXPECT_FALSE(document["Frames"][1].contains("Value")) << "a frame without value has no \"Value\"";
    EXPECT_TRUE(document["Frames"][2].at("Value").is_null());
    EXPECT_EQ(document["Frames"][8].at("Report"), "") << "an empty report is the empty text";

    PipelineRecording readBack{std::string_view(text)};
    expectSameFrames(readBack.frames(), recording.frames());
    EXPECT_EQ(readBack.json(), text) << "writing the read recording gives the same container";
    expectSameFrames(streamFrames(text), recording.frames());
}

TEST(RecordingContainer, AStreamedContainerHandsOverWhatTheWholeTextReaderReads)
{
    const std::string report = R"("Type": "InputReport", "Timestamp": 5, "Report": "01 ff ")";
    const std::string cases[] = {
        // Key order, repeated keys, booleans for numbers, other keys at every level.
        R"({"Note": {"deep": [[1], {"x": null}]}, "Version": 1, "Frames": [
            {"Report": "0a ", "Timestamp": true, "Type": "InputReport", "Extra": [1, 2]},
            {"Type": "State", "Timestamp": 3.9, "Key": "k", "Value": {"b": [1, -2, 1.5e300, "\u00e9"]}},
            {"Type": "State", "Timestamp": 4, "Key": "k", "Key": "later", "Value": -0},
            {"Type": "State", "Timestamp": 4, "Key": "ð â¬", "Value": "Ã©"},
            {)" + report + R"(}], "After": "x"})",
        "\xEF\xBB\xBF" R"({"Version": 1, "Frames": [{)" + report + "}]}",
        R"({"Version": 0, "Frames": "ignored", "Reports": [{"ReportData": "02 ", "Timestamp": 9, "Other": 1}]})",
        R"({"Version": 1, "Reports": "ignored", "Frames": []})",
        // The frames before the version: read whole from the start.
        R"({"Frames": [{)" + report + R"(}], "Version": 1})",
    };
    for (const std::string& text : cases) {
        SCOPED_TRACE(text);
        PipelineRecording whole{std::string_view(text)};
        expectSameFrames(streamFrames(text), whole.frames());
    }

    // A fault is raised where it is reached, after the frames before it.
    std::size_t handed = 0;
    EXPECT_THROW(streamFrames(R"({"Version": 1, "Frames": [{)" + report + "}, {" + report + R"(}, {"Type": 1}]})",
                              &handed),
                 std::invalid_argument);
    EXPECT_EQ(handed, 2u);
    EXPECT_THROW(streamFrames(R"({"Version": 1, "Frames": [{)" + report + "}, ", &handed), std::runtime_error);
    EXPECT_EQ(handed, 1u);

    // Frames before the version from an input that cannot be read again.
    int ends[2];
    ASSERT_EQ(::pipe(ends), 0);
    const std::string early = R"({"Frames": [], "Version": 1})";
    ASSERT_EQ(::write(ends[1], early.data(), early.size()), static_cast<ssize_t>(early.size()));
    ::close(ends[1]);
    try {
        VeltoTouch::ContainerStream::read(ends[0], [](Frame&&) {});
        ADD_FAILURE() << "frames before the version were taken from a pipe";
    } catch (const std::runtime_error& error) {
        EXPECT_NE(std::string(error.what()).find("before its \"Version\""), std::string::npos) << error.what();
    }
    ::close(ends[0]);

    // A stop ends a read that waits for input that never comes, whenever it
    // comes: before the read, or while it waits.
    for (const bool stopFirst : {true, false}) {
        ASSERT_EQ(::pipe(ends), 0);
        const std::string start = R"({"Version": 1, "Frames": [{)" + report + "}, ";
        ASSERT_EQ(::write(ends[1], start.data(), start.size()), static_cast<ssize_t>(start.size()));
        std::atomic<bool> stop{stopFirst};
        std::thread stopper([&] {
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
            stop = true;
        });
        handed = 0;
        EXPECT_THROW(VeltoTouch::ContainerStream::read(
                         ends[0], [&](Frame&&) { ++handed; }, [&] { return stop.load(); }),
                     std::runtime_error);
        stopper.join();
        EXPECT_EQ(handed, stopFirst ? 0u : 1u);
        ::close(ends[0]);
        ::close(ends[1]);
    }
}

TEST(RecordingContainer, ValuesJsonCannotHoldAreWrittenWithoutFailing)
{
    PipelineRecording recording;
    recording.appendFrame(stateFrame(1, "bytes", PropertyValue::bytes({0x00, 0x0A, 0xFF})));
    recording.appendFrame(stateFrame(2, "nan", PropertyValue::float64(std::nan(""))));
    recording.appendFrame(stateFrame(3, "inf", PropertyValue::float32(-std::numeric_limits<float>::infinity())));
    recording.appendFrame(stateFrame(4, "float", PropertyValue::float32(0.1f)));
    recording.appendFrame(stateFrame(5, "bad\xff utf8", PropertyValue::string("\xc3")));

    std::string text;
    ASSERT_NO_THROW(text = recording.json());
    PipelineRecording readBack{std::string_view(text)};
    std::vector<PropertyValue> values;
    for (const Frame& frame : readBack.frames()) values.push_back(frame.value);
    ASSERT_EQ(values.size(), 5u);
    EXPECT_EQ(values[0], PropertyValue::string("00 0a ff "));
    EXPECT_EQ(values[1], PropertyValue::null());
    EXPECT_EQ(values[2], PropertyValue::null());
    EXPECT_EQ(values[3], PropertyValue::float64(0.1)) << "float32 written in its shortest form";
    EXPECT_EQ(std::next(readBack.frames().begin(), 4)->key, "bad\xef\xbf\xbd utf8");
    EXPECT_EQ(values[4], PropertyValue::string("\xef\xbf\xbd"));
}

TEST(RecordingContainer, VersionZeroMigratesReportsAndBooleansCountAsNumbers)
{
    PipelineRecording none{std::string_view(R"({"Version": 0, "Comment": "no reports"})")};
    EXPECT_TRUE(none.frames().empty());

    PipelineRecording old{std::string_view(R"({
        "Version": 0,
        "Reports": [
            {"Timestamp": 300, "ReportData": "02 00 01 02 03 04 05 06 07 08 ", "Extra": 1},
            {"ReportData": "01 a0 ff ", "Timestamp": 100},
            {"Timestamp": true, "ReportData": ""}
        ]})")};
    PipelineRecording::FrameList expected{reportFrame(300, {2, 0, 1, 2, 3, 4, 5, 6, 7, 8}),
                                          reportFrame(100, {0x01, 0xA0, 0xFF}), reportFrame(1, {})};
    expectSameFrames(old.frames(), expected);

    PipelineRecording booleanVersion{std::string_view(R"({"Version": true, "Frames": [
        {"Type": "State", "Timestamp": false, "Key": "k"}]})")};
    expectSameFrames(booleanVersion.frames(), {stateFrame(0, "k", PropertyValue())});
    PipelineRecording falseVersion{std::string_view(R"({"Version": false})")};
    EXPECT_TRUE(falseVersion.frames().empty());
}

TEST(RecordingContainer, ReportTextIsReadInEveryHexForm)
{
    PipelineRecording recording{std::string_view(R"({"Version": 1, "Frames": [
        {"Type": "InputReport", "Timestamp": 1, "Report": "01 A0 Ff "},
        {"Type": "InputReport", "Timestamp": 2, "Report": "01 a0 ff"},
        {"Type": "InputReport", "Timestamp": 3, "Report": "0x01   0XA0\nff"},
        {"Type": "InputReport", "Timestamp": 4, "Report": "01 a0 ff ,02"},
        {"Type": "InputReport", "Timestamp": 5, "Report": "   "}]})")};
    std::vector<std::vector<std::uint8_t>> reports;
    for (const Frame& frame : recording.frames()) reports.push_back(frame.report);
    const std::vector<std::uint8_t> bytes{0x01, 0xA0, 0xFF};
    EXPECT_EQ(reports, (std::vector<std::vector<std::uint8_t>>{bytes, bytes, bytes, bytes, {}}));
}

TEST(RecordingContainer, MigrationReturnsCurrentContainersAsTheSameValue)
{
    const PropertyValue current = JsonValue::parse(R"({"Version": 1, "Frames": [], "Other": 3})");
    EXPECT_EQ(PipelineRecording::migrateSerializedContainer(current).identity(), current.identity());

    const PropertyValue old = JsonValue::parse(R"({"Version": 0, "Other": 3,
        "Reports": [{"Timestamp": "kept as it is", "ReportData": 5}]})");
    const PropertyValue migrated = PipelineRecording::migrateSerializedContainer(old);
    EXPECT_EQ(migrated, JsonValue::parse(R"({"Version": 1, "Frames": [
        {"Timestamp": "kept as it is", "Type": "InputReport", "Report": 5}]})"));
}

enum class Family { InvalidArgument, Runtime };

struct ReadError {
    const char* name;
    std::optional<std::string> input;
    Family family;
    std::string message;
};

TEST(RecordingContainer, EveryFaultRaisesItsMessageInItsFamily)
{
    const std::string prefix = "migrateSerializedContainer failed: ";
    const std::string deep = std::string(100000, '[') + std::string(100000, ']');
    const std::string v1 = R"({"Version": 1, "Frames": [)";
    const ReadError cases[] = {
        {"no data", std::nullopt, Family::InvalidArgument, "json not supplied"},
        {"empty text", "", Family::Runtime, prefix + "invalid container"},
        {"malformed", R"({"Version": 1,)", Family::Runtime, prefix + "invalid container"},
        {"trailing text", R"({"Version": 1, "Frames": []} x)", Family::Runtime, prefix + "invalid container"},
        {"comment", "// note\n{\"Version\": 1, \"Frames\": []}", Family::Runtime, prefix + "invalid container"},
        {"scalar", "42", Family::Runtime, prefix + "invalid container"},
        {"string", R"("text")", Family::Runtime, prefix + "invalid container"},
        {"array", R"([{"Version": 1}])", Family::Runtime, prefix + "invalid container"},
        {"invalid utf-8", "{\"Version\": 1, \"Frames\": [], \"\xff\": 0}", Family::Runtime,
         prefix + "invalid container"},
        {"too deep", deep, Family::Runtime, prefix + "invalid container"},
        {"overlong utf-8 in a key", v1 + "{\"Type\": \"State\", \"Timestamp\": 1, \"Key\": \"\xc0\xaf\"}]}",
         Family::Runtime, prefix + "invalid container"},
        {"surrogate in a value", v1 + "{\"Type\": \"State\", \"Timestamp\": 1, \"Key\": \"k\", \"Value\": [\"\xed\xa0\x80\"]}]}",
         Family::Runtime, prefix + "invalid container"},
        {"invalid utf-8 where nothing is read", "{\"Version\": 1, \"Note\": {\"\xff\": [\"\xc3\"]}, \"Frames\": []}",
         Family::Runtime, prefix + "invalid container"},
        {"utf-8 cut short", v1 + "{\"Type\": \"InputReport\", \"Timestamp\": 1, \"Report\": \"\xe2\x82\"}]}",
         Family::Runtime, prefix + "invalid container"},
        {"no version", R"({"Frames": []})", Family::Runtime, prefix + "invalid version"},
        {"text version", R"({"Version": "1"})", Family::Runtime, prefix + "invalid version"},
        {"null version", R"({"Version": null})", Family::Runtime, prefix + "invalid version"},
        {"version 2", R"({"Version": 2})", Family::Runtime, prefix + "invalid container version: 2"},
        {"version -1", R"({"Version": -1})", Family::Runtime,
         prefix + "invalid container version: 18446744073709551615"},
        {"v0 no timestamp", R"({"Version": 0, "Reports": [{"ReportData": "01 "}]})", Family::Runtime,
         prefix + "frame lacks Timestamp"},
        {"v0 no data", R"({"Version": 0, "Reports": [{"Timestamp": 1}]})", Family::Runtime,
         prefix + "frame lacks ReportData"},
        {"v0 reports not array", R"({"Version": 0, "Reports": {}})", Family::Runtime, prefix + "invalid reports"},
        {"v0 report not object", R"({"Version": 0, "Reports": [7]})", Family::Runtime,
         prefix + "report is not an object"},
        {"v0 timestamp kind", R"({"Version": 0, "Reports": [{"Timestamp": "1", "ReportData": ""}]})",
         Family::InvalidArgument, "invalid frame timestamp"},
        {"v0 data kind", R"({"Version": 0, "Reports": [{"Timestamp": 1, "ReportData": null}]})",
         Family::InvalidArgument, "invalid report"},
        {"no frames", R"({"Version": 1})", Family::InvalidArgument, "invalid frames"},
        {"frames object", R"({"Version": 1, "Frames": {}})", Family::InvalidArgument, "invalid frames"},
        {"frame not object", v1 + "[]]}", Family::InvalidArgument, "frame is not an object"},
        {"empty frame", v1 + "{}]}", Family::InvalidArgument, "invalid frame type"},
        {"type number", v1 + R"({"Type": 1, "Timestamp": 1}]})", Family::InvalidArgument, "invalid frame type"},
        {"type unknown", v1 + R"({"Type": "Gesture", "Timestamp": 1, "Report": ""}]})", Family::InvalidArgument,
         "invalid frame type"},
        {"no timestamp", v1 + R"({"Type": "State", "Key": "k"}]})", Family::InvalidArgument,
         "invalid frame timestamp"},
        {"text timestamp", v1 + R"({"Type": "InputReport", "Timestamp": "1", "Report": ""}]})",
         Family::InvalidArgument, "invalid frame timestamp"},
        {"no key", v1 + R"({"Type": "State", "Timestamp": 1}]})", Family::InvalidArgument, "invalid state key"},
        {"key number", v1 + R"({"Type": "State", "Timestamp": 1, "Key": 3}]})", Family::InvalidArgument,
         "invalid state key"},
        {"no report", v1 + R"({"Type": "InputReport", "Timestamp": 1}]})", Family::InvalidArgument,
         "invalid report"},
        {"report number", v1 + R"({"Type": "InputReport", "Timestamp": 1, "Report": 1}]})",
         Family::InvalidArgument, "invalid report"},
        {"report not hex", v1 + R"({"Type": "InputReport", "Timestamp": 1, "Report": "01 100 "}]})",
         Family::InvalidArgument, "invalid hex string"},
        {"second frame faulty", v1 + R"({"Type": "State", "Timestamp": 1, "Key": "k"}, {"Type": "State"}]})",
         Family::InvalidArgument, "invalid frame timestamp"},
    };
    // The same through both readers: the whole text, and the file streamed.
    for (const bool streamed : {false, true}) {
        for (const ReadError& c : cases) {
            SCOPED_TRACE(std::string(c.name) + (streamed ? " (streamed)" : ""));
            if (streamed && !c.input) continue;
            try {
                const std::optional<std::string_view> input =
                    c.input ? std::optional<std::string_view>(*c.input) : std::nullopt;
                if (streamed) {
                    streamFrames(*c.input);
                } else {
                    PipelineRecording recording(input);
                }
                ADD_FAILURE() << "no error raised";
            } catch (const std::invalid_argument& error) {
                EXPECT_EQ(c.family, Family::InvalidArgument);
                EXPECT_EQ(error.what(), c.message);
            } catch (const std::runtime_error& error) {
                EXPECT_EQ(c.family, Family::Runtime);
                EXPECT_EQ(error.what(), c.message);
            } catch (...) {
                ADD_FAILURE() << "unexpected exception type";
            }
        }
    }
}

TEST(RecordingContainer, MigrationAloneRaisesUnprefixedInvalidArgument)
{
    EXPECT_THROW(
        {
            try {
                PipelineRecording::migrateSerializedContainer(PropertyValue());
            } catch (const std::invalid_argument& error) {
                EXPECT_STREQ(error.what(), "invalid container");
                throw;
            }
        },
        std::invalid_argument);
    try {
        PipelineRecording::migrateSerializedContainer(JsonValue::parse(R"({"Version": 7})"));
        ADD_FAILURE() << "no error raised";
    } catch (const std::invalid_argument& error) {
        EXPECT_STREQ(error.what(), "invalid container version: 7");
    }
}

TEST(RecordingContainer, WritingTrimsTheRecordingToItsLimit)
{
    PipelineRecording recording;
    recording.setMaxFrameCount(4);
    recording.appendFrame(stateFrame(1, "a", PropertyValue::uint64(1)));
    for (std::uint8_t i = 1; i <= 5; ++i) recording.appendFrame(reportFrame(10 * i, {i}));
    recording.appendFrame(stateFrame(60, "a", PropertyValue::uint64(2)));
    ASSERT_EQ(recording.frames().size(), 7u) << "seven frames stay below twice the limit";

    PipelineRecording written{std::string_view(recording.json())};
    const PipelineRecording::FrameList expected{stateFrame(1, "a", PropertyValue::uint64(1)), reportFrame(20, {2}),
                                                reportFrame(30, {3}),
                                                reportFrame(40, {4}), reportFrame(50, {5}),
                                                stateFrame(60, "a", PropertyValue::uint64(2))};
    expectSameFrames(written.frames(), expected);
    expectSameFrames(recording.frames(), expected);
}

}  // namespace
