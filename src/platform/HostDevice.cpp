#include "platform/HostDevice.h"

#include "platform/HostDeviceRegistry.h"

namespace VeltoHost {

HostDevice::Ref HostDevice::createWithService(std::uint32_t service)
{
    return HostDeviceRegistry::shared().deviceForService(service);
}

}  // namespace VeltoHost
