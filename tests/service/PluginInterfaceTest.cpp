// The factory, driven the way the host drives it: through interface pointers
// only. The service's other entries are driven by the host event system and
// the service harness; output events and event copies, which no host here
// asks for, are not.

#include "platform/plugin/PluginInterface.h"
#include "service/VeltoTouchHIDServiceFactory.h"

#include <gtest/gtest.h>

using namespace VeltoHost;

namespace {

PluginInterfaceTable& pluginTable(VeltoInterfaceRef ref) { return **static_cast<PluginInterfaceTable**>(ref); }

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

    // A service that was never started stops all the same.
    EXPECT_EQ(table.Stop(plugin), kVeltoSuccess);
    EXPECT_EQ(table.Release(plugin), 0u);
}
