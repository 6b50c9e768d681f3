// The daemon and its client as an integrator runs them: the built tool as a
// process of its own on a private bus, asked by `veltotouch ctl` and by a
// plain D-Bus client. README's own daemon, ctl and busctl examples are run
// as printed by ReadmeExamplesTest.
#include "DaemonCommand.h"
#include "PrivateBus.h"
#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include "bus/BusService.h"
#include "bus/ControlClient.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <sys/socket.h>
#include <sys/un.h>

#include <chrono>
#include <csignal>
#include <cstring>
#include <fstream>
#include <memory>
#include <optional>
#include <thread>

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

// systemd's end of sd_notify: a datagram socket named to the daemon in
// NOTIFY_SOCKET, which tells the test when the daemon is ready and when a
// reload is done.
class NotifySocket {
public:
    explicit NotifySocket(const fs::path& path) : _path(path.string())
    {
        _fd = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strncpy(address.sun_path, _path.c_str(), sizeof address.sun_path - 1);
        ::bind(_fd, reinterpret_cast<const sockaddr*>(&address), sizeof address);
    }
    ~NotifySocket() { ::close(_fd); }
    NotifySocket(const NotifySocket&) = delete;
    NotifySocket& operator=(const NotifySocket&) = delete;

    ProcessSetup setup() const
    {
        ProcessSetup setup;
        setup.environment = {"NOTIFY_SOCKET=" + _path};
        return setup;
    }
    // The next message; empty when none comes before the deadline.
    std::string next() const
    {
        pollfd readable{_fd, POLLIN, 0};
        if (::poll(&readable, 1, static_cast<int>(std::chrono::milliseconds(kDeadline).count())) != 1) return {};
        char message[4096];
        const ssize_t length = ::recv(_fd, message, sizeof message, 0);
        return length > 0 ? std::string(message, static_cast<std::size_t>(length)) : std::string();
    }

private:
    std::string _path;
    int _fd = -1;
};

std::vector<std::string> operator+(std::vector<std::string> first, const std::vector<std::string>& second)
{
    first.insert(first.end(), second.begin(), second.end());
    return first;
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

// Each test on a private bus of its own.
class DaemonCommandTest : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_FALSE(bus.address().empty()) << bus.error(); }
    PrivateBus bus;
};

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

TEST_F(DaemonCommandTest, TwoSimulatedDevicesServedToCtlAndSignalsAsReplaySeesThem)
{
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

    // A relative path is the client's, not the daemon's.
    const std::string relative = "daemon-test-" + std::to_string(::getpid()) + ".json";
    const ToolRun saved = ctl(bus, {"save-recording", "-d", "1", relative});
    EXPECT_EQ(saved.status, 0) << saved.err;
    EXPECT_EQ(eventsOf(runTool({"replay", relative, "--jsonl"}).out), eventsOf(runTool({"replay", files[1], "--jsonl"}).out));
    fs::remove(relative);

    // What cannot be done is said in one line, and the daemon goes on. (An
    // output that cannot be made is refused before anything is asked of the
    // daemon, as for every command: OutputFileTest, SynthCommandTest.)
    struct Refusal {
        std::vector<std::string> arguments;
        std::string error;
    };
    const Refusal refusals[] = {
        {{"set", "Pipeline.Algs.HoldTimeoutMilliseconds=abc"},
         "veltotouch: the value for 'Pipeline.Algs.HoldTimeoutMilliseconds' is not JSON: abc (InvalidJson)\n"},
        {{"get", "-d", "7", "Pipeline.Algs.EventStats"},
         "veltotouch: no device 7 is attached ('veltotouch ctl devices' lists them)\n"},
    };
    for (const Refusal& refusal : refusals) {
        const ToolRun refused = ctl(bus, refusal.arguments);
        EXPECT_EQ(refused.status, 1) << refusal.arguments[0];
        EXPECT_EQ(refused.err, refusal.error);
    }
    EXPECT_EQ(ctl(bus, {"get", "-d", "1", "Pipeline.Algs.HoldTimeoutMilliseconds"}).status, 0);

    const ToolProcess::Result ended = stop(daemon, SIGTERM);
    ASSERT_TRUE(ended.exited) << "ended by signal " << ended.signal << "\n" << ended.err;
    EXPECT_EQ(ended.status, 0) << ended.err;
}

TEST_F(DaemonCommandTest, ADaemonThatLosesItsBusEndsWithAFailureForItsServiceManager)
{
    TempDir dir;
    const NotifySocket systemd(dir.file("notify"));
    ToolProcess daemon(daemonArguments(bus, {kExamples + "/taps.json"}, "0"), systemd.setup());
    ASSERT_EQ(systemd.next(), "READY=1");

    bus.kill();
    const ToolProcess::Result ended = daemon.finish(kDeadline);
    ASSERT_TRUE(ended.exited) << "ended by signal " << ended.signal << "\n" << ended.err;
    EXPECT_EQ(ended.status, 1);
    EXPECT_TRUE(ended.err.ends_with("\nveltotouch: the connection to the bus at " + bus.address() + " was lost\n"))
        << ended.err;
}

