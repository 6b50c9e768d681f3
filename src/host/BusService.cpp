#include "host/BusService.h"

#include "host/GestureFields.h"
#include "platform/Log.h"
#include "recording/JsonValue.h"

#include <systemd/sd-bus.h>

#include <cerrno>
#include <cstring>
#include <exception>
#include <stdexcept>

namespace VeltoHost {

namespace {

// A value quoted back in an error is cut here: the caller sent it and only
// needs enough to recognise it.
constexpr std::size_t kQuotedValueLimit = 80;

const Log& busLog()
{
    static const Log log("BusService");
    return log;
}

std::string errorText(int negativeErrno) { return std::strerror(-negativeErrno); }

std::string shortened(const std::string& text)
{
    if (text.size() <= kQuotedValueLimit) return text;
    return text.substr(0, kQuotedValueLimit) + "...";
}

const char* errorName(DeviceControl::Status status)
{
    return status == DeviceControl::Status::InvalidArgument ? BusService::kErrorInvalidArgument
                                                            : BusService::kErrorFailed;
}

int replyWith(sd_bus_error* error, const DeviceControl::Result& result)
{
    return sd_bus_error_set(error, errorName(result.status), result.message.c_str());
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
            PropertyValue value;
            const DeviceControl::Result outcome = device(userdata).control->getProperty(key, value);
            if (!outcome.isOk()) return replyWith(error, outcome);
            const std::string text = VeltoTouch::JsonValue::write(value, false);
            return sd_bus_reply_method_return(call, "s", text.c_str());
        });
    }

    static int setProperty(sd_bus_message* call, void* userdata, sd_bus_error* error)
    {
        return guarded(error, [&] {
            const char* key = nullptr;
            const char* text = nullptr;
            int result = sd_bus_message_read(call, "ss", &key, &text);
            if (result < 0) return result;
            const PropertyValue value = VeltoTouch::JsonValue::parse(text, VeltoTouch::JsonValue::TopLevel::AnyValue);
            if (!value.hasValue()) {
                return sd_bus_error_setf(error, kErrorInvalidJson, "the value for '%s' is not JSON: %s", key,
                                         shortened(text).c_str());
            }
            const DeviceControl::Result outcome = device(userdata).control->setProperty(key, value);
            if (!outcome.isOk()) return replyWith(error, outcome);
            return sd_bus_reply_method_return(call, "");
        });
    }

    static int saveRecording(sd_bus_message* call, void* userdata, sd_bus_error* error)
    {
        return guarded(error, [&] {
            const char* path = nullptr;
            int result = sd_bus_message_read(call, "s", &path);
            if (result < 0) return result;
            const DeviceControl::Result outcome = device(userdata).control->saveRecording(path);
            if (!outcome.isOk()) return replyWith(error, outcome);
            return sd_bus_reply_method_return(call, "");
        });
    }

    static int name(sd_bus*, const char*, const char*, const char*, sd_bus_message* reply, void* userdata,
                    sd_bus_error* error)
    {
        return guarded(error, [&] { return sd_bus_message_append(reply, "s", device(userdata).name.c_str()); });
    }

    static DeviceObject& device(void* userdata) { return *static_cast<DeviceObject*>(userdata); }
};

namespace {

// Access is the bus policy's business (packaging/): every method is marked
// unprivileged so that sd-bus does not add a capability check of its own on
// the system bus.
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
    SD_BUS_METHOD_WITH_NAMES("SaveRecording", "s", SD_BUS_PARAM(path), "", "", BusService::Handlers::saveRecording,
                             SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_SIGNAL_WITH_NAMES("Gesture", "ssuuuit",
                             SD_BUS_PARAM(gesture) SD_BUS_PARAM(region) SD_BUS_PARAM(frame) SD_BUS_PARAM(phase)
                                 SD_BUS_PARAM(eventMask) SD_BUS_PARAM(y) SD_BUS_PARAM(timestamp),
                             0),
    SD_BUS_SIGNAL_WITH_NAMES("DeviceReset", "t", SD_BUS_PARAM(timestamp), 0),
    SD_BUS_VTABLE_END,
};

}  // namespace

BusService::BusService(const BusConnection::Address& address) : _connection(address)
{
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
        device->control = control;
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
        sd_bus_slot_unref(found->second->slot);
        _devices.erase(found);
        emitManagerSignal("DeviceRemoved", path);
    });
}

void BusService::emitManagerSignal(const char* member, const std::string& path)
{
    const int result = sd_bus_emit_signal(_connection.bus(), kManagerPath, kManagerInterface, member, "o", path.c_str());
    if (result < 0) busLog().error("cannot send %s for %s: %s", member, path, errorText(result));
}

void BusService::publishEvent(DeviceId id, const HidEventRef& event)
{
    if (!event) return;
    if (_pendingSignals.fetch_add(1) >= kMaxPendingSignals) {
        _pendingSignals.fetch_sub(1);
        _signalsDropped.fetch_add(1);
        if (!_dropNoticed.exchange(true)) {
            busLog().error("the bus is not taking signals: dropping gestures beyond %ju waiting", kMaxPendingSignals);
        }
        return;
    }
    const bool queued = _connection.post([this, id, event] {
        _pendingSignals.fetch_sub(1);
        emitEvent(id, event);
    });
    if (!queued) _pendingSignals.fetch_sub(1);
}

void BusService::emitEvent(DeviceId id, const HidEventRef& event)
{
    auto found = _devices.find(id);
    if (found == _devices.end()) return;
    const GestureFields fields = GestureFields::of(*event);
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
