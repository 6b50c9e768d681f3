// The two function tables and the reference counting of the service base,
// driven the way the host drives them: through interface pointers only.

#include "platform/plugin/VeltoHIDService.h"

#include <gtest/gtest.h>

using namespace VeltoHost;

namespace {

PluginInterfaceTable& pluginTable(VeltoInterfaceRef ref) { return **static_cast<PluginInterfaceTable**>(ref); }
ServiceInterfaceTable& serviceTable(VeltoInterfaceRef ref) { return **static_cast<ServiceInterfaceTable**>(ref); }

// A host thread may drop its last reference while a call is running: the
// forwarding function's own hold must keep the object alive until it returns.
class ReleasingService : public VeltoHIDService {
public:
    ReleasingService(bool& destroyed, bool& aliveAfterRelease) : _destroyed(destroyed), _alive(aliveAfterRelease) {}
    ~ReleasingService() override { _destroyed = true; }
    VeltoStatus stop() override
    {
        release();
        _alive = !_destroyed;
        return 13;
    }

private:
    bool& _destroyed;
    bool& _alive;
};

}  // namespace

TEST(VeltoHIDService, QueryInterfaceAnswersTheTwoInterfacesOfOneObject)
{
    auto* service = new VeltoHIDService();
    VeltoInterfaceRef plugin = service->getPluginInterface();
    ASSERT_EQ(pluginTable(plugin).reserved, static_cast<void*>(service));

    VeltoInterfaceRef serviceRef = nullptr;
    EXPECT_EQ(pluginTable(plugin).QueryInterface(plugin, kVeltoHIDServiceInterface2ID, &serviceRef), kVeltoSuccess);
    EXPECT_EQ(serviceRef, service->getServiceInterface());
    ASSERT_EQ(serviceTable(serviceRef).reserved, static_cast<void*>(service));

    VeltoInterfaceRef pluginAgain = nullptr;
    EXPECT_EQ(serviceTable(serviceRef).QueryInterface(serviceRef, kVeltoPluginInterfaceID, &pluginAgain),
              kVeltoSuccess);
    EXPECT_EQ(pluginAgain, plugin);

    // Unknown identifiers, the plug-in type among them, leave the out pointer
    // alone and add no reference.
    auto sentinel = reinterpret_cast<VeltoInterfaceRef>(0x1234);
    VeltoInterfaceRef out = sentinel;
    EXPECT_EQ(serviceTable(serviceRef).QueryInterface(serviceRef, VeltoUUID{}, &out), kVeltoNoInterface);
    EXPECT_EQ(pluginTable(plugin).QueryInterface(plugin, kVeltoHIDServicePluginTypeID, &out), kVeltoNoInterface);
    EXPECT_EQ(out, sentinel);

    // Creation's reference plus two successful queries.
    EXPECT_EQ(serviceTable(serviceRef).AddRef(serviceRef), 4u);
    EXPECT_EQ(pluginTable(plugin).Release(plugin), 3u);
    EXPECT_EQ(serviceTable(serviceRef).Release(serviceRef), 2u);
    EXPECT_EQ(pluginTable(plugin).Release(plugin), 1u);
    EXPECT_EQ(serviceTable(serviceRef).Release(serviceRef), 0u);
}

TEST(VeltoHIDService, TheHostsLastReleaseDuringACallWaitsForItsReturn)
{
    bool destroyed = false;
    bool aliveAfterRelease = false;
    auto* service = new ReleasingService(destroyed, aliveAfterRelease);
    VeltoInterfaceRef plugin = service->getPluginInterface();
    EXPECT_EQ(pluginTable(plugin).Stop(plugin), 13);
    EXPECT_TRUE(aliveAfterRelease);
    EXPECT_TRUE(destroyed);
}
