// The factory, the two function tables and the reference counting, driven the
// way the host drives them: through interface pointers only.

#include "platform/PluginInterface.h"
#include "platform/PropertyDictionary.h"
#include "platform/SerialQueue.h"
#include "service/VeltoHIDService.h"
#include "service/VeltoTouchHIDServiceFactory.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

using namespace VeltoHost;
using VeltoTouch::VeltoHIDService;

namespace {

PluginInterfaceTable& pluginTable(VeltoInterfaceRef ref) { return **static_cast<PluginInterfaceTable**>(ref); }
ServiceInterfaceTable& serviceTable(VeltoInterfaceRef ref) { return **static_cast<ServiceInterfaceTable**>(ref); }

// Records which operation the tables reached and with what, to catch a slot
// wired to the wrong operation or arguments passed in the wrong order.
class RecordingService : public VeltoHIDService {
public:
    explicit RecordingService(bool* destroyed = nullptr) : _destroyed(destroyed) {}
    ~RecordingService() override
    {
        if (_destroyed) *_destroyed = true;
    }

    VeltoStatus probeWithService(std::uint32_t service, const PropertyValue& properties, std::int32_t* score) override
    {
        calls.push_back("probe " + std::to_string(service) + " " + properties.description());
        lastScore = score;
        return 11;
    }
    VeltoStatus startWithService(std::uint32_t service, const PropertyValue& properties) override
    {
        calls.push_back("start " + std::to_string(service) + " " + properties.description());
        return 12;
    }
    VeltoStatus stop() override
    {
        calls.push_back("stop");
        // A host thread may drop its last reference while a call is running;
        // the forwarding function's own hold must keep the object alive.
        if (releaseDuringStop) {
            release();
            if (aliveAfterRelease) *aliveAfterRelease = !(_destroyed && *_destroyed);
        }
        return 13;
    }
    bool openWithOptions(std::uint32_t options) override
    {
        calls.push_back("open " + std::to_string(options));
        return true;
    }
    void closeWithOptions(std::uint32_t options) override { calls.push_back("close " + std::to_string(options)); }
    PropertyValue getPropertyForKey(const char* key) override
    {
        calls.push_back(std::string("get ") + (key ? key : "(null)"));
        return stored;
    }
    bool setProperty(const PropertyValue& value, const char* key) override
    {
        calls.push_back("set " + value.description() + " " + key);
        return true;
    }
    void setEventCallback(VeltoEventCallback callback, void* target, void* refcon) override
    {
        calls.push_back("callback");
        lastCallback = callback;
        lastTarget = target;
        lastRefcon = refcon;
    }
    void scheduleWithDispatchQueue(const SerialQueue::Ref& queue) override
    {
        calls.push_back("schedule");
        lastQueue = queue;
    }
    void unscheduleWithDispatchQueue(const SerialQueue::Ref& queue) override
    {
        calls.push_back("unschedule");
        lastQueue = queue;
    }
    HidEventRef copyEventWithType(std::uint32_t type, HidEvent* matching, std::uint32_t options) override
    {
        calls.push_back("copyEvent " + std::to_string(type) + " " + std::to_string(options));
        lastMatching = matching;
        return event;
    }
    VeltoStatus setOutputEvent(HidEvent* output) override
    {
        calls.push_back("output");
        lastMatching = output;
        return 14;
    }

    std::vector<std::string> calls;
    std::int32_t* lastScore = nullptr;
    VeltoEventCallback lastCallback = nullptr;
    void* lastTarget = nullptr;
    void* lastRefcon = nullptr;
    SerialQueue::Ref lastQueue;
    HidEvent* lastMatching = nullptr;
    PropertyValue stored;
    HidEventRef event;
    bool releaseDuringStop = false;
    bool* aliveAfterRelease = nullptr;

private:
    bool* _destroyed;
};

void someCallback(void*, void*, void*, HidEvent*, std::uint32_t) {}

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

