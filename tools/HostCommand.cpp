#include "HostCommand.h"

#include "CommandLine.h"
#include "EventFormatter.h"
#include "FiniteNumberCheck.h"
#include "OutputFile.h"
#include "PluginLocator.h"
#include "StateArguments.h"
#include "StopSignals.h"
#include "ToolError.h"
#include "ToolFiles.h"
#include "platform/devices/HidrawHostDevice.h"
#include "platform/devices/HidrawNode.h"
#include "platform/devices/SimulatedHostDevice.h"
#include "platform/plugin/HostEventSystem.h"
#include "platform/runtime/MonotonicClock.h"
#include "platform/values/PropertyDictionary.h"
#include "recording/PipelineRecording.h"
#include "recording/SimulatedDevicePlayer.h"
#include "service/VeltoTouchHIDServiceFactory.h"

#include <cerrno>
#include <chrono>
#include <memory>
#include <mutex>
#include <optional>

namespace VeltoTool {

using VeltoHost::HostEventSystem;
using VeltoHost::MonotonicClock;
using VeltoHost::PropertyValue;
using VeltoHost::SimulatedHostDevice;
using VeltoTouch::PipelineRecording;

namespace {

constexpr const char* kCountersKey = "Pipeline.Algs.EventStats";
// Waits are cut into slices this long so that a signal ends them promptly.
constexpr std::uint64_t kWaitSliceMicroseconds = 20'000;
// After a stop, the plug-in gets this long to take the reports it was given.
constexpr auto kFinishTimeout = std::chrono::seconds(5);

void printSummary(const PropertyValue& stats, std::uint64_t discarded, std::ostream& out)
{
    out << "\nGesture counters (" << kCountersKey << "):\n";
    if (stats.isDictionary()) {
        for (const auto& [section, counters] : stats.asDictionary()) {
            out << "  " << section << ":";
            int shown = 0;
            if (counters.isDictionary()) {
                for (const auto& [name, value] : counters.asDictionary()) {
                    if (value.toUInt64() == 0) continue;
                    out << (shown++ % 4 == 0 ? "\n    " : "  ") << name << ' ' << value.toUInt64();
                }
            }
            out << (shown ? "\n" : " none\n");
        }
    }
    if (discarded) out << "  " << discarded << " reports were discarded unprocessed at the stop\n";
}

// Everything the host needs about its device before the plug-in starts.
struct Device {
    VeltoHost::HostDevice::Ref device;
    std::shared_ptr<SimulatedHostDevice> simulated;
    // A simulated device's recording, read as it plays.
    std::string recordingPath;
    ToolFiles::File recording{nullptr, &std::fclose};
};

Device openDevice(const std::string& name)
{
    Device device;
    if (std::optional<std::string> path = VeltoHost::SimulatedDevicePlayer::recordingPath(name)) {
        device.recordingPath = std::move(*path);
        device.recording = ToolFiles::openRecording(device.recordingPath);
        device.simulated = SimulatedHostDevice::create();
        device.device = device.simulated;
        return device;
    }
    const std::string refusal = VeltoHost::HidrawNode::refusal(name, VeltoHost::SimulatedDevicePlayer::kOrRecording);
    if (!refusal.empty()) throw ToolError(refusal);
    device.device = std::make_shared<VeltoHost::HidrawHostDevice>(name);
    return device;
}

}  // namespace

int HostCommand::run(const Options& options, std::ostream& out, std::ostream& err)
{
    // Before any slow work: a stop from here on ends the run in order.
    StopSignals signals;

    const std::string plugin = PluginLocator::chosenOrFound(options.plugin);
    Device device = openDevice(options.device);
    // Opened before the first report: a session is never played only to find
    // at the end that its recording cannot be saved, or that saving it would
    // overwrite the recording played or the plug-in.
    std::optional<OutputFile> savedRecording;
    if (!options.saveRecording.empty()) {
        const std::string played = device.simulated ? device.recordingPath : options.device;
        savedRecording.emplace(options.saveRecording, std::vector<std::string>{played, plugin});
    }

    HostEventSystem host;
    EventFormatter formatter(options.jsonLines, MonotonicClock::now());
    std::mutex outputLock;
    host.subscribe([&](const VeltoHost::HidEventRef& event) {
        std::lock_guard guard(outputLock);
        out << formatter.format(*event) << std::endl;
    });
    host.start(plugin, kVeltoTouchHIDServiceFactoryName, device.device);

    for (const auto& [key, text, value] : options.settings) {
        if (!host.setProperty(key, value)) {
            err << "veltotouch: property " << key << " was not taken\n";
        } else if (auto warning = StateArguments::readBackWarning(key, value, host.copyProperty(key))) {
            err << "veltotouch: warning: " << *warning << '\n';
        }
    }

    std::uint64_t discarded = 0;
    std::string fault;
    if (device.simulated) {
        using VeltoHost::SimulatedDevicePlayer;
        SimulatedDevicePlayer player(
            device.simulated,
            [&](const std::string& key, const PropertyValue& value) {
                host.setProperty(std::string(SimulatedDevicePlayer::kStateDomain) + key, value);
            },
            &StopSignals::requested, {.speed = options.speed},
            VeltoHost::GapCap(options.maxGapSeconds,
                              [&](const std::string& note) { err << "veltotouch: note: " << note << std::endl; }));
        // Played as it is read, so that a recording of any length fits in
        // memory; the faults in the words of the tool's other readers.
        bool stopped = false;
        try {
            stopped = player.playStream([&](const VeltoTouch::ContainerStream::FrameHandler& onFrame,
                                            const SimulatedDevicePlayer::StopCheck& stopRequested) {
                ToolFiles::streamRecording(device.recording.get(), device.recordingPath, onFrame, stopRequested,
                                           options.hidDevice);
            }) == SimulatedDevicePlayer::Ending::Stopped;
        } catch (const ToolError& error) {
            // A fault further into the recording: what came before it is
            // finished and reported as at the end, then the fault.
            fault = error.what();
        }
        const bool played = player.framesPlayed() > 0;
        if (stopped && !played) err << "veltotouch: stopped while loading " << device.recordingPath << std::endl;
        // Whatever the device was given, the plug-in takes before the end is read.
        if (!device.simulated->waitUntilIdle(kFinishTimeout)) discarded = device.simulated->pendingReportCount();
    } else {
        err << "veltotouch: reading " << options.device << "; press Ctrl-C to stop" << std::endl;
        while (!StopSignals::requested()) MonotonicClock::sleepMicroseconds(kWaitSliceMicroseconds);
    }
    // No report reaches the plug-in from here on, and every event it sent has
    // been printed: what follows describes exactly what was processed.
    host.unschedule();
    if (discarded) err << "veltotouch: " << discarded << " reports were discarded unprocessed at the stop\n";

    {
        std::lock_guard guard(outputLock);
        for (const std::string& key : options.reads) out << formatter.formatState(key, host.copyProperty(key)) << '\n';
        if (options.summary) {
            const PropertyValue counters = host.copyProperty(kCountersKey);
            // JSON lines stay JSON: the counters come as one more state line.
            if (options.jsonLines) {
                out << formatter.formatState(kCountersKey, counters) << '\n';
            } else {
                printSummary(counters, discarded, out);
            }
        }
        out.flush();
    }
    if (savedRecording) {
        savedRecording->stream() << host.copyProperty("Recording").asString();
        savedRecording->commit();
    }
    host.stop();
    if (!fault.empty()) {
        err << "veltotouch: " << fault << '\n';
        return 1;
    }
    return 0;
}

void HostCommand::addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err)
{
    auto options = std::make_shared<Options>();
    CLI::App* command = app.add_subcommand("host", "Run the plug-in in the host against a simulated or a real device");
    command->add_option("--device", options->device, "sim:FILE (a recording played as a device) or /dev/hidrawN")
        ->required()
        ->check(CommandLine::deviceCheck());
    command->add_option("--plugin", options->plugin,
                        "Plug-in module to load (default: $VELTOTOUCH_PLUGIN, else the installed or built module)");
    command->add_option("--speed", options->speed, "Simulated device: play S times faster than recorded")
        ->capture_default_str()
        ->check(CommandLine::speedCheck());
    CommandLine::addSettings(*command, options->settings,
                             "Pipeline.KEY=VALUE: property to write before reports flow (VALUE is JSON)");
    command
        ->add_option("--max-gap", options->maxGapSeconds,
                     "Simulated device: wait at most this many seconds for one gap between reports")
        ->check(FiniteNumberCheck(0))
        ->capture_default_str();
    command->add_option("--get", options->reads, "KEY: property to read at the end");
    command->add_option("--save-recording", options->saveRecording,
                        "Write the plug-in's \"Recording\" property here at the end");
    command->add_flag("--jsonl", options->jsonLines, "One JSON object per line");
    command->add_flag("--summary", options->summary, "Print the gesture counters at the end");
    CommandLine::addHidDevice(*command, options->hidDevice);
    command->callback([options, &status, &out, &err] { status = run(*options, out, err); });
}

}  // namespace VeltoTool
