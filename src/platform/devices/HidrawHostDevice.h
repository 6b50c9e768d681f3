#pragma once

#include "platform/devices/ScheduledHostDevice.h"
#include "platform/log/Log.h"

#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace VeltoHost {

// A Linux hidraw device (/dev/hidrawN). Each read() of the descriptor is one
// input report; with numbered reports its first byte is the report ID.
// Feature reports are read with HIDIOCGFEATURE; the properties "VendorID",
// "ProductID", "Product", "Transport" and "PhysicalDeviceUniqueID" come from
// the raw info, name and physical-path ioctls. Property writes are kept by
// this object and read back in place of the device's own values.
//
// A device that disappears (a read gives 0 bytes, ENODEV or EIO) ends report
// reception with one log line; later operations report kHostDeviceNoDevice.
class HidrawHostDevice : public ScheduledHostDevice {
public:
    // Opened by open() from `path`, read-write when allowed, else read-only.
    explicit HidrawHostDevice(std::string path);
    // Adopts an already open descriptor (closed on destruction). Used for
    // descriptors handed over by a device manager, and by tests with one end
    // of a packet socket pair. `numberedReports` says whether input reports
    // begin with their report ID.
    HidrawHostDevice(int fd, bool numberedReports);
    ~HidrawHostDevice() override;
    HidrawHostDevice(const HidrawHostDevice&) = delete;
    HidrawHostDevice& operator=(const HidrawHostDevice&) = delete;

    bool open(std::uint32_t options) override;
    void close(std::uint32_t options) override;
    std::int32_t getReport(HidReportType type, std::uint32_t reportID, std::uint8_t* buffer,
                           std::size_t& length) override;
    PropertyValue getProperty(const std::string& key) override;
    bool setProperty(const std::string& key, const PropertyValue& value) override;

    bool isGone() const;

    // True when a HID report descriptor declares report IDs.
    static bool descriptorUsesReportIDs(const std::uint8_t* descriptor, std::size_t length);

private:
    // The largest report hidraw hands out in one read.
    static constexpr std::size_t kMaxReportSize = 16384;

    // An open descriptor, closed when the last user lets go, so that a
    // read or ioctl in progress outside the lock never meets a reused number.
    struct Descriptor;
    using DescriptorRef = std::shared_ptr<const Descriptor>;

    void onReadable();
    void endReception(int error);
    RunLoop::SourceId attachSourceLocked() override;
    std::string name() const;
    static PropertyValue queryProperty(int fd, const std::string& key);
    static std::int32_t statusForErrno(int error);

    const std::string _path;  // empty for an adopted descriptor
    const Log _log;

    // Guarded by _lock.
    DescriptorRef _descriptor;
    bool _open = false;
    bool _gone = false;
    bool _numberedReports = true;
    std::map<std::string, PropertyValue> _propertyOverrides;

    // Owned by the scheduled loop's thread.
    std::vector<std::uint8_t> _readBuffer;
};

}  // namespace VeltoHost
