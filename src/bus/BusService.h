#pragma once

#include "bus/BusConnection.h"
#include "bus/DeviceControl.h"
#include "bus/GestureFields.h"
#include "bus/RawDataAccess.h"
#include "platform/plugin/HidEvent.h"
#include "platform/runtime/SerialQueue.h"

#include <sys/types.h>
#include <systemd/sd-bus.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>


namespace VeltoHost {

// The daemon's control interface on D-Bus: owns the well-known name, lists
// the attached devices on a manager object and serves one object per device
// through its DeviceControl, with the device's gestures as signals.
//
//   /org/veltotouch/VeltoTouch1            org.veltotouch.VeltoTouch1.Manager
//       ListDevices() -> ao; signals DeviceAdded(o), DeviceRemoved(o)
//   /org/veltotouch/VeltoTouch1/device/N   org.veltotouch.VeltoTouch1.Device
//       property Name (s); GetProperty(s key) -> s (JSON text);
//       SetProperty(s key, s value (JSON text)); SaveRecording(h file);
//       signals Gesture(s gesture, s region, u frame, u phase, u eventMask,
//       i y, t timestamp), DeviceReset(t timestamp)
//
// Values travel as compact JSON text both ways, so a text property such as
// "Recording" (itself the JSON of a recording) reads as a JSON string.
// SaveRecording takes a file the caller opened for writing, so the daemon
// never opens a path a client names: the file is created with the caller's
// own rights, wherever the caller may write.
//
// Who may do what: the bus policy (packaging/) lets anyone call the methods;
// the raw touch data ("Recording", "ServicePluginDebug", SaveRecording) is
// kept here to RawDataAccess, because a policy cannot look at a key.
//
// N counts attachments from 0 and is never reused, so a path seen in a
// DeviceRemoved signal never comes back meaning another device.
//
// Threading: the bus is served on the connection's own thread (see
// BusConnection), which also sends the signals, so nothing that thread does
// may take long: every call into a device's control runs on a worker thread
// of lower priority, in the order the requests came, and its answer is sent
// from the connection's thread when it is ready. Requests for the raw touch
// data have a worker of their own that starts one at most every
// kRawDataInterval, so however many clients read recordings, gestures keep
// going out on time; each client has a bounded number of requests in
// progress, so none can queue the others out.
// addDevice and removeDevice may be called from any thread and wait for the
// connection's thread. publishEvent may be called from any thread (typically
// the host's event queue): it only queues the signal and wakes the
// connection's thread, so the plug-in's deliveries never wait for the bus. A
// device's signals go out in the order they were published, and before its
// DeviceRemoved.
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

    // Keys whose values hold the raw touch data.
    static constexpr const char* kRawDataKeys[] = {"Recording", "ServicePluginDebug"};
    // No setting's JSON text comes near this; a larger value is refused
    // before it is parsed.
    static constexpr std::size_t kMaxValueBytes = 4096;
    // Requests of one client waiting for or in the worker; more are refused
    // until answers have gone out.
    static constexpr std::size_t kMaxRequestsPerClient = 4;
    // Requests of all clients waiting for or in the worker.
    static constexpr std::size_t kMaxRequests = 64;
    // Requests for the raw touch data start at most this often, for all
    // clients together: each one is half a megabyte to copy, write as JSON
    // and send through the same connection, and the same bus daemon, as the
    // gestures, so their pace is what keeps the gestures on time.
    static constexpr std::chrono::milliseconds kRawDataInterval{100};

    // Signals waiting for the connection's thread beyond this are dropped
    // (and counted): a bus that stalls must not grow the daemon without bound.
    static constexpr std::size_t kMaxPendingSignals = 8192;

    using DeviceId = std::uint64_t;

    // Connects, serves the manager object and takes the name. Raises
    // std::runtime_error when the bus cannot be reached or the name is
    // already owned or not allowed.
    explicit BusService(const BusConnection::Address& address, RawDataAccess access = RawDataAccess());
    // Drops every device object (no signals) and closes the connection.
    ~BusService();
    BusService(const BusService&) = delete;
    BusService& operator=(const BusService&) = delete;

