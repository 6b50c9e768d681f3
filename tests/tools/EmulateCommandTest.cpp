// emulate against a stand-in for /dev/uhid. On a real kernel, the system test
// (tests/system/daemon.sh) has the daemon take emulated surfaces as it takes
// real ones: every example's gestures come through, so no report went to the
// daemon's look at a new device before it took it (case 1), and the feature
// reports reach ctl while emulate waits before its last report (case 2).
#include "EmulateCommand.h"
#include "ToolError.h"
#include "ToolTestSupport.h"
#include "platform/devices/FakeUhidKernel.h"
#include "recording/RecordingTestSupport.h"

#include <gtest/gtest.h>
#include <linux/input.h>

#include <atomic>
#include <map>
#include <sstream>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

using namespace VeltoTool;
using namespace VeltoTool::Testing;
using RecordingTestSupport::reportFrame;
using RecordingTestSupport::stateFrame;
using VeltoHost::Testing::FakeUhidKernel;
using VeltoTouch::PipelineRecording;

namespace {

using Bytes = std::vector<std::uint8_t>;
constexpr std::uint64_t kSecondNs = 1'000'000'000;

Bytes image(std::uint8_t fill)
{
    Bytes report(73, fill);
    report[0] = 0x01;
    return report;
}

Bytes bytes(const std::uint8_t* data, std::size_t size) { return {data, data + size}; }

// A recording of these reports, 10 ms apart, with state frames before,
// between and after them.
std::string recordingOf(const std::vector<Bytes>& reports)
{
    const auto state = [](std::uint64_t ns) {
        return stateFrame(ns, "Algs.HoldTimeoutMilliseconds", VeltoHost::PropertyValue::uint32(600));
    };
    PipelineRecording recording;
    std::uint64_t reportNs = kSecondNs;
    recording.appendFrame(state(reportNs));
    for (const Bytes& report : reports) {
        recording.appendFrame(reportFrame(reportNs += kSecondNs / 100, report));
        recording.appendFrame(state(reportNs + 1));
    }
    return recording.json();
}

// The length in bytes, counting the ID, of each report a descriptor declares,
// by main item (0x80 input, 0xB0 feature) and ID; and its usage page.
std::map<std::pair<int, int>, std::uint32_t> declaredIn(const Bytes& descriptor, std::uint32_t& usagePage)
{
    std::map<std::pair<int, int>, std::uint32_t> declared;
    std::uint32_t items[256] = {};  // the last value of each tag
    for (std::size_t at = 0, size = 0; at < descriptor.size(); at += 1 + size) {
        size = (descriptor[at] & 3) == 3 ? 4 : descriptor[at] & 3;
        const int tag = descriptor[at] & 0xFC;
        items[tag] = 0;
        for (std::size_t i = 0; i < size; ++i) items[tag] |= std::uint32_t(descriptor.at(at + 1 + i)) << (8 * i);
        // Report ID 0x84, size 0x74 (bits) and count 0x94.
        if (tag == 0x80 || tag == 0xB0) declared[{tag, items[0x84]}] = 1 + items[0x74] * items[0x94] / 8;
    }
    usagePage = items[0x04];
    return declared;
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
        kernel.receiveAll();
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

TEST(EmulateCommand, PlaysTheReportsIntoADeviceShapedLikeTheSurfaceAndAnswersItsFeatureReports)
{
    TempDir dir;
    const std::vector<Bytes> reports = {image(0x11), {0x02, 0x00, 1, 2, 3, 4, 5, 6, 7, 8}, image(0x22), image(0x33)};
    EmulateCommand::Options options;
    options.file = dir.file("played.json", recordingOf(reports));
    options.speed = 0;
    options.vendor = 0x2345;
    options.product = 0x6789;
    options.holdDurationMs = 0x01020304;
    Background background(options);
    // Asked before the first report: 0x77 is no report of the surface, and
    // only feature reports are kept, not input reports.
    uhid_event setReport = FakeUhidKernel::event(UHID_SET_REPORT);
    setReport.u.set_report.id = 5;
    for (const uhid_event& request :
         {FakeUhidKernel::event(UHID_START), FakeUhidKernel::getReport(1, 0x1F), FakeUhidKernel::getReport(2, 0x3B),
          FakeUhidKernel::getReport(3, 0x77), FakeUhidKernel::getReport(4, 0x1F, UHID_INPUT_REPORT), setReport,
          FakeUhidKernel::event(UHID_OPEN)}) {
        background.kernel.send(request);
    }
    const std::vector<uhid_event> events = background.kernel.receiveAll();
    ASSERT_EQ(background.finish(), 0) << background.err.str();
    ASSERT_GE(events.size(), 2u);

    ASSERT_EQ(events.front().type, UHID_CREATE2);
    const auto& create = events.front().u.create2;
    EXPECT_STREQ(reinterpret_cast<const char*>(create.name), "VeltoTouch virtual surface");
    EXPECT_EQ(create.bus, BUS_USB);
    EXPECT_EQ(create.vendor, 0x2345u);
    EXPECT_EQ(create.product, 0x6789u);
    std::uint32_t usagePage = 0;
    std::map<std::pair<int, int>, std::uint32_t> expected = {{{0x80, 0x01}, 73}, {{0x80, 0x02}, 10}, {{0xB0, 0x1F}, 5}};
    for (int id : {0x04, 0x10, 0x11, 0x12, 0x13, 0x1D, 0x32, 0x3B, 0x3C, 0x3F}) expected[{0xB0, id}] = 128;
    EXPECT_EQ(declaredIn(bytes(create.rd_data, create.rd_size), usagePage), expected);
    EXPECT_EQ(usagePage, 0xFF00u);

    // The inputs played in order without the state frames: the looping test.
    // What the hold duration and the debug reports read through the kernel:
    // the system test (case 2).
    std::map<std::uint32_t, uhid_event> replies;
    for (const uhid_event& event : events) {
        if (event.type == UHID_GET_REPORT_REPLY) replies[event.u.get_report_reply.id] = event;
        if (event.type == UHID_SET_REPORT_REPLY) replies[event.u.set_report_reply.id] = event;
    }
    ASSERT_EQ(replies.size(), 5u);
    EXPECT_EQ(replies[1].u.get_report_reply.err, 0);
    EXPECT_EQ(replies[2].u.get_report_reply.err, 0);
    EXPECT_EQ(replies[3].u.get_report_reply.err, EIO);
    EXPECT_EQ(replies[4].u.get_report_reply.err, EIO);
    EXPECT_EQ(replies[5].type, UHID_SET_REPORT_REPLY);
    EXPECT_EQ(replies[5].u.set_report_reply.err, EIO);
    EXPECT_EQ(events.back().type, UHID_DESTROY);
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
    EXPECT_EQ(background.finish(), 0) << background.err.str();
    EXPECT_EQ(background.err.str(), "veltotouch: VeltoTouch virtual surface 1234:5678 made; playing " + options.file +
                                        " once a reader keeps it open (Ctrl-C to stop)\n");

    // Stopped while nobody has it open: made and removed, nothing played.
    Background unopened(options);
    EXPECT_EQ(unopened.nextType(), UHID_CREATE2);
    unopened.stop = true;
    EXPECT_EQ(unopened.nextType(), UHID_DESTROY);
    EXPECT_EQ(unopened.finish(), 0);
}

// A recording that fails at its start never makes a device appear.
TEST(EmulateCommand, ARecordingThatCannotBePlayedIsNamedAndMakesNoDevice)
{
    TempDir dir;
    const std::tuple<std::string, std::string, std::string> cases[] = {
        {"text.json", "not json", ": not JSON"}, {"states.json", recordingOf({}), ": no input reports to play"}};
    for (const auto& [name, content, message] : cases) {
        EmulateCommand::Options options;
        options.file = dir.file(name, content);
        Background background(options);
        EXPECT_TRUE(background.kernel.receiveAll().empty()) << name;
        EXPECT_EQ(background.finish(), 1);
        EXPECT_EQ(background.err.str().rfind(options.file + message, 0), 0u) << background.err.str();
    }
}

TEST(EmulateCommand, CommandLineFailuresAreOneLineSayingWhatToDo)
{
    TempDir dir;
    const std::string recording = dir.file("one.json", recordingOf({image(1)}));
    const std::tuple<std::vector<std::string>, int, std::string> cases[] = {
        {{recording, "--uhid", "/no/such/uhid"}, 1,
         "/no/such/uhid: No such file or directory (the uhid module is not loaded? 'modprobe uhid' loads it)"},
        {{recording, "--vendor", "0x10000"}, 2, "--vendor: must be at most 65535 (0xffff), got 0x10000"},
        {{recording, "--hold-duration", "-1"}, 2,
         "--hold-duration: expected a number (decimal, or hexadecimal after 0x), got \"-1\""},
    };
    for (auto [arguments, status, line] : cases) {
        arguments.insert(arguments.begin(), "emulate");
        const ToolRun run = runTool(arguments);
        EXPECT_EQ(run.status, status) << run.err;
        EXPECT_EQ(run.err, "veltotouch: " + line + (status == 2 ? " (see 'veltotouch help emulate')\n" : "\n"));
    }
}

}  // namespace
