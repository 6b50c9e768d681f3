#include "platform/devices/HostDeviceRegistry.h"

#include <utility>

namespace VeltoHost {

HostDeviceRegistry& HostDeviceRegistry::shared()
{
    static HostDeviceRegistry registry;
    return registry;
}

std::uint32_t HostDeviceRegistry::add(HostDevice::Ref device)
{
    std::lock_guard<std::mutex> guard(_lock);
    // Skip handles chosen by set() and the null handle after a wrap.
    while (_nextService == 0 || _entries.count(_nextService) != 0) ++_nextService;
    std::uint32_t service = _nextService++;
    _entries[service] = std::move(device);
    return service;
}

void HostDeviceRegistry::set(std::uint32_t service, HostDevice::Ref device)
{
    HostDevice::Ref previous;  // released after the lock: it may be the last reference
    std::lock_guard<std::mutex> guard(_lock);
    previous = std::exchange(_entries[service], std::move(device));
}

void HostDeviceRegistry::remove(std::uint32_t service)
{
    HostDevice::Ref removed;  // released after the lock: it may be the last reference
    std::lock_guard<std::mutex> guard(_lock);
    auto it = _entries.find(service);
    if (it == _entries.end()) return;
    removed = std::move(it->second);
    _entries.erase(it);
}

HostDevice::Ref HostDeviceRegistry::deviceForService(std::uint32_t service) const
{
    std::lock_guard<std::mutex> guard(_lock);
    auto it = _entries.find(service);
    return it == _entries.end() ? nullptr : it->second;
}

}  // namespace VeltoHost
