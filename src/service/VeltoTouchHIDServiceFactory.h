#pragma once

#include "platform/plugin/PluginInterface.h"

// The module's one exported entry point, found by name by the host's loader.
// Returns the plug-in interface of a new service holding one reference for
// the host, or null when `typeID` is not the HID service plug-in type. The
// allocator is ignored.
extern "C" __attribute__((visibility("default"))) VeltoHost::VeltoInterfaceRef
VeltoTouchHIDServiceFactory(void* allocator, VeltoHost::VeltoUUID typeID);
