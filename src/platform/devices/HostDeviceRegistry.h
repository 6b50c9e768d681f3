#pragma once

#include "platform/devices/HostDevice.h"

#include <cstdint>
#include <map>
#include <mutex>

namespace VeltoHost {

// The host's table from service handles to devices. The host registers the
// device it matched and hands the handle to the plug-in, whose
// HostDevice::createWithService looks it up here. Both sides share this one
// table because the platform library is loaded once per process.
//
// Thread-safe: every operation takes the table's lock; a device that leaves
// the table is released outside it.
class HostDeviceRegistry {
public:
    static HostDeviceRegistry& shared();

    // Registers under a fresh handle (never 0) and returns it.
    std::uint32_t add(HostDevice::Ref device);
    // Registers under a handle the caller chose, replacing what was there.
    void set(std::uint32_t service, HostDevice::Ref device);
    void remove(std::uint32_t service);

    // The registered device, or null.
    HostDevice::Ref deviceForService(std::uint32_t service) const;

private:
    mutable std::mutex _lock;
    // Guarded by _lock.
    std::map<std::uint32_t, HostDevice::Ref> _entries;
    std::uint32_t _nextService = 1;
};

}  // namespace VeltoHost
