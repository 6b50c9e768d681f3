#include "recording/SimulatedDevicePlayer.h"

#include "platform/runtime/MonotonicClock.h"
#include "recording/ContainerReadAhead.h"
#include "records/TickConversion.h"

#include <algorithm>
#include <chrono>
#include <utility>

namespace VeltoHost {

namespace {

// Waits are cut into slices this long so that a stop request ends them promptly.
constexpr std::uint64_t kWaitSliceNs = 20'000'000;
// How long pushing pauses when the device's queue is full at speed 0.
constexpr std::uint64_t kQueueFullPauseMicroseconds = 200;
// No step of the schedule is longer than a year: the deadline stays far from overflow.
constexpr std::uint64_t kLongestScheduleStepNs = 365ull * 24 * 3600 * 1'000'000'000ull;

// Thrown from the frame handler to end a stream once a stop is requested.
struct PlaybackStopped {};

std::uint64_t nowNanoseconds() { return VeltoTouch::Util::nanosecondsFromMachTime(MonotonicClock::now()); }

}  // namespace

std::optional<std::string> SimulatedDevicePlayer::recordingPath(std::string_view deviceName)
{
    if (!deviceName.starts_with(kDevicePrefix)) return std::nullopt;
    return std::string(deviceName.substr(kDevicePrefix.size()));
}

SimulatedDevicePlayer::FrameSource SimulatedDevicePlayer::readAhead(int fd, std::optional<std::uint32_t> hidDevice)
{
    return [fd, hidDevice](const VeltoTouch::ContainerStream::FrameHandler& onFrame, const StopCheck& stopRequested) {
        VeltoTouch::ContainerReadAhead::read(fd, onFrame, stopRequested, hidDevice);
    };
}

SimulatedDevicePlayer::SimulatedDevicePlayer(SimulatedHostDevice::Ref device, StateWriter writeState,
                                             StopCheck shouldStop, Options options, GapCap gapCap)
    : _device(std::move(device)),
      _writeState(std::move(writeState)),
      _shouldStop(std::move(shouldStop)),
      _options(options),
      _gapCap(std::move(gapCap))
{
}

SimulatedDevicePlayer::Ending SimulatedDevicePlayer::playStream(const FrameSource& source)
{
    try {
        source(
            [this](VeltoTouch::PipelineRecording::Frame&& frame) {
                if (!play(frame)) throw PlaybackStopped{};
            },
            _shouldStop);
    } catch (const PlaybackStopped&) {
        return Ending::Stopped;
    } catch (...) {
        // A stop cuts the input short, which the reader may take for a fault.
        if (_shouldStop()) return Ending::Stopped;
        throw;
    }
    return _shouldStop() ? Ending::Stopped : Ending::Finished;
}

bool SimulatedDevicePlayer::play(const VeltoTouch::PipelineRecording::Frame& frame)
{
    using Type = VeltoTouch::PipelineRecording::Frame::Type;
    if (_shouldStop()) return false;
    if (frame.type == Type::State) {
        if (!waitUntilTaken()) return false;
        _writeState(frame.key, frame.value.hasValue() ? frame.value : PropertyValue::null());
        ++_statesWritten;
        return true;
    }
    if (frame.type != Type::InputReport) return true;

    if (_options.speed > 0) {
        pace(frame.timestampNs);
    } else {
        while (_device->pendingReportCount() >= _options.maxQueuedReports) {
            if (_shouldStop()) return false;
            MonotonicClock::sleepMicroseconds(kQueueFullPauseMicroseconds);
        }
    }
    if (_shouldStop()) return false;
    _device->pushInputReport(frame.report);
    ++_reportsPushed;
    return true;
}

bool SimulatedDevicePlayer::waitUntilTaken()
{
    while (!_device->waitUntilIdle(std::chrono::nanoseconds(kWaitSliceNs))) {
        if (_shouldStop()) return false;
    }
    return true;
}

void SimulatedDevicePlayer::pace(std::uint64_t timestampNs)
{
    const std::uint64_t now = nowNanoseconds();
    if (!_previousReportNs) {
        _deadlineNs = now;
    } else if (timestampNs > *_previousReportNs) {
        // Computed in floating point: a gap of 2^64 ns at a speed below 1 must saturate, not wrap.
        const double waitMicroseconds = static_cast<double>(timestampNs - *_previousReportNs) / _options.speed / 1000.0;
        const std::uint64_t wait = _gapCap(GapCap::wholeMicroseconds(waitMicroseconds));
        const std::uint64_t waitNs = std::min<std::uint64_t>(wait, kLongestScheduleStepNs / 1000) * 1000;
        // A schedule that fell behind (a slow consumer) is not made up in a burst.
        _deadlineNs = std::max(_deadlineNs, now - std::min(now, kWaitSliceNs)) + waitNs;
    }
    _previousReportNs = timestampNs;
    sleepUntil(_deadlineNs);
}

bool SimulatedDevicePlayer::sleepUntil(std::uint64_t deadlineNs)
{
    for (std::uint64_t now = nowNanoseconds(); now < deadlineNs; now = nowNanoseconds()) {
        if (_shouldStop()) return false;
        MonotonicClock::sleepMicroseconds(std::min(deadlineNs - now, kWaitSliceNs) / 1000);
    }
    return true;
}

}  // namespace VeltoHost
