#include "platform/plugin/VeltoHIDService.h"

#include "platform/plugin/VeltoIUnknown.h"

namespace VeltoHost {

VeltoHIDService::VeltoHIDService()
    : _pluginInterface(new PluginInterfaceTable{
          this,
          VeltoIUnknown::QueryInterface,
          VeltoIUnknown::AddRef,
          VeltoIUnknown::Release,
          1,  // version
          0,  // revision
          VeltoIUnknown::Probe,
          VeltoIUnknown::Start,
          VeltoIUnknown::Stop,
      }),
      _serviceInterface(new ServiceInterfaceTable{
          this,
          VeltoIUnknown::QueryInterface,
          VeltoIUnknown::AddRef,
          VeltoIUnknown::Release,
          VeltoIUnknown::open,
          VeltoIUnknown::close,
          VeltoIUnknown::copyProperty,
          VeltoIUnknown::setProperty,
          VeltoIUnknown::setEventCallback,
          VeltoIUnknown::scheduleWithDispatchQueue,
          VeltoIUnknown::unscheduleFromDispatchQueue,
          VeltoIUnknown::copyEvent,
          VeltoIUnknown::setOutputEvent,
      })
{
}

VeltoHIDService::~VeltoHIDService()
{
    delete _serviceInterface;
    delete _pluginInterface;
}

VeltoInterfaceRef VeltoHIDService::getPluginInterface() noexcept { return &_pluginInterface; }

VeltoInterfaceRef VeltoHIDService::getServiceInterface() noexcept { return &_serviceInterface; }

std::uint32_t VeltoHIDService::addRef() noexcept { return _refCount.fetch_add(1, std::memory_order_relaxed) + 1; }

std::uint32_t VeltoHIDService::release() noexcept
{
    // acq_rel: every use of the object by other holders happens before the
    // destruction that the last release performs.
    std::uint32_t count = _refCount.fetch_sub(1, std::memory_order_acq_rel) - 1;
    if (count == 0) delete this;
    return count;
}

VeltoStatus VeltoHIDService::probeWithService(std::uint32_t, const PropertyValue&, std::int32_t*)
{
    return kVeltoUnsupported;
}

VeltoStatus VeltoHIDService::startWithService(std::uint32_t, const PropertyValue&) { return kVeltoUnsupported; }

VeltoStatus VeltoHIDService::stop() { return kVeltoUnsupported; }

bool VeltoHIDService::openWithOptions(std::uint32_t) { return false; }

void VeltoHIDService::closeWithOptions(std::uint32_t) {}

PropertyValue VeltoHIDService::getPropertyForKey(const char*) { return {}; }

bool VeltoHIDService::setProperty(const PropertyValue&, const char*) { return false; }

void VeltoHIDService::setEventCallback(VeltoEventCallback, void*, void*) {}

void VeltoHIDService::scheduleWithDispatchQueue(const SerialQueue::Ref&) {}

void VeltoHIDService::unscheduleWithDispatchQueue(const SerialQueue::Ref&) {}

HidEventRef VeltoHIDService::copyEventWithType(std::uint32_t, HidEvent*, std::uint32_t) { return nullptr; }

VeltoStatus VeltoHIDService::setOutputEvent(HidEvent*) { return kVeltoUnsupported; }

}  // namespace VeltoHost
