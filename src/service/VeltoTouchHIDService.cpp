#include "service/VeltoTouchHIDService.h"

#include "service/ServicePropertyKey.h"

#include "platform/log/LogFormat.h"
#include "platform/log/Trace.h"
#include "platform/plugin/HidEvent.h"
#include "platform/runtime/Thread.h"
#include "platform/values/PropertyDictionary.h"
#include "records/DomainKey.h"
#include "records/FeatureReport.h"
#include "records/HexText.h"
#include "records/InputReport.h"

#include <algorithm>
#include <memory>
#include <optional>
#include <utility>
#include <vector>

namespace VeltoTouch {

using namespace VeltoHost;

namespace {

// Runs on the host's queue: one job per report's batch of events. The job
// owns its copy of the events; it never touches the pipeline.
void deliverEvents(const VeltoTouchHIDService::DispatchEventInfo& info, const HidEventList& events, const Log& log)
{
    Trace::emit(VeltoTouchHIDService::kTraceDispatchBatch, events.size(), 0, 0, 0);
    log.debug("Dispatch %ju event(s) land", events.size());
    // Events may flow before the host set a callback (it set none before
    // scheduling); with nobody to hand them to, the batch is dropped here.
    if (!info.callback) return;
    for (const HidEventRef& entry : events) {
        HidEventRef event = entry;
        Trace::emit(VeltoTouchHIDService::kTraceDispatchEvent, static_cast<std::uint32_t>(event->type()),
                    static_cast<std::uint32_t>(event->phase()), 0, 0);
        log.log("Dispatch event: %@", event);
        info.callback(info.target, info.refcon, info.sender, event.get(), 0);
    }
}

// The output probe: runs on the input-report thread under the pipeline lock,
// so it only copies references and hands one job to the host's queue.
void dispatchEvents(const VeltoTouchHIDService::DispatchEventInfo& info, const HidEventList& events,
                    const std::shared_ptr<const Log>& log)
{
    HidEventList batch(events);
    log->debug("HID events probe: %ju event(s)", batch.size());
    if (batch.empty()) return;
    log->debug("Dispatch %ju event(s) takeoff", batch.size());
    if (!info.queue) return;
    // The job owns its events and its own reference to the queue, so batches
    // still queued deliver after the thread has ended and the service has
    // dropped the queue.
    info.queue->async([info, batch = std::move(batch), log] { deliverEvents(info, batch, *log); });
}

std::uint64_t reportByte(const std::uint8_t* report, std::size_t length, std::size_t index)
{
    return index < length ? report[index] : 0;
}

bool isNull(const PropertyValue& value) { return !value.hasValue() || value.isNull(); }

}  // namespace

VeltoTouchHIDService::VeltoTouchHIDService()
    : _log("HIDService"), _pipeline(std::make_shared<Pipeline>())
{
    _recording.pipeline = _pipeline;
    _recording.setMaxFrameCount(kRecordingMaxFrameCount);
}

VeltoTouchHIDService::~VeltoTouchHIDService()
{
    _log.debug("%@", "dealloc");
    if (_inputReportThread.running()) {
        // The host unschedules before its last release. Should it not have,
        // the thread must still not outlive the object it works on.
        _inputReportThread.requestStop(kHandleInputReportsRunLoopMode);
        _inputReportThread.waitUntilStopped();
    }
    _veltoDevice.reset();
}

// ---- Lifecycle ----

VeltoStatus VeltoTouchHIDService::probeWithService(std::uint32_t, const PropertyValue&, std::int32_t*)
{
    _log.debug("%@", "probeWithService:properties:outScore:");
    return kVeltoSuccess;
}

VeltoStatus VeltoTouchHIDService::startWithService(std::uint32_t service, const PropertyValue&)
{
    _log.debug("%@", "startWithService:properties:");
    _veltoDevice = HostDevice::createWithService(service);
    return _veltoDevice ? kVeltoSuccess : kVeltoNoResources;
}

VeltoStatus VeltoTouchHIDService::stop()
{
    _log.debug("%@", "stop");
    _veltoDevice.reset();
    return kVeltoSuccess;
}

bool VeltoTouchHIDService::openWithOptions(std::uint32_t options)
{
    _log.debug("openWithOptions:%jx", options);
    return _veltoDevice && _veltoDevice->open(options);
}

void VeltoTouchHIDService::closeWithOptions(std::uint32_t options)
{
    _log.debug("closeWithOptions:%jx", options);
    if (_veltoDevice) _veltoDevice->close(options);
}

HidEventRef VeltoTouchHIDService::copyEventWithType(std::uint32_t, HidEvent*, std::uint32_t)
{
    _log.debug("%@", "copyEventWithType:matching:options:");
    return nullptr;
}

VeltoStatus VeltoTouchHIDService::setOutputEvent(HidEvent*)
{
    _log.debug("%@", "setOutputEvent:");
    return kVeltoUnsupported;
}

void VeltoTouchHIDService::setEventCallback(VeltoEventCallback callback, void* target, void* refcon)
{
    _log.debug("%@", "setEventCallback:target:refcon:");
    _dispatchEventInfo.callback = callback;
    _dispatchEventInfo.target = target;
    _dispatchEventInfo.refcon = refcon;
}

// ---- Input report thread ----

void VeltoTouchHIDService::scheduleWithDispatchQueue(const SerialQueue::Ref& queue)
{
    _log.debug("%@", "scheduleWithDispatchQueue:");
    _dispatchEventInfo.queue = queue;
    _dispatchEventInfo.sender = getServiceInterface();
    // The thread gets its own references to the device and the queue so that
    // it never reads members the host thread may change meanwhile; they go
    // with its run step, before unscheduling hears that the thread is done.
    // The service may be destroyed as soon as that is heard, so the last line
    // goes through a copy of the log handle.
    const Log log = _log;
    const bool started = _inputReportThread.start(
        "VeltoInputReport",
        {[log] { log.debug("input report thread start"); },
         [this, info = _dispatchEventInfo, device = _veltoDevice]() mutable {
             handleInputReports(std::move(info), std::move(device));
         },
         [log] { log.debug("input report thread end"); }});
    if (!started) {
        // The service stays unscheduled (no event loop, no handshake), so a
        // later unschedule, stop or release has nothing to wait for either.
        _log.error("input report thread could not be started; no reports will be received");
        _dispatchEventInfo.queue.reset();
    }
}

void VeltoTouchHIDService::handleInputReports(DispatchEventInfo info, HostDevice::Ref device)
{
    if (int error = Thread::setCurrentScheduling(kInputReportThreadPolicy, kInputReportThreadPriority)) {
        _log.error("pthread_setschedparam failed: %d", error);
    }

    auto reportFunction = std::make_unique<ReportFunction>(
        [this](HidReportType type, std::uint8_t reportID, const std::uint8_t* report, std::size_t reportLength,
               std::uint64_t timeStamp) {
            _log.debug("Received input report (type %ju, reportID %ju, reportLength %ju, timestampMach %ju)",
                       static_cast<std::uint32_t>(type), reportID, reportLength, timeStamp);
            handleInputReport(report, reportLength, timeStamp);
        });

    installPipelineProbes(info);

    std::vector<std::uint8_t> reportBuffer(kInputReportBufferSize);
    RunLoop::Ref runLoop = RunLoop::current();
    if (device) {
        device->registerInputReportWithTimeStampCallback(reportBuffer.data(), reportBuffer.size(),
                                                         inputReportCallback, reportFunction.get());
        device->scheduleWithRunLoop(runLoop, kHandleInputReportsRunLoopMode);
    }

    RunLoop::RunResult result;
    do {
        result = RunLoop::run(kHandleInputReportsRunLoopMode, std::nullopt, true);
    } while (result == RunLoop::RunResult::HandledSource);

    if (device) {
        device->unscheduleFromRunLoop(runLoop, kHandleInputReportsRunLoopMode);
        device->registerInputReportWithTimeStampCallback(reportBuffer.data(), reportBuffer.size(), nullptr, nullptr);
    }

    clearPipelineProbes();
}

void VeltoTouchHIDService::inputReportCallback(void* context, std::int32_t, void*, HidReportType type,
                                               std::uint32_t reportID, std::uint8_t* report, std::size_t reportLength,
                                               std::uint64_t timeStamp)
{
    auto& reportFunction = *static_cast<ReportFunction*>(context);
    reportFunction(type, static_cast<std::uint8_t>(reportID), report, reportLength, timeStamp);
}

void VeltoTouchHIDService::handleInputReport(const std::uint8_t* report, std::size_t reportLength,
                                             std::uint64_t timeStamp)
{
    std::lock_guard<std::mutex> lock(_pipelineLock);
    // The device's own stamp, taken as the report was read: the recording
    // and the pipeline see when it came, not when its turn came.
    _recording.handleInputReportAt(timeStamp, report, reportLength);
}

void VeltoTouchHIDService::installPipelineProbes(const DispatchEventInfo& info)
{
    // Delivery jobs may run after the service is gone, so they share their
    // own log handle; the other probes run only while the thread (and so the
    // service) lives.
    auto jobLog = std::make_shared<const Log>(_log);
    const Log* log = &_log;
    std::lock_guard<std::mutex> lock(_pipelineLock);
    Pipeline& pipeline = *_pipeline;
    pipeline.inputReportProbe = [log](const std::uint8_t* report, std::size_t length) {
        Trace::emit(kTraceInputReport, reportByte(report, length, 0), reportByte(report, length, 1),
                    reportByte(report, length, 2), reportByte(report, length, 3));
        log->debug("Input report probe");
    };
    pipeline.invalidInputReportProbe = [log](const std::uint8_t* report, std::size_t length) {
        if (length != 0) {
            log->debug("Invalid input report with ID %ju", report[0]);
        } else {
            log->debug("Invalid input report len==0");
        }
    };
    pipeline.firmwareEventProbe = [log](const InputReport::FirmwareEvent& event) {
        Trace::emit(kTraceFirmwareEvent, event.event, event.contextValue(), 0, 0);
        log->log("Firmware event probe; event: %jx, context: %jx", event.event, event.contextValue());
    };
    pipeline.imageProbe = [log](const InputReport::Image& image) {
        log->log("Received image frame: %ju", image.frameNumber);
    };
    pipeline.disjointImageProbe = [log](std::uint32_t previousFrameNumber, const InputReport::Image& image) {
        log->error("Disjoint image (frame number: %ju -> %ju)\n\n", previousFrameNumber, image.frameNumber);
    };
    pipeline.hidEventsProbe = [info, jobLog](const HidEventList& events) { dispatchEvents(info, events, jobLog); };
}

void VeltoTouchHIDService::clearPipelineProbes()
{
    std::lock_guard<std::mutex> lock(_pipelineLock);
    Pipeline& pipeline = *_pipeline;
    pipeline.inputReportProbe = nullptr;
    pipeline.invalidInputReportProbe = nullptr;
    pipeline.firmwareEventProbe = nullptr;
    pipeline.imageProbe = nullptr;
    pipeline.disjointImageProbe = nullptr;
    pipeline.hidEventsProbe = nullptr;
}

void VeltoTouchHIDService::unscheduleWithDispatchQueue(const SerialQueue::Ref&)
{
    _log.debug("%@", "unscheduleWithDispatchQueue:");
    if (_inputReportThread.running()) {
        _log.debug("signalling input report thread to exit");
        _inputReportThread.requestStop(kHandleInputReportsRunLoopMode);
        _log.debug("waiting for input report thread to exit");
        _inputReportThread.waitUntilStopped();
        _log.debug("input report thread exited");
    }
    _dispatchEventInfo.queue.reset();
}

// ---- Properties ----

PropertyValue VeltoTouchHIDService::getPropertyForKey(const char* key)
{
    _log.debug("getPropertyForKey:%@", key);
    if (!key) return {};
    std::string name = key;
    if (Util::stripDomainFromKey(name, kPipelineDomain)) return copyPipelineState(name);
    if (name == "Version") {
        static const PropertyValue version = PropertyValue::array({PropertyValue::int32(kServicePluginVersion[0]),
                                                                   PropertyValue::int32(kServicePluginVersion[1]),
                                                                   PropertyValue::int32(kServicePluginVersion[2])});
        return version;
    }
    if (name == "FirmwareDebugReports") return copyFirmwareDebugReports();
    if (name == "FactoryResetHoldDuration") return copyFactoryResetHoldDuration();
    if (name == "Recording") return copyRecording();
    if (name != "ServicePluginDebug") {
        if (!_veltoDevice) return {};
        PropertyValue value = _veltoDevice->getProperty(name);
        return isNull(value) ? PropertyValue() : value;
    }
    return copyServicePluginDebug();
}

bool VeltoTouchHIDService::setProperty(const PropertyValue& value, const char* key)
{
    _log.debug("setProperty:%@ forKey:%@", value, key);
    if (!key) return false;
    std::string name = key;
    if (Util::stripDomainFromKey(name, kPipelineDomain)) {
        std::lock_guard<std::mutex> lock(_pipelineLock);
        _recording.setState(name, value);
        return true;
    }
    return _veltoDevice && _veltoDevice->setProperty(name, value);
}

PropertyValue VeltoTouchHIDService::copyPipelineState(const std::string& key)
{
    PropertyValue value;
    {
        std::lock_guard<std::mutex> lock(_pipelineLock);
        value = _pipeline->getState(key);
    }
    // The host knows one null; an unknown key answers with no value at all.
    return isNull(value) ? PropertyValue() : value;
}

PropertyValue VeltoTouchHIDService::copyFirmwareDebugReports()
{
    PropertyDictionary reports;
    std::array<std::uint8_t, kFirmwareDebugReportBufferSize> buffer{};
    for (std::uint8_t reportID : kFirmwareDebugReportIDs) {
        std::size_t length = buffer.size();
        std::int32_t status = _veltoDevice
                                  ? _veltoDevice->getReport(HidReportType::Feature, reportID, buffer.data(), length)
                                  : kHostDeviceNoDevice;
        std::string entryKey = formatLog("0x%02jx", reportID);
        if (status != kHostDeviceSuccess) {
            reports.set(std::move(entryKey), PropertyValue::string(formatLog("Failed to get report ID 0x%jx: 0x%jx",
                                                                             reportID,
                                                                             static_cast<std::uint32_t>(status))));
        } else {
            reports.set(std::move(entryKey),
                        PropertyValue::string(Util::hexStringFromBytes(buffer.data(), std::min(length, buffer.size()))));
        }
    }
    return PropertyValue::dictionary(std::move(reports));
}

PropertyValue VeltoTouchHIDService::copyFactoryResetHoldDuration()
{
    if (!_veltoDevice) return {};
    std::array<std::uint8_t, kFactoryResetHoldDurationBufferSize> buffer{};
    std::size_t length = buffer.size();
    if (_veltoDevice->getReport(HidReportType::Feature, FeatureReport::FactoryResetHoldDuration::kReportID,
                                buffer.data(), length) != kHostDeviceSuccess) {
        return {};
    }
    auto report = FeatureReport::FactoryResetHoldDuration::parse(buffer.data(), std::min(length, buffer.size()));
    if (!report) return {};
    return PropertyValue::uint32(report->holdDuration);
}

PropertyValue VeltoTouchHIDService::copyRecording()
{
    std::optional<PipelineRecording> copy;
    {
        // Only the copy is made under the lock; writing the JSON text, which
        // takes far longer, must not hold up the input-report thread.
        std::lock_guard<std::mutex> lock(_pipelineLock);
        copy.emplace(_recording);
    }
    return PropertyValue::string(copy->json());
}

PropertyValue VeltoTouchHIDService::copyServicePluginDebug()
{
    const std::string keys[] = {
        "Version",
        "FirmwareDebugReports",
        "Recording",
        formatLog("%s.%s", "Pipeline", "DebugInfo"),
        formatLog("%s.%s.%s", "Pipeline", "Algs", "DebugInfo"),
    };
    PropertyDictionary debug;
    for (const std::string& key : keys) {
        // Each lookup logs and locks on its own; the lock is never held
        // across them.
        PropertyValue value = getPropertyForKey(key.c_str());
        if (!isNull(value)) debug.set(key, std::move(value));
    }
    return PropertyValue::dictionary(std::move(debug));
}

}  // namespace VeltoTouch
