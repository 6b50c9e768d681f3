#include "host/SimulatedDevicePlayer.h"

#include "platform/MonotonicClock.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <utility>

namespace VeltoHost {

namespace {

// Waits are cut into slices this long so that a stop request ends them promptly.
constexpr std::uint64_t kWaitSliceNs = 20'000'000;
// How long pushing pauses when the device's queue is full at speed 0.
constexpr std::uint64_t kQueueFullPauseMicroseconds = 200;

std::uint64_t monotonicNanoseconds()
{
    return static_cast<std::uint64_t>(
        std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::steady_clock::now().time_since_epoch())
            .count());
}

}  // namespace

SimulatedDevicePlayer::SimulatedDevicePlayer(SimulatedHostDevice::Ref device, StateWriter writeState,
                                             StopCheck shouldStop, Options options, Notice notice)
    : _device(std::move(device)),
      _writeState(std::move(writeState)),
      _shouldStop(std::move(shouldStop)),
      _options(options),
      _notice(std::move(notice))
{
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
    const std::uint64_t now = monotonicNanoseconds();
    if (!_previousReportNs) {
        _deadlineNs = now;
    } else if (timestampNs > *_previousReportNs) {
        const double waitNs = static_cast<double>(timestampNs - *_previousReportNs) / _options.speed;
        const double capNs = static_cast<double>(_options.maxGapMicroseconds) * 1000.0;
        if (waitNs > capNs && !_gapNoticed) {
            _gapNoticed = true;
            if (_notice) {
                _notice("a gap of " + std::to_string((timestampNs - *_previousReportNs) / 1'000'000) +
                        " ms between reports is played as " + std::to_string(_options.maxGapMicroseconds / 1000) +
                        " ms (--max-gap)");
            }
        }
        // A schedule that fell behind (a slow consumer) is not made up in a burst.
        _deadlineNs = std::max(_deadlineNs, now - std::min(now, kWaitSliceNs)) +
                      static_cast<std::uint64_t>(std::min(waitNs, capNs));
    }
    _previousReportNs = timestampNs;
    sleepUntil(_deadlineNs);
}

bool SimulatedDevicePlayer::sleepUntil(std::uint64_t deadlineNs)
{
    for (std::uint64_t now = monotonicNanoseconds(); now < deadlineNs; now = monotonicNanoseconds()) {
        if (_shouldStop()) return false;
        MonotonicClock::sleepMicroseconds(std::min(deadlineNs - now, kWaitSliceNs) / 1000);
    }
    return true;
}

}  // namespace VeltoHost
