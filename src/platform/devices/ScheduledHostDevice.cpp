#include "platform/devices/ScheduledHostDevice.h"

#include <algorithm>
#include <cstring>
#include <utility>

namespace VeltoHost {

void ScheduledHostDevice::registerInputReportWithTimeStampCallback(std::uint8_t* buffer, std::size_t bufferSize,
                                                                   HostDeviceInputReportCallback callback,
                                                                   void* context)
{
    std::lock_guard<std::recursive_mutex> delivery(_deliveryLock);
    std::lock_guard<std::mutex> guard(_lock);
    _receiver = {callback, buffer, buffer ? bufferSize : 0, context};
    deliveryMayStartLocked();
}

void ScheduledHostDevice::scheduleWithRunLoop(const std::shared_ptr<RunLoop>& runLoop, const std::string& mode)
{
    if (!runLoop) return;
    detachSource();
    std::lock_guard<std::mutex> guard(_lock);
    _runLoop = runLoop;
    _mode = mode;
    _source = attachSourceLocked();
    deliveryMayStartLocked();
}

void ScheduledHostDevice::unscheduleFromRunLoop(const std::shared_ptr<RunLoop>& runLoop, const std::string& mode)
{
    TakenSource taken;
    {
        std::lock_guard<std::mutex> guard(_lock);
        unscheduleRequestedLocked();
        if (!_runLoop || _runLoop != runLoop || _mode != mode) return;
        taken = takeSourceLocked(true);
    }
    taken.remove();
}

ScheduledHostDevice::TakenSource ScheduledHostDevice::takeSourceLocked(bool forgetLoop)
{
    TakenSource taken{forgetLoop ? std::move(_runLoop) : _runLoop, std::exchange(_source, 0)};
    if (forgetLoop) _mode.clear();
    return taken;
}

void ScheduledHostDevice::TakenSource::remove() const
{
    if (runLoop && source != 0) runLoop->removeSource(source);
}

void ScheduledHostDevice::detachSource()
{
    TakenSource taken;
    {
        std::lock_guard<std::mutex> guard(_lock);
        taken = takeSourceLocked(true);
    }
    taken.remove();
}

void ScheduledHostDevice::deliver(const Receiver& receiver, const std::uint8_t* report, std::size_t length,
                                  std::uint32_t reportID, std::uint64_t timeStamp)
{
    const std::size_t copied = std::min(length, receiver.bufferSize);
    if (copied > 0) std::memcpy(receiver.buffer, report, copied);
    receiver.callback(receiver.context, kHostDeviceSuccess, this, HidReportType::Input, reportID, receiver.buffer,
                      copied, timeStamp);
}

}  // namespace VeltoHost
