#pragma once

#include "bus/BusConnection.h"
#include "bus/BusService.h"
#include "daemon/DaemonConfig.h"
#include "daemon/DeviceSession.h"
#include "daemon/DeviceWatcher.h"
#include "daemon/KeyboardSink.h"
#include "daemon/UinputKeyboard.h"
#include "platform/devices/HostDevice.h"
#include "platform/devices/SimulatedHostDevice.h"
#include "platform/log/Log.h"

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <thread>
#include <vector>

namespace VeltoHost {

// The system service: one DeviceSession per touch device, the devices found
// by a watcher (udev) and by hand (recordings played as simulated devices),
// every device served on the bus, gestures turned into keys on one virtual
// keyboard.
//
// Everything but the sessions' own threads runs on the thread that calls
// run(): the watcher reports there (its run loop in kRunLoopMode), devices are
// attached and detached there, the configuration is reloaded there, and the
// destructor takes the sessions apart there in the order they were attached.
//
// A device that cannot be had (a path that is no hidraw node, a recording
// that cannot be read or does not start as one, a plug-in that will not
// start on it) is logged with its name and left out; the others are served.
// A simulated device plays its recording as the file is read, on a thread of
// its own (SimulatedDevicePlayer); a fault further into the file is logged
// where it is reached, and the device stays attached with what it played. A service with nothing to
// serve and no way of ever getting a device, or without its bus, ends run()
// and says why, so that the service manager can report it or start it again.
class Daemon {
public:
    static constexpr const char* kRunLoopMode = "VeltoDaemon";

    struct Options {
        BusConnection::Address bus = BusConnection::Address::system();
        std::vector<std::string> simulatedFiles;  // played as devices, then left attached
        // Hidraw nodes given by hand, whatever their ids; no other path is taken.
        std::vector<std::string> devicePaths;
        double speed = 1.0;                       // of the simulated devices; 0 as fast as taken
        // Of a simulated device's hid-recorder file holding several devices,
        // the one to play; empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
        bool keys = true;
        std::string uinputPath = UinputKeyboard::kDefaultUinputPath;
        DaemonConfig config;
        std::string configPath;  // where `config` came from, read again on a reload; empty: none
        std::string pluginPath;
    };
    // How a device the watcher reports is opened (a hidraw device by default).
    using DeviceOpener = std::function<HostDevice::Ref(const DeviceWatcher::Device&)>;
    // A virtual keyboard offering exactly `keyCodes` (a UinputKeyboard at
    // Options::uinputPath by default), or none and why, as a sentence.
    struct MadeKeyboard {
        std::unique_ptr<KeyboardSink> keyboard;
        std::string error;
    };
    using KeyboardMaker = std::function<MadeKeyboard(const std::set<unsigned int>& keyCodes)>;

    // Why run() returned.
    enum class Ending {
        Stopped,         // asked to
        BusLost,         // the connection to the bus broke: no client can reach the service
        NothingToServe,  // no device attached, and no configured match could ever bring one
    };

    // Sets the configuration's log level, connects to the bus and takes the
    // name, creates the keyboard (or says once why there is none) and
    // attaches every simulated device and every device given by path (one
    // that cannot be had is logged and skipped). Raises std::runtime_error
    // when the bus cannot be had: a service that cannot be reached should not
    // start.
    Daemon(Options options, std::unique_ptr<DeviceWatcher> watcher, DeviceOpener open = {},
           KeyboardMaker makeKeyboard = {});
    ~Daemon();
    Daemon(const Daemon&) = delete;
    Daemon& operator=(const Daemon&) = delete;

    // Starts the watcher (the devices present are attached), tells systemd the
    // service is ready, and serves until `stopRequested` turns true or the
    // service has nothing left to serve. Whenever `reloadRequested` answers
    // true, reads the configuration file again (see reload()).
    Ending run(const std::function<bool()>& stopRequested, const std::function<bool()>& reloadRequested = {});

private:
    // One attached device.
    struct Attached {
        std::string name;
        // Reported by the watcher, not given by hand: released when the
        // configuration stops matching it.
        bool watched = false;
        std::unique_ptr<DeviceSession> session;
        // A simulated device's playback. Declared last, so that it is stopped
        // and joined before the session it plays into is taken apart.
        std::jthread player;
    };

    // Reads Options::configPath again and applies it: the log level, the key
    // map of every device (a keyboard made anew when the keys need codes the
    // old one lacks), and the matches (devices present that are now matched
    // are attached, watched ones it stops matching released; devices given
    // by hand stay). A file that cannot be read or has a fault is logged with
    // its place and changes nothing.
    void reload();
    void apply(DaemonConfig config);
    void logWarnings(const DaemonConfig& config) const;
    void applyLogLevel(const std::optional<int>& threshold) const;
    void applyKeys(const KeyMap::Bindings& keys);
    void applyMatches();
    bool nothingToServe() const;

    // Attaches the file as a simulated device once it starts as a recording,
    // and starts its playback.
    void attachSimulated(const std::string& file);
    void attachGivenPath(const std::string& path);
    // The new session, or null when the device would not start (logged).
    DeviceSession* attach(const std::string& name, HostDevice::Ref device, bool watched);
    void attachWatched(const DeviceWatcher::Device& device);
    // Opens and attaches; a device that will not open is logged and skipped.
    void openAndAttach(const DeviceWatcher::Device& device, bool watched);
    void removeWatched(const std::string& path);
    void detach(const std::string& name);
    bool isAttached(const std::string& name) const;

    const Log _log{"Daemon"};
    Options _options;
    // The threshold before the configuration set its own: what a file
    // without log_level falls back to (the environment's).
    const int _environmentThreshold;
    std::unique_ptr<DeviceWatcher> _watcher;
    DeviceOpener _open;
    KeyboardMaker _makeKeyboard;
    BusService _bus;
    std::unique_ptr<KeyboardSink> _keyboard;
    std::set<unsigned int> _keyboardCodes;  // the keys `_keyboard` was made with
    std::mutex _keyboardLock;
    // Attached devices, in order of attachment (run()'s thread only).
    std::vector<Attached> _sessions;
    // Every device the watcher reports present, taken or not, by path, so that
    // a reload can take one that a new match names (run()'s thread only).
    std::map<std::string, DeviceWatcher::Device> _present;
};

}  // namespace VeltoHost
