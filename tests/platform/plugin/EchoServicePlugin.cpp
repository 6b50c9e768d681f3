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
#include "platform/Semaphore.h"
#include "platform/SerialQueue.h"
#include "platform/Thread.h"

#include <atomic>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#define VELTO_EXPORT extern "C" __attribute__((visibility("default")))

using namespace VeltoHost;

namespace {

constexpr const char* kEchoMode = "EchoServiceMode";
constexpr std::size_t kReportBufferSize = 512;
constexpr std::uint32_t kEchoUsagePage = 0xFF00;

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
    explicit EchoService(bool serveServiceInterface);
    ~EchoService();

    VeltoInterfaceRef pluginInterface() { return &_pluginInterface; }
    VeltoInterfaceRef serviceInterface() { return &_serviceInterface; }

    static EchoService* from(VeltoInterfaceRef self) { return static_cast<EchoService*>((*static_cast<void***>(self))[0]); }

    static VeltoStatus queryInterface(VeltoInterfaceRef self, VeltoUUID iid, VeltoInterfaceRef* out);
    static std::uint32_t addRef(VeltoInterfaceRef self);
    static std::uint32_t release(VeltoInterfaceRef self);
    static VeltoStatus probe(VeltoInterfaceRef self, const PropertyValue& properties, std::uint32_t service,
                             std::int32_t* outScore);
    static VeltoStatus start(VeltoInterfaceRef self, const PropertyValue& properties, std::uint32_t service);
    static VeltoStatus stop(VeltoInterfaceRef self);
    static bool open(VeltoInterfaceRef self, std::uint32_t options);
    static void close(VeltoInterfaceRef self, std::uint32_t options);
    static PropertyValue copyProperty(VeltoInterfaceRef self, const char* key);
    static bool setProperty(VeltoInterfaceRef self, const char* key, const PropertyValue& value);
    static void setEventCallback(VeltoInterfaceRef self, VeltoEventCallback callback, void* target, void* refcon);
    static void schedule(VeltoInterfaceRef self, SerialQueue* queue);
    static void unschedule(VeltoInterfaceRef self, SerialQueue* queue);
    static HidEventRef copyEvent(VeltoInterfaceRef self, std::uint32_t, HidEvent*, std::uint32_t);
    static VeltoStatus setOutputEvent(VeltoInterfaceRef self, HidEvent*);

private:
    void handleInputReports(DispatchInfo info);
    static void reportCallback(void* context, std::int32_t result, void* sender, HidReportType type,
                               std::uint32_t reportID, std::uint8_t* report, std::size_t length,
                               std::uint64_t timeStamp);

    PluginInterfaceTable* _pluginInterface;
    ServiceInterfaceTable* _serviceInterface;
    std::atomic<std::uint32_t> _references{1};
    const bool _serveServiceInterface;

    // Host thread, or the input-report thread between the handshakes.
    HostDevice::Ref _device;
    RunLoop::Ref _runLoop;
    Semaphore::Ref _threadSignal;
    DispatchInfo _dispatch;
    std::mutex _propertiesLock;
    std::map<std::string, PropertyValue> _ownProperties;  // guarded by _propertiesLock
};

EchoService::EchoService(bool serveServiceInterface)
    : _pluginInterface(new PluginInterfaceTable{this, &queryInterface, &addRef, &release, 1, 0, &probe, &start, &stop}),
      _serviceInterface(new ServiceInterfaceTable{this, &queryInterface, &addRef, &release, &open, &close,
                                                  &copyProperty, &setProperty, &setEventCallback, &schedule,
                                                  &unschedule, &copyEvent, &setOutputEvent}),
      _serveServiceInterface(serveServiceInterface)
{
    ++liveServices;
    logCall("create");
}

EchoService::~EchoService()
{
    logCall("dealloc");
    delete _pluginInterface;
    delete _serviceInterface;
    --liveServices;
}

VeltoStatus EchoService::queryInterface(VeltoInterfaceRef self, VeltoUUID iid, VeltoInterfaceRef* out)
{
    EchoService* service = from(self);
    logCall("QueryInterface");
    if (iid == kVeltoPluginInterfaceID) {
        *out = service->pluginInterface();
    } else if (iid == kVeltoHIDServiceInterface2ID && service->_serveServiceInterface) {
        *out = service->serviceInterface();
    } else {
        return kVeltoNoInterface;
    }
    ++service->_references;
    return kVeltoSuccess;
}

std::uint32_t EchoService::addRef(VeltoInterfaceRef self)
{
    logCall("AddRef");
    return ++from(self)->_references;
}

std::uint32_t EchoService::release(VeltoInterfaceRef self)
{
    EchoService* service = from(self);
    logCall("Release");
    std::uint32_t count = --service->_references;
    if (count == 0) delete service;
    return count;
}

VeltoStatus EchoService::probe(VeltoInterfaceRef, const PropertyValue& properties, std::uint32_t, std::int32_t*)
{
    logCall("Probe " + properties.description());
    return kVeltoSuccess;
}

VeltoStatus EchoService::start(VeltoInterfaceRef self, const PropertyValue&, std::uint32_t service)
{
    logCall("Start");
    from(self)->_device = HostDevice::createWithService(service);
    return from(self)->_device ? kVeltoSuccess : kVeltoNoResources;
}

VeltoStatus EchoService::stop(VeltoInterfaceRef self)
{
    logCall("Stop");
    from(self)->_device.reset();
    return kVeltoSuccess;
}

