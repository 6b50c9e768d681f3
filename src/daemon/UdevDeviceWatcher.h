#pragma once

#include "daemon/DeviceWatcher.h"
#include "platform/runtime/RunLoop.h"

#include <memory>
#include <optional>
#include <string>
#include <string_view>

struct udev;
struct udev_monitor;

namespace VeltoHost {

// Hidraw devices as the kernel's device manager sees them: the ones present
// at start (enumeration), then additions and removals (a udev monitor whose
// descriptor is a source of a run loop, so the callbacks run on that loop's
// thread when it runs in `mode`).
//
// The ids come from the HID device above the hidraw node: its HID_ID property
// reads "BUS:VENDOR:PRODUCT" in hex (USB is bus 3, Bluetooth 5).
class UdevDeviceWatcher : public DeviceWatcher {
public:
    UdevDeviceWatcher(RunLoop::Ref runLoop, std::string mode);
    ~UdevDeviceWatcher() override;
    UdevDeviceWatcher(const UdevDeviceWatcher&) = delete;
    UdevDeviceWatcher& operator=(const UdevDeviceWatcher&) = delete;

    // Raises std::runtime_error when udev cannot be reached at all.
    void start(Added added, Removed removed) override;
    void stop() override;

    // "0003:0000046D:0000C52B" -> bus 3, vendor 0x046D, product 0xC52B; empty
    // for anything else (ids wider than 16 bits included).
    static std::optional<Device> identityFromHidId(std::string_view hidId);

private:
    void onMonitorReadable();

    RunLoop::Ref _runLoop;
    std::string _mode;
    udev* _udev = nullptr;
    udev_monitor* _monitor = nullptr;
    RunLoop::SourceId _source = 0;
    Added _added;
    Removed _removed;
};

}  // namespace VeltoHost
