#include "EmulateCommand.h"
#include "ToolError.h"
#include "ToolTestSupport.h"
#include "platform/FakeUhidKernel.h"
#include "records/FeatureReport.h"
#include "recording/PipelineRecording.h"

#include <gtest/gtest.h>
#include <linux/input.h>

#include <atomic>
#include <map>
#include <sstream>
#include <thread>
#include <utility>
#include <vector>

using namespace VeltoTool;
using namespace VeltoTool::Testing;
using VeltoHost::Testing::FakeUhidKernel;
using VeltoTouch::PipelineRecording;

namespace {

using Bytes = std::vector<std::uint8_t>;
constexpr std::uint64_t kSecondNs = 1'000'000'000;
const std::vector<std::uint8_t> kDebugReportIDs = {0x04, 0x10, 0x11, 0x12, 0x13, 0x1D, 0x32, 0x3B, 0x3C, 0x3F};

Bytes image(std::uint8_t fill)
{
    Bytes report(73, fill);
    report[0] = 0x01;
    return report;
}

Bytes firmwareEvent() { return {0x02, 0x00, 1, 2, 3, 4, 5, 6, 7, 8}; }

// A recording of these reports, one every `spacingNs`, with state frames
// before, between and after them.
std::string recordingOf(const std::vector<Bytes>& reports, std::uint64_t spacingNs = kSecondNs / 100)
{
    PipelineRecording recording;
    const auto state = [&](std::uint64_t timestampNs) {
        PipelineRecording::Frame frame;
        frame.timestampNs = timestampNs;
        frame.key = "Algs.HoldTimeoutMilliseconds";
        frame.value = VeltoHost::PropertyValue::uint32(600);
        recording.appendFrame(frame);
    };
    std::uint64_t timestampNs = kSecondNs;
    state(timestampNs);
    for (const Bytes& report : reports) {
        PipelineRecording::Frame frame;
        frame.type = PipelineRecording::Frame::Type::InputReport;
        frame.timestampNs = timestampNs += spacingNs;
        frame.report = report;
        recording.appendFrame(frame);
        state(timestampNs + 1);
    }
    return recording.json();
}

// The reports a report descriptor declares, by kind ("input", "feature") and
// ID, with their length in bytes counting the ID; and its usage page.
struct DeclaredReports {
    std::uint32_t usagePage = 0;
    std::map<std::pair<std::string, std::uint8_t>, std::size_t> lengths;
};

DeclaredReports parseDescriptor(const Bytes& descriptor)
{
    DeclaredReports declared;
    std::uint32_t reportID = 0, reportSize = 0, reportCount = 0;
    for (std::size_t at = 0; at < descriptor.size();) {
        const std::uint8_t prefix = descriptor[at];
        const std::size_t size = (prefix & 3) == 3 ? 4 : prefix & 3;
        std::uint32_t value = 0;
        for (std::size_t i = 0; i < size; ++i) value |= std::uint32_t(descriptor.at(at + 1 + i)) << (8 * i);
        switch (prefix & 0xFC) {
        case 0x04: declared.usagePage = value; break;
        case 0x84: reportID = value; break;
        case 0x74: reportSize = value; break;
        case 0x94: reportCount = value; break;
        case 0x80:
        case 0xB0: {
            const std::string kind = (prefix & 0xFC) == 0x80 ? "input" : "feature";
            declared.lengths[{kind, std::uint8_t(reportID)}] = 1 + reportSize * reportCount / 8;
            break;
        }
        default: break;
        }
        at += 1 + size;
    }
    return declared;
}

Bytes bytes(const std::uint8_t* data, std::size_t size) { return {data, data + size}; }

struct Played {
    int status = -1;
    std::string err;
    std::vector<uhid_event> events;
};

// Runs the command against the fake kernel, which has sent `requests`
// before it starts, and takes every event until the device's end is closed.
Played emulate(const EmulateCommand::Options& options, const std::vector<uhid_event>& requests)
{
    FakeUhidKernel kernel;
    for (const uhid_event& request : requests) kernel.send(request);
    Played played;
    std::ostringstream err;
    std::thread kernelSide([&] { played.events = kernel.receiveAll(); });
    played.status = EmulateCommand::run(options, kernel.takeDeviceEnd(), [] { return false; }, err);
    kernelSide.join();
    played.err = err.str();
    return played;
}

TEST(EmulateCommand, PlaysTheReportsIntoADeviceShapedLikeTheSurfaceAndAnswersItsFeatureReports)
{
    TempDir dir;
    const std::vector<Bytes> reports = {image(0x11), firmwareEvent(), image(0x22), image(0x33)};
    const fs::path file = dir.file("played.json", recordingOf(reports));
    EmulateCommand::Options custom;
    custom.vendor = 0x2345;
    custom.product = 0x6789;
    custom.holdDurationMs = 0x01020304;
    struct Case {
        EmulateCommand::Options options;
        std::uint32_t vendor, product, holdDurationMs;
    };
    for (Case c : {Case{{}, 0x1234, 0x5678, 5000}, Case{custom, 0x2345, 0x6789, 0x01020304}}) {
        SCOPED_TRACE(c.vendor);
        c.options.file = file;
        c.options.speed = 0;
        // Asked before the first report; 0x77 is no report of the surface.
        const Played played =
            emulate(c.options, {FakeUhidKernel::event(UHID_START), FakeUhidKernel::event(UHID_OPEN),
                                FakeUhidKernel::getReport(1, 0x1F), FakeUhidKernel::getReport(2, 0x3B),
                                FakeUhidKernel::getReport(3, 0x77)});
        ASSERT_EQ(played.status, 0) << played.err;
        ASSERT_GE(played.events.size(), 2u);

        ASSERT_EQ(played.events.front().type, UHID_CREATE2);
        const auto& create = played.events.front().u.create2;
        EXPECT_STREQ(reinterpret_cast<const char*>(create.name), "VeltoTouch virtual surface");
        EXPECT_EQ(create.bus, BUS_USB);
        EXPECT_EQ(create.vendor, c.vendor);
        EXPECT_EQ(create.product, c.product);
        const DeclaredReports declared = parseDescriptor(bytes(create.rd_data, create.rd_size));
        EXPECT_EQ(declared.usagePage, 0xFF00u);
        std::map<std::pair<std::string, std::uint8_t>, std::size_t> expected = {
            {{"input", 0x01}, 73}, {{"input", 0x02}, 10}, {{"feature", 0x1F}, 5}};
        for (std::uint8_t id : kDebugReportIDs) expected[{"feature", id}] = 128;
        EXPECT_EQ(declared.lengths, expected);

        std::vector<Bytes> inputs;
        std::map<std::uint32_t, uhid_event> replies;
        for (const uhid_event& event : played.events) {
            if (event.type == UHID_INPUT2) inputs.push_back(bytes(event.u.input2.data, event.u.input2.size));
            if (event.type == UHID_GET_REPORT_REPLY) replies[event.u.get_report_reply.id] = event;
        }
        EXPECT_EQ(inputs, reports) << "every input report in order, no state frame";
        ASSERT_EQ(replies.size(), 3u);
        const auto& hold = replies[1].u.get_report_reply;
        EXPECT_EQ(hold.err, 0);
        const auto parsed = VeltoTouch::FeatureReport::FactoryResetHoldDuration::parse(hold.data, hold.size);
        ASSERT_TRUE(parsed);
        EXPECT_EQ(parsed->holdDuration, c.holdDurationMs);
        EXPECT_EQ(bytes(replies[2].u.get_report_reply.data, replies[2].u.get_report_reply.size), Bytes(128, 0x3B));
        EXPECT_EQ(replies[3].u.get_report_reply.err, EIO);
        EXPECT_EQ(played.events.back().type, UHID_DESTROY);
    }
}

// Runs the command on its own thread with a stop flag the test sets.
struct Background {
    FakeUhidKernel kernel;
    std::atomic<bool> stop{false};
    int status = -1;
    std::ostringstream err;
    std::thread command;

