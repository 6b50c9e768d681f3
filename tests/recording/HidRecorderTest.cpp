#include "RecordingTestSupport.h"

#include "recording/HidRecorderReader.h"
#include "recording/HidRecorderWriter.h"
#include "recording/ReportDescriptor.h"

#include <gtest/gtest.h>

#include <sys/socket.h>
#include <unistd.h>

#include <map>
#include <optional>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace {

using namespace RecordingTestSupport;
using VeltoTouch::HidRecorderReader;
using VeltoTouch::HidRecorderWriter;
using VeltoTouch::ReportDescriptor;
using Bytes = std::vector<std::uint8_t>;

// The smallest descriptor with the surface's two input reports: 8-bit
// fields, ID 1 with 72 of them, ID 2 with 9.
const std::string kSurface = "R: 22 06 00 ff 09 01 a1 01 75 08 85 01 95 48 81 02 85 02 95 09 81 02 c0\n";
const std::string kKeyboard = "R: 12 05 01 09 06 a1 01 75 08 95 08 81 02\n";  // 8 bytes, no report IDs

// (time, bytes) of every frame, which must all be input reports.
std::vector<std::pair<std::uint64_t, Bytes>> reportsOf(const PipelineRecording::FrameList& frames)
{
    std::vector<std::pair<std::uint64_t, Bytes>> reports;
    for (const Frame& frame : frames) {
        EXPECT_EQ(frame.type, Frame::Type::InputReport);
        reports.emplace_back(frame.timestampNs, frame.report);
    }
    return reports;
}

// The frames of a text read whole. Fed in pieces, the reader hands over the
// same frames or the same fault: fuzz/fuzz_hid_recorder_reader.cpp.
PipelineRecording::FrameList readWhole(const std::string& text, std::optional<std::uint32_t> device = {})
{
    return PipelineRecording(std::string_view(text), device).frames();
}

// The frames ContainerStream reads from a stream socket, which cannot be
// read again: the format is told from what has been read already. Written
// on a thread of its own, so that a text larger than the socket's buffer
// goes through too, and without SIGPIPE once the reader has given up.
PipelineRecording::FrameList readFromPipe(const std::string& text, std::optional<std::uint32_t> device = {})
{
    int ends[2];
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    std::thread writer([&text, end = ends[1]] {
        for (std::size_t at = 0; at < text.size();) {
            const ssize_t sent = ::send(end, text.data() + at, text.size() - at, MSG_NOSIGNAL);
            if (sent <= 0) break;
            at += static_cast<std::size_t>(sent);
        }
        ::close(end);
    });
    PipelineRecording::FrameList frames;
    const auto done = [&] {
        ::close(ends[0]);
        writer.join();
    };
    try {
        VeltoTouch::ContainerStream::read(ends[0], [&](Frame&& frame) { frames.push_back(std::move(frame)); }, {},
                                          device);
    } catch (...) {
        done();
        throw;
    }
    done();
    return frames;
}

