#include "service/VeltoTouchHIDServiceFactory.h"

#include "service/VeltoTouchHIDService.h"

// The signature must match what the host's loader casts the symbol to.
static_assert(std::is_same_v<decltype(&VeltoTouchHIDServiceFactory), VeltoHost::VeltoPluginFactory>);

extern "C" VeltoHost::VeltoInterfaceRef VeltoTouchHIDServiceFactory(void*, VeltoHost::VeltoUUID typeID)
{
    if (!(typeID == VeltoHost::kVeltoHIDServicePluginTypeID)) return nullptr;
    auto* service = new VeltoTouch::VeltoTouchHIDService();
    // The host's reference replaces the creation's own.
    service->addRef();
    service->release();
    return service->getPluginInterface();
}
