#pragma once

#include "bus/BusService.h"
#include "daemon/DeviceSession.h"
#include "platform/devices/SimulatedHostDevice.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

// One simulated device running the real plug-in module, served on a
// BusService: the daemon's own DeviceSession, without key output, with
// recordings played into it on the test's thread.
class AttachedDevice {
public:
    AttachedDevice(VeltoHost::BusService& bus, const std::string& name);
    ~AttachedDevice();
    AttachedDevice(const AttachedDevice&) = delete;
    AttachedDevice& operator=(const AttachedDevice&) = delete;

    // Takes the device apart: its object leaves the bus (the destructor does it otherwise).
    void detach();

    const VeltoHost::SimulatedHostDevice::Ref& device() const { return _device; }
    VeltoHost::HostDeviceControl& control() { return _session->control(); }
    VeltoHost::BusService::DeviceId id() const { return _id; }
    std::string path() const { return VeltoHost::BusService::devicePath(_id); }

    // Plays a recording into the device as fast as the plug-in takes it,
    // state frames written as the daemon writes them; returns once the
    // plug-in has taken every report. Returns the number of reports pushed.
    std::uint64_t play(const std::string& recordingPath);

private:
    VeltoHost::SimulatedHostDevice::Ref _device;
    std::optional<VeltoHost::DeviceSession> _session;
    VeltoHost::BusService::DeviceId _id = 0;
};

// The text of a file (empty when it cannot be read).
std::string readFile(const std::string& path);

// Plays a recording into a session's simulated device as the daemon plays a
// sim file, as fast as the plug-in takes it; returns once the plug-in has
// taken every report (its events may still be on their way), with the number
// of reports pushed.
std::uint64_t playInto(VeltoHost::DeviceSession& session, const VeltoHost::SimulatedHostDevice::Ref& device,
                       const VeltoTouch::PipelineRecording& recording);
