#pragma once

// The host's plug-in interface definitions: identifiers, status codes and the
// two function tables through which the host talks to a HID service plug-in.
// Both sides are C++ built with the same compiler, so the tables may carry C++
// value types (PropertyValue, HidEventRef); the factory itself has C linkage
// so that the host can find it by name in the loaded module.

#include "platform/plugin/HidEvent.h"
#include "platform/values/PropertyValue.h"

#include <cstdint>
#include <cstring>

namespace VeltoHost {

class SerialQueue;

struct VeltoUUID {
    std::uint8_t bytes[16];

    friend bool operator==(const VeltoUUID& a, const VeltoUUID& b) noexcept
    {
        return std::memcmp(a.bytes, b.bytes, sizeof a.bytes) == 0;
    }
};

// The plug-in type served by a HID service factory.
inline constexpr VeltoUUID kVeltoHIDServicePluginTypeID = {
    {0x7a, 0x3e, 0x51, 0x0c, 0x9d, 0x42, 0x4b, 0x8f, 0xa1, 0x6e, 0x20, 0x5d, 0xc4, 0x93, 0x18, 0x01}};
// The plug-in interface (PluginInterfaceTable).
inline constexpr VeltoUUID kVeltoPluginInterfaceID = {
    {0x7a, 0x3e, 0x51, 0x0c, 0x9d, 0x42, 0x4b, 0x8f, 0xa1, 0x6e, 0x20, 0x5d, 0xc4, 0x93, 0x18, 0x02}};
// The HID service interface, second version (ServiceInterfaceTable).
inline constexpr VeltoUUID kVeltoHIDServiceInterface2ID = {
    {0x7a, 0x3e, 0x51, 0x0c, 0x9d, 0x42, 0x4b, 0x8f, 0xa1, 0x6e, 0x20, 0x5d, 0xc4, 0x93, 0x18, 0x03}};

using VeltoStatus = std::int32_t;
inline constexpr VeltoStatus kVeltoSuccess = 0;
inline constexpr VeltoStatus kVeltoNoInterface = static_cast<VeltoStatus>(0x80000004u);
inline constexpr VeltoStatus kVeltoNoResources = static_cast<VeltoStatus>(0xE00002BEu);
inline constexpr VeltoStatus kVeltoUnsupported = static_cast<VeltoStatus>(0xE00002C7u);

// An interface pointer as the host holds it: the address of a word that
// points to the table.
using VeltoInterfaceRef = void*;

// The host's event callback: target, refcon, sender, event, options.
using VeltoEventCallback = void (*)(void* target, void* refcon, void* sender, HidEvent* event, std::uint32_t options);

struct PluginInterfaceTable {
    void* reserved;
    VeltoStatus (*QueryInterface)(VeltoInterfaceRef self, VeltoUUID iid, VeltoInterfaceRef* out);
    std::uint32_t (*AddRef)(VeltoInterfaceRef self);
    std::uint32_t (*Release)(VeltoInterfaceRef self);
    std::uint16_t version;
    std::uint16_t revision;
    VeltoStatus (*Probe)(VeltoInterfaceRef self, const PropertyValue& properties, std::uint32_t service,
                         std::int32_t* outScore);
    VeltoStatus (*Start)(VeltoInterfaceRef self, const PropertyValue& properties, std::uint32_t service);
    VeltoStatus (*Stop)(VeltoInterfaceRef self);
};

struct ServiceInterfaceTable {
    void* reserved;
    VeltoStatus (*QueryInterface)(VeltoInterfaceRef self, VeltoUUID iid, VeltoInterfaceRef* out);
    std::uint32_t (*AddRef)(VeltoInterfaceRef self);
    std::uint32_t (*Release)(VeltoInterfaceRef self);
    bool (*open)(VeltoInterfaceRef self, std::uint32_t options);
    void (*close)(VeltoInterfaceRef self, std::uint32_t options);
    // Returns the value with a reference for the caller, or an empty reference
    // for null. A null key reads as null.
    PropertyValue (*copyProperty)(VeltoInterfaceRef self, const char* key);
    bool (*setProperty)(VeltoInterfaceRef self, const char* key, const PropertyValue& value);
    void (*setEventCallback)(VeltoInterfaceRef self, VeltoEventCallback callback, void* target, void* refcon);
    void (*scheduleWithDispatchQueue)(VeltoInterfaceRef self, SerialQueue* queue);
    void (*unscheduleFromDispatchQueue)(VeltoInterfaceRef self, SerialQueue* queue);
    HidEventRef (*copyEvent)(VeltoInterfaceRef self, std::uint32_t type, HidEvent* matching, std::uint32_t options);
    VeltoStatus (*setOutputEvent)(VeltoInterfaceRef self, HidEvent* event);
};

// Exported by every HID service module under its own name; the host looks the
// name up after loading the module.
using VeltoPluginFactory = VeltoInterfaceRef (*)(void* allocator, VeltoUUID typeID);

}  // namespace VeltoHost
