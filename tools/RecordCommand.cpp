#include "RecordCommand.h"

#include "CommandLine.h"
#include "FiniteNumberCheck.h"
#include "OutputFile.h"
#include "StopSignals.h"
#include "ToolError.h"
#include "daemon/DaemonConfig.h"
#include "daemon/UdevDeviceWatcher.h"
#include "platform/devices/HidrawDescription.h"
#include "platform/devices/HidrawNode.h"
#include "platform/runtime/MonotonicClock.h"
#include "platform/runtime/RunLoop.h"
#include "recording/ContainerWriter.h"
#include "recording/HidRecorderWriter.h"
#include "records/TickConversion.h"

#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <memory>
#include <system_error>
#include <vector>

namespace VeltoTool {

using VeltoTouch::PipelineRecording;

namespace {

// The largest report hidraw hands out in one read.
constexpr std::size_t kLargestReport = 16384;
// How long a wait for the next report lasts at most, so that a stop asked for
// by a flag rather than a signal is seen in time.
constexpr int kLongestWaitMs = 100;

// The nanoseconds the plug-in would stamp a report arriving now with.
std::uint64_t nowNs() { return VeltoTouch::Util::nanosecondsFromMachTime(VeltoHost::MonotonicClock::now()); }

int hidrawNumber(const std::string& path)
{
    const std::size_t digits = path.find_last_not_of("0123456789") + 1;
    return digits < path.size() ? std::stoi(path.substr(digits)) : -1;
}

std::string idsOf(std::uint16_t vendor, std::uint16_t product)
{
    char text[16];
    std::snprintf(text, sizeof text, "%04x:%04x", vendor, product);
    return text;
}

class Descriptor {
public:
    explicit Descriptor(int fd) : _fd(fd) {}
    ~Descriptor() { ::close(_fd); }
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;
    int get() const { return _fd; }

private:
    int _fd;
};

// Writes each report in the chosen format as it arrives.
class ReportSink {
public:
    ReportSink(std::ostream& out, ConvertCommand::Format format, const std::string& device, int fd)
    {
        if (format == ConvertCommand::Format::Container) {
            _container.emplace(out);
            _frame.type = PipelineRecording::Frame::Type::InputReport;
            return;
        }
        try {
            _hid.emplace(out, VeltoHost::HidrawDescription::of(fd));
        } catch (const std::system_error& error) {
            throw ToolError(device + ": " + error.what());
        }
    }

    void write(std::uint64_t timestampNs, const std::uint8_t* data, std::size_t length)
    {
        if (_hid) return _hid->writeReport(timestampNs, data, length);
        _frame.timestampNs = timestampNs;
        _frame.report.assign(data, data + length);
        _container->write(_frame);
    }

