#include "host/Daemon.h"

#include "host/SimulatedDevicePlayer.h"
#include "platform/HidrawHostDevice.h"
#include "platform/RunLoop.h"
#include "platform/SimulatedHostDevice.h"

#include <systemd/sd-daemon.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <thread>
#include <utility>

namespace VeltoHost {

namespace {

constexpr const char* kSimulatedPrefix = "sim:";
// How often run() looks at the stop request between events.
constexpr auto kStopPollInterval = std::chrono::milliseconds(100);

std::string fileText(const std::string& path)
{
    std::ifstream file(path, std::ios::binary);
    if (!file) throw std::runtime_error(path + ": cannot be read");
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

}  // namespace

Daemon::Daemon(Options options, std::unique_ptr<DeviceWatcher> watcher, DeviceOpener open)
    : _options(std::move(options)), _watcher(std::move(watcher)), _open(std::move(open)), _bus(_options.bus)
{
    if (!_open) {
        _open = [](const DeviceWatcher::Device& device) { return std::make_shared<HidrawHostDevice>(device.path); };
    }
    if (_options.keys) {
        KeyMap keyMap(_options.config.keys);
        UinputKeyboard::Created created = UinputKeyboard::create(keyMap.keyCodes(), _options.uinputPath);
        if (created.keyboard) {
            _keyboard = std::move(created.keyboard);
        } else {
            _log.error("no key output: %s", created.error);
        }
    }
    for (const std::string& file : _options.simulatedFiles) {
        VeltoTouch::PipelineRecording recording{std::string_view(fileText(file))};
        SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
        const std::string name = kSimulatedPrefix + file;
        if (DeviceSession* session = attach(name, device)) {
            session->playInBackground(std::move(recording), device, _options.speed);
        }
    }
    for (const std::string& path : _options.devicePaths) {
        DeviceWatcher::Device given;
        given.path = path;
        openAndAttach(given);
    }
}

Daemon::~Daemon()
{
    if (_watcher) _watcher->stop();
    // In order of attachment, each device taken apart whole before the next.
    for (auto& session : _sessions) session.second.reset();
}

void Daemon::run(const std::function<bool()>& stopRequested)
{
    if (_watcher) {
        _watcher->start([this](const DeviceWatcher::Device& device) { attachWatched(device); },
                        [this](const std::string& path) { detach(path); });
    }
    sd_notify(0, "READY=1");
    _log.log("serving %ju devices", static_cast<std::uint64_t>(_sessions.size()));
    while (!stopRequested()) {
        // Without a watcher the mode may have nothing to wait on, and the
        // loop returns at once: then wait here instead of spinning.
        if (RunLoop::run(kRunLoopMode, kStopPollInterval, false) == RunLoop::RunResult::Finished) {
            std::this_thread::sleep_for(kStopPollInterval);
        }
    }
    sd_notify(0, "STOPPING=1");
    if (_watcher) _watcher->stop();
}

void Daemon::attachWatched(const DeviceWatcher::Device& device)
{
    if (!_options.config.takes(device.vendor, device.product)) return;
    const bool known = std::any_of(_sessions.begin(), _sessions.end(),
                                   [&](const auto& session) { return session.first == device.path; });
    if (known) return;  // reported by both the enumeration and the monitor
    openAndAttach(device);
}

void Daemon::openAndAttach(const DeviceWatcher::Device& device)
{
    HostDevice::Ref opened;
    try {
        opened = _open(device);
    } catch (const std::exception& error) {
        _log.error("%s: %s", device.path, error.what());
        return;
    }
    attach(device.path, std::move(opened));
}

DeviceSession* Daemon::attach(const std::string& name, HostDevice::Ref device)
{
    DeviceSession::Outputs outputs{&_bus, _keyboard.get(), &_keyboardLock, _options.config.keys};
    try {
        _sessions.emplace_back(name, std::make_unique<DeviceSession>(name, std::move(device), _options.pluginPath,
                                                                     std::move(outputs)));
    } catch (const std::exception& error) {
        // One device that will not start does not stop the others.
        _log.error("%s: not attached: %s", name, error.what());
        return nullptr;
    }
    _log.log("%s attached", name);
    return _sessions.back().second.get();
}

void Daemon::detach(const std::string& name)
{
    auto it = std::find_if(_sessions.begin(), _sessions.end(), [&](const auto& s) { return s.first == name; });
    if (it == _sessions.end()) return;
    _sessions.erase(it);
    _log.log("%s detached", name);
}

}  // namespace VeltoHost
