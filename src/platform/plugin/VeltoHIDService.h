#pragma once

#include "platform/plugin/PluginInterface.h"
#include "platform/runtime/SerialQueue.h"
#include "platform/values/PropertyValue.h"

#include <atomic>
#include <cstdint>

namespace VeltoHost {

// Base of a HID service plug-in object: owns the two function tables through
// which the host talks to it and the object's reference count. The host holds
// the address of `_pluginInterface` or `_serviceInterface` as its interface
// pointer; the tables' reserved word leads back to this object.
//
// Every operation has a refusing default, so a service overrides only what it
// supports. Objects live on the heap and are destroyed by the last release.
class VeltoHIDService {
public:
    VeltoHIDService();
    virtual ~VeltoHIDService();

    VeltoHIDService(const VeltoHIDService&) = delete;
    VeltoHIDService& operator=(const VeltoHIDService&) = delete;

    VeltoInterfaceRef getPluginInterface() noexcept;
    VeltoInterfaceRef getServiceInterface() noexcept;

    // Reference counting shared by both interfaces. A new object holds one
    // reference, its creator's. Both return the count after the change;
    // release destroys the object when the count reaches 0.
    std::uint32_t addRef() noexcept;
    std::uint32_t release() noexcept;

    virtual VeltoStatus probeWithService(std::uint32_t service, const PropertyValue& properties,
                                         std::int32_t* outScore);
    virtual VeltoStatus startWithService(std::uint32_t service, const PropertyValue& properties);
    virtual VeltoStatus stop();
    virtual bool openWithOptions(std::uint32_t options);
    virtual void closeWithOptions(std::uint32_t options);
    // An empty reference stands for null. `key` may be null.
    virtual PropertyValue getPropertyForKey(const char* key);
    virtual bool setProperty(const PropertyValue& value, const char* key);
    virtual void setEventCallback(VeltoEventCallback callback, void* target, void* refcon);
    virtual void scheduleWithDispatchQueue(const SerialQueue::Ref& queue);
    virtual void unscheduleWithDispatchQueue(const SerialQueue::Ref& queue);
    virtual HidEventRef copyEventWithType(std::uint32_t type, HidEvent* matching, std::uint32_t options);
    virtual VeltoStatus setOutputEvent(HidEvent* event);

private:
    // The host dereferences these members' addresses, so they stay plain
    // pointers to tables that never move.
    PluginInterfaceTable* _pluginInterface;
    ServiceInterfaceTable* _serviceInterface;
    std::atomic<std::uint32_t> _refCount{1};
};

}  // namespace VeltoHost
