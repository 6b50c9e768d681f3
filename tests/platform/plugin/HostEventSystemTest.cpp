#include "platform/devices/HostDeviceRegistry.h"
#include "platform/devices/SimulatedHostDevice.h"
#include "platform/plugin/HostEventSystem.h"
#include "platform/runtime/Semaphore.h"
#include "platform/values/PropertyDictionary.h"

#include <gtest/gtest.h>

#include <dlfcn.h>

#include <atomic>
#include <mutex>
#include <stdexcept>
#include <string>
#include <vector>

using namespace VeltoHost;
using namespace std::chrono_literals;

namespace {

constexpr const char* kEchoPluginPath = VELTO_ECHO_PLUGIN_PATH;
constexpr const char* kEchoFactory = "VeltoEchoServiceFactory";

// The test module's own exports, reached the way a debugger would: by
// loading the same module again (the loader hands back the same copy).
struct EchoModule {
    void* handle = dlopen(kEchoPluginPath, RTLD_NOW | RTLD_LOCAL);
    ~EchoModule()
    {
        if (handle) dlclose(handle);
    }
    template <typename Function>
    Function* get(const char* name) const
    {
        return reinterpret_cast<Function*>(dlsym(handle, name));
    }
    int liveServices() const { return get<int()>("VeltoEchoLiveServices")(); }
    std::vector<std::string> callLog() const
    {
        std::vector<std::string> calls;
        get<void(std::vector<std::string>*)>("VeltoEchoCallLog")(&calls);
        return calls;
    }
    void clearCallLog() const { get<void()>("VeltoEchoClearCallLog")(); }
};

std::vector<std::string> withoutProbeDetails(std::vector<std::string> calls)
{
    for (std::string& call : calls) {
        if (call.rfind("Probe", 0) == 0) call = "Probe";
    }
    return calls;
}

std::string runtimeErrorOf(HostEventSystem& host, const std::string& path, const std::string& factory,
                           HostDevice::Ref device)
{
    try {
        host.start(path, factory, std::move(device));
    } catch (const std::runtime_error& error) {
        return error.what();
    }
    return "no error";
}

}  // namespace

TEST(HostEventSystemTest, DrivesAPluginModuleAndDeliversItsEventsToSubscribers)
{
    EchoModule module;
    ASSERT_NE(module.handle, nullptr) << dlerror();
    module.clearCallLog();

    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    device->setProperty("Product", PropertyValue::string("Simulated Surface"));
    device->setProperty("VendorID", PropertyValue::uint32(0x1234));

    HostEventSystem host;
    std::mutex lock;
    std::vector<std::vector<std::uint8_t>> payloads;  // guarded by lock
    bool onQueue = true;                              // guarded by lock
    Semaphore arrived;
    host.subscribe([&](const HidEventRef& event) {
        std::lock_guard<std::mutex> guard(lock);
        onQueue = onQueue && host.queue()->isCurrent();
        payloads.push_back(event->vendorDefined().payload);
        arrived.signal();
    });
    int unsubscribedCalls = 0;
    HostEventSystem::SubscriptionId dropped = host.subscribe([&](const HidEventRef&) { ++unsubscribedCalls; });
    host.unsubscribe(dropped);

    host.start(kEchoPluginPath, kEchoFactory, device, {}, 0x1);
    ASSERT_TRUE(host.isRunning());
    EXPECT_EQ(HostDevice::createWithService(host.service()), device);
    EXPECT_EQ(module.liveServices(), 1);
    EXPECT_EQ(device->counters().lastOpenOptions, 0x1u);

    for (std::uint8_t i = 1; i <= 5; ++i) device->pushInputReport({i, static_cast<std::uint8_t>(i * 10)});
    for (int i = 0; i < 5; ++i) ASSERT_TRUE(arrived.waitFor(10s));
    host.drain();
    {
        std::lock_guard<std::mutex> guard(lock);
        ASSERT_EQ(payloads.size(), 5u);
        for (std::uint8_t i = 1; i <= 5; ++i) {
            EXPECT_EQ(payloads[i - 1], (std::vector<std::uint8_t>{i, static_cast<std::uint8_t>(i * 10)}));
        }
        EXPECT_TRUE(onQueue);
    }
    EXPECT_EQ(host.eventsDelivered(), 5u);
    EXPECT_EQ(unsubscribedCalls, 0);

    // Properties go through the service table both ways.
    EXPECT_EQ(host.copyProperty("Product"), PropertyValue::string("Simulated Surface"));
    EXPECT_TRUE(host.setProperty("Product", PropertyValue::string("Renamed")));
    EXPECT_EQ(device->getProperty("Product"), PropertyValue::string("Renamed"));

    host.stop();
    EXPECT_FALSE(host.isRunning());
    EXPECT_FALSE(host.copyProperty("Product").hasValue());
    EXPECT_FALSE(host.setProperty("Product", PropertyValue::string("Stopped")));
    EXPECT_EQ(module.liveServices(), 0);

    EXPECT_FALSE(device->isScheduled());

    std::vector<std::string> calls = module.callLog();
    ASSERT_FALSE(calls.empty());
    // Probe saw the device's matching properties.
    EXPECT_NE(calls[1].find("Simulated Surface"), std::string::npos) << calls[1];
    EXPECT_EQ(withoutProbeDetails(calls),
              (std::vector<std::string>{"create", "Probe", "Start", "open", "setEventCallback",
                                        "scheduleWithDispatchQueue", "unscheduleFromDispatchQueue", "close", "Stop",
                                        "dealloc"}));
}

