#include "platform/devices/SimulatedHostDevice.h"

#include "platform/runtime/MonotonicClock.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

namespace VeltoHost {

SimulatedHostDevice::SimulatedHostDevice() : _eventFd(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)) {}

SimulatedHostDevice::~SimulatedHostDevice()
{
    detachSource();
    if (_eventFd >= 0) ::close(_eventFd);
}

bool SimulatedHostDevice::open(std::uint32_t options)
{
    std::lock_guard<std::mutex> guard(_lock);
    _counters.lastOpenOptions = options;
    if (_failOpen) return false;
    _open = true;
    if (deliverableLocked() && !_pending.empty()) signalLocked();
    return true;
}

void SimulatedHostDevice::close(std::uint32_t)
{
    std::lock_guard<std::mutex> guard(_lock);
    _open = false;
}

std::int32_t SimulatedHostDevice::getReport(HidReportType type, std::uint32_t reportID, std::uint8_t* buffer,
                                            std::size_t& length)
{
    std::lock_guard<std::mutex> guard(_lock);
    if (!_open) return kHostDeviceNotOpen;
    if (buffer == nullptr || length == 0) return kHostDeviceBadArgument;
    if (_getReportFailure) return *_getReportFailure;
    auto it = _reports.find({type, reportID});
    if (it == _reports.end()) return kHostDeviceError;
    const std::vector<std::uint8_t>& bytes = it->second;
    if (bytes.size() > length) return kHostDeviceBadArgument;
    std::copy(bytes.begin(), bytes.end(), buffer);
    length = bytes.size();
    return kHostDeviceSuccess;
}

PropertyValue SimulatedHostDevice::getProperty(const std::string& key)
{
    std::lock_guard<std::mutex> guard(_lock);
    auto it = _properties.find(key);
    return it == _properties.end() ? PropertyValue() : it->second;
}

bool SimulatedHostDevice::setProperty(const std::string& key, const PropertyValue& value)
{
    std::lock_guard<std::mutex> guard(_lock);
    if (_refusePropertyWrites) return false;
    _properties[key] = value;
    return true;
}

RunLoop::SourceId SimulatedHostDevice::attachSourceLocked()
{
    return _runLoop->addFileDescriptorSource(_eventFd, _mode, [this] { deliverOne(); });
}

void SimulatedHostDevice::deliveryMayStartLocked()
{
    if (deliverableLocked() && !_pending.empty()) signalLocked();
}

void SimulatedHostDevice::unscheduleRequestedLocked() { ++_counters.unschedules; }

void SimulatedHostDevice::pushInputReport(std::vector<std::uint8_t> report)
{
    std::uint64_t timeStamp = MonotonicClock::now();
    {
        std::lock_guard<std::mutex> guard(_lock);
        if (_pending.size() >= kMaxPendingReports) _pending.pop_front();
        _pending.push_back({std::move(report), timeStamp});
        if (deliverableLocked()) signalLocked();
        _progress.notify_all();
    }
}

void SimulatedHostDevice::setReport(HidReportType type, std::uint32_t reportID, std::vector<std::uint8_t> bytes)
{
    std::lock_guard<std::mutex> guard(_lock);
    _reports[{type, reportID}] = std::move(bytes);
}

void SimulatedHostDevice::failGetReport(std::int32_t status)
{
    std::lock_guard<std::mutex> guard(_lock);
    if (status == kHostDeviceSuccess) {
        _getReportFailure.reset();
    } else {
        _getReportFailure = status;
    }
}

void SimulatedHostDevice::failOpen(bool fail)
{
    std::lock_guard<std::mutex> guard(_lock);
    _failOpen = fail;
}

void SimulatedHostDevice::refusePropertyWrites(bool refuse)
{
    std::lock_guard<std::mutex> guard(_lock);
    _refusePropertyWrites = refuse;
}

SimulatedHostDevice::Counters SimulatedHostDevice::counters() const
{
    std::lock_guard<std::mutex> guard(_lock);
    return _counters;
}

bool SimulatedHostDevice::isOpen() const
{
    std::lock_guard<std::mutex> guard(_lock);
    return _open;
}

bool SimulatedHostDevice::isScheduled() const
{
    std::lock_guard<std::mutex> guard(_lock);
    return _source != 0;
}

bool SimulatedHostDevice::hasCallback() const
{
    std::lock_guard<std::mutex> guard(_lock);
    return _receiver.callback != nullptr;
}

std::size_t SimulatedHostDevice::pendingReportCount() const
{
    std::lock_guard<std::mutex> guard(_lock);
    return _pending.size();
}

bool SimulatedHostDevice::waitUntilIdle(std::chrono::nanoseconds timeout)
{
    std::unique_lock<std::mutex> guard(_lock);
    return _progress.wait_for(guard, timeout, [this] { return _pending.empty() && !_delivering; });
}

bool SimulatedHostDevice::deliverableLocked() const
{
    return _open && _source != 0 && _receiver.callback != nullptr;
}

void SimulatedHostDevice::signalLocked()
{
    // Extra wake-ups are harmless: a delivery with nothing to deliver does nothing.
    std::uint64_t one = 1;
    while (write(_eventFd, &one, sizeof one) < 0 && errno == EINTR) {
    }
}

// Runs on the scheduled loop's thread: one report per readable event, so
// that a loop run that returns after one handled source sees one report.
void SimulatedHostDevice::deliverOne()
{
    std::uint64_t count = 0;
    while (read(_eventFd, &count, sizeof count) < 0 && errno == EINTR) {
    }

    std::lock_guard<std::recursive_mutex> delivery(_deliveryLock);
    PendingReport report;
    Receiver receiver;
    {
        std::lock_guard<std::mutex> guard(_lock);
        if (!deliverableLocked() || _pending.empty()) return;
        report = std::move(_pending.front());
        _pending.pop_front();
        _delivering = true;
        receiver = _receiver;
    }
    const std::uint32_t reportID = report.bytes.empty() ? 0 : report.bytes[0];
    deliver(receiver, report.bytes.data(), report.bytes.size(), reportID, report.timeStamp);
    {
        std::lock_guard<std::mutex> guard(_lock);
        _delivering = false;
        if (deliverableLocked() && !_pending.empty()) signalLocked();
        _progress.notify_all();
    }
}

}  // namespace VeltoHost
