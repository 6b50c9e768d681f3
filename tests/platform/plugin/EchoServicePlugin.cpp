// A test plug-in: the smallest HID service that exercises the host side for
// real. It implements both tables, takes its device from the service handle,
// runs an input-report thread with its own event loop, and turns every input
// report into a vendor-defined event (payload = the report bytes) delivered
// on the host's queue. Every table call is written to a call log that the
// tests read through the exported VeltoEchoCallLog.

#include "platform/HidEvent.h"
#include "platform/HostDevice.h"
#include "platform/PluginInterface.h"
#include "platform/PropertyDictionary.h"
#include "platform/RunLoop.h"
#include "platform/InputReportThread.h"
#include "platform/SerialQueue.h"
#include "platform/Thread.h"

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

class EchoService {
public:
    explicit EchoService(bool serveServiceInterface) : _serveServiceInterface(serveServiceInterface)
    {
        ++liveServices;
        logCall("create");
    }
    ~EchoService()
    {
        logCall("dealloc");
        --liveServices;
    }

    VeltoInterfaceRef pluginInterface() { return &_pluginInterface; }

private:
    static EchoService& from(VeltoInterfaceRef self)
    {
        return *static_cast<EchoService*>((*static_cast<void***>(self))[0]);
    }

    static VeltoStatus queryInterface(VeltoInterfaceRef self, VeltoUUID iid, VeltoInterfaceRef* out)
    {
        EchoService& service = from(self);
        logCall("QueryInterface");
        if (iid == kVeltoPluginInterfaceID) {
            *out = &service._pluginInterface;
        } else if (iid == kVeltoHIDServiceInterface2ID && service._serveServiceInterface) {
            *out = &service._serviceInterface;
        } else {
            return kVeltoNoInterface;
        }
        ++service._references;
        return kVeltoSuccess;
    }
    static std::uint32_t addRef(VeltoInterfaceRef self)
    {
        logCall("AddRef");
        return ++from(self)._references;
    }
    static std::uint32_t release(VeltoInterfaceRef self)
    {
        EchoService* service = &from(self);
        logCall("Release");
        std::uint32_t count = --service->_references;
        if (count == 0) delete service;
        return count;
    }
    static VeltoStatus probe(VeltoInterfaceRef, const PropertyValue& properties, std::uint32_t, std::int32_t*)
    {
        logCall("Probe " + properties.description());
        return kVeltoSuccess;
    }
    static VeltoStatus start(VeltoInterfaceRef self, const PropertyValue&, std::uint32_t service)
    {
        logCall("Start");
        from(self)._device = HostDevice::createWithService(service);
        return from(self)._device ? kVeltoSuccess : kVeltoNoResources;
    }
    static VeltoStatus stop(VeltoInterfaceRef self)
    {
        logCall("Stop");
        from(self)._device.reset();
        return kVeltoSuccess;
    }
    static bool open(VeltoInterfaceRef self, std::uint32_t options)
    {
        logCall("open");
        return from(self)._device && from(self)._device->open(options);
    }
    static void close(VeltoInterfaceRef self, std::uint32_t options)
    {
        logCall("close");
        if (from(self)._device) from(self)._device->close(options);
    }
    // Properties are the device's.
    static PropertyValue copyProperty(VeltoInterfaceRef self, const char* key)
    {
        return key && from(self)._device ? from(self)._device->getProperty(key) : PropertyValue();
    }
    static bool setProperty(VeltoInterfaceRef self, const char* key, const PropertyValue& value)
    {
        return key && from(self)._device && from(self)._device->setProperty(key, value);
    }
    static void setEventCallback(VeltoInterfaceRef self, VeltoEventCallback callback, void* target, void* refcon)
    {
        logCall("setEventCallback");
        DispatchInfo& dispatch = from(self)._dispatch;
        dispatch.callback = callback;
        dispatch.target = target;
        dispatch.refcon = refcon;
    }
    static void schedule(VeltoInterfaceRef self, SerialQueue* queue)
    {
        logCall("scheduleWithDispatchQueue");
        EchoService* service = &from(self);
        service->_dispatch.queue = queue ? queue->shared_from_this() : nullptr;
        service->_dispatch.sender = &service->_serviceInterface;
        service->_thread.start("echo.reports", {nullptr,
                                                [service, info = service->_dispatch]() mutable {
                                                    // Moved in: the queue reference is gone before the exit signal.
                                                    service->handleInputReports(std::move(info));
                                                },
                                                nullptr});
    }
    static void unschedule(VeltoInterfaceRef self, SerialQueue*)
    {
        logCall("unscheduleFromDispatchQueue");
        EchoService& service = from(self);
        service._thread.requestStop(kEchoMode);
        service._thread.waitUntilStopped();
        service._dispatch.queue.reset();
    }
    static HidEventRef copyEvent(VeltoInterfaceRef, std::uint32_t, HidEvent*, std::uint32_t) { return nullptr; }
    static VeltoStatus setOutputEvent(VeltoInterfaceRef, HidEvent*) { return kVeltoUnsupported; }

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

    PluginInterfaceTable _pluginTable{this, &queryInterface, &addRef, &release, 1, 0, &probe, &start, &stop};
    ServiceInterfaceTable _serviceTable{this, &queryInterface, &addRef, &release, &open, &close, &copyProperty,
                                        &setProperty, &setEventCallback, &schedule, &unschedule, &copyEvent,
                                        &setOutputEvent};
    // The host's interface pointers are these members' addresses.
    PluginInterfaceTable* _pluginInterface = &_pluginTable;
    ServiceInterfaceTable* _serviceInterface = &_serviceTable;
    std::atomic<std::uint32_t> _references{1};
    const bool _serveServiceInterface;

    // Host thread, or the input-report thread between the handshakes.
    HostDevice::Ref _device;
    InputReportThread _thread;
    DispatchInfo _dispatch;
};

}  // namespace

// The creation's reference is the one the host releases.
VELTO_EXPORT VeltoInterfaceRef VeltoEchoServiceFactory(void*, VeltoUUID typeID)
{
    return typeID == kVeltoHIDServicePluginTypeID ? (new EchoService(true))->pluginInterface() : nullptr;
}

// A plug-in that serves only the plug-in interface, for the host's error path.
VELTO_EXPORT VeltoInterfaceRef VeltoEchoPluginOnlyFactory(void*, VeltoUUID typeID)
{
    return typeID == kVeltoHIDServicePluginTypeID ? (new EchoService(false))->pluginInterface() : nullptr;
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
