#include "bus/ControlClient.h"

#include "bus/BusService.h"
#include "pipeline/Pipeline.h"
#include "platform/runtime/MonotonicClock.h"
#include "records/Gesture.h"

#include <systemd/sd-bus.h>

#include <cerrno>
#include <cstring>
#include <exception>

namespace VeltoHost {

namespace {

// A reply for a whole recording can take a while on a loaded machine.
constexpr std::uint64_t kCallTimeoutUs = 30'000'000;

ControlClient::Reply replyOf(int result, sd_bus_error& error)
{
    ControlClient::Reply reply;
    if (result < 0) {
        reply.error = sd_bus_error_is_set(&error) ? error.name : "errno";
        reply.message = error.message ? error.message : std::strerror(-result);
    }
    return reply;
}

}  // namespace

ControlClient::ControlClient(const BusConnection::Address& address)
{
    try {
        _bus = BusConnection::connect(address);
    } catch (const std::exception& error) {
        _connectError = error.what();
        return;
    }
    sd_bus_set_method_call_timeout(_bus, kCallTimeoutUs);
}

ControlClient::~ControlClient()
{
    sd_bus_slot_unref(_match);
    sd_bus_slot_unref(_ownerMatch);
    sd_bus_flush_close_unref(_bus);
}

ControlClient::Reply ControlClient::call(const std::string& path, const std::string& interface, const std::string& member,
                                 const std::vector<std::string>& arguments)
{
    sd_bus_message* message = nullptr;
    sd_bus_message* answer = nullptr;
    sd_bus_error error{};  // all null: no error set
    int result = sd_bus_message_new_method_call(_bus, &message, BusService::kBusName, path.c_str(), interface.c_str(),
                                                member.c_str());
    for (const std::string& argument : arguments) {
        if (result >= 0) result = sd_bus_message_append_basic(message, 's', argument.c_str());
    }
    if (result >= 0) result = sd_bus_call(_bus, message, 0, &error, &answer);
    Reply reply = replyOf(result, error);
    if (result >= 0) {
        const char* text = nullptr;
        if (sd_bus_message_peek_type(answer, nullptr, nullptr) > 0 && sd_bus_message_read_basic(answer, 's', &text) > 0) {
            reply.value = text;
        }
    }
    sd_bus_error_free(&error);
    sd_bus_message_unref(answer);
    sd_bus_message_unref(message);
    drain();
    return reply;
}

ControlClient::Reply ControlClient::getProperty(const std::string& path, const std::string& key)
{
    return call(path, BusService::kDeviceInterface, "GetProperty", {key});
}

ControlClient::Reply ControlClient::setProperty(const std::string& path, const std::string& key, const std::string& json)
{
    return call(path, BusService::kDeviceInterface, "SetProperty", {key, json});
}

ControlClient::Reply ControlClient::saveRecording(const std::string& path, int file)
{
    sd_bus_message* answer = nullptr;
    sd_bus_error error{};  // all null: no error set
    const int result = sd_bus_call_method(_bus, BusService::kBusName, path.c_str(), BusService::kDeviceInterface,
                                          "SaveRecording", &error, &answer, "h", file);
    Reply reply = replyOf(result, error);
    sd_bus_error_free(&error);
    sd_bus_message_unref(answer);
    drain();
    return reply;
}

std::vector<std::string> ControlClient::listDevices(Reply* failure)
{
    sd_bus_message* answer = nullptr;
    sd_bus_error error{};  // all null: no error set
    const int result = sd_bus_call_method(_bus, BusService::kBusName, BusService::kManagerPath,
                                          BusService::kManagerInterface, "ListDevices", &error, &answer, "");
    std::vector<std::string> paths;
    if (result < 0) {
        if (failure) *failure = replyOf(result, error);
    } else if (sd_bus_message_enter_container(answer, 'a', "o") > 0) {
        const char* path = nullptr;
        while (sd_bus_message_read_basic(answer, 'o', &path) > 0) paths.emplace_back(path);
        sd_bus_message_exit_container(answer);
    }
    sd_bus_error_free(&error);
    sd_bus_message_unref(answer);
    drain();
    return paths;
}

ControlClient::Reply ControlClient::name(const std::string& path)
{
    sd_bus_error error{};  // all null: no error set
    char* text = nullptr;
    const int result = sd_bus_get_property_string(_bus, BusService::kBusName, path.c_str(), BusService::kDeviceInterface,
                                                  "Name", &error, &text);
    Reply reply = replyOf(result, error);
    if (text) reply.value = text;
    free(text);
    sd_bus_error_free(&error);
    drain();
    return reply;
}

bool ControlClient::watchSignals()
{
    // The owner's changes first, then its present owner: from here on no
    // change is missed.
    const std::string ownerRule = std::string("type='signal',sender='org.freedesktop.DBus',path='/org/freedesktop/DBus',"
                                              "interface='org.freedesktop.DBus',member='NameOwnerChanged',arg0='") +
                                  BusService::kBusName + "'";
    if (sd_bus_add_match(_bus, &_ownerMatch, ownerRule.c_str(), &ControlClient::onOwnerChanged, this) < 0) return false;
    sd_bus_message* answer = nullptr;
    const char* owner = nullptr;
    if (sd_bus_call_method(_bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus", "GetNameOwner",
                           nullptr, &answer, "s", BusService::kBusName) >= 0 &&
        sd_bus_message_read(answer, "s", &owner) >= 0 && owner) {
        _owner = owner;
    }
    sd_bus_message_unref(answer);
    const std::string rule = std::string("type='signal',path_namespace='") + BusService::kManagerPath + "'";
    return sd_bus_add_match(_bus, &_match, rule.c_str(), &ControlClient::onSignal, this) >= 0;
}

int ControlClient::onOwnerChanged(sd_bus_message* message, void* userdata, sd_bus_error*)
{
    auto* self = static_cast<ControlClient*>(userdata);
    const char* name = nullptr;
    const char* previous = nullptr;
    const char* owner = nullptr;
    if (sd_bus_message_read(message, "sss", &name, &previous, &owner) < 0 || !owner) return 0;
    if (self->_owner == owner) return 0;  // seen already, when the watch began
    self->_owner = owner;
    Signal signal;
    signal.receivedTicks = MonotonicClock::now();
    signal.member = "NameOwnerChanged";
    signal.object = owner;
    self->_signals.push_back(std::move(signal));
    return 0;
}

int ControlClient::onSignal(sd_bus_message* message, void* userdata, sd_bus_error*)
{
    auto* self = static_cast<ControlClient*>(userdata);
    // Anyone may send a signal with the service's path: only its owner's count.
    const char* sender = sd_bus_message_get_sender(message);
    if (!sender || self->_owner.empty() || self->_owner != sender) return 0;
    Signal signal;
    signal.receivedTicks = MonotonicClock::now();
    signal.path = sd_bus_message_get_path(message) ? sd_bus_message_get_path(message) : "";
    signal.member = sd_bus_message_get_member(message) ? sd_bus_message_get_member(message) : "";
    GestureFields& event = signal.event;
    if (signal.member == "Gesture") {
        const char* gesture = nullptr;
        const char* region = nullptr;
        std::uint32_t frame = 0;
        std::int32_t y = 0;
        if (sd_bus_message_read(message, "ssuuuit", &gesture, &region, &frame, &event.phase, &event.eventMask, &y,
                                &event.timestamp) < 0) {
            signal.member += " (unreadable)";
        } else {
            event.gesture = gesture;
            event.region = region;
            event.frame = frame;
            event.y = y;
        }
    } else if (signal.member == "DeviceReset") {
        // The signal carries only the time: the service sends it for the one
        // vendor-defined event the plug-in makes, whose usages are fixed.
        if (sd_bus_message_read(message, "t", &event.timestamp) < 0) {
            signal.member += " (unreadable)";
        } else {
            event.gesture = Gesture::name(Gesture::Kind::DeviceReset);
            event.isDeviceReset = true;
            event.usagePage = VeltoTouch::Pipeline::kResetEventUsagePage;
            event.usage = VeltoTouch::Pipeline::kResetEventUsage;
        }
    } else if (signal.member == "DeviceAdded" || signal.member == "DeviceRemoved") {
        const char* object = nullptr;
        if (sd_bus_message_read(message, "o", &object) < 0) {
            signal.member += " (unreadable)";
        } else {
            signal.object = object;
        }
    }
    self->_signals.push_back(std::move(signal));
    return 0;
}

void ControlClient::drain()
{
    int processed = 0;
    while (_bus && (processed = sd_bus_process(_bus, nullptr)) > 0) {
    }
    if (processed < 0) _broken = true;
}

bool ControlClient::waitUntil(const std::function<bool()>& done, std::chrono::milliseconds limit)
{
    const auto deadline = std::chrono::steady_clock::now() + limit;
    for (;;) {
        drain();
        if (done()) return true;
        const auto now = std::chrono::steady_clock::now();
        if (now >= deadline) return false;
        const auto left = std::chrono::duration_cast<std::chrono::microseconds>(deadline - now);
        const int waited = sd_bus_wait(_bus, static_cast<std::uint64_t>(left.count()));
        if (waited == -EINTR) return false;
        if (waited < 0) {
            _broken = true;
            return false;
        }
    }
}

std::vector<ControlClient::Signal> ControlClient::signalsNamed(const std::string& member) const
{
    std::vector<Signal> found;
    for (const Signal& signal : _signals) {
        if (signal.member == member) found.push_back(signal);
    }
    return found;
}

}  // namespace VeltoHost
