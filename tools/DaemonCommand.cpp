#include "DaemonCommand.h"

#include "CommandLine.h"
#include "PluginLocator.h"
#include "StopSignals.h"
#include "ToolError.h"
#include "daemon/Daemon.h"
#include "daemon/JournalLogSink.h"
#include "daemon/UdevDeviceWatcher.h"
#include "platform/log/Log.h"
#include "platform/runtime/RunLoop.h"
#include "recording/SimulatedDevicePlayer.h"

#include <malloc.h>

#include <memory>
#include <optional>

namespace VeltoTool {

using namespace VeltoHost;

namespace {

constexpr int kLargeBlockBytes = 1 << 20;

// Why a daemon ended with nothing to serve, in the terms of its command line.
std::string nothingToServe(const DaemonCommand::Options& options)
{
    std::string why = "no device to serve: ";
    why += options.devices.empty() ? "none was given with --device"
                                   : "none of the devices given with --device could be attached";
    why += options.udev ? ", and the configuration has no [[match]] to take any other"
                        : ", and with --no-udev no other is taken";
    return why;
}

}  // namespace

int DaemonCommand::run(const Options& options, std::ostream& err)
{
    const StopSignals signals(StopSignals::Hangup::Reload);
    // A large request (a client may send megabytes that are then refused) is
    // given back to the system once freed: with a fixed threshold, the
    // allocator maps every block this large on its own instead of raising the
    // threshold and keeping such blocks in its heap for the life of the service.
    ::mallopt(M_MMAP_THRESHOLD, kLargeBlockBytes);

    Daemon::Options daemon;
    daemon.bus = options.bus;
    daemon.speed = options.speed;
    daemon.hidDevice = options.hidDevice;
    daemon.keys = options.keys;
    daemon.configPath = options.config;
    if (!options.config.empty()) daemon.config = DaemonConfig::load(options.config);
    for (const std::string& device : options.devices) {
        if (std::optional<std::string> file = SimulatedDevicePlayer::recordingPath(device)) {
            daemon.simulatedFiles.push_back(std::move(*file));
        } else {
            daemon.devicePaths.push_back(device);
        }
    }
    daemon.pluginPath = PluginLocator::chosenOrFound(options.plugin);
    if (JournalLogSink::stderrIsJournal()) Log::setSink(std::make_shared<JournalLogSink>());
    const std::string busDescription = daemon.bus.description();

    std::unique_ptr<DeviceWatcher> watcher;
    if (options.udev) watcher = std::make_unique<UdevDeviceWatcher>(RunLoop::current(), Daemon::kRunLoopMode);
    Daemon service(std::move(daemon), std::move(watcher));
    // A failure is an exit status other than 0, so that systemd's
    // Restart=on-failure starts the service again.
    switch (service.run(&StopSignals::requested, &StopSignals::takeReloadRequest)) {
    case Daemon::Ending::Stopped: return 0;
    case Daemon::Ending::BusLost: throw ToolError("the connection to " + busDescription + " was lost");
    case Daemon::Ending::NothingToServe:
        err << "veltotouch: " << nothingToServe(options) << '\n';
        return kNothingToServe;
    }
    return 0;
}

void DaemonCommand::addTo(CLI::App& app, int& status, std::ostream&, std::ostream& err)
{
    auto options = std::make_shared<Options>();
    CLI::App* command = app.add_subcommand("daemon", "Serve touch devices on D-Bus and turn their gestures into keys");
    command->add_option("--config", options->config, "TOML settings: devices to take, key map, log level")
        ->check(CLI::ExistingFile);
    CommandLine::addBus(*command, options->bus);
    command
        ->add_option("--device", options->devices, "sim:FILE (a recording played, then left attached) or /dev/hidrawN")
        ->check(CommandLine::deviceCheck());
    command
        ->add_option("--speed", options->speed, "Simulated devices: play S times faster than recorded (0: at once)")
        ->capture_default_str()
        ->check(CommandLine::speedCheck());
    command->add_flag("!--no-udev", options->udev, "Take no device by itself, only those given with --device");
    command->add_flag("!--no-keys", options->keys, "Make no virtual keyboard");
    command->add_option("--plugin", options->plugin,
                        "Plug-in module to load (default: $VELTOTOUCH_PLUGIN, else the installed or built module)");
    CommandLine::addHidDevice(*command, options->hidDevice);
    command->callback([options, &status, &err] { status = run(*options, err); });
}

}  // namespace VeltoTool
