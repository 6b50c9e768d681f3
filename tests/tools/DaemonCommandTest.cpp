// The daemon and its client as an integrator runs them: the built tool as a
// process of its own on a private bus, asked by `veltotouch ctl`, by busctl
// and by a plain D-Bus client.
#include "PrivateBus.h"
#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include "host/BusService.h"
#include "host/ControlClient.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <csignal>
#include <map>

using namespace VeltoTool::Testing;
using VeltoHost::BusConnection;
using VeltoHost::BusService;
using VeltoHost::ControlClient;

namespace {

constexpr auto kDeadline = ToolProcess::Seconds(30);

// Every event of `replay --jsonl FILE`, with the counters at the end.
struct Replayed {
    std::vector<json> events;  // without time stamps: a replay and a live run differ there
    json counters;
};

Replayed replay(const std::string& file)
{
    const ToolRun run = runTool({"replay", file, "--jsonl", "--get", "Algs.EventStats"});
    EXPECT_EQ(run.status, 0) << run.err;
    Replayed replayed;
    for (json parsed : jsonLinesOf(run.out)) {
        if (parsed.contains("key")) {
            replayed.counters = parsed["value"];
        } else {
            parsed.erase("timestamp");
            replayed.events.push_back(parsed);
        }
    }
    return replayed;
}

ToolRun ctl(const PrivateBus& bus, std::vector<std::string> arguments)
{
    arguments.insert(arguments.begin(), {"ctl", "--bus", bus.address()});
    return runTool(arguments);
}

ToolProcess::Result busctl(const PrivateBus& bus, std::vector<std::string> arguments)
{
    arguments.insert(arguments.begin(), "--address=" + bus.address());
    ToolProcess process(arguments, ProcessSetup::copy("/usr/bin/busctl"));
    return process.finish(kDeadline);
}

std::vector<std::string> daemonArguments(const PrivateBus& bus, const std::vector<std::string>& files,
                                         const std::string& speed)
{
    std::vector<std::string> arguments{"daemon", "--bus", bus.address(), "--no-udev", "--no-keys", "--speed", speed};
    for (const std::string& file : files) {
        arguments.push_back("--device");
        arguments.push_back("sim:" + file);
    }
    return arguments;
}

}  // namespace

