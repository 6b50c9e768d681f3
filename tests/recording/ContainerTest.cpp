#include "RecordingTestSupport.h"

#include "recording/ContainerStream.h"

#include <gtest/gtest.h>

#include <unistd.h>

#include <cstdio>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>

namespace {

using namespace RecordingTestSupport;

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

    // A fault is raised where it is reached, after the frames before it (a
    // faulty frame after good ones is checked through `replay` and `host`).
    std::size_t handed = 0;
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

    // A stop requested before the read ends it, although its input never
    // ends; a stop while it waits is checked through `host` on a FIFO.
    ASSERT_EQ(::pipe(ends), 0);
    const std::string start = R"({"Version": 1, "Frames": [{)" + report + "}, ";
    ASSERT_EQ(::write(ends[1], start.data(), start.size()), static_cast<ssize_t>(start.size()));
    handed = 0;
    EXPECT_THROW(VeltoTouch::ContainerStream::read(ends[0], [&](Frame&&) { ++handed; }, [] { return true; }),
                 std::runtime_error);
    EXPECT_EQ(handed, 0u);
    ::close(ends[0]);
    ::close(ends[1]);
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

enum class Family { InvalidArgument, Runtime };

struct ReadError {
    const char* name;
    std::optional<std::string> input;
    Family family;
    std::string message;
};

// Faults that `replay` and `dump` name through the real binary (malformed
// text, no object at the top, version 2, no frames, bad hex) are checked
// there, with the prefix that tells the families apart.
TEST(RecordingContainer, EveryFaultRaisesItsMessageInItsFamily)
{
    const std::string prefix = "migrateSerializedContainer failed: ";
    const std::string deep = std::string(100000, '[') + std::string(100000, ']');
    const std::string v1 = R"({"Version": 1, "Frames": [)";
    const ReadError cases[] = {
        {"no data", std::nullopt, Family::InvalidArgument, "json not supplied"},
        {"empty text", "", Family::Runtime, prefix + "invalid container"},
        {"trailing text", R"({"Version": 1, "Frames": []} x)", Family::Runtime, prefix + "invalid container"},
        {"comment", "// note\n{\"Version\": 1, \"Frames\": []}", Family::Runtime, prefix + "invalid container"},
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

}  // namespace
