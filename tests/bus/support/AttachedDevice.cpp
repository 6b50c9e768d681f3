#include "AttachedDevice.h"

#include "recording/SimulatedDevicePlayer.h"

#include <fstream>
#include <sstream>

using namespace VeltoHost;

std::string readFile(const std::string& path)
{
    std::ifstream file(path, std::ios::binary);
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

AttachedDevice::AttachedDevice(BusService& bus, const std::string& name) : _device(SimulatedHostDevice::create())
{
    _session.emplace(name, _device, VELTO_SERVICE_MODULE_PATH, DeviceSession::Outputs{&bus, nullptr, nullptr, {}});
    _id = *_session->busId();
}

AttachedDevice::~AttachedDevice() = default;

void AttachedDevice::detach() { _session.reset(); }

std::uint64_t playInto(DeviceSession& session, const SimulatedHostDevice::Ref& device,
                       const VeltoTouch::PipelineRecording& recording)
{
    SimulatedDevicePlayer player(device, session.stateWriter(), [] { return false; }, {.speed = 0});
    for (const VeltoTouch::PipelineRecording::Frame& frame : recording.frames()) player.play(frame);
    player.waitUntilTaken();
    return player.reportsPushed();
}

std::uint64_t AttachedDevice::play(const std::string& recordingPath)
{
    return playInto(*_session, _device, VeltoTouch::PipelineRecording{std::string_view(readFile(recordingPath))});
}
