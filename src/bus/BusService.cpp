#include "bus/BusService.h"

#include "platform/log/Log.h"
#include "recording/JsonValue.h"

#include <fcntl.h>
#include <sched.h>
#include <sys/resource.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <exception>
#include <iterator>
#include <stdexcept>
#include <string_view>
#include <thread>
#include <utility>

namespace VeltoHost {

namespace {

// A value quoted back in an error is cut here: the caller sent it and only
// needs enough to recognise it.
constexpr std::size_t kQuotedValueLimit = 80;
// How far the worker thread stands back (nice value).
constexpr int kWorkerNice = 10;

const Log& busLog()
{
    static const Log log("BusService");
    return log;
}

std::string errorText(int negativeErrno) { return std::strerror(-negativeErrno); }

std::string shortened(std::string_view text)
{
    if (text.size() <= kQuotedValueLimit) return std::string(text);
    return std::string(text.substr(0, kQuotedValueLimit)) + "...";
}

std::string quoted(std::string_view text) { return "'" + shortened(text) + "'"; }

// A descriptor the worker writes a recording to, closed when the request is done.
struct Descriptor {
    explicit Descriptor(int fd) : fd(fd) {}
    ~Descriptor()
    {
        if (fd >= 0) ::close(fd);
    }
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;
    const int fd;
};

// The worker yields to everything else: the input-report threads, the
// host's queues and the connection's thread all come first, so a burst of
// recording reads only ever takes time nothing else wanted.
void lowerWorkerPriority()
{
    sched_param parameters{};
    ::sched_setscheduler(0, SCHED_BATCH, &parameters);
    ::setpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()), kWorkerNice);
}

// Client user ids remembered before the list starts again.
constexpr std::size_t kMaxRememberedClients = 1024;

const char* errorName(DeviceControl::Status status)
{
    return status == DeviceControl::Status::InvalidArgument ? BusService::kErrorInvalidArgument
                                                            : BusService::kErrorFailed;
}

// Every handler runs inside sd-bus's C code: nothing may unwind through it.
template <typename Body>
int guarded(sd_bus_error* error, Body&& body) noexcept
{
    try {
        return body();
    } catch (const std::exception& failure) {
        busLog().error("bus request failed: %s", failure.what());
        return sd_bus_error_setf(error, BusService::kErrorFailed, "internal error: %s", failure.what());
    } catch (...) {
        return sd_bus_error_set(error, BusService::kErrorFailed, "internal error");
    }
}

}  // namespace

struct BusService::Handlers {
    static int listDevices(sd_bus_message* call, void* userdata, sd_bus_error* error)
    {
        return guarded(error, [&] {
            const std::vector<std::string> paths = static_cast<BusService*>(userdata)->devicePaths();
            sd_bus_message* reply = nullptr;
            int result = sd_bus_message_new_method_return(call, &reply);
            if (result >= 0) result = sd_bus_message_open_container(reply, 'a', "o");
            for (const std::string& path : paths) {
                if (result >= 0) result = sd_bus_message_append_basic(reply, 'o', path.c_str());
            }
            if (result >= 0) result = sd_bus_message_close_container(reply);
            if (result >= 0) result = sd_bus_send(nullptr, reply, nullptr);
            sd_bus_message_unref(reply);
            return result;
        });
    }

    static int getProperty(sd_bus_message* call, void* userdata, sd_bus_error* error)
    {
        return guarded(error, [&] {
            const char* key = nullptr;
            int result = sd_bus_message_read(call, "s", &key);
            if (result < 0) return result;
            BusService& service = self(userdata);
            std::optional<uid_t> uid;
            const bool rawData = isRawDataKey(key);
            if (rawData) {
                uid = service.callerUid(call);
                if (!uid) return sd_bus_error_set(error, SD_BUS_ERROR_ACCESS_DENIED, "the caller's user is unknown");
            }
            return service.queueRequest(call, userdata, error, rawData ? Lane::RawData : Lane::Device,
                                        [&service, key = std::string(key), uid](DeviceControl& control) {
                if (uid && !service._access.allows(*uid)) return service.rawDataRefusal("reading " + quoted(key));
                PropertyValue value;
                const DeviceControl::Result outcome = control.getProperty(key, value);
                if (!outcome.isOk()) return answerOf(outcome);
                return Answer{{}, {}, VeltoTouch::JsonValue::write(value, false)};
            });
        });
    }

