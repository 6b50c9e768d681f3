#include "service/ServiceHarness.h"

#include "platform/devices/HostDeviceRegistry.h"
#include "platform/devices/SimulatedHostDevice.h"
#include "platform/runtime/MonotonicClock.h"
#include "platform/values/PropertyDictionary.h"
#include "records/InputReport.h"
#include "service/VeltoTouchHIDServiceFactory.h"

#include <gtest/gtest.h>

#include <chrono>

namespace VeltoTouch::Test {

using namespace VeltoHost;

namespace {

constexpr auto kPatience = std::chrono::seconds(30);

}  // namespace

void EventCollector::callback(void* target, void* refcon, void* sender, HidEvent* event, std::uint32_t options)
{
    auto& collector = *static_cast<EventCollector*>(target);
    DeliveredEvent delivered;
    delivered.type = event->type();
    delivered.phase = event->phase();
    delivered.timeStamp = event->timeStamp();
    delivered.usagePage = event->vendorDefined().usagePage;
    delivered.usage = event->vendorDefined().usage;
    delivered.target = target;
    delivered.refcon = refcon;
    delivered.sender = sender;
    delivered.options = options;
    delivered.thread = std::this_thread::get_id();
    std::lock_guard<std::mutex> lock(collector._lock);
    delivered.onQueue = collector._queue && collector._queue->isCurrent();
    collector._events.push_back(delivered);
    collector._arrived.notify_all();
}

void EventCollector::setQueue(SerialQueue::Ref queue)
{
    std::lock_guard<std::mutex> lock(_lock);
    _queue = std::move(queue);
}

bool EventCollector::waitFor(std::size_t count)
{
    std::unique_lock<std::mutex> lock(_lock);
    return _arrived.wait_for(lock, kPatience, [&] { return _events.size() >= count; });
}

std::vector<DeliveredEvent> EventCollector::events() const
{
    std::lock_guard<std::mutex> lock(_lock);
    return _events;
}

ServiceHarness::ServiceHarness(bool withDevice) : _queue(SerialQueue::create("service.test.events"))
{
    collector.setQueue(_queue);
    if (withDevice) {
        _device = SimulatedHostDevice::create();
        HostDeviceRegistry::shared().set(kServiceHandle, _device);
    }
    _plugin = VeltoTouchHIDServiceFactory(nullptr, kVeltoHIDServicePluginTypeID);
    VeltoStatus status = plugin().QueryInterface(_plugin, kVeltoHIDServiceInterface2ID, &_service);
    EXPECT_EQ(status, kVeltoSuccess);
}

ServiceHarness::~ServiceHarness()
{
    service().Release(_service);
    plugin().Release(_plugin);
    if (_device) HostDeviceRegistry::shared().remove(kServiceHandle);
    _queue->drain();
}

PluginInterfaceTable& ServiceHarness::plugin() const { return **static_cast<PluginInterfaceTable**>(_plugin); }

ServiceInterfaceTable& ServiceHarness::service() const { return **static_cast<ServiceInterfaceTable**>(_service); }

void ServiceHarness::start()
{
    ASSERT_EQ(plugin().Start(_plugin, PropertyValue::dictionary({}), kServiceHandle), kVeltoSuccess);
    ASSERT_TRUE(service().open(_service, 0));
}

void ServiceHarness::bringUp()
{
    start();
    setCallback(collector);
    schedule();
}

void ServiceHarness::tearDown()
{
    unschedule();
    service().close(_service, 0);
    EXPECT_EQ(plugin().Stop(_plugin), kVeltoSuccess);
}

void ServiceHarness::schedule() { service().scheduleWithDispatchQueue(_service, _queue.get()); }

void ServiceHarness::unschedule() { service().unscheduleFromDispatchQueue(_service, _queue.get()); }

void ServiceHarness::setCallback(EventCollector& target, void* refcon)
{
    service().setEventCallback(_service, EventCollector::callback, &target, refcon);
}

PropertyValue ServiceHarness::copyProperty(const char* key) const { return service().copyProperty(_service, key); }

bool ServiceHarness::setProperty(const char* key, const PropertyValue& value) const
{
    return service().setProperty(_service, key, value);
}

void ServiceHarness::push(const std::vector<std::uint8_t>& report) { _device->pushInputReport(report); }

bool ServiceHarness::waitForResetCount(std::uint32_t count) const
{
    auto deadline = std::chrono::steady_clock::now() + kPatience;
    while (std::chrono::steady_clock::now() < deadline) {
        PropertyValue info = copyProperty("Pipeline.DebugInfo");
        if (info.asDictionary().get("ResetCount").toUInt64() >= count) return true;
        MonotonicClock::sleepMicroseconds(1000);
    }
    return false;
}

}  // namespace VeltoTouch::Test
