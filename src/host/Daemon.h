#pragma once

#include "host/BusConnection.h"
#include "host/BusService.h"
#include "host/DaemonConfig.h"
#include "host/DeviceSession.h"
#include "host/DeviceWatcher.h"
#include "host/KeyboardSink.h"
#include "host/UinputKeyboard.h"
#include "platform/HostDevice.h"
#include "platform/Log.h"

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace VeltoHost {

// The system service: one DeviceSession per touch device, the devices found
// by a watcher (udev) and by hand (recordings played as simulated devices),
// every device served on the bus, gestures turned into keys on one virtual
// keyboard.
//
// Everything but the sessions' own threads runs on the thread that calls
// run(): the watcher reports there (its run loop in kRunLoopMode), devices are
// attached and detached there, and the destructor takes the sessions apart
// there in the order they were attached.
class Daemon {
public:
    static constexpr const char* kRunLoopMode = "VeltoDaemon";

    struct Options {
        BusConnection::Address bus = BusConnection::Address::system();
        std::vector<std::string> simulatedFiles;  // played as devices, then left attached
        std::vector<std::string> devicePaths;     // hidraw nodes given by hand, whatever their ids
        double speed = 1.0;                       // of the simulated devices; 0 as fast as taken
        bool keys = true;
        std::string uinputPath = UinputKeyboard::kDefaultUinputPath;
        DaemonConfig config;
        std::string pluginPath;
    };
    // How a device the watcher reports is opened (a hidraw device by default).
    using DeviceOpener = std::function<HostDevice::Ref(const DeviceWatcher::Device&)>;

    // Connects to the bus and takes the name, creates the keyboard (or says
    // once why there is none) and attaches every simulated device and every
    // device given by path (one that fails to open is logged and skipped). Raises
    // std::runtime_error when the bus or a recording file cannot be had, and
    // the container reader's errors for a malformed recording: a service that
    // cannot be reached, or was given a bad file by hand, should not start.
    Daemon(Options options, std::unique_ptr<DeviceWatcher> watcher, DeviceOpener open = {});
    ~Daemon();
    Daemon(const Daemon&) = delete;
    Daemon& operator=(const Daemon&) = delete;

    // Starts the watcher (the devices present are attached), tells systemd the
    // service is ready, and serves until `stopRequested` turns true.
    void run(const std::function<bool()>& stopRequested);

private:
    // The new session, or null when the device would not start (logged).
    DeviceSession* attach(const std::string& name, HostDevice::Ref device);
    void attachWatched(const DeviceWatcher::Device& device);
    // Opens and attaches; a device that will not open is logged and skipped.
    void openAndAttach(const DeviceWatcher::Device& device);
    void detach(const std::string& name);

    const Log _log{"Daemon"};
    Options _options;
    std::unique_ptr<DeviceWatcher> _watcher;
    DeviceOpener _open;
    BusService _bus;
    std::unique_ptr<KeyboardSink> _keyboard;
    std::mutex _keyboardLock;
    // Attached devices by name, in order of attachment (run()'s thread only).
    std::vector<std::pair<std::string, std::unique_ptr<DeviceSession>>> _sessions;
};

}  // namespace VeltoHost