bool EchoService::open(VeltoInterfaceRef self, std::uint32_t options)
{
    logCall("open");
    EchoService* service = from(self);
    return service->_device && service->_device->open(options);
}

void EchoService::close(VeltoInterfaceRef self, std::uint32_t options)
{
    logCall("close");
    if (from(self)->_device) from(self)->_device->close(options);
}

PropertyValue EchoService::copyProperty(VeltoInterfaceRef self, const char* key)
{
    EchoService* service = from(self);
    if (!key) return {};
    std::string text = key;
    if (text == "CallLog") {
        std::lock_guard<std::mutex> guard(callLogLock);
        PropertyValue::Array calls;
        for (const std::string& call : callLog) calls.push_back(PropertyValue::string(call));
        return PropertyValue::array(std::move(calls));
    }
    {
        std::lock_guard<std::mutex> guard(service->_propertiesLock);
        if (auto it = service->_ownProperties.find(text); it != service->_ownProperties.end()) return it->second;
    }
    return service->_device ? service->_device->getProperty(text) : PropertyValue();
}

bool EchoService::setProperty(VeltoInterfaceRef self, const char* key, const PropertyValue& value)
{
    EchoService* service = from(self);
    if (!key) return false;
    std::string text = key;
    if (text.rfind("Echo.", 0) == 0) {
        std::lock_guard<std::mutex> guard(service->_propertiesLock);
        service->_ownProperties[text] = value;
        return true;
    }
    return service->_device && service->_device->setProperty(text, value);
}

void EchoService::setEventCallback(VeltoInterfaceRef self, VeltoEventCallback callback, void* target, void* refcon)
{
    logCall("setEventCallback");
    EchoService* service = from(self);
    service->_dispatch.callback = callback;
    service->_dispatch.target = target;
    service->_dispatch.refcon = refcon;
}

void EchoService::schedule(VeltoInterfaceRef self, SerialQueue* queue)
{
    logCall("scheduleWithDispatchQueue");
    EchoService* service = from(self);
    service->_dispatch.queue = queue ? queue->shared_from_this() : nullptr;
    service->_dispatch.sender = service->serviceInterface();
    service->_threadSignal = Semaphore::create(0);
    Thread::startDetached(
        [service, info = service->_dispatch]() mutable {
            service->_runLoop = RunLoop::current();
            Semaphore::Ref signal = service->_threadSignal;
            signal->signal();
            // Moved in: the queue reference is gone before the exit signal.
            service->handleInputReports(std::move(info));
            signal->signal();
        },
        "echo.reports");
    service->_threadSignal->wait();
}

void EchoService::unschedule(VeltoInterfaceRef self, SerialQueue*)
{
    logCall("unscheduleFromDispatchQueue");
    EchoService* service = from(self);
    if (service->_runLoop) {
        service->_runLoop->performJob(kEchoMode, [] { RunLoop::stopCurrent(); });
        service->_runLoop->wakeUp();
        service->_runLoop.reset();
        service->_threadSignal->wait();
        service->_threadSignal.reset();
    }
    service->_dispatch.queue.reset();
}

HidEventRef EchoService::copyEvent(VeltoInterfaceRef, std::uint32_t, HidEvent*, std::uint32_t)
{
    return nullptr;
}

VeltoStatus EchoService::setOutputEvent(VeltoInterfaceRef, HidEvent*)
{
    return kVeltoUnsupported;
}

struct ReportContext {
    DispatchInfo info;
};

void EchoService::handleInputReports(DispatchInfo info)
{
    std::vector<std::uint8_t> buffer(kReportBufferSize);
    ReportContext context{std::move(info)};
    RunLoop::Ref loop = RunLoop::current();
    _device->registerInputReportWithTimeStampCallback(buffer.data(), buffer.size(), &reportCallback, &context);
    _device->scheduleWithRunLoop(loop, kEchoMode);
    while (RunLoop::run(kEchoMode, std::nullopt, true) == RunLoop::RunResult::HandledSource) {
    }
    _device->unscheduleFromRunLoop(loop, kEchoMode);
    _device->registerInputReportWithTimeStampCallback(buffer.data(), buffer.size(), nullptr, nullptr);
}

void EchoService::reportCallback(void* context, std::int32_t, void*, HidReportType, std::uint32_t reportID,
                                 std::uint8_t* report, std::size_t length, std::uint64_t timeStamp)
{
    const DispatchInfo& info = static_cast<ReportContext*>(context)->info;
    if (!info.queue || !info.callback) return;
    HidEventRef event =
        HidEvent::createVendorDefinedEvent(timeStamp, kEchoUsagePage, reportID, 0, report, length, 0);
    info.queue->async([info, event] { info.callback(info.target, info.refcon, info.sender, event.get(), 0); });
}

VeltoInterfaceRef createService(VeltoUUID typeID, bool serveServiceInterface)
{
    if (!(typeID == kVeltoHIDServicePluginTypeID)) return nullptr;
    auto* service = new EchoService(serveServiceInterface);
    return service->pluginInterface();  // the creation's reference is the one the host releases
}

}  // namespace

VELTO_EXPORT VeltoInterfaceRef VeltoEchoServiceFactory(void*, VeltoUUID typeID)
{
    return createService(typeID, true);
}

// A plug-in that serves only the plug-in interface, for the host's error path.
VELTO_EXPORT VeltoInterfaceRef VeltoEchoPluginOnlyFactory(void*, VeltoUUID typeID)
{
    return createService(typeID, false);
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