TEST(HidRecorderReader, ReadsTheNamedDeviceOrTheSurfacesWithItsTimesToTheNanosecond)
{
    // A byte order mark, CRLF lines, blanks and comments anywhere; the
    // keyboard is described first and sends first.
    const std::string text = "\xEF\xBB\xBF\r\n# capture\r\nD: 0\r\n" + kKeyboard + "N: Keyboard\nP: usb-1/input0\n" +
                             "I: 3 feed 1\nD: 7\n" + kSurface + "N: Surface\nI: 3 1234 5678\n" +
                             "D: 0\nE: 0.000000 8 00 00 04 00 00 00 00 00\n" +
                             "D: 7\n  E: 000012.000034 3 01 ff 0A \t\n# between\n\nE: 12.5 0\r\n" +
                             "D: 0\nE: 13.000001 8 00 00 00 00 00 00 00 00\n" +
                             "D: 7\nE: 18446744073.709551 2 02 00";
    const std::vector<std::pair<std::uint64_t, Bytes>> surface = {
        {12'000'034'000, {0x01, 0xff, 0x0a}}, {12'500'000'000, {}}, {18'446'744'073'709'551'000u, {0x02, 0x00}}};
    const std::vector<std::pair<std::uint64_t, Bytes>> keyboard = {{0, {0, 0, 4, 0, 0, 0, 0, 0}},
                                                                   {13'000'001'000, Bytes(8, 0)}};
    for (const auto& [device, expected] : {std::pair{std::optional<std::uint32_t>{}, surface},
                                           std::pair{std::optional<std::uint32_t>{7}, surface},
                                           std::pair{std::optional<std::uint32_t>{0}, keyboard}}) {
        SCOPED_TRACE(device ? "device " + std::to_string(*device) : "the surface's");
        EXPECT_EQ(reportsOf(readWhole(text, device)), expected);
        EXPECT_EQ(reportsOf(readFromPipe(text, device)), expected);
    }
}

TEST(HidRecorderReader, AFaultNamesItsLineAndEveryReaderRaisesTheSame)
{
    struct Case {
        std::string text;
        std::optional<std::uint32_t> device;
        std::size_t line;
        std::string reason;
    };
    const std::string surfaceReports =
        "the surface's input reports (Image 0x01 of 73 bytes, FirmwareEvent 0x02 of 10)";
    const Case cases[] = {
        {"E: 1 1 00", 0, 1, "invalid event time (expected SECONDS.MICROSECONDS)"},
        {"\n \r\n\tE: 1. 1 00", 0, 3, "invalid event time (expected SECONDS.MICROSECONDS)"},
        {"E: 1.1234567 1 00", 0, 1, "invalid event time (expected SECONDS.MICROSECONDS)"},
        {"E: 18446744073.709552 1 00", 0, 1, "invalid event time (expected SECONDS.MICROSECONDS)"},
        {"E: -1.0 1 00", 0, 1, "invalid event time (expected SECONDS.MICROSECONDS)"},
        {"E: 1.0 x 00", 0, 1, "invalid event length"},
        {"# c\n\nE: 1.0 2 00", 0, 3, "event length 2 but 1 byte"},
        {"E: 1.0 1 00 01", 0, 1, "event length 1 but 2 bytes"},
        {"E: 1.0 1 0g", 0, 1, "invalid hex byte in the event"},
        {"E: 1.0 1 000", 0, 1, "invalid hex byte in the event"},
        {"E: 1.0 1 0", 0, 1, "invalid hex byte in the event"},
        {"R: 2 01", 0, 1, "report descriptor length 2 but 1 byte"},
        {"R: two 01 02", 0, 1, "invalid report descriptor length"},
        {"R: 1 0x1", 0, 1, "invalid hex byte in the report descriptor"},
        {"D: 1\nR: 1 01\nD: 2\nD: 1\nR: 1 01", 0, 5, "a second report descriptor for device 1"},
        {"D: x", 0, 1, "invalid device number"},
        {"\xEF\xBB\xBF\r \rD:  c\r\n", 0, 1, "invalid device number"},
        {"D: 1 2", 0, 1, "invalid device number"},
        {"D: 4294967296", 0, 1, "invalid device number"},
        {"I: 3 1234", 0, 1, "invalid ids (expected I: BUS VENDOR PRODUCT in hex)"},
        {"I: 3 1234 5678 9", 0, 1, "invalid ids (expected I: BUS VENDOR PRODUCT in hex)"},
        {"I: 3 123456789 1", 0, 1, "invalid ids (expected I: BUS VENDOR PRODUCT in hex)"},
        {"# x\nhello", 0, 2, "unknown line (expected D:, R:, N:, P:, I:, E: or a # comment)"},
        {"N: x\nQ: y", 0, 2, "unknown line (expected D:, R:, N:, P:, I:, E: or a # comment)"},
        {"E", 0, 1, "unknown line (expected D:, R:, N:, P:, I:, E: or a # comment)"},
        {"D: 0\nN: " + std::string(HidRecorderReader::kLongestLine, 'x'), 0, 2, "longer than 1048576 bytes"},
        // The device to read is not there.
        {kKeyboard + "N: Keyboard\nE: 0.0 1 00\nD: 1\n" + kSurface, {}, 3,
         "no device described before the first event has " + surfaceReports + " (device 0 \"Keyboard\")"},
        {"E: 0.0 1 00\nD: 1\n" + kSurface, {}, 1,
         "no device described before the first event has " + surfaceReports + " (it describes no device)"},
        {"# only a comment\n", {}, 0, "no device has " + surfaceReports + " (it describes no device)"},
        {"D: 0\nN: a\tb\nD: 1\n" + kKeyboard, {}, 0, "no device has " + surfaceReports + " (devices 0 \"a?b\", 1)"},
        {"D: 0\nD: 1\n" + kSurface, 2, 0, "no device 2 in it (devices 0, 1)"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.text.substr(0, 80));
        const std::function<void()> readers[] = {[&] { readWhole(c.text, c.device); },
                                                 [&] { readFromPipe(c.text, c.device); }};
        for (const auto& read : readers) {
            try {
                read();
                ADD_FAILURE() << "read without a fault";
            } catch (const HidRecorderReader::Fault& fault) {
                EXPECT_EQ(fault.line(), c.line);
                EXPECT_EQ(fault.reason(), c.reason);
                EXPECT_STREQ(fault.what(), (c.line ? "line " + std::to_string(c.line) + ": " + c.reason : c.reason).c_str());
            }
        }
    }
}

TEST(HidRecorderReader, TheFramesBeforeAFaultAreHandedOverAndAStopEndsTheReadWithoutOne)
{
    std::size_t handed = 0;
    EXPECT_THROW(HidRecorderReader::read(kSurface + "E: 0.0 1 00\nE: 0.1 1 00\nE: 0.2 1 0", [&](Frame&&) { ++handed; }),
                 HidRecorderReader::Fault);
    EXPECT_EQ(handed, 2u);

    // A stop cuts the input short inside a line: not read as if it had ended there.
    int ends[2];
    ASSERT_EQ(::pipe(ends), 0);
    const std::string start = kSurface + "E: 0.0 1 00\nE: 0.1 2 00";
    ASSERT_EQ(::write(ends[1], start.data(), start.size()), static_cast<ssize_t>(start.size()));
    int asked = 0;
    handed = 0;
    try {
        VeltoTouch::ContainerStream::read(ends[0], [&](Frame&&) { ++handed; }, [&] { return ++asked > 1; });
        ADD_FAILURE() << "the stopped read ended as a whole recording";
    } catch (const HidRecorderReader::Fault& fault) {
        ADD_FAILURE() << "the line cut by the stop was read: " << fault.what();
    } catch (const std::runtime_error&) {
    }
    EXPECT_EQ(handed, 1u);
    ::close(ends[0]);
    ::close(ends[1]);
}

TEST(HidRecorderWriter, WritesTheDeviceOnceThenEachReportInWholeMicrosecondsFromItsOrigin)
{
    HidRecorderWriter::Device device{"Pad\nname", "usb-1/input0", 3, 0x1234, 0xabcd, {0x06, 0x00, 0xff}};
    std::ostringstream given, first;
    HidRecorderWriter fromGiven(given, device, 1'000'000'000);
    HidRecorderWriter fromFirst(first, device);
    const std::string header = "R: 3 06 00 ff\nN: Pad name\nP: usb-1/input0\nI: 3 1234 abcd\n";
    EXPECT_EQ(given.str(), header);

    for (HidRecorderWriter* writer : {&fromGiven, &fromFirst}) {
        EXPECT_TRUE(writer->write(reportFrame(2'000'000'999, {0x01, 0xab})));
        EXPECT_FALSE(writer->write(stateFrame(2'000'000'999, "Algs.HoldTimeoutMilliseconds", PropertyValue::uint32(1))));
        writer->writeReport(1'000'123'456'789'999, nullptr, 0);
        EXPECT_EQ(writer->reportsWritten(), 2u);
    }
    EXPECT_EQ(given.str(), header + "E: 000001.000000 2 01 ab\nE: 1000122.456789 0\n");
    EXPECT_EQ(first.str(), header + "E: 000000.000000 2 01 ab\nE: 1000121.456789 0\n");
    EXPECT_THROW(fromFirst.writeReport(2'000'000'998, nullptr, 0), std::invalid_argument);

    // Read back: the same reports, at their times truncated to the microsecond.
    EXPECT_EQ(reportsOf(readWhole(given.str(), 0)),
              (std::vector<std::pair<std::uint64_t, Bytes>>{{1'000'000'000, {0x01, 0xab}}, {1'000'122'456'789'000, {}}}));
}

TEST(ReportDescriptor, InputReportLengthsCountTheIDAndFollowPushAndPop)
{
    struct Case {
        Bytes descriptor;
        std::map<std::uint8_t, std::size_t> lengths;
        bool surface;
    };
    const Case cases[] = {
        // Without report IDs: 8 bits + 1 bit + 7 bits, 2 bytes.
        {{0x75, 0x08, 0x95, 0x01, 0x81, 0x02, 0x75, 0x01, 0x81, 0x02, 0x95, 0x07, 0x81, 0x01}, {{0, 2}}, false},
        // The surface's, with a feature report that is not counted and a long item.
        {{0x75, 0x08, 0x85, 0x01, 0x96, 0x48, 0x00, 0x81, 0x02, 0xFE, 0x02, 0x10, 0x85, 0x02, 0x85, 0x02, 0x95,
          0x09, 0x81, 0x02, 0x85, 0x1F, 0x95, 0x04, 0xB1, 0x02},
         {{1, 73}, {2, 10}},
         true},
        // Pushed globals come back with pop; a four-byte count; an item cut short at the end.
        {{0x75, 0x08, 0x85, 0x01, 0x95, 0x48, 0xA4, 0x85, 0x02, 0x97, 0x09, 0x00, 0x00, 0x00, 0x81, 0x02, 0xB4,
          0x81, 0x02, 0x95},
         {{1, 73}, {2, 10}},
         true},
        // One byte short of the Image report.
        {{0x75, 0x08, 0x85, 0x01, 0x95, 0x47, 0x81, 0x02, 0x85, 0x02, 0x95, 0x09, 0x81, 0x02}, {{1, 72}, {2, 10}}, false},
        // Bits past what 64 bits hold are held there, not wrapped.
        {{0x77, 0xFF, 0xFF, 0xFF, 0xFF, 0x97, 0xFF, 0xFF, 0xFF, 0xFF, 0x85, 0x01, 0x81, 0x02, 0x81, 0x02},
         {{1, std::size_t{1} + (~std::uint64_t{0} / 8 + 1)}},
         false},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(ReportDescriptor::inputReportLengths(c.descriptor), c.lengths);
        EXPECT_EQ(ReportDescriptor::declaresSurfaceReports(c.descriptor), c.surface);
    }
}

}  // namespace
