#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace VeltoHost {

// Tells a host which touch devices come and go. The daemon reacts to what a
// watcher reports, not to udev directly, so that hot-plug can be exercised in
// tests with a watcher that reports devices the test makes up.
//
// Callbacks run on the thread that drives the watcher (see the implementation),
// never concurrently.
class DeviceWatcher {
public:
    struct Device {
        std::string path;  // the device node, /dev/hidrawN
        std::uint16_t bus = 0;
        std::uint16_t vendor = 0;
        std::uint16_t product = 0;
        friend bool operator==(const Device&, const Device&) = default;
    };
    using Added = std::function<void(const Device&)>;
    using Removed = std::function<void(const std::string& path)>;

    virtual ~DeviceWatcher() = default;

    // Reports every device present now through `added`, then keeps watching
    // until stop(). A watcher is started once.
    virtual void start(Added added, Removed removed) = 0;
    virtual void stop() = 0;
};

}  // namespace VeltoHost
