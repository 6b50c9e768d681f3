#pragma once

#include "host/GapCap.h"
#include "platform/PropertyValue.h"
#include "platform/SimulatedHostDevice.h"
#include "recording/PipelineRecording.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace VeltoHost {

// Plays a recording into a simulated device as the real device and its host
// would have produced it: input reports pushed into the device with their
// recorded spacing, state frames written as properties at their place.
//
// A state frame takes effect after every report before it has been processed
// by the plug-in and before any report after it, at every speed: before the
// write, the player waits until the device has handed every pushed report to
// its callback (the plug-in processes a report inside that callback). The
// plug-in therefore sees the same sequence as a replay of the recording, and
// its own recording holds the state frames where they were.
//
// Pacing follows a schedule rather than sleeping gap by gap, so that the time
// spent pushing does not add up over a long recording. The wait for one gap
// goes through a GapCap (a recording with a time jump of years must not hang
// the host). Every wait ends early when `shouldStop` turns true.
class SimulatedDevicePlayer {
public:
    using StateWriter = std::function<void(const std::string& key, const PropertyValue& value)>;
    using StopCheck = std::function<bool()>;

    struct Options {
        // Recorded spacing divided by this; 0 pushes as fast as the plug-in takes reports.
        double speed = 1.0;
        // At speed 0, pushing pauses while this many reports wait in the device.
        std::size_t maxQueuedReports = 512;
    };

    SimulatedDevicePlayer(SimulatedHostDevice::Ref device, StateWriter writeState, StopCheck shouldStop,
                          Options options, GapCap gapCap = GapCap());

    // Plays one frame; false when a stop was requested before it was played.
    bool play(const VeltoTouch::PipelineRecording::Frame& frame);
    // Blocks until the device has handed every pushed report to the plug-in;
    // false when a stop was requested first.
    bool waitUntilTaken();

    std::uint64_t reportsPushed() const noexcept { return _reportsPushed; }
    std::uint64_t statesWritten() const noexcept { return _statesWritten; }

private:
    void pace(std::uint64_t timestampNs);
    bool sleepUntil(std::uint64_t deadlineNs);

    SimulatedHostDevice::Ref _device;
    StateWriter _writeState;
    StopCheck _shouldStop;
    Options _options;
    GapCap _gapCap;

    std::optional<std::uint64_t> _previousReportNs;
    std::uint64_t _deadlineNs = 0;  // monotonic time at which the next report is due
    std::uint64_t _reportsPushed = 0;
    std::uint64_t _statesWritten = 0;
};

}  // namespace VeltoHost