    static int setProperty(sd_bus_message* call, void* userdata, sd_bus_error* error)
    {
        return guarded(error, [&] {
            const char* key = nullptr;
            const char* text = nullptr;
            int result = sd_bus_message_read(call, "ss", &key, &text);
            if (result < 0) return result;
            const std::size_t size = std::strlen(text);
            if (size > kMaxValueBytes) {
                return sd_bus_error_setf(error, kErrorInvalidArgument,
                                         "the value for %s is %zu bytes long; no setting takes more than %zu",
                                         quoted(key).c_str(), size, kMaxValueBytes);
            }
            return self(userdata).queueRequest(call, userdata, error, Lane::Device,
                                               [key = std::string(key), text = std::string(text)](DeviceControl& control) {
                VeltoTouch::JsonValue::Problem problem = VeltoTouch::JsonValue::Problem::None;
                const PropertyValue value =
                    VeltoTouch::JsonValue::parse(text, VeltoTouch::JsonValue::TopLevel::AnyValue, problem);
                if (!value.hasValue()) {
                    return Answer{problem == VeltoTouch::JsonValue::Problem::NotJson ? kErrorInvalidJson
                                                                                     : kErrorInvalidArgument,
                                  "the value for " + quoted(key) + " is " + VeltoTouch::JsonValue::describe(problem) +
                                      ": " + shortened(text),
                                  {}};
                }
                return answerOf(control.setProperty(key, value));
            });
        });
    }

    static int saveRecording(sd_bus_message* call, void* userdata, sd_bus_error* error)
    {
        return guarded(error, [&] {
            int passed = -1;
            int result = sd_bus_message_read(call, "h", &passed);
            if (result < 0) return result;
            BusService& service = self(userdata);
            const std::optional<uid_t> uid = service.callerUid(call);
            if (!uid) return sd_bus_error_set(error, SD_BUS_ERROR_ACCESS_DENIED, "the caller's user is unknown");
            // The message owns the descriptor it carried; the worker gets its own.
            auto file = std::make_shared<Descriptor>(::fcntl(passed, F_DUPFD_CLOEXEC, 3));
            if (file->fd < 0) return sd_bus_error_set_errno(error, errno);
            return service.queueRequest(call, userdata, error, Lane::RawData,
                                        [&service, uid, file](DeviceControl& control) {
                if (!service._access.allows(*uid)) return service.rawDataRefusal("saving a recording");
                return answerOf(control.saveRecording(file->fd));
            });
        });
    }

    static int name(sd_bus*, const char*, const char*, const char*, sd_bus_message* reply, void* userdata,
                    sd_bus_error* error)
    {
        return guarded(error, [&] { return sd_bus_message_append(reply, "s", device(userdata).name.c_str()); });
    }

    static DeviceObject& device(void* userdata) { return *static_cast<DeviceObject*>(userdata); }
    static BusService& self(void* userdata) { return *device(userdata).service; }

    static Answer answerOf(const DeviceControl::Result& result)
    {
        if (result.isOk()) return {};
        return {errorName(result.status), result.message, {}};
    }

    static bool isRawDataKey(std::string_view key)
    {
        return std::find(std::begin(kRawDataKeys), std::end(kRawDataKeys), key) != std::end(kRawDataKeys);
    }
};

