#include "daemon/Daemon.h"

#include "PrivateBus.h"
#include "bus/ControlClient.h"

#include "platform/devices/SimulatedHostDevice.h"
#include "platform/log/CaptureLogSink.h"
#include "platform/runtime/RunLoop.h"

#include <gtest/gtest.h>

#include <linux/input-event-codes.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <functional>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <vector>

using namespace VeltoHost;
using namespace std::chrono_literals;

namespace {

const std::string kExamples = VELTO_EXAMPLES_DIR;

// Hot-plug on demand: reports the devices a test makes up, on the daemon's
// thread, as the udev watcher does.
class TestWatcher final : public DeviceWatcher {
public:
    void start(Added added, Removed removed) override
    {
        _added = std::move(added);
        _removed = std::move(removed);
        _loop = RunLoop::current();
        _started = true;
    }
    void stop() override {}

    bool started() const { return _started; }
    void plug(const Device& device)
    {
        _loop->performJob(Daemon::kRunLoopMode, [this, device] { _added(device); });
        _loop->wakeUp();
    }
    void unplug(const std::string& path)
    {
        _loop->performJob(Daemon::kRunLoopMode, [this, path] { _removed(path); });
        _loop->wakeUp();
    }

private:
    Added _added;
    Removed _removed;
    RunLoop::Ref _loop;
    std::atomic<bool> _started{false};
};

// Takes every key and keeps none: the reload test looks at which keyboards
// were made, the session test at what they are sent.
class IdleKeyboard final : public KeyboardSink {
public:
    bool emitKey(unsigned int, bool) override { return true; }
    bool sync() override { return true; }
};

// The limit only keeps a broken daemon from hanging the test.
bool eventually(const std::function<bool()>& done)
{
    const auto limit = std::chrono::steady_clock::now() + 20s;
    while (!done()) {
        if (std::chrono::steady_clock::now() > limit) return false;
        std::this_thread::sleep_for(1ms);
    }
    return true;
}

// A daemon on `bus` playing `file` as fast as the plug-in takes it.
Daemon::Options optionsOn(const PrivateBus& bus, const std::string& file)
{
    Daemon::Options options;
    options.bus = BusConnection::Address::at(bus.address());
    options.simulatedFiles = {file};
    options.speed = 0;
    options.pluginPath = VELTO_SERVICE_MODULE_PATH;
    return options;
}

std::vector<std::string> deviceNames(ControlClient& client)
{
    std::vector<std::string> names;
    for (const std::string& path : client.listDevices()) names.push_back(client.name(path).value);
    return names;
}

}  // namespace

