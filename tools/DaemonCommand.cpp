#include "DaemonCommand.h"

#include "host/Daemon.h"
#include "host/JournalLogSink.h"
#include "host/PluginLocator.h"
#include "host/StopSignals.h"
#include "host/UdevDeviceWatcher.h"
#include "platform/Log.h"
#include "platform/RunLoop.h"

#include <memory>
#include <string_view>

namespace VeltoTool {

using namespace VeltoHost;

namespace {

constexpr std::string_view kSimulatedPrefix = "sim:";

// The file's level wins over the environment's. "default" is not the
// default here: at that level the plug-in notes every frame it receives.
void setLogging(const DaemonConfig& config)
{
    if (config.logThreshold) Log::setThreshold(*config.logThreshold);
    if (JournalLogSink::stderrIsJournal()) Log::setSink(std::make_shared<JournalLogSink>());
}

}  // namespace

int DaemonCommand::run(const Options& options)
{
    const StopSignals stopSignals;

    Daemon::Options daemon;
    daemon.bus = BusConnection::Address::parse(options.bus);
    daemon.speed = options.speed;
    daemon.keys = options.keys;
    if (!options.config.empty()) daemon.config = DaemonConfig::load(options.config);
    for (const std::string& device : options.devices) {
        if (device.starts_with(kSimulatedPrefix)) {
            daemon.simulatedFiles.push_back(device.substr(kSimulatedPrefix.size()));
        } else {
            daemon.devicePaths.push_back(device);
        }
    }
    daemon.pluginPath = PluginLocator::chosenOrFound(options.plugin);
    setLogging(daemon.config);

    std::unique_ptr<DeviceWatcher> watcher;
    if (options.udev) watcher = std::make_unique<UdevDeviceWatcher>(RunLoop::current(), Daemon::kRunLoopMode);
    Daemon service(std::move(daemon), std::move(watcher));
    service.run(&StopSignals::requested);
    return 0;
}

}  // namespace VeltoTool