TEST(HostEventSystemTest, StartFailuresRaiseClearErrorsAndUndoEverything)
{
    EchoModule module;
    ASSERT_NE(module.handle, nullptr) << dlerror();
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    HostEventSystem host;

    // A module that cannot be loaded is named through `host --plugin`.
    std::string error = runtimeErrorOf(host, kEchoPluginPath, "VeltoTouchHIDServiceFactory", device);
    EXPECT_NE(error.find("factory VeltoTouchHIDServiceFactory not found"), std::string::npos) << error;

    error = runtimeErrorOf(host, kEchoPluginPath, "VeltoEchoPluginOnlyFactory", device);
    EXPECT_NE(error.find("does not serve the HID service interface (status 0x80000004)"), std::string::npos)
        << error;
    EXPECT_EQ(module.liveServices(), 0);

    // Open fails after start: the plug-in is stopped and released again.
    module.clearCallLog();
    device->failOpen(true);
    error = runtimeErrorOf(host, kEchoPluginPath, kEchoFactory, device);
    EXPECT_EQ(error, "plug-in could not open the device");
    EXPECT_FALSE(host.isRunning());
    EXPECT_EQ(host.service(), 0u);
    EXPECT_EQ(module.liveServices(), 0);
    EXPECT_EQ(withoutProbeDetails(module.callLog()),
              (std::vector<std::string>{"create", "Probe", "Start", "open", "Stop", "dealloc"}));

    // The same host starts cleanly once the device behaves.
    device->failOpen(false);
    host.start(kEchoPluginPath, kEchoFactory, device);
    EXPECT_TRUE(host.isRunning());
    std::uint32_t service = host.service();
    host.stop();
    EXPECT_EQ(HostDevice::createWithService(service), nullptr);
    EXPECT_EQ(module.liveServices(), 0);
    EXPECT_THROW(host.start(kEchoPluginPath, kEchoFactory, nullptr), std::runtime_error);

    // A host that goes away while running shuts the plug-in down first.
    {
        HostEventSystem scoped;
        scoped.start(kEchoPluginPath, kEchoFactory, device);
        device->pushInputReport({0x01});
        EXPECT_EQ(module.liveServices(), 1);
    }
    EXPECT_EQ(module.liveServices(), 0);
    EXPECT_FALSE(device->isScheduled());
}

TEST(HostEventSystemTest, UnschedulingEndsTheReportsButKeepsPropertiesUntilStop)
{
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    HostEventSystem host;
    std::atomic<int> events{0};
    host.subscribe([&](const HidEventRef&) { ++events; });
    host.start(kEchoPluginPath, kEchoFactory, device);

    device->pushInputReport({0x01});
    ASSERT_TRUE(device->waitUntilIdle());
    host.unschedule();
    // Every delivery queued before unscheduling has run when it returns.
    EXPECT_EQ(events.load(), 1);
    EXPECT_FALSE(device->isScheduled());

    // Reports pushed now stay with the device; the plug-in still answers.
    device->pushInputReport({0x02});
    EXPECT_EQ(device->pendingReportCount(), 1u);
    EXPECT_TRUE(host.setProperty("Product", PropertyValue::string("Unscheduled")));
    EXPECT_EQ(host.copyProperty("Product"), PropertyValue::string("Unscheduled"));

    host.unschedule();  // a second call changes nothing
    host.stop();
    EXPECT_EQ(events.load(), 1);
    EXPECT_EQ(device->counters().unschedules, 1u);
}