TEST_F(DaemonCommandTest, BadDevicesAreNamedAndLeftOutAndWithNothingToServeTheDaemonEnds)
{
    TempDir dir;
    const std::string bad = dir.file("bad.json", "not a recording").string();
    const std::vector<std::string> badDevices{"--device", "/dev/null", "--device", "sim:" + bad};
    const std::string refusals[] = {
        "/dev/null is a character device of the \"mem\" subsystem (1:3); expected a hidraw device node (/dev/hidrawN) "
        "or sim:FILE\n",
        "sim:" + bad + ": not attached: migrateSerializedContainer failed: invalid container\n",
    };

    const NotifySocket systemd(dir.file("notify"));
    ToolProcess daemon(daemonArguments(bus, {kExamples + "/taps.json"}, "0") + badDevices, systemd.setup());
    ASSERT_EQ(systemd.next(), "READY=1");
    EXPECT_EQ(ctl(bus, {"devices"}).out, "0  sim:" + kExamples + "/taps.json\n");
    const ToolProcess::Result served = stop(daemon, SIGTERM);
    EXPECT_EQ(served.status, 0) << served.err;
    for (const std::string& refusal : refusals) EXPECT_NE(served.err.find(refusal), std::string::npos) << served.err;

    // Nothing attached, and nothing that udev could ever bring.
    const std::string none = "veltotouch: no device to serve: none ";
    const std::vector<std::string> withUdev{"daemon", "--bus", bus.address()};
    const std::vector<std::string> noUdev = withUdev + std::vector<std::string>{"--no-udev"};
    const struct {
        std::vector<std::string> arguments;
        std::string lastLine;
    } ends[] = {
        {noUdev + badDevices,
         none + "of the devices given with --device could be attached, and with --no-udev no other is taken\n"},
        {withUdev + badDevices,
         none + "of the devices given with --device could be attached, and the configuration has no [[match]] to "
                "take any other\n"},
        {noUdev,
         none + "was given with --device, and with --no-udev no other is taken\n"},
    };
    for (const auto& end : ends) {
        ToolProcess ending(end.arguments);
        const ToolProcess::Result ended = ending.finish(kDeadline);
        EXPECT_EQ(ended.status, VeltoTool::DaemonCommand::kNothingToServe) << ended.err;
        EXPECT_TRUE(ended.err.ends_with(end.lastLine)) << ended.err;
    }
}

TEST_F(DaemonCommandTest, SighupReloadsTheConfigurationAndABadFileLeavesThePreviousOneInForce)
{
    TempDir dir;
    const std::string config = dir.file("veltotouch.toml", "log_level = \"error\"\n").string();
    const NotifySocket systemd(dir.file("notify"));
    const std::vector<std::string> withConfig{"--config", config};
    ToolProcess daemon(daemonArguments(bus, {kExamples + "/taps.json"}, "0") + withConfig, systemd.setup());
    ASSERT_EQ(systemd.next(), "READY=1");

    const struct {
        std::string file;
        std::string logged;
    } reloads[] = {
        {"log_level = \"default\"\n[keys]\ntap.middle = \"KEY_MUTE\"\n",
         "] default: configuration reloaded from " + config + "\n"},
        {"log_level = \"error\"\n[keys]\ntap.middle = \"KEY_NOPE\"\n",
         "] error: configuration not reloaded, the previous one stays in force: " + config +
             ":3:14: unknown key name \"KEY_NOPE\""},
    };
    for (const auto& reload : reloads) {
        dir.file("veltotouch.toml", reload.file);
        daemon.signal(SIGHUP);
        EXPECT_TRUE(systemd.next().starts_with("RELOADING=1\nMONOTONIC_USEC="));
        EXPECT_EQ(systemd.next(), "READY=1");
        EXPECT_EQ(ctl(bus, {"devices"}).out, "0  sim:" + kExamples + "/taps.json\n");
    }
    const ToolProcess::Result ended = stop(daemon, SIGTERM);
    ASSERT_TRUE(ended.exited) << "ended by signal " << ended.signal << "\n" << ended.err;
    EXPECT_EQ(ended.status, 0) << ended.err;
    for (const auto& reload : reloads) EXPECT_NE(ended.err.find(reload.logged), std::string::npos) << ended.err;
    // Logged at the level the first reload set: the bad file did not change it.
    EXPECT_NE(ended.err.find("] default: stopping: taking 1 devices apart\n"), std::string::npos) << ended.err;
}

TEST_F(DaemonCommandTest, CtlEventsEndWhenTheDaemonStopsUnlessFollowedIntoTheNextOne)
{
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

TEST_F(DaemonCommandTest, CtlWritesThatCannotHoldAreToldAndLargeValuesCostTheDaemonNothing)
{
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
        {{"set", "Version=[9,9,9]"}, 1, "veltotouch: property 'Version' is read-only (Failed)\n"},
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
        // The last request may still be let go of after its answer went out:
        // judged once the daemon has had a moment, and never sooner.
        long after = residentKilobytes(daemon->pid());
        for (int tries = 0; tries < 50 && after >= before + 8 * 1024; ++tries) {
            std::this_thread::sleep_for(std::chrono::milliseconds(100));
            after = residentKilobytes(daemon->pid());
        }
        EXPECT_LT(after, before + 8 * 1024) << "kB resident before: " << before;
    }
    EXPECT_EQ(stop(*daemon, SIGTERM).status, 0);
}
