#include "daemon/DeviceSession.h"

#include "service/VeltoTouchHIDServiceFactory.h"

#include <stdexcept>
#include <utility>

namespace VeltoHost {

namespace {

// Events kept for the bus while the device's object is being made: more
// than a few seconds of touches; the object takes milliseconds.
constexpr std::size_t kMaxEventsBeforeBusObject = 256;

}  // namespace

DeviceSession::DeviceSession(std::string name, HostDevice::Ref device, const std::string& pluginPath,
                             Outputs outputs)
    : _name(std::move(name)), _outputs(std::move(outputs)), _keyMap(_outputs.keys), _keyboard(_outputs.keyboard)
{
    // Subscribed before the start, so that a real device's first reports are
    // keyed too. Their events reach the bus once its object exists: a
    // listener to every device may well be there already (a surface that
    // resets as it is plugged in sends its reset at once).
    _subscription = _host.subscribe([this](const HidEventRef& event) { onEvent(event); });
    _host.start(pluginPath, kVeltoTouchHIDServiceFactoryName, std::move(device));
    _control = std::make_shared<HostDeviceControl>(_name, _host);
    if (!_outputs.bus) return;
    try {
        const BusService::DeviceId id = _outputs.bus->addDevice(_control);
        std::lock_guard guard(_publishLock);
        for (GestureFields& fields : _beforeBusObject) _outputs.bus->publishEvent(id, std::move(fields));
        _beforeBusObject.clear();
        _busId = id;
    } catch (...) {
        // Stopped while the members its deliveries use still exist.
        _host.stop();
        throw;
    }
}

DeviceSession::~DeviceSession() { takeApart(); }

void DeviceSession::takeApart() noexcept
{
    // Every event the plug-in sent has been published and keyed when this returns.
    _host.unschedule();
    _host.unsubscribe(_subscription);
    sendKeys(_keyMap.releaseAll());
    if (const auto id = busId()) _outputs.bus->removeDevice(*id);
    _host.stop();
}

void DeviceSession::changeKeys(const KeyMap::Bindings& keys, KeyboardSink* keyboard)
{
    auto swap = [this, &keys, keyboard] {
        sendKeys(_keyMap.releaseAll());
        _keyMap = KeyMap(keys);
        _keyboard = keyboard;
    };
    const SerialQueue::Ref& queue = _host.queue();
    if (!queue) return swap();  // not running: no event can arrive
    queue->async(swap);
    queue->drain();
}

SimulatedDevicePlayer::StateWriter DeviceSession::stateWriter()
{
    return [this](const std::string& key, const PropertyValue& value) {
        _control->setPropertyUnchecked(std::string(SimulatedDevicePlayer::kStateDomain) + key, value);
    };
}

// Each event is decoded once, here: its gesture presses the keys and, with
// its numbers, makes the bus signal.
void DeviceSession::onEvent(const HidEventRef& event)
{
    const Gesture gesture = Gesture::of(*event);
    publish(*event, gesture);
    sendKeys(_keyMap.handle(gesture));
}

void DeviceSession::publish(const HidEvent& event, const Gesture& gesture)
{
    if (!_outputs.bus) return;
    GestureFields fields = GestureFields::of(event, gesture);
    std::lock_guard guard(_publishLock);
    if (const auto id = busId()) {
        _outputs.bus->publishEvent(*id, std::move(fields));
    } else if (_beforeBusObject.size() < kMaxEventsBeforeBusObject) {
        _beforeBusObject.push_back(std::move(fields));
    }
}

void DeviceSession::sendKeys(const KeyMap::Actions& actions)
{
    if (actions.empty() || !_keyboard) return;
    std::unique_lock<std::mutex> guard;
    if (_outputs.keyboardLock) guard = std::unique_lock(*_outputs.keyboardLock);
    _keyboard->play(actions);
}

}  // namespace VeltoHost