TEST(DaemonCommandTest, TwoSimulatedDevicesServedToCtlBusctlAndSignalsAsReplaySeesThem)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    const std::vector<std::string> files{kExamples + "/taps.json", kExamples + "/reset-mid-hold.json"};

    // Nobody serves the name yet.
    const ToolRun absent = ctl(bus, {"devices"});
    EXPECT_EQ(absent.status, 1);
    EXPECT_EQ(absent.err, "veltotouch: the daemon is not running on the bus at " + bus.address() +
                              " (no owner of org.veltotouch.VeltoTouch1)\n");

    // Watching before the daemon starts: every signal of both devices is seen.
    ControlClient watcher(BusConnection::Address::at(bus.address()));
    ASSERT_TRUE(watcher.connected()) << watcher.connectError();
    ASSERT_TRUE(watcher.watchSignals());
    watcher.listDevices();  // a round trip: the match is in place from here on

    ToolProcess daemon(daemonArguments(bus, files, "1"));
    ASSERT_TRUE(daemon.started());
    ASSERT_TRUE(watcher.waitUntil([&] { return watcher.signalsNamed("DeviceAdded").size() == 2; }));

    // A client that joins while reports flow sees the rest, in replay's lines.
    ToolProcess events({"ctl", "--bus", bus.address(), "events", "-d", "1", "--jsonl"});
    std::vector<Replayed> replayed;
    for (const std::string& file : files) replayed.push_back(replay(file));
    // Both streams end: every event of both recordings has been signalled.
    const std::size_t total = replayed[0].events.size() + replayed[1].events.size();
    ASSERT_TRUE(watcher.waitUntil(
        [&] { return watcher.signalsNamed("Gesture").size() + watcher.signalsNamed("DeviceReset").size() >= total; },
        std::chrono::seconds(60)));

    events.signal(SIGINT);
    const ToolProcess::Result watched = events.finish(kDeadline);
    ASSERT_TRUE(watched.exited) << watched.err;
    EXPECT_EQ(watched.status, 0) << watched.err;
    std::vector<json> printed = jsonLinesOf(watched.out);
    for (json& line : printed) line.erase("timestamp");
    ASSERT_FALSE(printed.empty()) << "ctl events saw nothing of device 1";
    ASSERT_LE(printed.size(), replayed[1].events.size());
    EXPECT_TRUE(std::equal(printed.rbegin(), printed.rend(), replayed[1].events.rbegin())) << watched.out;

    // Both stay attached after their streams ended, with replay's counters.
    const ToolRun devices = ctl(bus, {"devices"});
    EXPECT_EQ(devices.out, "0  sim:" + files[0] + "\n1  sim:" + files[1] + "\n");
    for (std::size_t device = 0; device < files.size(); ++device) {
        const ToolRun counters = ctl(bus, {"get", "-d", std::to_string(device), "Pipeline.Algs.EventStats"});
        ASSERT_EQ(counters.status, 0) << counters.err;
        EXPECT_EQ(json::parse(counters.out), replayed[device].counters);
    }

    // Writes, reads and saves; without -d the first device.
    EXPECT_EQ(ctl(bus, {"set", "Pipeline.Algs.HoldTimeoutMilliseconds=650"}).status, 0);
    EXPECT_EQ(ctl(bus, {"get", "-d", "0", "Pipeline.Algs.HoldTimeoutMilliseconds"}).out, "650\n");
    const ToolProcess::Result readBack =
        busctl(bus, {"call", BusService::kBusName, BusService::devicePath(0), BusService::kDeviceInterface,
                     "GetProperty", "s", "Pipeline.Algs.HoldTimeoutMilliseconds"});
    EXPECT_EQ(readBack.out, "s \"650\"\n") << readBack.err;
    const ToolProcess::Result name = busctl(bus, {"get-property", BusService::kBusName, BusService::devicePath(1),
                                                  BusService::kDeviceInterface, "Name"});
    EXPECT_EQ(name.out, "s \"sim:" + files[1] + "\"\n") << name.err;

    // A relative path is the client's, not the daemon's.
    const std::string relative = "daemon-test-" + std::to_string(::getpid()) + ".json";
    const ToolRun saved = ctl(bus, {"save-recording", "-d", "1", relative});
    EXPECT_EQ(saved.status, 0) << saved.err;
    EXPECT_EQ(eventsOf(runTool({"replay", relative, "--jsonl"}).out), eventsOf(runTool({"replay", files[1], "--jsonl"}).out));
    fs::remove(relative);

    // What cannot be done is said in one line, and the daemon goes on.
    struct Refusal {
        std::vector<std::string> arguments;
        std::string error;
    };
    const Refusal refusals[] = {
        {{"set", "Pipeline.Algs.HoldTimeoutMilliseconds=abc"},
         "veltotouch: the value for 'Pipeline.Algs.HoldTimeoutMilliseconds' is not JSON: abc (InvalidJson)\n"},
        {{"get", "-d", "7", "Pipeline.Algs.EventStats"},
         "veltotouch: no device 7 is attached ('veltotouch ctl devices' lists them)\n"},
        {{"get", "Pipeline.NoSuchKey"}, "veltotouch: no readable property 'Pipeline.NoSuchKey' (InvalidArgument)\n"},
        {{"save-recording", "/no/such/dir/r.json"}, ""},
    };
    for (const Refusal& refusal : refusals) {
        const ToolRun refused = ctl(bus, refusal.arguments);
        EXPECT_EQ(refused.status, 1) << refusal.arguments[0];
        if (refusal.error.empty()) {
            EXPECT_EQ(refused.err.rfind("veltotouch: ", 0), 0u) << refused.err;
        } else {
            EXPECT_EQ(refused.err, refusal.error);
        }
    }
    EXPECT_EQ(ctl(bus, {"get", "-d", "1", "Pipeline.Algs.HoldTimeoutMilliseconds"}).status, 0);

    daemon.signal(SIGTERM);
    const ToolProcess::Result ended = daemon.finish(kDeadline);
    ASSERT_TRUE(ended.exited) << "ended by signal " << ended.signal << "\n" << ended.err;
    EXPECT_EQ(ended.status, 0) << ended.err;
}

TEST(DaemonCommandTest, ATermDuringPlaybackTakesEveryDeviceApartInOrder)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    ControlClient watcher(BusConnection::Address::at(bus.address()));
    ASSERT_TRUE(watcher.connected()) << watcher.connectError();
    ASSERT_TRUE(watcher.watchSignals());
    watcher.listDevices();

    const std::vector<std::string> files{kExamples + "/demo.json", kExamples + "/holds.json"};
    ToolProcess daemon(daemonArguments(bus, files, "1"));
    ASSERT_TRUE(daemon.started());
    ASSERT_TRUE(watcher.waitUntil([&] { return !watcher.signalsNamed("Gesture").empty(); }));
    daemon.signal(SIGTERM);
    const ToolProcess::Result ended = daemon.finish(kDeadline);
    // Under the sanitizers a leak or a fault would change the status.
    ASSERT_TRUE(ended.exited) << "ended by signal " << ended.signal << "\n" << ended.err;
    EXPECT_EQ(ended.status, 0) << ended.err;

    ASSERT_TRUE(watcher.waitUntil([&] { return watcher.signalsNamed("DeviceRemoved").size() == 2; }));
    const auto removed = watcher.signalsNamed("DeviceRemoved");
    EXPECT_EQ(removed[0].object, BusService::devicePath(0));
    EXPECT_EQ(removed[1].object, BusService::devicePath(1));
    // Each device's signals end before its removal is announced.
    std::map<std::string, bool> gone;
    for (const ControlClient::Signal& signal : watcher.signals()) {
        if (signal.member == "DeviceRemoved") gone[signal.object] = true;
        if (signal.member == "Gesture") {
            EXPECT_FALSE(gone[signal.path]) << "a gesture of a removed " << signal.path;
        }
    }
    // A demo cut short by the signal: fewer gestures than the whole replay.
    EXPECT_LT(watcher.signalsNamed("Gesture").size(), replay(files[0]).events.size() + replay(files[1]).events.size());
}
