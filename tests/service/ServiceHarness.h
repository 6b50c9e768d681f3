#pragma once

#include "records/ReportBytes.h"

#include "platform/plugin/HidEvent.h"
#include "platform/plugin/PluginInterface.h"
#include "platform/runtime/SerialQueue.h"
#include "platform/values/PropertyValue.h"

#include <condition_variable>
#include <initializer_list>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace VeltoHost {
class SimulatedHostDevice;
}

namespace VeltoTouch::Test {

// One event as the host's callback saw it.
struct DeliveredEvent {
    std::uint32_t type = 0;
    std::uint16_t phase = 0;
    std::uint64_t timeStamp = 0;
    std::uint32_t usagePage = 0;
    std::uint32_t usage = 0;
    void* target = nullptr;
    void* refcon = nullptr;
    void* sender = nullptr;
    std::uint32_t options = 0;
    bool onQueue = false;
    std::thread::id thread;
};

// Collects what the host's callback receives; wait() blocks until a number
// of events has arrived.
class EventCollector {
public:
    static void callback(void* target, void* refcon, void* sender, VeltoHost::HidEvent* event, std::uint32_t options);

    void setQueue(VeltoHost::SerialQueue::Ref queue);
    // Returns false when the events did not come within a generous limit
    // (a hung service must fail the test, not hang it).
    bool waitFor(std::size_t count);
    std::vector<DeliveredEvent> events() const;

private:
    mutable std::mutex _lock;
    std::condition_variable _arrived;
    std::vector<DeliveredEvent> _events;
    VeltoHost::SerialQueue::Ref _queue;
};

// A service created by the factory and driven through its tables the way the
// host drives it, with a simulated device registered for its service handle
// and a serial queue for delivery.
class ServiceHarness {
public:
    static constexpr std::uint32_t kServiceHandle = 0x5EC7;

    explicit ServiceHarness(bool withDevice = true);
    ~ServiceHarness();

    ServiceHarness(const ServiceHarness&) = delete;
    ServiceHarness& operator=(const ServiceHarness&) = delete;

    VeltoHost::PluginInterfaceTable& plugin() const;
    VeltoHost::ServiceInterfaceTable& service() const;
    VeltoHost::VeltoInterfaceRef pluginRef() const { return _plugin; }
    VeltoHost::VeltoInterfaceRef serviceRef() const { return _service; }

    // start and open.
    void start();
    // start, open, set the callback (to `collector`), schedule.
    void bringUp();
    // unschedule, close, stop.
    void tearDown();
    void schedule();
    void unschedule();
    void setCallback(EventCollector& collector, void* refcon = nullptr);

    VeltoHost::PropertyValue copyProperty(const char* key) const;
    bool setProperty(const char* key, const VeltoHost::PropertyValue& value) const;

    // Delivers a report from the device (callable from any thread).
    void push(const std::vector<std::uint8_t>& report);
    // Polls the pipeline's reset counter (for reports that give no event).
    bool waitForResetCount(std::uint32_t count) const;

    const VeltoHost::SerialQueue::Ref& queue() const { return _queue; }
    const std::shared_ptr<VeltoHost::SimulatedHostDevice>& device() const { return _device; }
    EventCollector collector;

private:
    std::shared_ptr<VeltoHost::SimulatedHostDevice> _device;
    VeltoHost::SerialQueue::Ref _queue;
    VeltoHost::VeltoInterfaceRef _plugin = nullptr;
    VeltoHost::VeltoInterfaceRef _service = nullptr;
};


}  // namespace VeltoTouch::Test
