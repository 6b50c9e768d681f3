#include "platform/plugin/VeltoIUnknown.h"

#include "platform/plugin/VeltoHIDService.h"
#include "platform/runtime/SerialQueue.h"

namespace VeltoHost {

namespace {

// Both tables begin with the reserved word, and an interface pointer is the
// address of the service's pointer to one of them.
VeltoHIDService* serviceFromInterface(VeltoInterfaceRef self) noexcept
{
    void* table = *static_cast<void**>(self);
    return static_cast<VeltoHIDService*>(*static_cast<void**>(table));
}

// Keeps the service alive for one forwarded call, so that a Release from
// another host thread cannot destroy it underneath the operation. The host's
// platform frees temporary objects by reference counting, so no further
// per-call scope is needed.
class ServiceHold {
public:
    explicit ServiceHold(VeltoInterfaceRef self) noexcept : _service(serviceFromInterface(self)) { _service->addRef(); }
    ~ServiceHold() { _service->release(); }
    ServiceHold(const ServiceHold&) = delete;
    ServiceHold& operator=(const ServiceHold&) = delete;

    VeltoHIDService* operator->() const noexcept { return _service; }
    VeltoHIDService& operator*() const noexcept { return *_service; }

private:
    VeltoHIDService* _service;
};

SerialQueue::Ref queueReference(SerialQueue* queue)
{
    // Queues only exist as shared objects; a foreign pointer gives an empty
    // reference rather than an exception.
    return queue ? queue->weak_from_this().lock() : nullptr;
}

}  // namespace

VeltoStatus VeltoIUnknown::QueryInterface(VeltoInterfaceRef self, VeltoUUID iid, VeltoInterfaceRef* out)
{
    ServiceHold service(self);
    VeltoInterfaceRef answer = nullptr;
    if (iid == kVeltoPluginInterfaceID) {
        answer = service->getPluginInterface();
    } else if (iid == kVeltoHIDServiceInterface2ID) {
        answer = service->getServiceInterface();
    } else {
        return kVeltoNoInterface;
    }
    if (out) *out = answer;
    service->addRef();
    return kVeltoSuccess;
}

std::uint32_t VeltoIUnknown::AddRef(VeltoInterfaceRef self) { return serviceFromInterface(self)->addRef(); }

std::uint32_t VeltoIUnknown::Release(VeltoInterfaceRef self) { return serviceFromInterface(self)->release(); }

VeltoStatus VeltoIUnknown::Probe(VeltoInterfaceRef self, const PropertyValue& properties, std::uint32_t service,
                                 std::int32_t* outScore)
{
    ServiceHold hold(self);
    return hold->probeWithService(service, properties, outScore);
}

VeltoStatus VeltoIUnknown::Start(VeltoInterfaceRef self, const PropertyValue& properties, std::uint32_t service)
{
    ServiceHold hold(self);
    return hold->startWithService(service, properties);
}

VeltoStatus VeltoIUnknown::Stop(VeltoInterfaceRef self)
{
    ServiceHold hold(self);
    return hold->stop();
}

bool VeltoIUnknown::open(VeltoInterfaceRef self, std::uint32_t options)
{
    ServiceHold hold(self);
    return hold->openWithOptions(options);
}

void VeltoIUnknown::close(VeltoInterfaceRef self, std::uint32_t options)
{
    ServiceHold hold(self);
    hold->closeWithOptions(options);
}

PropertyValue VeltoIUnknown::copyProperty(VeltoInterfaceRef self, const char* key)
{
    ServiceHold hold(self);
    // Values are shared by reference: returning the reference by value is the
    // caller's own reference.
    return hold->getPropertyForKey(key);
}

bool VeltoIUnknown::setProperty(VeltoInterfaceRef self, const char* key, const PropertyValue& value)
{
    ServiceHold hold(self);
    return hold->setProperty(value, key);
}

void VeltoIUnknown::setEventCallback(VeltoInterfaceRef self, VeltoEventCallback callback, void* target, void* refcon)
{
    ServiceHold hold(self);
    hold->setEventCallback(callback, target, refcon);
}

void VeltoIUnknown::scheduleWithDispatchQueue(VeltoInterfaceRef self, SerialQueue* queue)
{
    ServiceHold hold(self);
    hold->scheduleWithDispatchQueue(queueReference(queue));
}

void VeltoIUnknown::unscheduleFromDispatchQueue(VeltoInterfaceRef self, SerialQueue* queue)
{
    ServiceHold hold(self);
    hold->unscheduleWithDispatchQueue(queueReference(queue));
}

HidEventRef VeltoIUnknown::copyEvent(VeltoInterfaceRef self, std::uint32_t type, HidEvent* matching,
                                     std::uint32_t options)
{
    ServiceHold hold(self);
    return hold->copyEventWithType(type, matching, options);
}

VeltoStatus VeltoIUnknown::setOutputEvent(VeltoInterfaceRef self, HidEvent* event)
{
    ServiceHold hold(self);
    return hold->setOutputEvent(event);
}

}  // namespace VeltoHost
