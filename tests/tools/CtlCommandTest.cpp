// `veltotouch ctl` against the real daemon on a private bus: what a user sees
// when the daemon goes away, when a write does not read back as written, and
// what is refused.
#include "PrivateBus.h"
#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include "host/BusService.h"
#include "host/ControlClient.h"

#include <gtest/gtest.h>

#include <csignal>
#include <fstream>
#include <string>
#include <vector>

using namespace VeltoTool::Testing;
using VeltoHost::BusConnection;
using VeltoHost::BusService;
using VeltoHost::ControlClient;

namespace {

constexpr auto kDeadline = ToolProcess::Seconds(30);

ToolRun ctl(const PrivateBus& bus, std::vector<std::string> arguments)
{
    arguments.insert(arguments.begin(), {"ctl", "--bus", bus.address()});
    return runTool(arguments);
}

// The daemon playing a recording on `bus`, once it serves its device.
std::unique_ptr<ToolProcess> startDaemon(const PrivateBus& bus, const std::string& recording)
{
    ControlClient watcher(BusConnection::Address::at(bus.address()));
    EXPECT_TRUE(watcher.watchSignals());
    auto daemon = std::make_unique<ToolProcess>(std::vector<std::string>{
        "daemon", "--bus", bus.address(), "--no-udev", "--no-keys", "--device", "sim:" + recording});
    EXPECT_TRUE(watcher.waitUntil([&] { return !watcher.signalsNamed("DeviceAdded").empty(); }));
    return daemon;
}

ToolProcess::Result stop(ToolProcess& process, int signal)
{
    process.signal(signal);
    return process.finish(kDeadline);
}

// The resident memory of a process, in kilobytes.
long residentKilobytes(pid_t pid)
{
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    for (std::string line; std::getline(status, line);) {
        if (line.rfind("VmRSS:", 0) == 0) return std::stol(line.substr(6));
    }
    return -1;
}

}  // namespace

TEST(CtlCommandTest, EventsEndWhenTheDaemonStopsUnlessFollowedIntoTheNextOne)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    const std::string demo = kExamples + "/demo.json";
    auto first = startDaemon(bus, demo);

    ToolProcess plain({"ctl", "--bus", bus.address(), "events"});
    ToolProcess following({"ctl", "--bus", bus.address(), "events", "--follow", "--jsonl"});
    // A gesture printed by each: both watch the daemon.
    ASSERT_TRUE(plain.readLine(kDeadline));
    ASSERT_TRUE(following.readLine(kDeadline));

    const ToolProcess::Result firstEnded = stop(*first, SIGTERM);
    EXPECT_EQ(firstEnded.status, 0) << firstEnded.err;
    const ToolProcess::Result ended = plain.finish(kDeadline);
    EXPECT_EQ(ended.status, 1);
    EXPECT_EQ(ended.err, "veltotouch: the daemon stopped (org.veltotouch.VeltoTouch1 left the bus)\n");

    // The next daemon's gestures reach the follower; the one before it is
    // said to have gone.
    auto second = startDaemon(bus, demo);
    std::optional<std::string> line;
    do {
        line = following.readLine(kDeadline);
        ASSERT_TRUE(line) << "no gesture of the second daemon";
    } while (line->find("\"frame\":21,") == std::string::npos);  // the demo's first gesture, again
    const ToolProcess::Result followed = stop(following, SIGINT);
    EXPECT_EQ(followed.status, 0) << followed.err;
    EXPECT_NE(followed.err.find("the daemon stopped; waiting for it to come back"), std::string::npos) << followed.err;
    EXPECT_NE(followed.err.find("the daemon is running again"), std::string::npos) << followed.err;
    stop(*second, SIGTERM);
}

TEST(CtlCommandTest, WritesThatCannotHoldAreToldAndLargeValuesCostTheDaemonNothing)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    auto daemon = startDaemon(bus, kExamples + "/taps.json");

    struct Case {
        std::vector<std::string> arguments;
        int status;
        std::string err;  // expected within standard error
    };
    const Case cases[] = {
        {{"set", "Pipeline.Algs.HoldTimeoutMilliseconds=600"}, 0, ""},
        {{"set", "Pipeline.Algs.ActivationThreshold=1e40"},
         0,
         "veltotouch: warning: Pipeline.Algs.ActivationThreshold was set to 1e+40 but reads back null"},
        {{"set", "Pipeline.Algs.ActivationThreshold=1e400"}, 1, "is JSON with a number out of range"},
        {{"set", "Pipeline.Algs.ActivationThreshold=" + std::string(600, '[') + std::string(600, ']')},
         1,
         "is JSON nested deeper than 512 levels"},
        {{"set", "Version=[9,9,9]"}, 1, "veltotouch: property 'Version' is read-only (Failed)\n"},
        {{"set", "Recording=\"x\""}, 1, "property 'Recording' is read-only"},
        {{"set", "ServicePluginDebug={}"}, 1, "property 'ServicePluginDebug' is read-only"},
        {{"set", "Pipeline.Algs.ActivationThreshold=" + std::string(5000, '1')}, 1, "no setting takes more than 4096"},
    };
    for (const Case& c : cases) {
        const ToolRun run = ctl(bus, c.arguments);
        EXPECT_EQ(run.status, c.status) << c.arguments[1].substr(0, 60) << ": " << run.err;
        if (c.err.empty()) {
            EXPECT_EQ(run.err, "");
        } else {
            EXPECT_NE(run.err.find(c.err), std::string::npos) << run.err;
        }
    }
    EXPECT_EQ(ctl(bus, {"get", "Version"}).out.empty(), false);

    // Values far larger than any setting are refused without being kept.
    ControlClient client(BusConnection::Address::at(bus.address()));
    const std::string path = BusService::devicePath(0);
    const std::string huge(20 << 20, '7');
    const long before = residentKilobytes(daemon->pid());
    for (int i = 0; i < 10; ++i) {
        EXPECT_EQ(client.setProperty(path, "Pipeline.Algs.ActivationThreshold", huge).error,
                  BusService::kErrorInvalidArgument);
    }
    // A sanitizer's allocator keeps freed blocks in quarantine on purpose.
    if (!VELTO_SANITIZED) {
        EXPECT_LT(residentKilobytes(daemon->pid()), before + 8 * 1024) << "kB resident before: " << before;
    }
    EXPECT_EQ(stop(*daemon, SIGTERM).status, 0);
}
