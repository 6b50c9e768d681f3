#include "AttachedDevice.h"

#include "host/SimulatedDevicePlayer.h"
#include "recording/PipelineRecording.h"

#include <fstream>
#include <sstream>

using namespace VeltoHost;

namespace {

constexpr const char* kFactoryName = "VeltoTouchHIDServiceFactory";
// A recording's state frames carry the pipeline's own keys.
constexpr const char* kPipelineDomain = "Pipeline.";

}  // namespace

std::string readFile(const std::string& path)
{
    std::ifstream file(path, std::ios::binary);
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

AttachedDevice::AttachedDevice(BusService& bus, const std::string& name)
    : _bus(bus), _device(SimulatedHostDevice::create())
{
    _host.start(VELTO_SERVICE_MODULE_PATH, kFactoryName, _device);
    _control = std::make_shared<HostDeviceControl>(name, _host);
    _id = _bus.addDevice(_control);
    _attached = true;
    const BusService::DeviceId id = _id;
    _subscription = _host.subscribe([&bus, id](const HidEventRef& event) { bus.publishEvent(id, event); });
}

AttachedDevice::~AttachedDevice()
{
    detach();
    _host.stop();
}

void AttachedDevice::detach()
{
    if (!_attached) return;
    _attached = false;
    // No delivery may reach the bus service once the object is gone.
    _host.unsubscribe(_subscription);
    _host.drain();
    _bus.removeDevice(_id);
}

std::uint64_t AttachedDevice::play(const std::string& recordingPath)
{
    const std::string text = readFile(recordingPath);
    VeltoTouch::PipelineRecording recording{std::string_view(text)};
    SimulatedDevicePlayer player(
        _device,
        [this](const std::string& key, const PropertyValue& value) {
            _control->setPropertyUnchecked(kPipelineDomain + key, value);
        },
        [] { return false; }, {0.0, 512});
    for (const auto& frame : recording.frames()) player.play(frame);
    player.waitUntilTaken();
    return player.reportsPushed();
}
