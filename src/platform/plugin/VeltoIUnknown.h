#pragma once

#include "platform/plugin/PluginInterface.h"

#include <cstdint>

namespace VeltoHost {

// The functions that sit in the plug-in and service tables. Each takes the
// host's interface pointer, finds the service object through the table's
// reserved word, holds a reference to it for the duration of the call and
// forwards to the matching VeltoHIDService operation. Argument orders are the
// host's; where they differ from the operation's, the functions reorder.
class VeltoIUnknown {
public:
    VeltoIUnknown() = delete;

    static VeltoStatus QueryInterface(VeltoInterfaceRef self, VeltoUUID iid, VeltoInterfaceRef* out);
    static std::uint32_t AddRef(VeltoInterfaceRef self);
    static std::uint32_t Release(VeltoInterfaceRef self);

    static VeltoStatus Probe(VeltoInterfaceRef self, const PropertyValue& properties, std::uint32_t service,
                             std::int32_t* outScore);
    static VeltoStatus Start(VeltoInterfaceRef self, const PropertyValue& properties, std::uint32_t service);
    static VeltoStatus Stop(VeltoInterfaceRef self);

    static bool open(VeltoInterfaceRef self, std::uint32_t options);
    static void close(VeltoInterfaceRef self, std::uint32_t options);
    static PropertyValue copyProperty(VeltoInterfaceRef self, const char* key);
    static bool setProperty(VeltoInterfaceRef self, const char* key, const PropertyValue& value);
    static void setEventCallback(VeltoInterfaceRef self, VeltoEventCallback callback, void* target, void* refcon);
    static void scheduleWithDispatchQueue(VeltoInterfaceRef self, SerialQueue* queue);
    static void unscheduleFromDispatchQueue(VeltoInterfaceRef self, SerialQueue* queue);
    static HidEventRef copyEvent(VeltoInterfaceRef self, std::uint32_t type, HidEvent* matching,
                                 std::uint32_t options);
    static VeltoStatus setOutputEvent(VeltoInterfaceRef self, HidEvent* event);
};

}  // namespace VeltoHost
