#include "EmulateCommand.h"

#include "CommandLine.h"
#include "FiniteNumberCheck.h"
#include "StopSignals.h"
#include "ToolError.h"
#include "ToolFiles.h"
#include "VirtualSurface.h"
#include "platform/devices/UhidDevice.h"
#include "recording/GapCap.h"
#include "recording/PipelineRecording.h"
#include "records/FeatureReport.h"
#include "records/LittleEndian.h"
#include "service/VeltoTouchHIDService.h"

#include <linux/input.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <cstdio>
#include <memory>
#include <optional>
#include <vector>

namespace VeltoTool {

using VeltoHost::GapCap;
using VeltoHost::UhidDevice;
using VeltoTouch::PipelineRecording;

namespace {

using Clock = std::chrono::steady_clock;
using Service = VeltoTouch::VeltoTouchHIDService;
using HoldDuration = VeltoTouch::FeatureReport::FactoryResetHoldDuration;

// When a schedule has fallen behind (a slow kernel), at most this much of the
// delay is made up at once: reports are not sent in a burst.
constexpr auto kCatchUpLimit = std::chrono::milliseconds(20);

// How long a reader must keep the device open before reports go out. A
// program that only looks at a new device opens it for a moment and closes
// it again (the daemon does, for its ids, before it takes it): the reports
// sent meanwhile would be lost with that look, and whoever then takes the
// device for good would miss the start of the recording.
constexpr auto kSteadyOpen = std::chrono::milliseconds(250);

// The hold duration as the plug-in parses it; each debug report is its ID
// over its whole length, recognisable in the plug-in's hex text (a shift or
// a cut shows); any other ID is refused.
std::optional<std::vector<std::uint8_t>> surfaceFeatureReport(std::uint8_t reportID, std::uint32_t holdDurationMs)
{
    if (reportID == HoldDuration::kReportID) {
        std::vector<std::uint8_t> report(HoldDuration::kLength);
        report[0] = reportID;
        VeltoTouch::LittleEndian::putU32(&report[1], holdDurationMs);
        return report;
    }
    const auto& debugIDs = Service::kFirmwareDebugReportIDs;
    if (std::find(debugIDs.begin(), debugIDs.end(), reportID) != debugIDs.end()) {
        return std::vector<std::uint8_t>(Service::kFirmwareDebugReportBufferSize, reportID);
    }
    return std::nullopt;
}

std::string hex4(std::uint16_t number)
{
    char text[8];
    std::snprintf(text, sizeof text, "%04x", number);
    return text;
}

// Thrown from the recording's frame handler to end the playback.
struct PlaybackStopped {};

// Where the playback stands, across the passes of a loop.
struct Playback {
    const EmulateCommand::Options& options;
    UhidDevice& device;
    const EmulateCommand::StopCheck& stopRequested;
    std::ostream& err;
    GapCap gapCap;
    std::optional<std::uint64_t> previousReportNs;
    Clock::time_point deadline;
};

void failIfBroken(const UhidDevice& device)
{
    if (!device.error().empty()) throw ToolError(device.error());
}

// Serves until a reader has had the device open for kSteadyOpen without a
// break.
void waitForSteadyReader(Playback& playback)
{
    UhidDevice& device = playback.device;
    for (;;) {
        if (!device.waitUntilOpened(playback.stopRequested)) {
            failIfBroken(device);
            throw PlaybackStopped{};
        }
        const std::uint64_t openings = device.openings();
        if (!device.serveUntil(Clock::now() + kSteadyOpen, playback.stopRequested)) failIfBroken(device);
        if (playback.stopRequested()) throw PlaybackStopped{};
        if (device.isOpened() && device.openings() == openings) return;
    }
}

// Made at the first input report, so that a recording that fails at its
// start never makes a device appear and vanish; played once a reader keeps
// it open, so that no report is lost while a daemon notices the new device.
void createAndWaitForReader(Playback& playback)
{
    const EmulateCommand::Options& options = playback.options;
    const UhidDevice::Identity identity{VirtualSurface::kName, BUS_USB, options.vendor, options.product, 0, 0,
                                        VirtualSurface::reportDescriptor()};
    if (!playback.device.create(identity)) failIfBroken(playback.device);
    playback.err << "veltotouch: " << VirtualSurface::kName << " " << hex4(options.vendor) << ":" << hex4(options.product)
                 << " made; playing " << options.file << " once a reader keeps it open (Ctrl-C to stop)" << std::endl;
    waitForSteadyReader(playback);
}

// Waits for the report's place in the schedule, answering requests meanwhile.
void waitForTurn(Playback& playback, std::uint64_t timestampNs)
{
    UhidDevice& device = playback.device;
    if (playback.options.speed == 0) {
        if (!device.servePending()) failIfBroken(device);
        return;
    }
    const Clock::time_point now = Clock::now();
    if (!playback.previousReportNs) {
        playback.deadline = now;
    } else if (timestampNs > *playback.previousReportNs) {
        // In floating point: a gap of 2^64 ns at a speed below 1 saturates rather than wraps.
        const double microseconds =
            static_cast<double>(timestampNs - *playback.previousReportNs) / playback.options.speed / 1000.0;
        const auto wait = std::chrono::microseconds(playback.gapCap(GapCap::wholeMicroseconds(microseconds)));
        playback.deadline = std::max(playback.deadline, now - kCatchUpLimit) + wait;
    }
    playback.previousReportNs = timestampNs;
    if (!device.serveUntil(playback.deadline, playback.stopRequested)) failIfBroken(device);
}

// One pass over the recording; returns the number of input reports played.
std::uint64_t playPass(Playback& playback, ToolFiles::File file)
{
    std::uint64_t played = 0;
    playback.previousReportNs.reset();
    const auto stopped = !ToolFiles::streamRecording(
        file.get(), playback.options.file,
        [&](PipelineRecording::Frame&& frame) {
            // State frames are settings of the plug-in's pipeline, not something the device sends.
            if (frame.type != PipelineRecording::Frame::Type::InputReport) return;
            if (!playback.device.isCreated()) createAndWaitForReader(playback);
            waitForTurn(playback, frame.timestampNs);
            if (playback.stopRequested()) throw PlaybackStopped{};
            // With no reader the report would be lost: the playback waits for one.
            if (!playback.device.isOpened()) waitForSteadyReader(playback);
            if (!playback.device.sendInputReport(frame.report.data(), frame.report.size())) {
                failIfBroken(playback.device);
            }
            ++played;
        },
        playback.stopRequested, playback.options.hidDevice);
    if (stopped) throw PlaybackStopped{};
    if (played == 0) throw ToolError(playback.options.file + ": no input reports to play");
    return played;
}

int emulate(const EmulateCommand::Options& options, ToolFiles::File first, UhidDevice& device,
            const EmulateCommand::StopCheck& stopRequested, std::ostream& err)
{
    Playback playback{options, device, stopRequested, err,
                      GapCap(options.maxGapSeconds,
                             [&err](const std::string& note) { err << "veltotouch: note: " << note << std::endl; }),
                      std::nullopt, Clock::now()};
    try {
        playPass(playback, std::move(first));
        while (options.loop && !stopRequested()) playPass(playback, ToolFiles::openRecording(options.file));
    } catch (const PlaybackStopped&) {
    }
    // A reader waiting for a feature report is answered before the unplug.
    device.servePending();
    device.destroy();
    failIfBroken(device);
    return 0;
}

UhidDevice::FeatureReportSource featureReports(const EmulateCommand::Options& options)
{
    return [hold = options.holdDurationMs](std::uint8_t reportID) { return surfaceFeatureReport(reportID, hold); };
}

}  // namespace

int EmulateCommand::run(const Options& options, std::ostream& err)
{
    // Before any slow work: a stop from here on removes the device in order.
    StopSignals signals;
    ToolFiles::File recording = ToolFiles::openRecording(options.file);
    std::string error;
    const int fd = UhidDevice::openNode(options.uhidPath, error);
    if (fd < 0) throw ToolError(error);
    UhidDevice device(fd, featureReports(options));
    return emulate(options, std::move(recording), device, &StopSignals::requested, err);
}

int EmulateCommand::run(const Options& options, int uhidFd, const StopCheck& stopRequested, std::ostream& err)
{
    UhidDevice device(uhidFd, featureReports(options));
    return emulate(options, ToolFiles::openRecording(options.file), device, stopRequested, err);
}

std::uint32_t EmulateCommand::parseNumber(const std::string& text, std::uint32_t largest)
{
    const bool hex = text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X');
    const char* begin = text.data() + (hex ? 2 : 0);
    const char* end = text.data() + text.size();
    std::uint64_t number = 0;
    const auto [stop, error] = std::from_chars(begin, end, number, hex ? 16 : 10);
    if (text.empty() || error == std::errc::invalid_argument || stop != end) {
        throw ToolError("expected a number (decimal, or hexadecimal after 0x), got \"" + text + "\"");
    }
    if (error == std::errc::result_out_of_range || number > largest) {
        char bound[32];
        std::snprintf(bound, sizeof bound, "%u (0x%x)", largest, largest);
        throw ToolError("must be at most " + std::string(bound) + ", got " + text);
    }
    return static_cast<std::uint32_t>(number);
}

void EmulateCommand::addTo(CLI::App& app, int& status, std::ostream&, std::ostream& err)
{
    auto options = std::make_shared<Options>();
    CLI::App* command =
        app.add_subcommand("emulate", "Make a virtual surface through /dev/uhid and play a recording into it");
    command->add_option("FILE", options->file, "Recording (container, or hid-recorder text)")->required();
    // Ids and durations as the daemon's configuration writes them: 0xHEX or decimal.
    const auto addNumber = [&](const char* name, const char* type, std::uint32_t largest, auto& target,
                               const char* description) {
        CommandLine::addParsed(
            *command, name, type,
            [&target, largest](const std::string& text) {
                target = static_cast<std::remove_reference_t<decltype(target)>>(parseNumber(text, largest));
            },
            description);
    };
    addNumber("--vendor", "ID", 0xFFFF, options->vendor, "USB vendor id, 0xHEX or decimal (default 0x1234)");
    addNumber("--product", "ID", 0xFFFF, options->product, "USB product id (default 0x5678)");
    command
        ->add_option("--speed", options->speed,
                     "Play S times faster than recorded, S at least 0.001 (0: as fast as the kernel takes the reports)")
        ->capture_default_str()
        ->check(CommandLine::speedCheck());
    command
        ->add_option("--max-gap", options->maxGapSeconds, "Wait at most this many seconds for one gap between reports")
        ->check(FiniteNumberCheck(0))
        ->capture_default_str();
    command->add_flag("--loop", options->loop, "Play the recording again and again until interrupted");
    addNumber("--hold-duration", "MS", 0xFFFFFFFF, options->holdDurationMs,
              "Factory-reset hold duration the device reports (default 5000)");
    // Hidden from help: the uhid node elsewhere (the tests name one that is not there).
    command->add_option("--uhid", options->uhidPath, "uhid node")->group("");
    CommandLine::addHidDevice(*command, options->hidDevice);
    command->callback([options, &status, &err] { status = run(*options, err); });
}

}  // namespace VeltoTool
