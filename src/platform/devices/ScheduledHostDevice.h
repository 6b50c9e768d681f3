#pragma once

#include "platform/devices/HostDevice.h"
#include "platform/runtime/RunLoop.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>

namespace VeltoHost {

// What every device backend does the same way: keep where reports go (the
// buffer and callback a plug-in registered) and where they are delivered
// (the run loop, mode and source the device is scheduled with), and hand
// one report to the callback. A backend says how its source is attached and
// reads its reports; this class keeps the rest consistent under one lock.
class ScheduledHostDevice : public HostDevice {
public:
    void registerInputReportWithTimeStampCallback(std::uint8_t* buffer, std::size_t bufferSize,
                                                  HostDeviceInputReportCallback callback, void* context) final;
    void scheduleWithRunLoop(const std::shared_ptr<RunLoop>& runLoop, const std::string& mode) final;
    void unscheduleFromRunLoop(const std::shared_ptr<RunLoop>& runLoop, const std::string& mode) final;

protected:
    // The registration a report is delivered to.
    struct Receiver {
        HostDeviceInputReportCallback callback = nullptr;
        std::uint8_t* buffer = nullptr;
        std::size_t bufferSize = 0;
        void* context = nullptr;
    };

    // With _lock held: adds the backend's source to _runLoop in _mode (both
    // set) and returns it, or 0 when it cannot be attached yet.
    virtual RunLoop::SourceId attachSourceLocked() = 0;
    // With _lock held, after a registration and after scheduling (the
    // simulated device wakes its loop for reports that waited).
    virtual void deliveryMayStartLocked() {}
    // With _lock held, when unscheduling is asked for (whether or not it
    // changes anything): the simulated device counts them.
    virtual void unscheduleRequestedLocked() {}

    // A source taken from the device, to be removed from its loop. Removal
    // waits for a delivery in progress, which takes _lock, so it is done
    // outside _lock.
    struct TakenSource {
        std::shared_ptr<RunLoop> runLoop;
        RunLoop::SourceId source = 0;
        void remove() const;
    };
    // With _lock held: takes the source; `forgetLoop` also ends the scheduling.
    TakenSource takeSourceLocked(bool forgetLoop);
    // Both steps, ending the scheduling. A backend's destructor calls it first: the source's
    // callback reaches the backend.
    void detachSource();
    // Copies the report into the registered buffer (truncated to its size)
    // and calls the callback. Call with _deliveryLock held, not _lock.
    void deliver(const Receiver& receiver, const std::uint8_t* report, std::size_t length, std::uint32_t reportID,
                 std::uint64_t timeStamp);

    // Held across one delivery (copy into the buffer and callback), so that
    // a registration made on another thread never swaps the buffer under a
    // running delivery. Recursive: the callback may register again.
    std::recursive_mutex _deliveryLock;
    mutable std::mutex _lock;
    // Guarded by _lock.
    Receiver _receiver;
    std::shared_ptr<RunLoop> _runLoop;
    std::string _mode;
    RunLoop::SourceId _source = 0;
};

}  // namespace VeltoHost
