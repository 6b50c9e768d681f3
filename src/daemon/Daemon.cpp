#include "daemon/Daemon.h"

#include "platform/devices/HidrawHostDevice.h"
#include "platform/devices/HidrawNode.h"
#include "platform/devices/SimulatedHostDevice.h"
#include "platform/runtime/RunLoop.h"
#include "recording/ContainerStream.h"
#include "recording/SimulatedDevicePlayer.h"

#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <memory>
#include <stdexcept>
#include <thread>
#include <utility>

namespace VeltoHost {

namespace {

// How often run() looks at the stop and reload requests and the bus between events.
constexpr auto kPollInterval = std::chrono::milliseconds(100);

using RecordingFile = std::unique_ptr<std::FILE, int (*)(std::FILE*)>;

// A file that does not start as a recording is no device: its first fault,
// if it comes before the first frame, is raised here. The file is read up to
// its first frame and put back at its start. An input that cannot be read
// again (a pipe) is left as it is, its faults found as it plays.
void checkStartsAsRecording(int fd, std::optional<std::uint32_t> hidDevice)
{
    const off_t start = ::lseek(fd, 0, SEEK_CUR);
    if (start < 0) return;
    struct FirstFrame {};
    try {
        VeltoTouch::ContainerStream::read(
            fd, [](VeltoTouch::PipelineRecording::Frame&&) { throw FirstFrame{}; }, {}, hidDevice);
    } catch (const FirstFrame&) {
    }
    if (::lseek(fd, start, SEEK_SET) != start) {
        throw std::runtime_error(std::string("cannot be read again from its start: ") + std::strerror(errno));
    }
}

// Sets the configuration's level before anything logs; returns the one it replaced.
int setFirstLogLevel(const std::optional<int>& threshold)
{
    const int before = Log::threshold();
    if (threshold) Log::setThreshold(*threshold);
    return before;
}

// The moment of a reload on systemd's clock, which it asks for with
// RELOADING=1 so that it can tell this reload from an earlier one.
std::uint64_t monotonicMicroseconds()
{
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000u + static_cast<std::uint64_t>(now.tv_nsec) / 1000u;
}

}  // namespace

Daemon::Daemon(Options options, std::unique_ptr<DeviceWatcher> watcher, DeviceOpener open,
               KeyboardMaker makeKeyboard)
    : _options(std::move(options)),
      _environmentThreshold(setFirstLogLevel(_options.config.logThreshold)),
      _watcher(std::move(watcher)),
      _open(std::move(open)),
      _makeKeyboard(std::move(makeKeyboard)),
      _bus(_options.bus)
{
    logWarnings(_options.config);
    if (!_open) {
        _open = [](const DeviceWatcher::Device& device) { return std::make_shared<HidrawHostDevice>(device.path); };
    }
    if (!_makeKeyboard) {
        _makeKeyboard = [path = _options.uinputPath](const std::set<unsigned int>& keyCodes) {
            UinputKeyboard::Created created = UinputKeyboard::create(keyCodes, path);
            return MadeKeyboard{std::move(created.keyboard), std::move(created.error)};
        };
    }
    if (_options.keys) {
        _keyboardCodes = KeyMap(_options.config.keys).keyCodes();
        MadeKeyboard made = _makeKeyboard(_keyboardCodes);
        _keyboard = std::move(made.keyboard);
        if (!_keyboard) _log.error("no key output: %s", made.error);
    }
    for (const std::string& file : _options.simulatedFiles) attachSimulated(file);
    for (const std::string& path : _options.devicePaths) attachGivenPath(path);
}

Daemon::~Daemon()
{
    if (_watcher) _watcher->stop();
    // In order of attachment, each device taken apart whole before the next,
    // its playback first.
    for (Attached& attached : _sessions) {
        attached.player = {};
        attached.session.reset();
    }
}

Daemon::Ending Daemon::run(const std::function<bool()>& stopRequested, const std::function<bool()>& reloadRequested)
{
    // Said before the watcher starts: whether a device could ever come is a
    // matter of the configuration, not of what happens to be plugged in.
    if (nothingToServe()) return Ending::NothingToServe;
    if (_watcher) {
        _watcher->start([this](const DeviceWatcher::Device& device) { attachWatched(device); },
                        [this](const std::string& path) { removeWatched(path); });
    }
    sd_notify(0, "READY=1");
    _log.log("serving %ju devices", static_cast<std::uint64_t>(_sessions.size()));
    Ending ending = Ending::Stopped;
    for (;;) {
        // A reload asked for before a stop still happens: its sender is told
        // it was done (READY=1) rather than left waiting.
        if (reloadRequested && reloadRequested()) reload();
        if (_bus.connectionLost()) {
            ending = Ending::BusLost;
            break;
        }
        if (nothingToServe()) {
            ending = Ending::NothingToServe;
            break;
        }
        if (stopRequested()) break;
        // Without a watcher the mode may have nothing to wait on, and the
        // loop returns at once: then wait here instead of spinning.
        if (RunLoop::run(kRunLoopMode, kPollInterval, false) == RunLoop::RunResult::Finished) {
            std::this_thread::sleep_for(kPollInterval);
        }
    }
    sd_notify(0, "STOPPING=1");
    _log.log("stopping: taking %ju devices apart", static_cast<std::uint64_t>(_sessions.size()));
    if (_watcher) _watcher->stop();
    return ending;
}

bool Daemon::nothingToServe() const
{
    return _sessions.empty() && (!_watcher || _options.config.matches.empty());
}

void Daemon::reload()
{
    sd_notifyf(0, "RELOADING=1\nMONOTONIC_USEC=%" PRIu64, monotonicMicroseconds());
    if (_options.configPath.empty()) {
        _log.log("reload: no configuration file was given (--config); nothing to read again");
    } else {
        try {
            apply(DaemonConfig::load(_options.configPath));
            _log.log("configuration reloaded from %s", _options.configPath);
        } catch (const std::exception& error) {
            _log.error("configuration not reloaded, the previous one stays in force: %s", error.what());
        }
    }
    sd_notify(0, "READY=1");
}

void Daemon::apply(DaemonConfig config)
{
    logWarnings(config);
    applyLogLevel(config.logThreshold);
    const bool keysChanged = !(config.keys == _options.config.keys);
    _options.config = std::move(config);
    if (keysChanged) applyKeys(_options.config.keys);
    applyMatches();
}

void Daemon::logWarnings(const DaemonConfig& config) const
{
    for (const std::string& warning : config.warnings) _log.error("%s", warning);
}

void Daemon::applyLogLevel(const std::optional<int>& threshold) const
{
    Log::setThreshold(threshold.value_or(_environmentThreshold));
}

void Daemon::applyKeys(const KeyMap::Bindings& keys)
{
    const std::set<unsigned int> codes = KeyMap(keys).keyCodes();
    std::unique_ptr<KeyboardSink> retired;
    // A keyboard offers only the keys it was made with; one that lacks a new
    // key is made anew. One that merely offers a key the new map leaves
    // unbound stays: a key nobody sends costs nothing, a new input device
    // disturbs desktops.
    if (_keyboard && !std::includes(_keyboardCodes.begin(), _keyboardCodes.end(), codes.begin(), codes.end())) {
        MadeKeyboard made = _makeKeyboard(codes);
        if (made.keyboard) {
            retired = std::exchange(_keyboard, std::move(made.keyboard));
            _keyboardCodes = codes;
        } else {
            _log.error("the new keys need a new virtual keyboard, and it could not be made (%s); the old one stays, "
                       "without the keys it lacks",
                       made.error);
        }
    }
    for (Attached& attached : _sessions) attached.session->changeKeys(keys, _keyboard.get());
    // Every session has moved to the new keyboard on its own queue; the old
    // one goes under the lock, like every other use of a keyboard.
    std::lock_guard guard(_keyboardLock);
    retired.reset();
}

void Daemon::applyMatches()
{
    std::vector<std::string> released;
    for (const Attached& attached : _sessions) {
        const auto present = _present.find(attached.name);
        if (attached.watched && present != _present.end() &&
            !_options.config.takes(present->second.vendor, present->second.product)) {
            released.push_back(attached.name);
        }
    }
    for (const std::string& name : released) detach(name);
    for (const auto& [path, device] : _present) {
        if (_options.config.takes(device.vendor, device.product) && !isAttached(path)) openAndAttach(device, true);
    }
}

void Daemon::attachSimulated(const std::string& file)
{
    const std::string name = std::string(SimulatedDevicePlayer::kDevicePrefix) + file;
    errno = 0;
    RecordingFile recording(std::fopen(file.c_str(), "rbe"), &std::fclose);
    try {
        if (!recording) {
            throw std::runtime_error(std::string("cannot be read: ") +
                                     (errno ? std::strerror(errno) : "unknown error"));
        }
        checkStartsAsRecording(::fileno(recording.get()), _options.hidDevice);
    } catch (const std::exception& error) {
        _log.error("%s: not attached: %s", name, error.what());
        return;
    }
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    DeviceSession* session = attach(name, device, false);
    if (!session) return;
    // The session outlives the thread that plays into it: Attached::player
    // is stopped and joined before the session is taken apart.
    _sessions.back().player = std::jthread([log = _log, name, session, device = std::move(device),
                                            recording = std::move(recording), speed = _options.speed,
                                            hidDevice = _options.hidDevice](std::stop_token stop) {
        SimulatedDevicePlayer player(device, session->stateWriter(), [&stop] { return stop.stop_requested(); },
                                     {.speed = speed});
        try {
            player.playStream(SimulatedDevicePlayer::readAhead(::fileno(recording.get()), hidDevice));
        } catch (const std::exception& error) {
            log.error("%s: played up to a fault, after %ju frames; the device stays attached: %s", name,
                      player.framesPlayed(), error.what());
        }
        player.waitUntilTaken();
    });
}

void Daemon::attachGivenPath(const std::string& path)
{
    // Anything else would open without complaint and deliver nothing, or
    // garbage, for as long as the service runs.
    if (const std::string refusal = HidrawNode::refusal(path, SimulatedDevicePlayer::kOrRecording); !refusal.empty()) {
        _log.error("%s", refusal);
        return;
    }
    DeviceWatcher::Device given;
    given.path = path;
    openAndAttach(given, false);
}

void Daemon::attachWatched(const DeviceWatcher::Device& device)
{
    _present[device.path] = device;
    if (!_options.config.takes(device.vendor, device.product)) return;
    if (isAttached(device.path)) return;  // reported by both the enumeration and the monitor
    openAndAttach(device, true);
}

void Daemon::openAndAttach(const DeviceWatcher::Device& device, bool watched)
{
    HostDevice::Ref opened;
    try {
        opened = _open(device);
    } catch (const std::exception& error) {
        _log.error("%s: not attached: %s", device.path, error.what());
        return;
    }
    attach(device.path, std::move(opened), watched);
}

DeviceSession* Daemon::attach(const std::string& name, HostDevice::Ref device, bool watched)
{
    DeviceSession::Outputs outputs{&_bus, _keyboard.get(), &_keyboardLock, _options.config.keys};
    try {
        auto session =
            std::make_unique<DeviceSession>(name, std::move(device), _options.pluginPath, std::move(outputs));
        _sessions.push_back({name, watched, std::move(session), {}});
    } catch (const std::exception& error) {
        // One device that will not start does not stop the others.
        _log.error("%s: not attached: %s", name, error.what());
        return nullptr;
    }
    _log.log("%s attached", name);
    return _sessions.back().session.get();
}

void Daemon::removeWatched(const std::string& path)
{
    _present.erase(path);
    detach(path);
}

void Daemon::detach(const std::string& name)
{
    auto it = std::find_if(_sessions.begin(), _sessions.end(), [&](const Attached& each) { return each.name == name; });
    if (it == _sessions.end()) return;
    _sessions.erase(it);
    _log.log("%s detached", name);
}

bool Daemon::isAttached(const std::string& name) const
{
    return std::any_of(_sessions.begin(), _sessions.end(), [&](const Attached& each) { return each.name == name; });
}

}  // namespace VeltoHost
