#include "platform/HostDeviceRegistry.h"

#include <utility>

namespace VeltoHost {

HostDeviceRegistry& HostDeviceRegistry::shared()
{
    static HostDeviceRegistry registry;
    return registry;
}

std::uint32_t HostDeviceRegistry::add(HostDevice::Ref device)
{
    return addFactory([device = std::move(device)] { return device; });
}

std::uint32_t HostDeviceRegistry::addFactory(Factory factory)
{
    std::lock_guard<std::mutex> guard(_lock);
    // Skip handles chosen by set() and the null handle after a wrap.
    while (_nextService == 0 || _entries.count(_nextService) != 0) ++_nextService;
    std::uint32_t service = _nextService++;
    _entries[service] = std::move(factory);
    return service;
}

void HostDeviceRegistry::set(std::uint32_t service, HostDevice::Ref device)
{
    setFactory(service, [device = std::move(device)] { return device; });
}

void HostDeviceRegistry::setFactory(std::uint32_t service, Factory factory)
{
    Factory previous;
    std::lock_guard<std::mutex> guard(_lock);
    Factory& entry = _entries[service];
    previous = std::exchange(entry, std::move(factory));
}

void HostDeviceRegistry::remove(std::uint32_t service)
{
    Factory removed;  // released after the lock, it may hold the last device reference
    std::lock_guard<std::mutex> guard(_lock);
    auto it = _entries.find(service);
    if (it == _entries.end()) return;
    removed = std::move(it->second);
    _entries.erase(it);
}

HostDevice::Ref HostDeviceRegistry::deviceForService(std::uint32_t service) const
{
    Factory factory;
    {
        std::lock_guard<std::mutex> guard(_lock);
        auto it = _entries.find(service);
        if (it == _entries.end() || !it->second) return nullptr;
        factory = it->second;
    }
    return factory();
}

}  // namespace VeltoHost
