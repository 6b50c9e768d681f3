#pragma once

#include "platform/devices/SimulatedHostDevice.h"
#include "platform/values/PropertyValue.h"
#include "recording/ContainerStream.h"
#include "recording/GapCap.h"
#include "recording/PipelineRecording.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

namespace VeltoHost {

// Plays a recording into a simulated device as the real device and its host
// would have produced it: input reports pushed into the device with their
// recorded spacing, state frames written as properties at their place. Every
// host program that plays a "sim:FILE" device (the host command, the daemon)
// plays it through this class, frame by frame as the file is read.
//
// A state frame takes effect after every report before it has been processed
// by the plug-in and before any report after it, at every speed: before the
// write, the player waits until the device has handed every pushed report to
// its callback (the plug-in processes a report inside that callback). The
// plug-in therefore sees the same sequence as a replay of the recording, and
// its own recording holds the state frames where they were.
//
// Pacing follows a schedule on the host's clock (MonotonicClock) rather than
// sleeping gap by gap, so that the time spent pushing does not add up over a
// long recording. The wait for one gap goes through a GapCap (a recording
// with a time jump of years must not hang the host). Every wait ends early
// when `shouldStop` turns true.
class SimulatedDevicePlayer {
public:
    using StateWriter = std::function<void(const std::string& key, const PropertyValue& value)>;
    using StopCheck = std::function<bool()>;

    // A device named "sim:FILE" on a command line is FILE played through this class.
    static constexpr std::string_view kDevicePrefix = "sim:";
    // What a program that plays such devices adds to HidrawNode::refusal.
    static constexpr std::string_view kOrRecording = " or sim:FILE";
    // A state frame's key is the pipeline's own; the plug-in has it under
    // this prefix, which the StateWriter puts before it.
    static constexpr std::string_view kStateDomain = "Pipeline.";
    // At speed 0, pushing pauses while this many reports wait in the device:
    // as fast as possible still leaves the device's queue room.
    static constexpr std::size_t kMaxQueuedReports = 512;

    // FILE of a device name "sim:FILE"; nothing for any other name.
    static std::optional<std::string> recordingPath(std::string_view deviceName);

    struct Options {
        // Recorded spacing divided by this; 0 pushes as fast as the plug-in takes reports.
        double speed = 1.0;
        std::size_t maxQueuedReports = kMaxQueuedReports;
    };

    // Reads a recording as it arrives, handing each frame to `onFrame` in
    // file order, until the input ends, `stopRequested` turns true or
    // `onFrame` throws; a fault of the recording is raised where it is
    // reached. readAhead() is the plain one; a caller may wrap it to word
    // the faults its own way.
    using FrameSource =
        std::function<void(const VeltoTouch::ContainerStream::FrameHandler& onFrame, const StopCheck& stopRequested)>;
    // The recording read from `fd` (left open) by ContainerReadAhead, parsed
    // on a thread of its own ahead of the playing; `hidDevice` names the
    // device to read of a hid-recorder text that holds several.
    static FrameSource readAhead(int fd, std::optional<std::uint32_t> hidDevice = std::nullopt);

    enum class Ending {
        Finished,  // every frame of the recording was played
        Stopped,   // a stop was requested first
    };

    SimulatedDevicePlayer(SimulatedHostDevice::Ref device, StateWriter writeState, StopCheck shouldStop,
                          Options options, GapCap gapCap = GapCap());

    // Plays every frame `source` hands over, as it arrives, so that a
    // recording of any length plays in bounded memory. A fault of the
    // recording reaches the caller after the frames before it were played,
    // unless a stop was requested (then it is Stopped). Does not wait for
    // the device to hand the last reports over (waitUntilTaken does).
    Ending playStream(const FrameSource& source);
    // Plays one frame; false when a stop was requested before it was played.
    bool play(const VeltoTouch::PipelineRecording::Frame& frame);
    // Blocks until the device has handed every pushed report to the plug-in;
    // false when a stop was requested first.
    bool waitUntilTaken();

    std::uint64_t reportsPushed() const noexcept { return _reportsPushed; }
    std::uint64_t statesWritten() const noexcept { return _statesWritten; }
    std::uint64_t framesPlayed() const noexcept { return _reportsPushed + _statesWritten; }

private:
    void pace(std::uint64_t timestampNs);
    bool sleepUntil(std::uint64_t deadlineNs);

    SimulatedHostDevice::Ref _device;
    StateWriter _writeState;
    StopCheck _shouldStop;
    Options _options;
    GapCap _gapCap;

    std::optional<std::uint64_t> _previousReportNs;
    std::uint64_t _deadlineNs = 0;  // the clock's time, in nanoseconds, at which the next report is due
    std::uint64_t _reportsPushed = 0;
    std::uint64_t _statesWritten = 0;
};

}  // namespace VeltoHost