    explicit Background(const EmulateCommand::Options& options)
        : command([this, options, fd = kernel.takeDeviceEnd()] {
              try {
                  status = EmulateCommand::run(options, fd, [this] { return stop.load(); }, err);
              } catch (const ToolError& error) {
                  err << error.what();
                  status = 1;
              }
          })
    {
    }
    // After a failed check too: whatever the command still writes is taken
    // until it has closed its end, so that it can see the stop.
    ~Background()
    {
        if (!command.joinable()) return;
        stop = true;
        try {
            while (kernel.receive()) {
            }
        } catch (const std::runtime_error&) {
        }
        command.join();
    }
    int finish()
    {
        command.join();
        return status;
    }
    std::uint32_t nextType()
    {
        const auto event = kernel.receive();
        return event ? event->type : ~0u;
    }
};

TEST(EmulateCommand, AnswersFeatureReportsWhileItWaitsForTheNextReport)
{
    TempDir dir;
    EmulateCommand::Options options;
    // Two reports an hour apart, waited for in full.
    options.file = dir.file("slow.json", recordingOf({image(1), image(2)}, 3600 * kSecondNs));
    options.maxGapSeconds = 7200;
    Background background(options);
    EXPECT_EQ(background.nextType(), UHID_CREATE2);
    background.kernel.send(FakeUhidKernel::event(UHID_OPEN));
    EXPECT_EQ(background.nextType(), UHID_INPUT2);
    background.kernel.send(FakeUhidKernel::getReport(5, 0x1F));
    EXPECT_EQ(background.nextType(), UHID_GET_REPORT_REPLY);
    background.stop = true;
    EXPECT_EQ(background.nextType(), UHID_DESTROY) << "stopped before the second report";
    EXPECT_FALSE(background.kernel.receive()) << "closed";
    EXPECT_EQ(background.finish(), 0) << background.err.str();
}

TEST(EmulateCommand, LoopsUntilStoppedAndPlaysNothingBeforeAReaderOpensIt)
{
    TempDir dir;
    EmulateCommand::Options options;
    options.file = dir.file("loop.json", recordingOf({image(1), image(2)}));
    options.speed = 0;
    options.loop = true;
    Background background(options);
    EXPECT_EQ(background.nextType(), UHID_CREATE2);
    background.kernel.send(FakeUhidKernel::event(UHID_OPEN));
    for (int i = 0; i < 5; ++i) {
        const auto event = background.kernel.receive();
        ASSERT_TRUE(event && event->type == UHID_INPUT2);
        EXPECT_EQ(bytes(event->u.input2.data, event->u.input2.size), image(static_cast<std::uint8_t>(1 + i % 2))) << i;
    }
    background.stop = true;
    std::uint32_t type = UHID_INPUT2;
    while (type == UHID_INPUT2) type = background.nextType();
    EXPECT_EQ(type, UHID_DESTROY);
    EXPECT_FALSE(background.kernel.receive()) << "closed";
    EXPECT_EQ(background.finish(), 0) << background.err.str();
    EXPECT_EQ(background.err.str(), "veltotouch: VeltoTouch virtual surface 1234:5678 made; playing " + options.file +
                                        " once a reader opens it (Ctrl-C to stop)\n");

    // Stopped while nobody has it open: made and removed, nothing played.
    Background unopened(options);
    EXPECT_EQ(unopened.nextType(), UHID_CREATE2);
    unopened.stop = true;
    EXPECT_EQ(unopened.nextType(), UHID_DESTROY);
    EXPECT_FALSE(unopened.kernel.receive()) << "closed";
    EXPECT_EQ(unopened.finish(), 0);
}

// A recording that fails at its start never makes a device appear.
TEST(EmulateCommand, ARecordingThatCannotBePlayedIsNamedAndMakesNoDevice)
{
    TempDir dir;
    struct Case {
        std::string name, content, message;
    };
    const Case cases[] = {
        {"text.json", "not json", ": not JSON"},
        {"states.json", recordingOf({}), ": no input reports to play"},
        {"missing.json", "", ": No such file or directory"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        EmulateCommand::Options options;
        options.file = dir.file(c.name, c.content);
        FakeUhidKernel kernel;
        std::ostringstream err;
        try {
            EmulateCommand::run(options, kernel.takeDeviceEnd(), [] { return false; }, err);
            ADD_FAILURE() << "played";
        } catch (const ToolError& error) {
            EXPECT_EQ(std::string(error.what()).rfind(options.file + c.message, 0), 0u) << error.what();
        }
        EXPECT_TRUE(kernel.receiveAll().empty());
    }
}

TEST(EmulateCommand, CommandLineFailuresAreOneLine)
{
    TempDir dir;
    const std::string recording = dir.file("one.json", recordingOf({image(1)}));
    struct Case {
        std::vector<std::string> arguments;
        int status;
        std::string line;
    };
    const Case cases[] = {
        {{recording, "--uhid", "/no/such/uhid"}, 1,
         "veltotouch: /no/such/uhid: No such file or directory (the uhid module is not loaded?"},
        {{"/no/such.json"}, 1, "veltotouch: /no/such.json: No such file or directory"},
        {{}, 2, "veltotouch: FILE is required"},
        {{recording, "--speed", "0.0001"}, 2, "veltotouch: --speed: must be 0 or at least 0.001, got 0.0001"},
        {{recording, "--max-gap", "-1"}, 2, "veltotouch: --max-gap: must be at least 0, got -1"},
        {{recording, "--vendor", "0x10000"}, 2, "veltotouch: --vendor: must be at most 65535 (0xffff), got 0x10000"},
        {{recording, "--product", "12ab"}, 2,
         "veltotouch: --product: expected a number (decimal, or hexadecimal after 0x), got \"12ab\""},
        {{recording, "--hold-duration", "-1"}, 2,
         "veltotouch: --hold-duration: expected a number (decimal, or hexadecimal after 0x), got \"-1\""},
    };
    for (const Case& c : cases) {
        std::vector<std::string> arguments = c.arguments;
        arguments.insert(arguments.begin(), "emulate");
        const ToolRun run = runTool(arguments);
        EXPECT_EQ(run.status, c.status) << run.err;
        EXPECT_EQ(run.err.rfind(c.line, 0), 0u) << run.err;
        EXPECT_EQ(run.err.find('\n'), run.err.size() - 1) << "one line: " << run.err;
    }
}

}  // namespace
