#include "CtlCommand.h"

#include "EventFormatter.h"
#include "StateArguments.h"
#include "ToolError.h"
#include "host/BusService.h"
#include "host/ControlClient.h"
#include "host/StopSignals.h"

#include <charconv>
#include <chrono>
#include <filesystem>
#include <string_view>
#include <vector>

namespace VeltoTool {

using VeltoHost::BusConnection;
using VeltoHost::BusService;
using VeltoHost::ControlClient;

namespace {

constexpr std::string_view kUnknownObject = "org.freedesktop.DBus.Error.UnknownObject";
constexpr std::string_view kUnknownMethod = "org.freedesktop.DBus.Error.UnknownMethod";
constexpr std::string_view kServiceUnknown = "org.freedesktop.DBus.Error.ServiceUnknown";
constexpr std::string_view kNameHasNoOwner = "org.freedesktop.DBus.Error.NameHasNoOwner";
constexpr std::string_view kAccessDenied = "org.freedesktop.DBus.Error.AccessDenied";

// The number N of ".../device/N"; empty for any other object.
std::optional<unsigned> deviceNumber(std::string_view path)
{
    const std::string_view prefix = BusService::kDevicePathPrefix;
    if (!path.starts_with(prefix)) return std::nullopt;
    path.remove_prefix(prefix.size());
    unsigned number = 0;
    const auto [end, error] = std::from_chars(path.data(), path.data() + path.size(), number);
    if (error != std::errc() || end != path.data() + path.size()) return std::nullopt;
    return number;
}

class Session {
public:
    Session(const CtlCommand::Options& options)
        : _options(options), _address(BusConnection::Address::parse(options.bus)), _client(_address)
    {
        if (!_client.connected()) throw ToolError(_client.connectError());
    }

    ControlClient& client() { return _client; }

    // A failed reply as one line a person can act on.
    [[noreturn]] void fail(const ControlClient::Reply& reply, const std::string& path = {}) const
    {
        if (reply.error == kServiceUnknown || reply.error == kNameHasNoOwner) {
            throw ToolError("the daemon is not running on " + _address.description() + " (no owner of " +
                            BusService::kBusName + ")");
        }
        if ((reply.error == kUnknownObject || reply.error == kUnknownMethod) && deviceNumber(path)) {
            throw ToolError("no device " + std::to_string(*deviceNumber(path)) +
                            " is attached ('veltotouch ctl devices' lists them)");
        }
        if (reply.error == kAccessDenied) {
            throw ToolError(reply.message + " (writing properties and saving recordings takes root or the "
                            "veltotouch group)");
        }
        std::string name = reply.error;
        if (const auto dot = name.rfind('.'); dot != std::string::npos) name.erase(0, dot + 1);
        throw ToolError(reply.message + " (" + name + ")");
    }

    std::vector<std::string> devices()
    {
        ControlClient::Reply failure;
        std::vector<std::string> paths = _client.listDevices(&failure);
        if (!failure.ok()) fail(failure);
        return paths;
    }

    // The object of -d N, or of the first attached device.
    std::string devicePath()
    {
        if (_options.device) return BusService::devicePath(*_options.device);
        const std::vector<std::string> paths = devices();
        if (paths.empty()) throw ToolError("no device is attached");
        return paths.front();
    }

    ControlClient::Reply checked(ControlClient::Reply reply, const std::string& path) const
    {
        if (!reply.ok()) fail(reply, path);
        return reply;
    }

private:
    const CtlCommand::Options& _options;
    BusConnection::Address _address;
    ControlClient _client;
};

int watchEvents(Session& session, const CtlCommand::Options& options, std::ostream& out)
{
    using VeltoHost::StopSignals;
    const StopSignals stopSignals;
    ControlClient& client = session.client();
    if (!client.watchSignals()) throw ToolError("cannot watch the daemon's signals");
    // A call after the match is in place: the device exists, and no signal
    // sent from here on is missed.
    std::string watched;
    if (options.device) {
        watched = session.devicePath();
        session.checked(client.name(watched), watched);
    } else {
        session.devices();
    }

    EventFormatter formatter(options.jsonLines);
    bool haveOrigin = false;
    auto printNew = [&] {
        for (const ControlClient::Signal& signal : client.signals()) {
            if (signal.member != "Gesture" && signal.member != "DeviceReset") continue;
            if (!watched.empty() && signal.path != watched) continue;
            if (!haveOrigin) {
                formatter.setOrigin(signal.event.timestamp);
                haveOrigin = true;
            }
            const std::optional<unsigned> source = watched.empty() ? deviceNumber(signal.path) : std::nullopt;
            out << formatter.format(signal.event, source) << '\n';
        }
        out.flush();
        client.clearSignals();
        return StopSignals::requested();
    };
    while (!StopSignals::requested()) {
        client.waitUntil(printNew, std::chrono::seconds(1));
        if (client.broken()) throw ToolError("lost the connection to the bus");
    }
    return 0;
}

}  // namespace

int CtlCommand::run(const Options& options, std::ostream& out)
{
    Session session(options);
    ControlClient& client = session.client();
    switch (options.action) {
    case Action::Devices:
        for (const std::string& path : session.devices()) {
            const ControlClient::Reply name = session.checked(client.name(path), path);
            const std::optional<unsigned> number = deviceNumber(path);
            out << (number ? std::to_string(*number) : path) << "  " << name.value << '\n';
        }
        return 0;
    case Action::Get: {
        const std::string path = session.devicePath();
        out << session.checked(client.getProperty(path, options.key), path).value << '\n';
        return 0;
    }
    case Action::Set: {
        const auto [key, value] = StateArguments::split(options.assignment);
        const std::string path = session.devicePath();
        session.checked(client.setProperty(path, key, value), path);
        return 0;
    }
    case Action::SaveRecording: {
        // The daemon runs elsewhere, in another directory: it needs the whole path.
        const std::string file = std::filesystem::absolute(options.output).lexically_normal().string();
        const std::string path = session.devicePath();
        session.checked(client.saveRecording(path, file), path);
        return 0;
    }
    case Action::Events: return watchEvents(session, options, out);
    }
    return 0;
}

}  // namespace VeltoTool
