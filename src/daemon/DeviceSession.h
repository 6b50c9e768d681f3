#pragma once

#include "bus/BusService.h"
#include "daemon/HostDeviceControl.h"
#include "daemon/KeyMap.h"
#include "daemon/KeyboardSink.h"
#include "platform/plugin/HostEventSystem.h"
#include "recording/SimulatedDevicePlayer.h"

#include <atomic>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace VeltoHost {

// One touch device served by the system service: its plug-in running in a
// host event system of its own, its object on the bus, its gestures turned
// into key presses.
//
// Events reach the bus and the key map on the host's event queue, so the key
// map, and the keyboard it writes to, belong to that queue's thread; a new
// map is swapped in there, between two events. A keyboard shared by several
// devices is written under the lock the service hands in, one gesture's
// actions at a time, so that two devices never interleave a press and its
// release.
//
// Taken apart in the order that leaves nothing behind (a simulated device's
// player has stopped before): the plug-in is unscheduled (its last events are
// delivered); a key still held is released; the bus object is withdrawn; the
// plug-in is stopped.
class DeviceSession {
public:
    struct Outputs {
        BusService* bus = nullptr;           // null: no bus object
        KeyboardSink* keyboard = nullptr;    // null: no key output (until changeKeys gives one)
        std::mutex* keyboardLock = nullptr;  // shared by every session writing to `keyboard`
        KeyMap::Bindings keys = KeyMap::defaultBindings();
    };

    // Starts the plug-in on `device`; raises std::runtime_error when it cannot
    // be started or served on the bus (the plug-in is stopped again then).
    DeviceSession(std::string name, HostDevice::Ref device, const std::string& pluginPath, Outputs outputs);
    ~DeviceSession();
    DeviceSession(const DeviceSession&) = delete;
    DeviceSession& operator=(const DeviceSession&) = delete;

    // Writes a recording's state frame as the plug-in's property of the same
    // key in the "Pipeline" domain: the writer a SimulatedDevicePlayer of this
    // session's simulated device plays with.
    SimulatedDevicePlayer::StateWriter stateWriter();

    // Replaces the key map, and the keyboard its keys go to, between two of
    // the device's events; returns once done. A key the old map holds down is
    // released first, on the old keyboard (the one it was pressed on), so
    // that a hold in progress cannot leave it down. The old keyboard may go
    // once this returns.
    void changeKeys(const KeyMap::Bindings& keys, KeyboardSink* keyboard);

    const std::string& name() const noexcept { return _name; }
    std::optional<BusService::DeviceId> busId() const noexcept
    {
        const BusService::DeviceId id = _busId.load();
        return id == kNoBusId ? std::nullopt : std::optional(id);
    }
    HostEventSystem& host() noexcept { return _host; }
    HostDeviceControl& control() noexcept { return *_control; }

private:
    void onEvent(const HidEventRef& event);
    void publish(const HidEvent& event, const Gesture& gesture);
    void sendKeys(const KeyMap::Actions& actions);
    void takeApart() noexcept;

    const std::string _name;
    const Outputs _outputs;
    HostEventSystem _host;
    std::shared_ptr<HostDeviceControl> _control;
    static constexpr BusService::DeviceId kNoBusId = ~BusService::DeviceId{0};
    // Set once by the constructor while the host's queue may already deliver.
    std::atomic<BusService::DeviceId> _busId{kNoBusId};
    // A listener that watches every device (ctl events, a match on the
    // service's name) is there before a new device's object: the events of
    // the device's first moments are kept until the object exists and then
    // published after its DeviceAdded, in order. The lock orders publishing
    // against that hand-over.
    std::mutex _publishLock;
    std::vector<GestureFields> _beforeBusObject;  // guarded by _publishLock
    HostEventSystem::SubscriptionId _subscription = 0;
    // The host's event queue only, and the destructor once that is drained.
    KeyMap _keyMap;
    KeyboardSink* _keyboard;
};

}  // namespace VeltoHost
