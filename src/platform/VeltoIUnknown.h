#pragma once

#include "platform/PluginInterface.h"

#include <cstdint>

namespace VeltoTouch {

// The functions that sit in the plug-in and service tables. Each takes the
// host's interface pointer, finds the service object through the table's
// reserved word, holds a reference to it for the duration of the call and
// forwards to the matching VeltoHIDService operation. Argument orders are the
// host's; where they differ from the operation's, the functions reorder.
class VeltoIUnknown {
public:
    VeltoIUnknown() = delete;

    static VeltoHost::VeltoStatus QueryInterface(VeltoHost::VeltoInterfaceRef self, VeltoHost::VeltoUUID iid,
                                                 VeltoHost::VeltoInterfaceRef* out);
    static std::uint32_t AddRef(VeltoHost::VeltoInterfaceRef self);
    static std::uint32_t Release(VeltoHost::VeltoInterfaceRef self);

    static VeltoHost::VeltoStatus Probe(VeltoHost::VeltoInterfaceRef self, const VeltoHost::PropertyValue& properties,
                                        std::uint32_t service, std::int32_t* outScore);
    static VeltoHost::VeltoStatus Start(VeltoHost::VeltoInterfaceRef self, const VeltoHost::PropertyValue& properties,
                                        std::uint32_t service);
    static VeltoHost::VeltoStatus Stop(VeltoHost::VeltoInterfaceRef self);

    static bool open(VeltoHost::VeltoInterfaceRef self, std::uint32_t options);
    static void close(VeltoHost::VeltoInterfaceRef self, std::uint32_t options);
    static VeltoHost::PropertyValue copyProperty(VeltoHost::VeltoInterfaceRef self, const char* key);
    static bool setProperty(VeltoHost::VeltoInterfaceRef self, const char* key, const VeltoHost::PropertyValue& value);
    static void setEventCallback(VeltoHost::VeltoInterfaceRef self, VeltoHost::VeltoEventCallback callback,
                                 void* target, void* refcon);
    static void scheduleWithDispatchQueue(VeltoHost::VeltoInterfaceRef self, VeltoHost::SerialQueue* queue);
    static void unscheduleFromDispatchQueue(VeltoHost::VeltoInterfaceRef self, VeltoHost::SerialQueue* queue);
    static VeltoHost::HidEventRef copyEvent(VeltoHost::VeltoInterfaceRef self, std::uint32_t type,
                                            VeltoHost::HidEvent* matching, std::uint32_t options);
    static VeltoHost::VeltoStatus setOutputEvent(VeltoHost::VeltoInterfaceRef self, VeltoHost::HidEvent* event);
};

}  // namespace VeltoTouch
