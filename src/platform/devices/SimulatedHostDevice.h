#pragma once

#include "platform/devices/ScheduledHostDevice.h"

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace VeltoHost {

// A device whose reports come from a test or a tool instead of hardware.
//
// Input reports pushed with pushInputReport() (from any thread) are delivered
// on the scheduled run loop's thread through an eventfd source in the
// scheduled mode, one report per handled source, in push order, each copied
// into the registered buffer (truncated to its size) with the clock reading
// taken at the push as its time stamp. Reports pushed while the device is not
// open, not scheduled or has no callback are kept, up to kMaxPendingReports,
// and delivered once all three hold: the host schedules the device from
// another thread than the one pushing, and a test must not lose the reports
// it pushed right after scheduling. Beyond the limit the oldest report is
// dropped, as a device's own buffer would overflow.
//
// Feature reports and properties come from tables the test fills; failures
// can be injected; counters tell the test what the plug-in did.
class SimulatedHostDevice : public ScheduledHostDevice {
public:
    using Ref = std::shared_ptr<SimulatedHostDevice>;

    static constexpr std::size_t kMaxPendingReports = 4096;

    struct Counters {
        std::uint64_t unschedules = 0;
        std::optional<std::uint32_t> lastOpenOptions;
    };

    static Ref create() { return std::make_shared<SimulatedHostDevice>(); }
    SimulatedHostDevice();
    ~SimulatedHostDevice() override;
    SimulatedHostDevice(const SimulatedHostDevice&) = delete;
    SimulatedHostDevice& operator=(const SimulatedHostDevice&) = delete;

    // HostDevice
    bool open(std::uint32_t options) override;
    void close(std::uint32_t options) override;
    std::int32_t getReport(HidReportType type, std::uint32_t reportID, std::uint8_t* buffer,
                           std::size_t& length) override;
    PropertyValue getProperty(const std::string& key) override;
    // Stores into the property table (the same table the test fills) unless
    // writes are refused with refusePropertyWrites().
    bool setProperty(const std::string& key, const PropertyValue& value) override;

    // Input. The report ID given to the callback is the first byte (0 for an
    // empty report).
    void pushInputReport(std::vector<std::uint8_t> report);

    // Feature (and other) reports answered by getReport; the stored bytes are
    // returned as they are, report ID byte included.
    void setReport(HidReportType type, std::uint32_t reportID, std::vector<std::uint8_t> bytes);
    void setFeatureReport(std::uint32_t reportID, std::vector<std::uint8_t> bytes)
    {
        setReport(HidReportType::Feature, reportID, std::move(bytes));
    }

    // Failure injection: getReport of every ID returns `status`
    // (kHostDeviceSuccess clears it); open fails while failOpen is set.
    void failGetReport(std::int32_t status);
    void failOpen(bool fail);
    void refusePropertyWrites(bool refuse);

    Counters counters() const;
    bool isOpen() const;
    bool isScheduled() const;
    bool hasCallback() const;
    std::size_t pendingReportCount() const;

    // Blocks until every report pushed so far was delivered or dropped;
    // false when `timeout` passed first (a test failure, not a timing).
    bool waitUntilIdle(std::chrono::nanoseconds timeout = std::chrono::seconds(10));

private:
    struct PendingReport {
        std::vector<std::uint8_t> bytes;
        std::uint64_t timeStamp;
    };

    bool deliverableLocked() const;
    void signalLocked();
    void deliverOne();

    RunLoop::SourceId attachSourceLocked() override;
    void deliveryMayStartLocked() override;
    void unscheduleRequestedLocked() override;

    const int _eventFd;
    std::condition_variable _progress;
    // Guarded by _lock.
    Counters _counters;
    bool _open = false;
    bool _failOpen = false;
    bool _refusePropertyWrites = false;
    std::optional<std::int32_t> _getReportFailure;
    std::map<std::pair<HidReportType, std::uint32_t>, std::vector<std::uint8_t>> _reports;
    std::map<std::string, PropertyValue> _properties;
    std::deque<PendingReport> _pending;
    bool _delivering = false;  // a report was taken and its callback has not returned yet
};

}  // namespace VeltoHost
