#pragma once

#include "bus/BusConnection.h"
#include "bus/GestureFields.h"

#include <systemd/sd-bus.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace VeltoHost {

// The other end of the daemon's control interface (BusService): plain calls
// that answer with the service's result or its D-Bus error, and a record of
// the service's signals. Used by `veltotouch ctl` and by the bus tests.
//
// A client is used by one thread. Nothing runs in the background: signals
// are read while the caller waits for them or makes a call.
//
// Only the service's own signals are recorded: any client on the bus may send
// a signal with the service's object path and interface, so each one is
// checked against the unique name that owns the service's name at that
// moment. The owner is followed through the bus's NameOwnerChanged, which
// arrives before anything the new owner sends, and each change is recorded
// too ("NameOwnerChanged", with the new owner in `object`, empty when the
// service left the bus).
class ControlClient {
public:
    struct Reply {
        std::string error;    // the D-Bus error name; empty on success
        std::string message;  // the error's message
        std::string value;    // the string result, for methods that return one

        bool ok() const noexcept { return error.empty(); }
    };

    struct Signal {
        std::string path;    // the object that sent it
        std::string member;  // "Gesture", "DeviceReset", "DeviceAdded", "DeviceRemoved", "NameOwnerChanged"
        std::string object;  // DeviceAdded, DeviceRemoved; NameOwnerChanged: the new owner
        // Gesture and DeviceReset, in the same terms as the tool's event lines.
        GestureFields event;
        std::uint64_t receivedTicks = 0;  // host clock when it was read
    };

    // Connects; connected() tells whether it worked and connectError() why not.
    explicit ControlClient(const BusConnection::Address& address);
    ~ControlClient();
    ControlClient(const ControlClient&) = delete;
    ControlClient& operator=(const ControlClient&) = delete;

    bool connected() const noexcept { return _bus != nullptr; }
    const std::string& connectError() const noexcept { return _connectError; }

    // A method of the service with string arguments.
    Reply call(const std::string& path, const std::string& interface, const std::string& member,
               const std::vector<std::string>& arguments = {});
    Reply getProperty(const std::string& path, const std::string& key);
    Reply setProperty(const std::string& path, const std::string& key, const std::string& json);
    // Passes `file`, a descriptor the caller opened for writing; the service
    // writes the recording into it.
    Reply saveRecording(const std::string& path, int file);
    // The manager's device list, in order of attachment; `error` gets the
    // reply when the call failed.
    std::vector<std::string> listDevices(Reply* error = nullptr);
    // The device object's Name property through org.freedesktop.DBus.Properties.
    Reply name(const std::string& path);

    // Records every signal the service sends from now on, and every change of
    // the service's owner.
    bool watchSignals();
    // The unique name that owns the service's name, as last seen; empty when
    // the service is not on the bus.
    const std::string& owner() const noexcept { return _owner; }
    // Reads the bus until `done` holds; false when it still did not after
    // `limit`, when a signal interrupted the wait, or when the connection
    // broke (then broken() is true).
    bool waitUntil(const std::function<bool()>& done, std::chrono::milliseconds limit = std::chrono::seconds(20));
    bool broken() const noexcept { return _broken; }
    const std::vector<Signal>& signals() const noexcept { return _signals; }
    void clearSignals() noexcept { _signals.clear(); }
    std::vector<Signal> signalsNamed(const std::string& member) const;

private:
    static int onSignal(sd_bus_message* message, void* userdata, sd_bus_error* error);
    static int onOwnerChanged(sd_bus_message* message, void* userdata, sd_bus_error* error);
    void drain();

    sd_bus* _bus = nullptr;
    sd_bus_slot* _match = nullptr;
    sd_bus_slot* _ownerMatch = nullptr;
    std::string _owner;
    std::string _connectError;
    bool _broken = false;
    std::vector<Signal> _signals;
};

}  // namespace VeltoHost
