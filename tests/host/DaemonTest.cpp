#include "host/Daemon.h"

#include "host/ControlClient.h"
#include "PrivateBus.h"

#include "platform/RunLoop.h"
#include "platform/SimulatedHostDevice.h"

#include <gtest/gtest.h>

#include <atomic>
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

}  // namespace

TEST(DaemonTest, ServesSimulatedAndHotPluggedDevicesAndTakesOnlyTheConfiguredOnes)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    Daemon::Options options;
    options.bus = BusConnection::Address::at(bus.address());
    options.simulatedFiles = {kExamples + "/taps.json", kExamples + "/holds.json"};
    options.speed = 0;
    options.uinputPath = "/nonexistent/uinput";  // no key output: said once, and the daemon goes on
    options.config.matches = {{0x1234, 0x5678}};
    options.pluginPath = VELTO_SERVICE_MODULE_PATH;
    auto watcher = std::make_unique<TestWatcher>();
    TestWatcher& plugs = *watcher;
    std::atomic<int> opened{0};
    ControlClient client(BusConnection::Address::at(bus.address()));
    ASSERT_TRUE(client.connected()) << client.connectError();
    ASSERT_TRUE(client.watchSignals());

    {
        Daemon daemon(options, std::move(watcher), [&](const DeviceWatcher::Device&) {
            ++opened;
            return SimulatedHostDevice::create();
        });
        // Stopped and joined before the daemon goes, also when an assertion returns early.
        std::jthread serving([&](std::stop_token stop) { daemon.run([&] { return stop.stop_requested(); }); });
        while (!plugs.started()) std::this_thread::sleep_for(1ms);

        // Both recordings play as devices 0 and 1 and stay attached.
        ASSERT_TRUE(client.waitUntil([&] { return client.signalsNamed("Gesture").size() == 6 + 9; }));
        EXPECT_EQ(client.listDevices().size(), 2u);
        EXPECT_EQ(client.name(BusService::devicePath(1)).value, "sim:" + kExamples + "/holds.json");

        plugs.plug({"/dev/hidraw-other", 3, 0x1234, 0x9999});  // not configured: left alone
        plugs.plug({"/dev/hidraw-test", 3, 0x1234, 0x5678});
        plugs.plug({"/dev/hidraw-test", 3, 0x1234, 0x5678});  // told twice, taken once
        // Added after the two simulated devices.
        ASSERT_TRUE(client.waitUntil([&] { return client.signalsNamed("DeviceAdded").size() == 3; }));
        EXPECT_EQ(client.signalsNamed("DeviceAdded")[2].object, BusService::devicePath(2));
        EXPECT_EQ(client.name(BusService::devicePath(2)).value, "/dev/hidraw-test");

        plugs.unplug("/dev/hidraw-test");
        ASSERT_TRUE(client.waitUntil([&] { return client.signalsNamed("DeviceRemoved").size() == 1; }));
        EXPECT_EQ(client.name(BusService::devicePath(2)).error, "org.freedesktop.DBus.Error.UnknownObject");
        // Plugged again, it gets a new number: a path once removed never means another device.
        plugs.plug({"/dev/hidraw-test", 3, 0x1234, 0x5678});
        ASSERT_TRUE(client.waitUntil([&] { return client.signalsNamed("DeviceAdded").size() == 4; }));
        EXPECT_EQ(client.listDevices(),
                  (std::vector<std::string>{BusService::devicePath(0), BusService::devicePath(1), BusService::devicePath(3)}));
    }
    EXPECT_EQ(opened.load(), 2);
    // The daemon is gone: its devices went with it, in order.
    ASSERT_TRUE(client.waitUntil([&] { return client.signalsNamed("DeviceRemoved").size() == 4; }));
    std::vector<std::string> announced;
    for (const auto& signal : client.signals()) {
        if (signal.member != "DeviceAdded" && signal.member != "DeviceRemoved") continue;
        EXPECT_EQ(signal.path, BusService::kManagerPath);
        announced.push_back(signal.member + " " + signal.object.substr(signal.object.rfind('/') + 1));
    }
    EXPECT_EQ(announced, (std::vector<std::string>{"DeviceAdded 0", "DeviceAdded 1", "DeviceAdded 2", "DeviceRemoved 2",
                                                   "DeviceAdded 3", "DeviceRemoved 0", "DeviceRemoved 1",
                                                   "DeviceRemoved 3"}));
}
