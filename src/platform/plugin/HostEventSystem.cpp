#include "platform/plugin/HostEventSystem.h"

#include "platform/devices/HostDeviceRegistry.h"
#include "platform/log/Log.h"
#include "platform/log/LogFormat.h"
#include "platform/values/PropertyDictionary.h"

#include <dlfcn.h>

#include <stdexcept>
#include <utility>
#include <vector>

namespace VeltoHost {

namespace {

constexpr const char* kEventQueueLabel = "velto.host.events";

// The device's own properties that a plug-in may match on.
constexpr const char* kMatchingKeys[] = {"VendorID", "ProductID", "Product", "Transport"};

const Log& hostLog()
{
    static const Log log("HostEventSystem");
    return log;
}

std::string lastLoaderError()
{
    const char* text = dlerror();
    return text ? text : "unknown error";
}

PropertyValue matchingProperties(HostDevice& device)
{
    PropertyDictionary properties;
    for (const char* key : kMatchingKeys) {
        PropertyValue value = device.getProperty(key);
        if (value.hasValue()) properties.set(key, std::move(value));
    }
    return PropertyValue::dictionary(std::move(properties));
}

}  // namespace

HostEventSystem::HostEventSystem() = default;

HostEventSystem::~HostEventSystem()
{
    shutDown();
}

void HostEventSystem::start(const std::string& modulePath, const std::string& factoryName, HostDevice::Ref device,
                            PropertyValue properties, std::uint32_t openOptions)
{
    if (_module) throw std::runtime_error("host event system already started");
    if (!device) throw std::runtime_error("no device to serve");
    try {
        loadPlugin(modulePath, factoryName);
        attach(std::move(device), std::move(properties), openOptions);
    } catch (...) {
        shutDown();
        throw;
    }
}

void HostEventSystem::unschedule()
{
    if (!_scheduled) return;
    serviceTable().unscheduleFromDispatchQueue(_serviceInterface, _queue.get());
    _scheduled = false;
    _queue->drain();
}

void HostEventSystem::stop()
{
    shutDown();
}

void HostEventSystem::loadPlugin(const std::string& modulePath, const std::string& factoryName)
{
    _module = dlopen(modulePath.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
    if (!_module) throw std::runtime_error("cannot load plug-in module " + modulePath + ": " + lastLoaderError());

    dlerror();
    void* symbol = dlsym(_module, factoryName.c_str());
    if (!symbol) {
        throw std::runtime_error("factory " + factoryName + " not found in " + modulePath + ": " +
                                 lastLoaderError());
    }
    auto factory = reinterpret_cast<VeltoPluginFactory>(symbol);
    _pluginInterface = factory(nullptr, kVeltoHIDServicePluginTypeID);
    if (!_pluginInterface) throw std::runtime_error("factory " + factoryName + " created no plug-in");

    VeltoInterfaceRef serviceInterface = nullptr;
    VeltoStatus status =
        pluginTable().QueryInterface(_pluginInterface, kVeltoHIDServiceInterface2ID, &serviceInterface);
    if (status != kVeltoSuccess || !serviceInterface) {
        throw std::runtime_error(formatLog("plug-in does not serve the HID service interface (status 0x%08jx)",
                                           static_cast<std::uint32_t>(status)));
    }
    _serviceInterface = serviceInterface;
}

void HostEventSystem::attach(HostDevice::Ref device, PropertyValue properties, std::uint32_t openOptions)
{
    if (!properties.hasValue()) properties = matchingProperties(*device);
    _device = std::move(device);
    _service = HostDeviceRegistry::shared().add(_device);

    VeltoStatus status = pluginTable().Probe(_pluginInterface, properties, _service, &_probeScore);
    if (status != kVeltoSuccess) {
        throw std::runtime_error(
            formatLog("plug-in probe failed (status 0x%08jx)", static_cast<std::uint32_t>(status)));
    }
    status = pluginTable().Start(_pluginInterface, properties, _service);
    if (status != kVeltoSuccess) {
        throw std::runtime_error(
            formatLog("plug-in start failed (status 0x%08jx)", static_cast<std::uint32_t>(status)));
    }
    _started = true;

    if (!serviceTable().open(_serviceInterface, openOptions)) {
        throw std::runtime_error("plug-in could not open the device");
    }
    _opened = true;

    serviceTable().setEventCallback(_serviceInterface, &HostEventSystem::eventCallback, this, nullptr);
    _queue = SerialQueue::create(kEventQueueLabel);
    serviceTable().scheduleWithDispatchQueue(_serviceInterface, _queue.get());
    _scheduled = true;
    hostLog().debug("plug-in started for service %ju", _service);
}

// The reverse of start, from wherever start got to. Never throws.
void HostEventSystem::shutDown() noexcept
{
    if (_scheduled) serviceTable().unscheduleFromDispatchQueue(_serviceInterface, _queue.get());
    if (_opened) serviceTable().close(_serviceInterface, 0);
    if (_started) pluginTable().Stop(_pluginInterface);
    _scheduled = _opened = _started = false;

    // One Release per reference obtained: the query's, then the factory's.
    if (_serviceInterface) serviceTable().Release(std::exchange(_serviceInterface, nullptr));
    if (_pluginInterface) pluginTable().Release(std::exchange(_pluginInterface, nullptr));

    // Delivery jobs are the plug-in's code: they must all have run, and been
    // destroyed, before the module goes.
    if (_queue) {
        _queue->drain();
        _queue.reset();
    }
    if (_service != 0) HostDeviceRegistry::shared().remove(std::exchange(_service, 0));
    _device.reset();
    if (_module) {
        if (dlclose(_module) != 0) hostLog().error("dlclose failed: %s", lastLoaderError());
        _module = nullptr;
    }
}

PropertyValue HostEventSystem::copyProperty(const std::string& key)
{
    if (!_serviceInterface) return {};
    return serviceTable().copyProperty(_serviceInterface, key.c_str());
}

bool HostEventSystem::setProperty(const std::string& key, const PropertyValue& value)
{
    if (!_serviceInterface) return false;
    return serviceTable().setProperty(_serviceInterface, key.c_str(), value);
}

HostEventSystem::SubscriptionId HostEventSystem::subscribe(EventSubscriber subscriber)
{
    auto shared = std::make_shared<const EventSubscriber>(std::move(subscriber));
    std::lock_guard<std::mutex> guard(_subscribersLock);
    SubscriptionId id = _nextSubscription++;
    _subscribers.emplace(id, std::move(shared));
    return id;
}

void HostEventSystem::unsubscribe(SubscriptionId id)
{
    std::shared_ptr<const EventSubscriber> removed;  // released after the lock
    std::lock_guard<std::mutex> guard(_subscribersLock);
    auto it = _subscribers.find(id);
    if (it == _subscribers.end()) return;
    removed = std::move(it->second);
    _subscribers.erase(it);
}

void HostEventSystem::drain()
{
    if (_queue) _queue->drain();
}

void HostEventSystem::eventCallback(void* target, void* /*refcon*/, void* /*sender*/, HidEvent* event,
                                    std::uint32_t /*options*/)
{
    if (target && event) static_cast<HostEventSystem*>(target)->deliver(event);
}

void HostEventSystem::deliver(HidEvent* event)
{
    // The callback lends the event for the call only; subscribers may keep
    // what they are given, so they get their own copy of the record.
    HidEventRef shared = std::make_shared<HidEvent>(*event);
    std::vector<std::shared_ptr<const EventSubscriber>> subscribers;
    {
        std::lock_guard<std::mutex> guard(_subscribersLock);
        subscribers.reserve(_subscribers.size());
        for (const auto& [id, subscriber] : _subscribers) subscribers.push_back(subscriber);
    }
    ++_eventsDelivered;
    for (const auto& subscriber : subscribers) (*subscriber)(shared);
}

const PluginInterfaceTable& HostEventSystem::pluginTable() const
{
    return **static_cast<PluginInterfaceTable**>(_pluginInterface);
}

const ServiceInterfaceTable& HostEventSystem::serviceTable() const
{
    return **static_cast<ServiceInterfaceTable**>(_serviceInterface);
}

}  // namespace VeltoHost
