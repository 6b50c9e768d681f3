#pragma once

#include "bus/DeviceControl.h"
#include "platform/plugin/HostEventSystem.h"

#include <mutex>
#include <string>

namespace VeltoHost {

// The control of a device whose plug-in runs in a HostEventSystem: reads and
// writes go to the plug-in's properties, a saved recording is the plug-in's
// "Recording" property written into a file the caller opened.
//
// The plug-in takes any write and counts a value of the wrong kind as 0, so a
// remote "ActivationThreshold" = "high" would silently switch the recogniser
// off. Writes are therefore checked against the property's current value
// before they reach the plug-in: the key must be readable (or one of the few
// write-only commands), the value of the same kind (a number may set a flag),
// an integer setting takes only integers it can hold, and the recogniser's
// dictionaries (counters, debug information) and the service's own
// read-only keys (Version, Recording, ...) are refused as read-only rather
// than taken and ignored.
//
// The host must outlive this object, and must not be stopped while a call is
// in progress: detach the control from whoever calls it (the bus service's
// removeDevice waits for that) before stopping the host.
class HostDeviceControl final : public DeviceControl {
public:
    HostDeviceControl(std::string name, HostEventSystem& host);

    std::string name() const override { return _name; }
    Result getProperty(const std::string& key, PropertyValue& value) override;
    Result setProperty(const std::string& key, const PropertyValue& value) override;
    Result saveRecording(int file) override;

    // The host's own write, unchecked, under the same serialisation as the
    // checked calls: for the daemon's other writers (a simulated device's
    // recorded state frames), since the host takes property calls from one
    // thread at a time.
    bool setPropertyUnchecked(const std::string& key, const PropertyValue& value);

private:
    PropertyValue copy(const std::string& key);
    Result checkWrite(const std::string& key, const PropertyValue& current, const PropertyValue& value) const;

    const std::string _name;
    HostEventSystem& _host;
    std::mutex _hostLock;  // one property call at a time reaches the host
};

}  // namespace VeltoHost
