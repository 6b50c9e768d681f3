#pragma once

#include <systemd/sd-bus.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

// The other end of the bus service in tests: an sd-bus client connection on
// the test's thread, with plain calls and a record of the service's signals.
// Nothing here runs unless the test calls it; signals are read while the
// test waits for them or makes a call.
class BusClient {
public:
    struct Reply {
        std::string error;    // the D-Bus error name; empty on success
        std::string message;  // the error's message
        std::string value;    // the string result, for methods that return one
    };

    struct Signal {
        std::string path;
        std::string member;
        std::string object;  // DeviceAdded, DeviceRemoved
        // Gesture
        std::string gesture;
        std::string region;
        std::uint32_t frame = 0;
        std::uint32_t phase = 0;
        std::uint32_t eventMask = 0;
        std::int32_t y = 0;
        std::uint64_t timestamp = 0;  // Gesture, DeviceReset
        std::uint64_t receivedTicks = 0;
    };

    // Connects to the bus at `address`; connected() tells whether it worked.
    explicit BusClient(const std::string& address);
    ~BusClient();
    BusClient(const BusClient&) = delete;
    BusClient& operator=(const BusClient&) = delete;

    bool connected() const { return _bus != nullptr; }
    const std::string& connectError() const { return _connectError; }

    // A method of the service with string arguments.
    Reply call(const std::string& path, const std::string& interface, const std::string& member,
               const std::vector<std::string>& arguments = {});
    Reply getProperty(const std::string& path, const std::string& key);
    Reply setProperty(const std::string& path, const std::string& key, const std::string& json);
    Reply saveRecording(const std::string& path, const std::string& file);
    // The manager's device list; `error` set when the call failed.
    std::vector<std::string> listDevices(std::string* error = nullptr);
    // The device object's Name property through org.freedesktop.DBus.Properties.
    Reply name(const std::string& path);
    // Asks for the service's well-known name; the error name when refused.
    std::string requestServiceName();

    // Records every signal the service sends from now on.
    bool watchSignals();
    // Reads the bus until `done` holds; false when it still did not after
    // `limit` (a test failure, never a measurement).
    bool waitUntil(const std::function<bool()>& done, std::chrono::milliseconds limit = std::chrono::seconds(20));
    const std::vector<Signal>& signals() const { return _signals; }
    void clearSignals() { _signals.clear(); }
    std::vector<Signal> signalsNamed(const std::string& member) const;

private:
    static int onSignal(sd_bus_message* message, void* userdata, sd_bus_error* error);
    void drain();

    sd_bus* _bus = nullptr;
    sd_bus_slot* _match = nullptr;
    std::string _connectError;
    std::vector<Signal> _signals;
};