    // The untouched defaults of a service that was never started.
    std::int32_t score = 123;
    EXPECT_EQ(table.Probe(plugin, PropertyValue::dictionary({}), 7, &score), kVeltoSuccess);
    EXPECT_EQ(score, 123);
    EXPECT_EQ(table.Stop(plugin), kVeltoSuccess);
    EXPECT_EQ(table.Release(plugin), 0u);
}

TEST(PluginInterface, QueryInterfaceAnswersTheTwoInterfacesOfOneObject)
{
    auto* service = new RecordingService();
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

TEST(PluginInterface, TablesForwardEachSlotWithTheOperationsArgumentOrder)
{
    bool destroyed = false;
    auto* service = new RecordingService(&destroyed);
    VeltoInterfaceRef plugin = service->getPluginInterface();
    VeltoInterfaceRef svc = service->getServiceInterface();
    PluginInterfaceTable& p = pluginTable(plugin);
    ServiceInterfaceTable& s = serviceTable(svc);

    std::int32_t score = 5;
    PropertyValue properties = PropertyValue::string("props");
    EXPECT_EQ(p.Probe(plugin, properties, 42, &score), 11);
    EXPECT_EQ(service->lastScore, &score);
    EXPECT_EQ(p.Start(plugin, properties, 43), 12);
    EXPECT_TRUE(s.open(svc, 0x10));
    s.close(svc, 0x20);

    service->stored = PropertyValue::string("value");
    PropertyValue copied = s.copyProperty(svc, "Key");
    EXPECT_EQ(copied.identity(), service->stored.identity());
    // The caller's copy is a reference of its own: it outlives the service's.
    service->stored = {};
    EXPECT_EQ(copied.asString(), "value");
    EXPECT_FALSE(s.copyProperty(svc, nullptr).hasValue());
    EXPECT_TRUE(s.setProperty(svc, "Written", PropertyValue::int32(3)));

    int target = 0;
    int refcon = 0;
    s.setEventCallback(svc, someCallback, &target, &refcon);
    EXPECT_EQ(service->lastCallback, &someCallback);
    EXPECT_EQ(service->lastTarget, &target);
    EXPECT_EQ(service->lastRefcon, &refcon);

    SerialQueue::Ref queue = SerialQueue::create("test.queue");
    s.scheduleWithDispatchQueue(svc, queue.get());
    EXPECT_EQ(service->lastQueue, queue);
    s.unscheduleFromDispatchQueue(svc, nullptr);
    EXPECT_EQ(service->lastQueue, nullptr);

    service->event = HidEvent::createVendorDefinedEvent(0, 1, 2, 0, nullptr, 0, 0);
    HidEventRef matching = HidEvent::createVendorDefinedEvent(0, 3, 4, 0, nullptr, 0, 0);
    EXPECT_EQ(s.copyEvent(svc, 9, matching.get(), 8), service->event);
    EXPECT_EQ(service->lastMatching, matching.get());
    EXPECT_EQ(s.setOutputEvent(svc, nullptr), 14);

    EXPECT_EQ(service->calls, (std::vector<std::string>{
                                  "probe 42 \"props\"",
                                  "start 43 \"props\"",
                                  "open 16",
                                  "close 32",
                                  "get Key",
                                  "get (null)",
                                  "set 3 Written",
                                  "callback",
                                  "schedule",
                                  "unschedule",
                                  "copyEvent 9 8",
                                  "output",
                              }));

    // The host's last Release arrives while an operation runs: the object
    // stays alive until the forwarded call has returned.
    bool aliveDuringCall = false;
    service->releaseDuringStop = true;
    service->aliveAfterRelease = &aliveDuringCall;
    EXPECT_EQ(p.Stop(plugin), 13);
    EXPECT_TRUE(aliveDuringCall);
    EXPECT_TRUE(destroyed);
}
