// The factory, driven the way the host drives it: through interface pointers only.

#include "platform/plugin/HidEvent.h"
#include "platform/plugin/PluginInterface.h"
#include "platform/values/PropertyDictionary.h"
#include "service/VeltoTouchHIDServiceFactory.h"

#include <gtest/gtest.h>

using namespace VeltoHost;

namespace {

PluginInterfaceTable& pluginTable(VeltoInterfaceRef ref) { return **static_cast<PluginInterfaceTable**>(ref); }
ServiceInterfaceTable& serviceTable(VeltoInterfaceRef ref) { return **static_cast<ServiceInterfaceTable**>(ref); }

}  // namespace

TEST(PluginInterface, FactoryServesOnlyThePluginTypeAndHandsOverOneReference)
{
    EXPECT_EQ(VeltoTouchHIDServiceFactory(nullptr, kVeltoPluginInterfaceID), nullptr);
    EXPECT_EQ(VeltoTouchHIDServiceFactory(nullptr, VeltoUUID{}), nullptr);

    VeltoInterfaceRef plugin = VeltoTouchHIDServiceFactory(nullptr, kVeltoHIDServicePluginTypeID);
    ASSERT_NE(plugin, nullptr);
    PluginInterfaceTable& table = pluginTable(plugin);

    // Exactly one reference belongs to the host: one more and one less.
    EXPECT_EQ(table.AddRef(plugin), 2u);
    EXPECT_EQ(table.Release(plugin), 1u);

    // The service refuses output events and keeps no events to copy.
    VeltoInterfaceRef service = nullptr;
    ASSERT_EQ(table.QueryInterface(plugin, kVeltoHIDServiceInterface2ID, &service), kVeltoSuccess);
    HidEventRef event = HidEvent::createVendorDefinedEvent(0, 1, 1, 0, nullptr, 0, 0);
    EXPECT_EQ(serviceTable(service).setOutputEvent(service, event.get()), kVeltoUnsupported);
    EXPECT_EQ(serviceTable(service).copyEvent(service, HidEvent::kTypeDigitizer, event.get(), 0), nullptr);
    EXPECT_EQ(serviceTable(service).Release(service), 1u);

    // The untouched defaults of a service that was never started.
    std::int32_t score = 123;
    EXPECT_EQ(table.Probe(plugin, PropertyValue::dictionary({}), 7, &score), kVeltoSuccess);
    EXPECT_EQ(score, 123);
    EXPECT_EQ(table.Stop(plugin), kVeltoSuccess);
    EXPECT_EQ(table.Release(plugin), 0u);
}
