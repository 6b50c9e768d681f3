#pragma once

#include "host/BusConnection.h"
#include "host/DeviceControl.h"
#include "platform/HidEvent.h"

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

struct sd_bus_slot;

namespace VeltoHost {

// The daemon's control interface on D-Bus: owns the well-known name, lists
// the attached devices on a manager object and serves one object per device
// through its DeviceControl, with the device's gestures as signals.
//
//   /org/veltotouch/VeltoTouch1            org.veltotouch.VeltoTouch1.Manager
//       ListDevices() -> ao; signals DeviceAdded(o), DeviceRemoved(o)
//   /org/veltotouch/VeltoTouch1/device/N   org.veltotouch.VeltoTouch1.Device
//       property Name (s); GetProperty(s key) -> s (JSON text);
//       SetProperty(s key, s value (JSON text)); SaveRecording(s path);
//       signals Gesture(s gesture, s region, u frame, u phase, u eventMask,
//       i y, t timestamp), DeviceReset(t timestamp)
//
// Values travel as compact JSON text both ways, so a text property such as
// "Recording" (itself the JSON of a recording) reads as a JSON string.
//
// N counts attachments from 0 and is never reused, so a path seen in a
// DeviceRemoved signal never comes back meaning another device.
//
// Threading: everything on the bus runs on the connection's own thread (see
// BusConnection), including the DeviceControl calls. addDevice and
// removeDevice may be called from any thread and wait for that thread.
// publishEvent may be called from any thread (typically the host's event
// queue): it only queues the signal and wakes the connection's thread, so
// the plug-in's deliveries never wait for the bus. A device's signals go out
// in the order they were published, and before its DeviceRemoved.
//
// Taking a device apart: stop its events reaching publishEvent (unsubscribe
// and drain the host's queue), removeDevice, then stop the device. The
// service itself goes last, after every publisher has stopped.
//
// A request, however malformed, is answered with an error and never reaches
// further than the device's control: nothing here stops the service.
class BusService {
public:
    static constexpr const char* kBusName = "org.veltotouch.VeltoTouch1";
    static constexpr const char* kManagerPath = "/org/veltotouch/VeltoTouch1";
    static constexpr const char* kManagerInterface = "org.veltotouch.VeltoTouch1.Manager";
    static constexpr const char* kDevicePathPrefix = "/org/veltotouch/VeltoTouch1/device/";
    static constexpr const char* kDeviceInterface = "org.veltotouch.VeltoTouch1.Device";

    static constexpr const char* kErrorInvalidJson = "org.veltotouch.VeltoTouch1.Error.InvalidJson";
    static constexpr const char* kErrorInvalidArgument = "org.veltotouch.VeltoTouch1.Error.InvalidArgument";
    static constexpr const char* kErrorFailed = "org.veltotouch.VeltoTouch1.Error.Failed";

    // Signals waiting for the connection's thread beyond this are dropped
    // (and counted): a bus that stalls must not grow the daemon without bound.
    static constexpr std::size_t kMaxPendingSignals = 8192;

    using DeviceId = std::uint64_t;

    // Connects, serves the manager object and takes the name. Raises
    // std::runtime_error when the bus cannot be reached or the name is
    // already owned or not allowed.
    explicit BusService(const BusConnection::Address& address);
    // Drops every device object (no signals) and closes the connection.
    ~BusService();
    BusService(const BusService&) = delete;
    BusService& operator=(const BusService&) = delete;

    // Serves a device object and announces it with DeviceAdded. Raises
    // std::runtime_error when the object cannot be served.
    DeviceId addDevice(std::shared_ptr<DeviceControl> control);
    // Withdraws the object and announces it with DeviceRemoved. On return no
    // call of the device's control is in progress or still to come, so its
    // device may be stopped. Unknown ids are ignored.
    void removeDevice(DeviceId id);

    // Queues the signal for one event of a device: Gesture for a digitizer
    // event, DeviceReset for a device reset. Never blocks on the bus; events
    // of a device already removed are dropped.
    void publishEvent(DeviceId id, const HidEventRef& event);

    static std::string devicePath(DeviceId id);
    const std::string& uniqueName() const noexcept { return _connection.uniqueName(); }

    // Signals dropped because too many were waiting, or because the bus
    // refused them.
    std::uint64_t signalsDropped() const noexcept { return _signalsDropped.load(); }

    // The C entry points of the bus vtables; public only so that the tables
    // in the implementation file can name them.
    struct Handlers;

private:
    struct DeviceObject {
        DeviceId id = 0;
        std::string path;
        std::string name;
        std::shared_ptr<DeviceControl> control;
        sd_bus_slot* slot = nullptr;
    };

    void serveManager();
    void requestName();
    void emitManagerSignal(const char* member, const std::string& path);
    void emitEvent(DeviceId id, const HidEventRef& event);
    std::vector<std::string> devicePaths() const;

    BusConnection _connection;
    sd_bus_slot* _managerSlot = nullptr;
    std::atomic<std::size_t> _pendingSignals{0};
    std::atomic<std::uint64_t> _signalsDropped{0};
    std::atomic<bool> _dropNoticed{false};

    // Connection's thread only.
    std::map<DeviceId, std::unique_ptr<DeviceObject>> _devices;
    DeviceId _nextDeviceId = 0;
};

}  // namespace VeltoHost
