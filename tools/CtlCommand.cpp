#include "CtlCommand.h"

#include "CommandLine.h"
#include "EventFormatter.h"
#include "OutputFile.h"
#include "StateArguments.h"
#include "StopSignals.h"
#include "ToolError.h"
#include "bus/BusService.h"
#include "bus/ControlClient.h"
#include "recording/JsonValue.h"

#include <charconv>
#include <chrono>
#include <memory>
#include <ostream>
#include <string_view>
#include <vector>

namespace VeltoTool {

using VeltoHost::BusConnection;
using VeltoHost::BusService;
using VeltoHost::ControlClient;
using VeltoHost::PropertyValue;

namespace {

constexpr std::string_view kUnknownObject = "org.freedesktop.DBus.Error.UnknownObject";
constexpr std::string_view kUnknownMethod = "org.freedesktop.DBus.Error.UnknownMethod";
constexpr std::string_view kServiceUnknown = "org.freedesktop.DBus.Error.ServiceUnknown";
constexpr std::string_view kNameHasNoOwner = "org.freedesktop.DBus.Error.NameHasNoOwner";
constexpr std::string_view kAccessDenied = "org.freedesktop.DBus.Error.AccessDenied";
constexpr std::string_view kBusPolicyRefusal = "Rejected send message";

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
        : _options(options), _address(options.bus), _client(_address)
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
            // The bus's own refusal names rules, not reasons; the daemon's says why.
            if (!reply.message.starts_with(kBusPolicyRefusal)) throw ToolError(reply.message);
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

// Prints the daemon's gestures until interrupted. Only the owner of the
// service's name is listened to (ControlClient), and when it leaves the bus
// the watch ends: the next daemon numbers its devices anew, so its device 1
// need not be the one asked for.
int watchEvents(Session& session, const CtlCommand::Options& options, std::ostream& out, std::ostream& err)
{
    const StopSignals stopSignals;
    ControlClient& client = session.client();
    if (!client.watchSignals()) throw ToolError("cannot watch the daemon's signals");
    // A call after the match is in place: the device exists, and no signal
    // sent from here on is missed.
    std::string watched;
    if (client.owner().empty() && options.follow) {
        err << "veltotouch: the daemon is not running; waiting for it" << std::endl;
    } else if (options.device) {
        watched = session.devicePath();
        session.checked(client.name(watched), watched);
    } else {
        session.devices();
    }
    if (options.device) watched = BusService::devicePath(*options.device);

    EventFormatter formatter(options.jsonLines);
    bool haveOrigin = false;
    auto printNew = [&] {
        for (const ControlClient::Signal& signal : client.signals()) {
            if (signal.member == "NameOwnerChanged") {
                if (!options.follow && signal.object.empty()) {
                    out.flush();
                    throw ToolError(std::string("the daemon stopped (") + BusService::kBusName + " left the bus)");
                }
                err << (signal.object.empty() ? "veltotouch: the daemon stopped; waiting for it to come back"
                                              : "veltotouch: the daemon is running again; its devices are numbered anew")
                    << std::endl;
                continue;
            }
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

// Says when a value reads back other than it was written: the plug-in keeps
// a number beyond a setting's range as infinity, which reads back as null.
void warnOfReadBack(Session& session, const std::string& path, const std::string& key, const std::string& text,
                    std::ostream& err)
{
    using VeltoTouch::JsonValue;
    const ControlClient::Reply readBack = session.client().getProperty(path, key);
    if (!readBack.ok()) return;  // a command such as a reset: nothing to compare
    const PropertyValue written = JsonValue::parse(text, JsonValue::TopLevel::AnyValue);
    const PropertyValue value = JsonValue::parse(readBack.value, JsonValue::TopLevel::AnyValue);
    if (written.isNumber() && value.isNull()) {
        err << "veltotouch: warning: " << key << " was set to " << written.description()
            << " but reads back null: beyond what the setting can hold, it became infinity\n";
        return;
    }
    if (auto warning = StateArguments::readBackWarning(key, written, value)) {
        err << "veltotouch: warning: " << *warning << '\n';
    }
}

}  // namespace

int CtlCommand::run(const Options& options, std::ostream& out, std::ostream& err)
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
        const auto& [key, value] = options.assignment;
        const std::string path = session.devicePath();
        session.checked(client.setProperty(path, key, value), path);
        warnOfReadBack(session, path, key, value, err);
        return 0;
    }
    case Action::SaveRecording: {
        // Opened here, with the caller's rights and relative to the caller's
        // directory; the daemon only writes into it.
        const std::string path = session.devicePath();
        OutputFile file(options.output);
        session.checked(client.saveRecording(path, file.descriptor()), path);
        file.commit();
        return 0;
    }
    case Action::Events: return watchEvents(session, options, out, err);
    }
    return 0;
}

void CtlCommand::addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err)
{
    auto options = std::make_shared<Options>();
    CLI::App* command = app.add_subcommand("ctl", "Ask the running daemon: devices, properties, gestures, recordings");
    CommandLine::addBus(*command, options->bus);
    // --bus may come after the action too.
    command->fallthrough();
    command->require_subcommand(1);
    const auto addAction = [&](const char* name, const char* description, Action action) {
        CLI::App* actionCommand = command->add_subcommand(name, description);
        actionCommand->callback([options, action] { options->action = action; });
        if (action != Action::Devices) {
            actionCommand->add_option("-d,--device", options->device,
                                      "N: device number (see 'ctl devices'); default the first");
        }
        return actionCommand;
    };
    addAction("devices", "List the attached devices: number and name", Action::Devices);
    addAction("get", "Print a property's value as JSON", Action::Get)
        ->add_option("KEY", options->key, "Property, e.g. Pipeline.Algs.EventStats")
        ->required();
    CommandLine::addParsed(
        *addAction("set", "Write a property", Action::Set), "KEY=VALUE", "TEXT:KEY=JSON",
        [&assignment = options->assignment](const std::string& text) { assignment = StateArguments::split(text); },
        "VALUE is JSON")
        ->required();
    CLI::App* events = addAction("events", "Print gestures as they happen, until interrupted (or the daemon stops)",
                                 Action::Events);
    events->add_flag("--jsonl", options->jsonLines, "One JSON object per line");
    events->add_flag("--follow", options->follow, "Go on when the daemon stops, and wait for it to come back");
    addAction("save-recording", "Write a device's recording to a file", Action::SaveRecording)
        ->add_option("OUT", options->output, "File to write (opened here, with your rights)")
        ->required();
    command->callback([options, &status, &out, &err] { status = run(*options, out, err); });
}

}  // namespace VeltoTool