    // Serves a device object and announces it with DeviceAdded. Raises
    // std::runtime_error when the object cannot be served.
    DeviceId addDevice(std::shared_ptr<DeviceControl> control);
    // Withdraws the object and announces it with DeviceRemoved. On return no
    // call of the device's control is in progress or still to come (requests
    // still queued are answered with an error), so its device may be
    // stopped. Unknown ids are ignored.
    void removeDevice(DeviceId id);

    // Queues the signal for one event of a device, decoded: Gesture for a
    // digitizer event, DeviceReset for a device reset. Never blocks on the
    // bus; events of a device already removed are dropped.
    void publishEvent(DeviceId id, GestureFields fields);
    // The same for an event still to be decoded; a null one is ignored.
    void publishEvent(DeviceId id, const HidEventRef& event);

    static std::string devicePath(DeviceId id);
    const std::string& uniqueName() const noexcept { return _connection.uniqueName(); }
    // True once the connection to the bus has broken: no client can reach the
    // service any more.
    bool connectionLost() const noexcept { return _connection.lost(); }

    // Signals dropped because too many were waiting, or because the bus
    // refused them.
    std::uint64_t signalsDropped() const noexcept { return _signalsDropped.load(); }

    // The C entry points of the bus vtables; public only so that the tables
    // in the implementation file can name them.
    struct Handlers;

private:
    // The device's control as the worker reaches it: closed by removeDevice,
    // which waits for a call in progress.
    struct ControlGate {
        std::mutex lock;
        std::shared_ptr<DeviceControl> control;  // null once closed; guarded by lock
    };

    struct DeviceObject {
        DeviceId id = 0;
        std::string path;
        std::string name;
        std::shared_ptr<ControlGate> gate;
        BusService* service = nullptr;
        sd_bus_slot* slot = nullptr;
    };

    // What the worker found for one request, sent back as its reply.
    struct Answer {
        std::string error;  // D-Bus error name; empty for success
        std::string message;
        std::optional<std::string> value;  // GetProperty's text
    };
    using Work = std::function<Answer(DeviceControl&)>;
    enum class Lane { Device, RawData };

    // Queues `work` for the device `call` was made to; the reply follows
    // when it has run. Returns what sd-bus expects of a handler.
    int queueRequest(sd_bus_message* call, void* device, sd_bus_error* error, Lane lane, Work work);
    // Raw-data worker only: sleeps until the next request may start.
    void waitForRawDataTurn(ControlGate& gate);
    void sendAnswer(sd_bus_message* call, const std::string& client, const Answer& answer);
    // The calling client's user id, asked of the bus once per client.
    std::optional<uid_t> callerUid(sd_bus_message* call);
    Answer rawDataRefusal(const std::string& what) const;
    static void closeGate(ControlGate& gate);

    void serveManager();
    void requestName();
    void emitManagerSignal(const char* member, const std::string& path);
    void emitEvent(DeviceId id, const GestureFields& fields);
    std::vector<std::string> devicePaths() const;

    const RawDataAccess _access;
    BusConnection _connection;
    sd_bus_slot* _managerSlot = nullptr;
    // Device calls, off the connection's thread. Declared after the
    // connection so that it goes first: its last answers still reach the bus.
    SerialQueue::Ref _worker;
    SerialQueue::Ref _rawDataWorker;
    std::chrono::steady_clock::time_point _nextRawDataTurn{};  // raw-data worker only
    std::atomic<std::size_t> _pendingSignals{0};
    std::atomic<std::uint64_t> _signalsDropped{0};
    std::atomic<bool> _dropNoticed{false};

    // Connection's thread only.
    std::map<DeviceId, std::unique_ptr<DeviceObject>> _devices;
    DeviceId _nextDeviceId = 0;
    std::map<std::string, std::size_t> _requestsByClient;  // by unique name; none listed with 0
    std::size_t _requests = 0;
    std::map<std::string, uid_t> _clientUids;  // unique names are never reused
};

}  // namespace VeltoHost
