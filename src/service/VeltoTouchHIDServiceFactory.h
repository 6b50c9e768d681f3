#pragma once

#include "platform/plugin/PluginInterface.h"

// The module's one exported entry point, found by name by the host's loader.
// Returns the plug-in interface of a new service holding one reference for
// the host, or null when `typeID` is not the HID service plug-in type. The
// allocator is ignored.
extern "C" __attribute__((visibility("default"))) VeltoHost::VeltoInterfaceRef
VeltoTouchHIDServiceFactory(void* allocator, VeltoHost::VeltoUUID typeID);

// The name a host looks the entry point up by, for hosts that load the module
// rather than link it (the daemon, the tool's host command).
inline constexpr const char* kVeltoTouchHIDServiceFactoryName = "VeltoTouchHIDServiceFactory";
