#include "platform/devices/HostDevice.h"

#include "platform/devices/HostDeviceRegistry.h"

namespace VeltoHost {

HostDevice::Ref HostDevice::createWithService(std::uint32_t service)
{
    return HostDeviceRegistry::shared().deviceForService(service);
}

}  // namespace VeltoHost