    void finish()
    {
        if (_container) _container->finish();
    }

private:
    std::optional<VeltoTouch::ContainerWriter> _container;
    std::optional<VeltoTouch::HidRecorderWriter> _hid;
    PipelineRecording::Frame _frame;  // reused, so that a report costs no allocation
};

ConvertCommand::Format formatFor(const RecordCommand::Options& options)
{
    if (options.format) return *options.format;
    return options.output.ends_with(".hid") ? ConvertCommand::Format::HidRecorder : ConvertCommand::Format::Container;
}

std::string seconds(std::uint64_t nanoseconds)
{
    char text[32];
    std::snprintf(text, sizeof text, "%.1f s", static_cast<double>(nanoseconds) / 1e9);
    return text;
}

}  // namespace

std::string RecordCommand::findSurface(const std::string& config)
{
    VeltoHost::DaemonConfig settings;
    try {
        settings = VeltoHost::DaemonConfig::load(config);
    } catch (const VeltoHost::DaemonConfig::Error& error) {
        throw ToolError(std::string("no DEVICE given, and the configuration that would find one cannot be read: ") +
                        error.what());
    }
    if (settings.matches.empty()) {
        throw ToolError("no DEVICE given, and " + config +
                        " has no [[match]] ids to find a surface by; name a hidraw node (/dev/hidrawN)");
    }
    std::vector<VeltoHost::DeviceWatcher::Device> present;
    VeltoHost::UdevDeviceWatcher watcher(VeltoHost::RunLoop::current(), "record");
    try {
        // The devices present are reported before start() returns.
        watcher.start([&](const VeltoHost::DeviceWatcher::Device& device) { present.push_back(device); },
                      [](const std::string&) {});
    } catch (const std::runtime_error& error) {
        throw ToolError(std::string("no DEVICE given, and udev cannot tell which devices are present: ") + error.what());
    }
    watcher.stop();
    std::erase_if(present, [&](const auto& device) { return !settings.takes(device.vendor, device.product); });
    if (present.empty()) {
        std::string ids;
        for (const auto& match : settings.matches) ids += (ids.empty() ? "" : ", ") + idsOf(match.vendor, match.product);
        throw ToolError("no surface found: no hidraw device has the ids " + config + " names (" + ids + ")");
    }
    return std::min_element(present.begin(), present.end(),
                            [](const auto& a, const auto& b) { return hidrawNumber(a.path) < hidrawNumber(b.path); })
        ->path;
}

int RecordCommand::run(const Options& options, std::ostream& err)
{
    // Installed before the output exists: a stop ends the capture and keeps
    // it, rather than removing the unfinished file.
    StopSignals signals;
    return run(options, &StopSignals::requested, err);
}

int RecordCommand::run(const Options& options, const StopCheck& stopRequested, std::ostream& err)
{
    const std::string device = options.device.empty() ? findSurface(options.config) : options.device;
    if (const std::string refusal = VeltoHost::HidrawNode::refusal(device); !refusal.empty()) throw ToolError(refusal);
    // Read-only: the capture sends the device nothing, and a reader needs no more.
    const int fd = ::open(device.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (fd < 0) throw ToolError(device + ": cannot open: " + std::strerror(errno));
    const Descriptor hidraw(fd);
    OutputFile out(options.output, {device});
    ReportSink sink(out.stream(), formatFor(options), device, fd);

    const std::uint64_t startNs = nowNs();
    const bool timed = options.durationSeconds.has_value();
    const std::uint64_t endNs =
        timed ? startNs + static_cast<std::uint64_t>(std::llround(*options.durationSeconds * 1e9)) : 0;
    err << "veltotouch: recording " << device << " to " << options.output
        << (timed ? " for " + seconds(endNs - startNs) : std::string(" until Ctrl-C")) << std::endl;

    std::vector<std::uint8_t> report(kLargestReport);
    std::uint64_t reports = 0;
    bool unplugged = false;
    int readError = 0;
    while (!stopRequested()) {
        int waitMs = kLongestWaitMs;
        if (timed) {
            const std::uint64_t now = nowNs();
            if (now >= endNs) break;
            waitMs = static_cast<int>(std::min<std::uint64_t>(kLongestWaitMs, (endNs - now + 999'999) / 1'000'000));
        }
        pollfd ready{fd, POLLIN, 0};
        const int polled = ::poll(&ready, 1, waitMs);
        if (polled < 0 && errno != EINTR) throw ToolError(device + ": " + std::strerror(errno));
        if (polled <= 0) continue;
        // One read is one report. One read a wake-up: with more waiting, the
        // next poll returns at once, and a read that would find nothing is
        // never made.
        const ssize_t count = ::read(fd, report.data(), report.size());
        if (count > 0) {
            sink.write(nowNs(), report.data(), static_cast<std::size_t>(count));
            ++reports;
        } else if (count == 0 || errno == ENODEV || errno == EIO) {
            // The device is gone.
            unplugged = true;
        } else if (errno != EAGAIN && errno != EINTR) {
            // Any other failure ends the capture too, keeping what it holds.
            readError = errno;
        }
        out.checkWritten();
        if (unplugged || readError) break;
    }
    sink.finish();
    out.commit();
    const std::uint64_t tookNs = nowNs() - startNs;
    if (unplugged) err << "veltotouch: " << device << " was removed; the recording ends there" << std::endl;
    if (readError) {
        err << "veltotouch: " << device << ": " << std::strerror(readError) << "; the recording ends there"
            << std::endl;
    }
    err << "veltotouch: recorded " << reports << (reports == 1 ? " input report" : " input reports") << " in "
        << seconds(tookNs) << " to " << options.output << std::endl;
    return readError ? 1 : 0;
}

void RecordCommand::addTo(CLI::App& app, int& status, std::ostream&, std::ostream& err)
{
    auto options = std::make_shared<Options>();
    options->config = VELTO_DEFAULT_CONFIG;
    CLI::App* command =
        app.add_subcommand("record", "Capture a surface's input reports to a recording as they arrive");
    command->add_option("DEVICE", options->device,
                        "hidraw node (default: the first surface the configuration's [[match]] ids name)");
    command->add_option("-o,--output", options->output, "Recording to write")->required();
    command
        ->add_option("--duration", options->durationSeconds,
                     "Stop after this many seconds (default: at Ctrl-C, SIGTERM or an unplug)")
        ->check(FiniteNumberCheck(0.001));
    ConvertCommand::addFormat(*command, options->format,
                              "container or hid (default: hid for an output ending in .hid, else container)");
    command->add_option("--config", options->config, "TOML settings whose [[match]] ids find the surface")
        ->capture_default_str();
    command->callback([options, &status, &err] { status = run(*options, err); });
}

}  // namespace VeltoTool
