#pragma once

#include "platform/devices/HostDevice.h"
#include "platform/plugin/HidEvent.h"
#include "platform/plugin/PluginInterface.h"
#include "platform/runtime/SerialQueue.h"
#include "platform/values/PropertyValue.h"

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>

namespace VeltoHost {

// The host's HID event system: loads a HID service plug-in module, matches it
// to one device and drives it through the plug-in tables. Events the plug-in
// delivers are handed to subscribers on the host's event queue.
//
// start() loads the module (dlopen by path), finds the factory by its
// exported name, creates the plug-in, queries the service interface,
// registers the device for a service handle and calls Probe, Start, open,
// setEventCallback and scheduleWithDispatchQueue. stop() unschedules (unless
// unschedule() already did), closes,
// stops, releases every reference obtained, waits for the queue to run the
// plug-in's delivery jobs and closes the module. Failures in start() raise
// std::runtime_error after undoing what was done.
//
// The module is loaded with RTLD_NODELETE: a plug-in's detached thread may
// still be running its last lines after the handshake that unscheduling
// waits for, so the module's code must stay mapped after dlclose.
//
// Threading: start, stop and the property calls come from one host thread at
// a time, never from a subscriber. Subscribers run on the event queue.
class HostEventSystem {
public:
    using EventSubscriber = std::function<void(const HidEventRef&)>;
    using SubscriptionId = std::uint64_t;

    HostEventSystem();
    ~HostEventSystem();
    HostEventSystem(const HostEventSystem&) = delete;
    HostEventSystem& operator=(const HostEventSystem&) = delete;

    // `properties` are given to Probe and Start; when empty, a dictionary of
    // the device's "VendorID", "ProductID", "Product" and "Transport".
    void start(const std::string& modulePath, const std::string& factoryName, HostDevice::Ref device,
               PropertyValue properties = {}, std::uint32_t openOptions = 0);
    // Ends the flow of reports without ending the plug-in: unschedules it from
    // its queue (its input-report thread stops taking reports) and waits for
    // the deliveries queued so far. Properties stay readable, so a host can
    // read the final state of exactly what was processed; stop() then
    // closes, stops and releases. Nothing happens when not scheduled.
    void unschedule();
    void stop();
    bool isRunning() const noexcept { return _serviceInterface != nullptr; }

    // The service handle under which the device is registered (0 when stopped).
    std::uint32_t service() const noexcept { return _service; }
    // The score Probe left (the host's initial value is 0).
    std::int32_t probeScore() const noexcept { return _probeScore; }
    // The event queue (null when stopped).
    const SerialQueue::Ref& queue() const noexcept { return _queue; }

    // Forwarded to the plug-in; empty and false when not running.
    PropertyValue copyProperty(const std::string& key);
    bool setProperty(const std::string& key, const PropertyValue& value);

    SubscriptionId subscribe(EventSubscriber subscriber);
    void unsubscribe(SubscriptionId id);
    std::uint64_t eventsDelivered() const noexcept { return _eventsDelivered.load(); }

    // Blocks until the event deliveries queued so far have run.
    void drain();

private:
    static void eventCallback(void* target, void* refcon, void* sender, HidEvent* event, std::uint32_t options);
    void deliver(HidEvent* event);
    void loadPlugin(const std::string& modulePath, const std::string& factoryName);
    void attach(HostDevice::Ref device, PropertyValue properties, std::uint32_t openOptions);
    void shutDown() noexcept;

    const PluginInterfaceTable& pluginTable() const;
    const ServiceInterfaceTable& serviceTable() const;

    // Owned by the host thread (see Threading).
    void* _module = nullptr;
    VeltoInterfaceRef _pluginInterface = nullptr;
    VeltoInterfaceRef _serviceInterface = nullptr;
    HostDevice::Ref _device;
    SerialQueue::Ref _queue;
    std::uint32_t _service = 0;
    std::int32_t _probeScore = 0;
    bool _started = false;
    bool _opened = false;
    bool _scheduled = false;

    std::atomic<std::uint64_t> _eventsDelivered{0};

    std::mutex _subscribersLock;
    // Guarded by _subscribersLock.
    std::map<SubscriptionId, std::shared_ptr<const EventSubscriber>> _subscribers;
    SubscriptionId _nextSubscription = 1;
};

}  // namespace VeltoHost
