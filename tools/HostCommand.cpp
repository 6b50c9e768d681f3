#include "HostCommand.h"

#include "EventFormatter.h"
#include "StateArguments.h"
#include "ToolError.h"
#include "ToolFiles.h"
#include "pipeline/Util.h"
#include "platform/HidrawHostDevice.h"
#include "platform/HostEventSystem.h"
#include "platform/MonotonicClock.h"
#include "platform/PropertyDictionary.h"
#include "platform/SimulatedHostDevice.h"
#include "recording/PipelineRecording.h"

#include <csignal>
#include <cstring>
#include <filesystem>
#include <mutex>

namespace VeltoTool {

using VeltoHost::HostEventSystem;
using VeltoHost::MonotonicClock;
using VeltoHost::PropertyValue;
using VeltoHost::SimulatedHostDevice;
using VeltoTouch::PipelineRecording;

namespace {

constexpr const char* kFactoryName = "VeltoTouchHIDServiceFactory";
constexpr const char* kSimulatedPrefix = "sim:";
// Waits are cut into slices this long so that a signal ends them promptly.
constexpr std::uint64_t kWaitSliceMicroseconds = 20'000;
// As-fast-as-possible playback still leaves the device's queue room.
constexpr std::size_t kMaxQueuedReports = 512;

volatile std::sig_atomic_t gStopRequested = 0;

extern "C" void requestStop(int) { gStopRequested = 1; }

// SIGINT and SIGTERM end the run in order instead of killing the process.
class StopSignals {
public:
    StopSignals()
    {
        gStopRequested = 0;
        _previousInt = std::signal(SIGINT, requestStop);
        _previousTerm = std::signal(SIGTERM, requestStop);
    }
    ~StopSignals()
    {
        std::signal(SIGINT, _previousInt);
        std::signal(SIGTERM, _previousTerm);
    }
    static bool requested() { return gStopRequested != 0; }

private:
    void (*_previousInt)(int);
    void (*_previousTerm)(int);
};

void sleepUnlessStopped(std::uint64_t microseconds)
{
    while (microseconds > 0 && !StopSignals::requested()) {
        const std::uint64_t slice = std::min(microseconds, kWaitSliceMicroseconds);
        MonotonicClock::sleepMicroseconds(slice);
        microseconds -= slice;
    }
}

// Plays a recording as the device would have sent it: input reports pushed
// with their recorded spacing divided by `speed` (0: as fast as the plug-in
// takes them), state changes written as "Pipeline" properties at their place.
void playRecordingAsDevice(const PipelineRecording& recording, SimulatedHostDevice& device, HostEventSystem& host,
                           float speed)
{
    std::optional<std::uint64_t> previousReportNs;
    for (const PipelineRecording::Frame& frame : recording.frames()) {
        if (StopSignals::requested()) return;
        if (frame.type == PipelineRecording::Frame::Type::State) {
            host.setProperty("Pipeline." + frame.key, frame.value.hasValue() ? frame.value : PropertyValue::null());
            continue;
        }
        if (speed > 0 && previousReportNs && frame.timestampNs > *previousReportNs) {
            sleepUnlessStopped(static_cast<std::uint64_t>((frame.timestampNs - *previousReportNs) / 1000.0 / speed));
        }
        while (speed <= 0 && device.pendingReportCount() >= kMaxQueuedReports && !StopSignals::requested()) {
            MonotonicClock::sleepMicroseconds(200);
        }
        previousReportNs = frame.timestampNs;
        device.pushInputReport(frame.report);
    }
    device.waitUntilIdle();
}

void printSummary(const PropertyValue& stats, std::ostream& out)
{
    out << "\nGesture counters (Pipeline.Algs.EventStats):\n";
    for (const auto& [section, counters] : stats.asDictionary()) {
        out << "  " << section << ":";
        int shown = 0;
        for (const auto& [name, value] : counters.asDictionary()) {
            if (value.toUInt64() == 0) continue;
            out << (shown++ % 4 == 0 ? "\n    " : "  ") << name << ' ' << value.toUInt64();
        }
        out << (shown ? "\n" : " none\n");
    }
}

}  // namespace

std::string HostCommand::defaultPluginPath()
{
#ifdef VELTO_PLUGIN_FILE_NAME
    std::error_code error;
    const auto self = std::filesystem::read_symlink("/proc/self/exe", error);
    if (!error) return (self.parent_path() / VELTO_PLUGIN_RELATIVE_DIR / VELTO_PLUGIN_FILE_NAME).lexically_normal();
    return VELTO_PLUGIN_FILE_NAME;
#else
    return "libVeltoTouchHIDService.so";
#endif
}

int HostCommand::run(const Options& options, std::ostream& out, std::ostream& err)
{
    std::optional<PipelineRecording> recording;
    std::shared_ptr<SimulatedHostDevice> simulated;
    VeltoHost::HostDevice::Ref device;
    if (options.device.rfind(kSimulatedPrefix, 0) == 0) {
        recording.emplace(std::string_view(ToolFiles::read(options.device.substr(std::strlen(kSimulatedPrefix)))));
        simulated = SimulatedHostDevice::create();
        device = simulated;
    } else {
        device = std::make_shared<VeltoHost::HidrawHostDevice>(options.device);
    }

    std::vector<std::pair<std::string, PropertyValue>> settings;
    for (const auto& [key, text] : options.settings) settings.emplace_back(key, StateArguments::parseValue(key, text));

    StopSignals signals;
    HostEventSystem host;
    EventFormatter formatter(options.jsonLines, MonotonicClock::now());
    std::mutex outputLock;
    host.subscribe([&](const VeltoHost::HidEventRef& event) {
        std::lock_guard guard(outputLock);
        out << formatter.format(*event) << std::endl;
    });
    host.start(options.plugin, kFactoryName, device);

    for (const auto& [key, value] : settings) {
        if (!host.setProperty(key, value)) err << "veltotouch: property " << key << " was not taken\n";
    }

    if (simulated) {
        playRecordingAsDevice(*recording, *simulated, host, options.speed);
    } else {
        err << "veltotouch: reading " << options.device << "; press Ctrl-C to stop\n";
        while (!StopSignals::requested()) sleepUnlessStopped(kWaitSliceMicroseconds);
    }
    host.drain();

    {
        std::lock_guard guard(outputLock);
        for (const std::string& key : options.reads) out << formatter.formatState(key, host.copyProperty(key)) << '\n';
        if (options.summary) printSummary(host.copyProperty("Pipeline.Algs.EventStats"), out);
    }
    if (!options.saveRecording.empty()) {
        ToolFiles::write(options.saveRecording, host.copyProperty("Recording").asString());
    }
    host.stop();
    return 0;
}

}  // namespace VeltoTool
