#include "DaemonCommand.h"

#include "ToolError.h"
#include "host/Daemon.h"
#include "host/JournalLogSink.h"
#include "host/PluginLocator.h"
#include "host/SimulatedDevicePlayer.h"
#include "host/StopSignals.h"
#include "host/UdevDeviceWatcher.h"
#include "platform/Log.h"
#include "platform/RunLoop.h"

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
    daemon.bus = BusConnection::Address::parse(options.bus);
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

}  // namespace VeltoTool