TEST(DaemonTest, HotPluggedDevicesAreTakenByTheMatchesAndAReloadTakesNewKeysLogLevelAndMatches)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    const std::string path =
        (std::filesystem::temp_directory_path() / ("daemon-reload-" + std::to_string(::getpid()) + ".toml")).string();
    const auto write = [&](const std::string& text) { std::ofstream(path) << text; };
    write("[[match]]\nvendor = 0x1234\nproduct = 0x5678\n");
    Daemon::Options options = optionsOn(bus, kExamples + "/taps.json");
    options.config = DaemonConfig::load(path);
    options.configPath = path;
    auto watcher = std::make_unique<TestWatcher>();
    TestWatcher& plugs = *watcher;
    std::mutex madeLock;
    std::vector<std::set<unsigned int>> made;  // the key codes of each keyboard made, guarded by madeLock
    const auto keyboardsMade = [&] {
        std::lock_guard guard(madeLock);
        return made;
    };
    const int environmentThreshold = Log::threshold();
    ControlClient client(BusConnection::Address::at(bus.address()));
    ASSERT_TRUE(client.connected()) << client.connectError();
    ASSERT_TRUE(client.watchSignals());

    Daemon daemon(
        options, std::move(watcher), [](const DeviceWatcher::Device&) { return SimulatedHostDevice::create(); },
        [&](const std::set<unsigned int>& codes) {
            std::lock_guard guard(madeLock);
            made.push_back(codes);
            return Daemon::MadeKeyboard{std::make_unique<IdleKeyboard>(), {}};
        });
    // The daemon takes a request at one poll and has carried it out by the
    // next, with every device the watcher told of before.
    std::atomic<int> polls{0};
    std::atomic<bool> reloadRequested{false};
    const auto settled = [&] {
        const int asked = polls.load();
        return eventually([&] { return polls.load() >= asked + 2; });
    };
    const auto reload = [&] {
        reloadRequested = true;
        return settled();
    };
    std::jthread serving([&](std::stop_token stop) {
        daemon.run([&] { return stop.stop_requested(); },
                   [&] {
                       ++polls;
                       return reloadRequested.exchange(false);
                   });
    });
    while (!plugs.started()) std::this_thread::sleep_for(1ms);
    plugs.plug({"/dev/hidraw-a", 3, 0x1234, 0x5678});
    plugs.plug({"/dev/hidraw-a", 3, 0x1234, 0x5678});  // told twice, taken once
    plugs.plug({"/dev/hidraw-b", 3, 0x1234, 0x9999});  // not configured: left alone
    ASSERT_TRUE(settled());
    EXPECT_EQ(deviceNames(client), (std::vector<std::string>{"sim:" + kExamples + "/taps.json", "/dev/hidraw-a"}));

    const std::string takeB = "[[match]]\nvendor = 0x1234\nproduct = 0x9999\n";
    struct Step {
        std::string file;
        std::vector<std::string> devices;
        std::size_t keyboards;  // made so far
        int threshold;
    };
    const std::vector<Step> steps = {
        // A key the first keyboard lacks: a new one. The device given by hand stays.
        {"log_level = \"off\"\n" + takeB + "[keys]\ntap.middle = \"KEY_MUTE\"\n",
         {"sim:" + kExamples + "/taps.json", "/dev/hidraw-b"}, 2, Log::kOff},
        // A key fewer: the keyboard stays. No level: the environment's again.
        {takeB + "[keys]\ntap.middle = \"\"\n", {"sim:" + kExamples + "/taps.json", "/dev/hidraw-b"}, 2,
         environmentThreshold},
        // The defaults again: play/pause is back, on a new keyboard.
        {"", {"sim:" + kExamples + "/taps.json"}, 3, environmentThreshold},
    };
    for (const Step& step : steps) {
        SCOPED_TRACE(step.file);
        write(step.file);
        ASSERT_TRUE(reload());
        EXPECT_EQ(deviceNames(client), step.devices);
        EXPECT_EQ(keyboardsMade().size(), step.keyboards);
        EXPECT_EQ(Log::threshold(), step.threshold);
    }
    const std::vector<std::set<unsigned int>> keyboards = keyboardsMade();
    EXPECT_EQ(keyboards[1], (std::set<unsigned int>{KEY_VOLUMEUP, KEY_VOLUMEDOWN, KEY_MUTE, KEY_VOICECOMMAND}));
    serving.request_stop();
    std::filesystem::remove(path);
}

TEST(DaemonTest, ASimulatedHidRecorderFilePlaysTheDeviceNamedAndOneNotInItIsLeftOut)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    const std::string file = kExamples + "/hid-recorder-two-devices.hid";
    const auto optionsFor = [&](std::uint32_t hidDevice) {
        Daemon::Options options = optionsOn(bus, file);
        options.hidDevice = hidDevice;
        options.keys = false;
        return options;
    };

    // Device 1 is the surface: its tap at the top, its reset and its hold at
    // the bottom, as replay finds them (hid-recorder-two-devices.expected).
    {
        ControlClient client(BusConnection::Address::at(bus.address()));
        ASSERT_TRUE(client.connected()) << client.connectError();
        ASSERT_TRUE(client.watchSignals());
        Daemon daemon(optionsFor(1), nullptr);
        std::jthread serving([&](std::stop_token stop) { daemon.run([&] { return stop.stop_requested(); }); });
        ASSERT_TRUE(client.waitUntil([&] {
            return client.signalsNamed("Gesture").size() == 5 && client.signalsNamed("DeviceReset").size() == 1;
        }));
        std::vector<std::string> gestures;
        for (const ControlClient::Signal& signal : client.signalsNamed("Gesture")) {
            gestures.push_back(signal.event.gesture + " " + signal.event.region);
        }
        EXPECT_EQ(gestures, (std::vector<std::string>{"may-begin top", "tap top", "may-begin bottom",
                                                      "hold-start bottom", "hold-end bottom"}));
        EXPECT_EQ(deviceNames(client), (std::vector<std::string>{"sim:" + file}));
    }
    // There is no device 2: the file is left out, and with it everything to serve.
    CaptureLogSink::Scope log(LogLevel::Error);
    Daemon daemon(optionsFor(2), nullptr);
    EXPECT_EQ(daemon.run([] { return false; }), Daemon::Ending::NothingToServe);
    const std::vector<std::string> errors = log.sink().messages("Daemon");
    ASSERT_EQ(errors.size(), 1u);
    EXPECT_EQ(errors[0].rfind("sim:" + file + ": not attached: ", 0), 0u) << errors[0];
    EXPECT_NE(errors[0].find("no device 2 in it"), std::string::npos) << errors[0];
}
