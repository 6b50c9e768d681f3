#pragma once

#include "platform/values/PropertyValue.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

namespace VeltoHost {

class RunLoop;

enum class HidReportType : std::uint32_t { Input = 0, Output = 1, Feature = 2 };

// Status codes of device operations (0 is success).
inline constexpr std::int32_t kHostDeviceSuccess = 0;
inline constexpr std::int32_t kHostDeviceError = static_cast<std::int32_t>(0xE00002BCu);       // general failure
inline constexpr std::int32_t kHostDeviceNotOpen = static_cast<std::int32_t>(0xE00002CDu);     // device not open
inline constexpr std::int32_t kHostDeviceNoDevice = static_cast<std::int32_t>(0xE00002C0u);    // device is gone
inline constexpr std::int32_t kHostDeviceBadArgument = static_cast<std::int32_t>(0xE00002C2u); // buffer too small etc.

// Called on the thread whose run loop the device is scheduled on, once per
// input report, with the report in the registered buffer.
using HostDeviceInputReportCallback = void (*)(void* context, std::int32_t result, void* sender, HidReportType type,
                                               std::uint32_t reportID, std::uint8_t* report, std::size_t reportLength,
                                               std::uint64_t timeStamp);

// Access to one HID device, as a plug-in sees it. Backends: a simulated device
// and a Linux hidraw device. All operations are safe to call from the host's
// thread while reports are delivered on the run loop's thread.
class HostDevice {
public:
    using Ref = std::shared_ptr<HostDevice>;

    virtual ~HostDevice() = default;

    // The device registered for a service handle (see HostDeviceRegistry), or
    // null when there is none.
    static Ref createWithService(std::uint32_t service);

    virtual bool open(std::uint32_t options) = 0;
    virtual void close(std::uint32_t options) = 0;

    // Reads a report into `buffer`; `length` gives its size and, on success,
    // receives the number of bytes written.
    virtual std::int32_t getReport(HidReportType type, std::uint32_t reportID, std::uint8_t* buffer,
                                   std::size_t& length) = 0;

    // The device's own property for `key` (vendor, product, name ...), or an
    // empty reference when it has none.
    virtual PropertyValue getProperty(const std::string& key) = 0;
    virtual bool setProperty(const std::string& key, const PropertyValue& value) = 0;

    // Registers where reports go: the buffer (owned by the caller and kept
    // until the callback is replaced) and the callback with its context. A
    // null callback ends delivery.
    virtual void registerInputReportWithTimeStampCallback(std::uint8_t* buffer, std::size_t bufferSize,
                                                          HostDeviceInputReportCallback callback, void* context) = 0;

    // Report delivery happens while the device is scheduled on a run loop,
    // from that loop's thread, when the loop runs in `mode`.
    virtual void scheduleWithRunLoop(const std::shared_ptr<RunLoop>& runLoop, const std::string& mode) = 0;
    virtual void unscheduleFromRunLoop(const std::shared_ptr<RunLoop>& runLoop, const std::string& mode) = 0;
};

}  // namespace VeltoHost
