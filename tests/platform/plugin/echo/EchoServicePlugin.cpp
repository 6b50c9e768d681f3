// A test plug-in: the smallest HID service that exercises the host side for
// real. Built on the platform's service base, it takes its device from the service handle,
// runs an input-report thread with its own event loop, and turns every input
// report into a vendor-defined event (payload = the report bytes) delivered
// on the host's queue. Every operation is written to a call log that the
// tests read through the exported VeltoEchoCallLog.

#include "platform/devices/HostDevice.h"
#include "platform/plugin/HidEvent.h"
#include "platform/plugin/InputReportThread.h"
#include "platform/plugin/PluginInterface.h"
#include "platform/plugin/VeltoHIDService.h"
#include "platform/runtime/RunLoop.h"
#include "platform/runtime/SerialQueue.h"
#include "platform/values/PropertyDictionary.h"

#include <atomic>
#include <mutex>
#include <string>
#include <vector>

#define VELTO_EXPORT extern "C" __attribute__((visibility("default")))

using namespace VeltoHost;

namespace {

constexpr const char* kEchoMode = "EchoServiceMode";

std::mutex callLogLock;
std::vector<std::string> callLog;  // guarded by callLogLock
std::atomic<int> liveServices{0};

void logCall(std::string call)
{
    std::lock_guard<std::mutex> guard(callLogLock);
    callLog.push_back(std::move(call));
}

struct DispatchInfo {
    SerialQueue::Ref queue;
    VeltoEventCallback callback = nullptr;
    void* target = nullptr;
    void* refcon = nullptr;
    void* sender = nullptr;
};

class EchoService final : public VeltoHIDService {
public:
    EchoService()
    {
        ++liveServices;
        logCall("create");
    }
    ~EchoService() override
    {
        logCall("dealloc");
        --liveServices;
    }

    VeltoStatus probeWithService(std::uint32_t, const PropertyValue& properties, std::int32_t*) override
    {
        logCall("Probe " + properties.description());
        return kVeltoSuccess;
    }
    VeltoStatus startWithService(std::uint32_t service, const PropertyValue&) override
    {
        logCall("Start");
        _device = HostDevice::createWithService(service);
        return _device ? kVeltoSuccess : kVeltoNoResources;
    }
    VeltoStatus stop() override
    {
        logCall("Stop");
        _device.reset();
        return kVeltoSuccess;
    }
    bool openWithOptions(std::uint32_t options) override
    {
        logCall("open");
        return _device && _device->open(options);
    }
    void closeWithOptions(std::uint32_t options) override
    {
        logCall("close");
        if (_device) _device->close(options);
    }
    // Properties are the device's.
    PropertyValue getPropertyForKey(const char* key) override
    {
        return key && _device ? _device->getProperty(key) : PropertyValue();
    }
    bool setProperty(const PropertyValue& value, const char* key) override
    {
        return key && _device && _device->setProperty(key, value);
    }
    void setEventCallback(VeltoEventCallback callback, void* target, void* refcon) override
    {
        logCall("setEventCallback");
        _dispatch.callback = callback;
        _dispatch.target = target;
        _dispatch.refcon = refcon;
    }
    void scheduleWithDispatchQueue(const SerialQueue::Ref& queue) override
    {
        logCall("scheduleWithDispatchQueue");
        _dispatch.queue = queue;
        _dispatch.sender = getServiceInterface();
        // Moved in: the queue reference is gone before the exit signal.
        _thread.start("echo.reports",
                      {nullptr, [this, info = _dispatch]() mutable { handleInputReports(std::move(info)); }, nullptr});
    }
    void unscheduleWithDispatchQueue(const SerialQueue::Ref&) override
    {
        logCall("unscheduleFromDispatchQueue");
        _thread.requestStop(kEchoMode);
        _thread.waitUntilStopped();
        _dispatch.queue.reset();
    }

private:
    void handleInputReports(DispatchInfo info)
    {
        std::vector<std::uint8_t> buffer(512);
        RunLoop::Ref loop = RunLoop::current();
        _device->registerInputReportWithTimeStampCallback(buffer.data(), buffer.size(), &reportCallback, &info);
        _device->scheduleWithRunLoop(loop, kEchoMode);
        while (RunLoop::run(kEchoMode, std::nullopt, true) == RunLoop::RunResult::HandledSource) {
        }
        _device->unscheduleFromRunLoop(loop, kEchoMode);
        _device->registerInputReportWithTimeStampCallback(buffer.data(), buffer.size(), nullptr, nullptr);
    }
    static void reportCallback(void* context, std::int32_t, void*, HidReportType, std::uint32_t reportID,
                               std::uint8_t* report, std::size_t length, std::uint64_t timeStamp)
    {
        const DispatchInfo& info = *static_cast<DispatchInfo*>(context);
        if (!info.queue || !info.callback) return;
        HidEventRef event = HidEvent::createVendorDefinedEvent(timeStamp, 0xFF00, reportID, 0, report, length, 0);
        info.queue->async([info, event] { info.callback(info.target, info.refcon, info.sender, event.get(), 0); });
    }

    // Host thread, or the input-report thread between the handshakes.
    HostDevice::Ref _device;
    InputReportThread _thread;
    DispatchInfo _dispatch;
};

// A plug-in that answers only for its plug-in interface, for the host's
// error path: the host must refuse it and release it.
class PluginOnly {
public:
    PluginOnly() { ++liveServices; }
    ~PluginOnly() { --liveServices; }
    VeltoInterfaceRef pluginInterface() { return &_interface; }

private:
    static PluginOnly& from(VeltoInterfaceRef self)
    {
        return *static_cast<PluginOnly*>((*static_cast<PluginInterfaceTable**>(self))->reserved);
    }
    static VeltoStatus query(VeltoInterfaceRef self, VeltoUUID iid, VeltoInterfaceRef* out)
    {
        if (iid != kVeltoPluginInterfaceID) return kVeltoNoInterface;
        *out = self;
        addRef(self);
        return kVeltoSuccess;
    }
    static std::uint32_t addRef(VeltoInterfaceRef self) { return ++from(self)._references; }
    static std::uint32_t release(VeltoInterfaceRef self)
    {
        PluginOnly* plugin = &from(self);
        const std::uint32_t count = --plugin->_references;
        if (count == 0) delete plugin;
        return count;
    }

    PluginInterfaceTable _table{this, &query, &addRef, &release, 1, 0, nullptr, nullptr, nullptr};
    PluginInterfaceTable* _interface = &_table;
    std::uint32_t _references = 1;
};

}  // namespace

// The creation's reference is the one the host releases.
VELTO_EXPORT VeltoInterfaceRef VeltoEchoServiceFactory(void*, VeltoUUID typeID)
{
    return typeID == kVeltoHIDServicePluginTypeID ? (new EchoService)->getPluginInterface() : nullptr;
}

// A plug-in that serves only the plug-in interface, for the host's error path.
VELTO_EXPORT VeltoInterfaceRef VeltoEchoPluginOnlyFactory(void*, VeltoUUID typeID)
{
    return typeID == kVeltoHIDServicePluginTypeID ? (new PluginOnly)->pluginInterface() : nullptr;
}

VELTO_EXPORT int VeltoEchoLiveServices()
{
    return liveServices.load();
}

VELTO_EXPORT void VeltoEchoCallLog(std::vector<std::string>* out)
{
    std::lock_guard<std::mutex> guard(callLogLock);
    *out = callLog;
}

VELTO_EXPORT void VeltoEchoClearCallLog()
{
    std::lock_guard<std::mutex> guard(callLogLock);
    callLog.clear();
}
