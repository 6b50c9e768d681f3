#pragma once

#include "host/BusService.h"
#include "host/HostDeviceControl.h"
#include "platform/HostEventSystem.h"
#include "platform/SimulatedHostDevice.h"

#include <memory>
#include <string>
#include <vector>

// One simulated device running the real plug-in module in a HostEventSystem,
// served on a BusService with its events published as signals: the daemon's
// wiring of one device, taken apart again in the daemon's order (events
// stopped, object withdrawn, plug-in stopped).
class AttachedDevice {
public:
    AttachedDevice(VeltoHost::BusService& bus, const std::string& name);
    ~AttachedDevice();
    AttachedDevice(const AttachedDevice&) = delete;
    AttachedDevice& operator=(const AttachedDevice&) = delete;

    // Withdraws the device from the bus (the destructor does it otherwise).
    void detach();

    const VeltoHost::SimulatedHostDevice::Ref& device() const { return _device; }
    VeltoHost::HostEventSystem& host() { return _host; }
    VeltoHost::HostDeviceControl& control() { return *_control; }
    VeltoHost::BusService::DeviceId id() const { return _id; }
    std::string path() const { return VeltoHost::BusService::devicePath(_id); }

    // Plays a recording into the device as fast as the plug-in takes it,
    // state frames written as the daemon writes them; returns once the
    // plug-in has taken every report. Returns the number of reports pushed.
    std::uint64_t play(const std::string& recordingPath);

private:
    VeltoHost::BusService& _bus;
    VeltoHost::SimulatedHostDevice::Ref _device;
    VeltoHost::HostEventSystem _host;
    std::shared_ptr<VeltoHost::HostDeviceControl> _control;
    VeltoHost::BusService::DeviceId _id = 0;
    VeltoHost::HostEventSystem::SubscriptionId _subscription = 0;
    bool _attached = false;
};

// The text of a file (empty when it cannot be read).
std::string readFile(const std::string& path);