namespace {

// Every method is marked unprivileged so that sd-bus does not add a
// capability check of its own on the system bus: the bus policy
// (packaging/) and RawDataAccess decide.
const sd_bus_vtable kManagerVtable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD_WITH_NAMES("ListDevices", "", "", "ao", SD_BUS_PARAM(devices), BusService::Handlers::listDevices,
                             SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_SIGNAL_WITH_NAMES("DeviceAdded", "o", SD_BUS_PARAM(device), 0),
    SD_BUS_SIGNAL_WITH_NAMES("DeviceRemoved", "o", SD_BUS_PARAM(device), 0),
    SD_BUS_VTABLE_END,
};

const sd_bus_vtable kDeviceVtable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("Name", "s", BusService::Handlers::name, 0, SD_BUS_VTABLE_PROPERTY_CONST),
    SD_BUS_METHOD_WITH_NAMES("GetProperty", "s", SD_BUS_PARAM(key), "s", SD_BUS_PARAM(value),
                             BusService::Handlers::getProperty, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD_WITH_NAMES("SetProperty", "ss", SD_BUS_PARAM(key) SD_BUS_PARAM(value), "", "",
                             BusService::Handlers::setProperty, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD_WITH_NAMES("SaveRecording", "h", SD_BUS_PARAM(file), "", "", BusService::Handlers::saveRecording,
                             SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_SIGNAL_WITH_NAMES("Gesture", "ssuuuit",
                             SD_BUS_PARAM(gesture) SD_BUS_PARAM(region) SD_BUS_PARAM(frame) SD_BUS_PARAM(phase)
                                 SD_BUS_PARAM(eventMask) SD_BUS_PARAM(y) SD_BUS_PARAM(timestamp),
                             0),
    SD_BUS_SIGNAL_WITH_NAMES("DeviceReset", "t", SD_BUS_PARAM(timestamp), 0),
    SD_BUS_VTABLE_END,
};

}  // namespace

BusService::BusService(const BusConnection::Address& address, RawDataAccess access)
    : _access(std::move(access)),
      _connection(address),
      _worker(SerialQueue::create("bus requests")),
      _rawDataWorker(SerialQueue::create("bus raw data"))
{
    _worker->async(lowerWorkerPriority);
    _rawDataWorker->async(lowerWorkerPriority);
    // Objects first, name last: a client that sees the name appear finds
    // the manager already there.
    try {
        serveManager();
        requestName();
    } catch (...) {
        // The slot holds a reference to the connection, which would keep it open.
        sd_bus_slot_unref(_managerSlot);
        throw;
    }
    _connection.start();
    busLog().log("serving %s on %s as %s", kBusName, address.description(), _connection.uniqueName());
}

BusService::~BusService()
{
    // Requests still queued find their devices closed and are answered; the
    // answers go out before the connection closes.
    _connection.call([this] {
        for (auto& [id, device] : _devices) closeGate(*device->gate);
    });
    _rawDataWorker.reset();
    _worker.reset();
    _connection.stop();
    for (auto& [id, device] : _devices) sd_bus_slot_unref(device->slot);
    _devices.clear();
    sd_bus_slot_unref(_managerSlot);
}

void BusService::serveManager()
{
    const int result =
        sd_bus_add_object_vtable(_connection.bus(), &_managerSlot, kManagerPath, kManagerInterface, kManagerVtable, this);
    if (result < 0) throw std::runtime_error(std::string("cannot serve ") + kManagerPath + ": " + errorText(result));
}

void BusService::requestName()
{
    const int result = sd_bus_request_name(_connection.bus(), kBusName, 0);
    if (result == -EEXIST || result == -EALREADY) {
        throw std::runtime_error(std::string("the name ") + kBusName + " is already owned on this bus (is another daemon running?)");
    }
    if (result < 0) {
        throw std::runtime_error(std::string("cannot own the name ") + kBusName + ": " + errorText(result) +
                                 (result == -EACCES ? " (the bus policy does not allow it)" : ""));
    }
}

std::string BusService::devicePath(DeviceId id) { return kDevicePathPrefix + std::to_string(id); }

std::vector<std::string> BusService::devicePaths() const
{
    std::vector<std::string> paths;
    paths.reserve(_devices.size());
    for (const auto& [id, device] : _devices) paths.push_back(device->path);
    return paths;
}

BusService::DeviceId BusService::addDevice(std::shared_ptr<DeviceControl> control)
{
    DeviceId added = 0;
    _connection.call([&] {
        auto device = std::make_unique<DeviceObject>();
        device->id = _nextDeviceId;
        device->path = devicePath(device->id);
        device->name = control->name();
        device->gate = std::make_shared<ControlGate>();
        device->gate->control = control;
        device->service = this;
        const int result = sd_bus_add_object_vtable(_connection.bus(), &device->slot, device->path.c_str(),
                                                    kDeviceInterface, kDeviceVtable, device.get());
        if (result < 0) throw std::runtime_error("cannot serve " + device->path + ": " + errorText(result));
        ++_nextDeviceId;
        added = device->id;
        const std::string path = device->path;
        _devices.emplace(added, std::move(device));
        emitManagerSignal("DeviceAdded", path);
    });
    return added;
}

void BusService::removeDevice(DeviceId id)
{
    _connection.call([&] {
        auto found = _devices.find(id);
        if (found == _devices.end()) return;
        const std::string path = found->second->path;
        // After this no worker job reaches the control; one in progress has ended.
        closeGate(*found->second->gate);
        sd_bus_slot_unref(found->second->slot);
        _devices.erase(found);
        emitManagerSignal("DeviceRemoved", path);
    });
}

void BusService::closeGate(ControlGate& gate)
{
    std::lock_guard guard(gate.lock);
    gate.control.reset();
}

int BusService::queueRequest(sd_bus_message* call, void* device, sd_bus_error* error, Lane lane, Work work)
{
    const char* sender = sd_bus_message_get_sender(call);
    std::string client = sender ? sender : "";
    std::size_t& pending = _requestsByClient[client];
    if (pending >= kMaxRequestsPerClient || _requests >= kMaxRequests) {
        if (pending == 0) _requestsByClient.erase(client);
        return sd_bus_error_setf(error, SD_BUS_ERROR_LIMITS_EXCEEDED,
                                 "too many requests in progress (at most %zu per client): wait for the answers",
                                 kMaxRequestsPerClient);
    }
    ++pending;
    ++_requests;
    sd_bus_message_ref(call);
    std::shared_ptr<ControlGate> gate = Handlers::device(device).gate;
    const std::string name = Handlers::device(device).name;
    SerialQueue& worker = lane == Lane::RawData ? *_rawDataWorker : *_worker;
    worker.async([this, lane, call, client = std::move(client), gate = std::move(gate), name, work = std::move(work)] {
        if (lane == Lane::RawData) waitForRawDataTurn(*gate);
        Answer answer;
        {
            std::lock_guard guard(gate->lock);
            if (!gate->control) {
                answer = {kErrorFailed, "device " + name + " was removed", {}};
            } else {
                try {
                    answer = work(*gate->control);
                } catch (const std::exception& failure) {
                    busLog().error("bus request failed: %s", failure.what());
                    answer = {kErrorFailed, std::string("internal error: ") + failure.what(), {}};
                }
            }
        }
        // The worker ends before the connection stops, so the answer always
        // reaches the connection's thread, which alone may touch the message.
        _connection.post([this, call, client, answer = std::move(answer)] { sendAnswer(call, client, answer); });
    });
    return 1;  // answered later
}

void BusService::waitForRawDataTurn(ControlGate& gate)
{
    {
        // A device taken apart (or a service going away) does not wait.
        std::lock_guard guard(gate.lock);
        if (!gate.control) return;
    }
    const auto now = std::chrono::steady_clock::now();
    if (_nextRawDataTurn > now) std::this_thread::sleep_for(_nextRawDataTurn - now);
    _nextRawDataTurn = std::max(now, _nextRawDataTurn) + kRawDataInterval;
}

void BusService::sendAnswer(sd_bus_message* call, const std::string& client, const Answer& answer)
{
    int result = 0;
    if (!answer.error.empty()) {
        result = sd_bus_reply_method_errorf(call, answer.error.c_str(), "%s", answer.message.c_str());
    } else if (answer.value) {
        result = sd_bus_reply_method_return(call, "s", answer.value->c_str());
    } else {
        result = sd_bus_reply_method_return(call, "");
    }
    if (result < 0) busLog().debug("cannot answer %s: %s", client, errorText(result));
    sd_bus_message_unref(call);
    --_requests;
    auto found = _requestsByClient.find(client);
    if (found != _requestsByClient.end() && --found->second == 0) _requestsByClient.erase(found);
}

std::optional<uid_t> BusService::callerUid(sd_bus_message* call)
{
    const char* sender = sd_bus_message_get_sender(call);
    if (!sender) return std::nullopt;
    if (auto known = _clientUids.find(sender); known != _clientUids.end()) return known->second;
    sd_bus_creds* creds = nullptr;
    uid_t uid = 0;
    const int result = sd_bus_query_sender_creds(call, SD_BUS_CREDS_EUID | SD_BUS_CREDS_UID, &creds);
    const bool found = result >= 0 && (sd_bus_creds_get_euid(creds, &uid) >= 0 || sd_bus_creds_get_uid(creds, &uid) >= 0);
    sd_bus_creds_unref(creds);
    if (!found) {
        busLog().error("cannot tell the user of %s: %s", sender, errorText(result < 0 ? result : -ENODATA));
        return std::nullopt;
    }
    // Bounded: clients come and go for as long as the service runs.
    if (_clientUids.size() >= kMaxRememberedClients) _clientUids.clear();
    _clientUids.emplace(sender, uid);
    return uid;
}

BusService::Answer BusService::rawDataRefusal(const std::string& what) const
{
    return {SD_BUS_ERROR_ACCESS_DENIED,
            what + " is kept to root and the group " + _access.group() + ": it holds the raw touch data", {}};
}

void BusService::emitManagerSignal(const char* member, const std::string& path)
{
    const int result = sd_bus_emit_signal(_connection.bus(), kManagerPath, kManagerInterface, member, "o", path.c_str());
    if (result < 0) busLog().error("cannot send %s for %s: %s", member, path, errorText(result));
}

void BusService::publishEvent(DeviceId id, const HidEventRef& event)
{
    if (event) publishEvent(id, GestureFields::of(*event));
}

void BusService::publishEvent(DeviceId id, GestureFields fields)
{
    if (_pendingSignals.fetch_add(1) >= kMaxPendingSignals) {
        _pendingSignals.fetch_sub(1);
        _signalsDropped.fetch_add(1);
        if (!_dropNoticed.exchange(true)) {
            busLog().error("the bus is not taking signals: dropping gestures beyond %ju waiting", kMaxPendingSignals);
        }
        return;
    }
    const bool queued = _connection.post([this, id, fields = std::move(fields)] {
        _pendingSignals.fetch_sub(1);
        emitEvent(id, fields);
    });
    if (!queued) _pendingSignals.fetch_sub(1);
}

void BusService::emitEvent(DeviceId id, const GestureFields& fields)
{
    auto found = _devices.find(id);
    if (found == _devices.end()) return;
    const char* path = found->second->path.c_str();
    int result = 0;
    if (fields.isDeviceReset) {
        result = sd_bus_emit_signal(_connection.bus(), path, kDeviceInterface, "DeviceReset", "t", fields.timestamp);
    } else {
        result = sd_bus_emit_signal(_connection.bus(), path, kDeviceInterface, "Gesture", "ssuuuit",
                                    fields.gesture.c_str(), fields.region.c_str(),
                                    static_cast<std::uint32_t>(fields.frame), static_cast<std::uint32_t>(fields.phase),
                                    fields.eventMask, static_cast<std::int32_t>(fields.y), fields.timestamp);
    }
    if (result < 0) {
        _signalsDropped.fetch_add(1);
        if (!_dropNoticed.exchange(true)) busLog().error("cannot send a gesture signal: %s", errorText(result));
    }
}

}  // namespace VeltoHost
