// The factory, the two function tables and the reference counting, driven the
// way the host drives them: through interface pointers only.

#include "platform/HidEvent.h"
#include "platform/PluginInterface.h"
#include "platform/PropertyDictionary.h"
#include "service/VeltoHIDService.h"
#include "service/VeltoTouchHIDServiceFactory.h"

#include <gtest/gtest.h>

using namespace VeltoHost;
using VeltoTouch::VeltoHIDService;

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

TEST(PluginInterface, FactoryServesOnlyThePluginTypeAndHandsOverOneReference)
{
    EXPECT_EQ(VeltoTouchHIDServiceFactory(nullptr, kVeltoPluginInterfaceID), nullptr);
    EXPECT_EQ(VeltoTouchHIDServiceFactory(nullptr, VeltoUUID{}), nullptr);

    VeltoInterfaceRef plugin = VeltoTouchHIDServiceFactory(nullptr, kVeltoHIDServicePluginTypeID);
    ASSERT_NE(plugin, nullptr);
    PluginInterfaceTable& table = pluginTable(plugin);
    EXPECT_EQ(table.version, 1);
    EXPECT_EQ(table.revision, 0);

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

TEST(PluginInterface, QueryInterfaceAnswersTheTwoInterfacesOfOneObject)
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

TEST(PluginInterface, TheHostsLastReleaseDuringACallWaitsForItsReturn)
{
    bool destroyed = false;
    bool aliveAfterRelease = false;
    auto* service = new ReleasingService(destroyed, aliveAfterRelease);
    VeltoInterfaceRef plugin = service->getPluginInterface();
    EXPECT_EQ(pluginTable(plugin).Stop(plugin), 13);
    EXPECT_TRUE(aliveAfterRelease);
    EXPECT_TRUE(destroyed);
}
