#pragma once

#include "pipeline/Pipeline.h"
#include "platform/devices/HostDevice.h"
#include "platform/log/Log.h"
#include "platform/plugin/InputReportThread.h"
#include "platform/plugin/VeltoHIDService.h"
#include "platform/runtime/RunLoop.h"
#include "platform/runtime/SerialQueue.h"
#include "recording/PipelineRecording.h"

#include <array>
#include <cstdint>
#include <memory>
#include <mutex>

namespace VeltoTouch {

// The touch surface's HID service. Reports arrive on an input-report thread
// of its own (started by scheduling, ended by unscheduling), pass under
// `_pipelineLock` through the recorder into the pipeline, and the pipeline's
// events are delivered as one job per report on the host's serial queue.
// Properties in the "Pipeline" domain reach the pipeline; a few service keys
// give diagnostics; every other key belongs to the device.
//
// The host calls the lifecycle, scheduling and property operations from its
// own thread, one at a time, in its documented order (start before open and
// schedule, unschedule before stop).
class VeltoTouchHIDService final : public VeltoHost::VeltoHIDService {
public:
    // Where events go: the host's queue and callback, with the opaque words
    // passed back to it.
    struct DispatchEventInfo {
        VeltoHost::SerialQueue::Ref queue;
        VeltoHost::VeltoEventCallback callback = nullptr;
        void* target = nullptr;
        void* refcon = nullptr;
        void* sender = nullptr;
    };

    static constexpr const char* kHandleInputReportsRunLoopMode = "kHandleInputReportsRunLoopMode";
    static constexpr int kInputReportThreadPolicy = 2;  // round-robin real time
    static constexpr int kInputReportThreadPriority = 63;
    static constexpr std::size_t kInputReportBufferSize = 512;
    static constexpr std::uint64_t kRecordingMaxFrameCount = 1350;

    static constexpr std::uint32_t kTraceInputReport = 0x2B150180;
    static constexpr std::uint32_t kTraceDispatchBatch = 0x2B150184;
    static constexpr std::uint32_t kTraceDispatchEvent = 0x2B150188;
    static constexpr std::uint32_t kTraceFirmwareEvent = 0x2B15018C;

    static constexpr std::array<std::int32_t, 3> kServicePluginVersion = {28, 0, 0};
    static constexpr std::array<std::uint8_t, 10> kFirmwareDebugReportIDs = {0x04, 0x10, 0x11, 0x12, 0x13,
                                                                             0x1D, 0x32, 0x3B, 0x3C, 0x3F};
    static constexpr std::size_t kFirmwareDebugReportBufferSize = 128;
    static constexpr std::size_t kFactoryResetHoldDurationBufferSize = 32;

    VeltoTouchHIDService();
    ~VeltoTouchHIDService() override;

    VeltoHost::VeltoStatus probeWithService(std::uint32_t service, const VeltoHost::PropertyValue& properties,
                                            std::int32_t* outScore) override;
    VeltoHost::VeltoStatus startWithService(std::uint32_t service, const VeltoHost::PropertyValue& properties) override;
    VeltoHost::VeltoStatus stop() override;
    bool openWithOptions(std::uint32_t options) override;
    void closeWithOptions(std::uint32_t options) override;
    VeltoHost::PropertyValue getPropertyForKey(const char* key) override;
    bool setProperty(const VeltoHost::PropertyValue& value, const char* key) override;
    void setEventCallback(VeltoHost::VeltoEventCallback callback, void* target, void* refcon) override;
    void scheduleWithDispatchQueue(const VeltoHost::SerialQueue::Ref& queue) override;
    void unscheduleWithDispatchQueue(const VeltoHost::SerialQueue::Ref& queue) override;
    VeltoHost::HidEventRef copyEventWithType(std::uint32_t type, VeltoHost::HidEvent* matching,
                                             std::uint32_t options) override;
    VeltoHost::VeltoStatus setOutputEvent(VeltoHost::HidEvent* event) override;

private:
    using ReportFunction = std::function<void(VeltoHost::HidReportType type, std::uint8_t reportID,
                                              const std::uint8_t* report, std::size_t reportLength,
                                              std::uint64_t timeStamp)>;

    void handleInputReports(DispatchEventInfo info, VeltoHost::HostDevice::Ref device);
    // `timeStamp`: the device's, in the ticks of the host's clock.
    void handleInputReport(const std::uint8_t* report, std::size_t reportLength, std::uint64_t timeStamp);
    void installPipelineProbes(const DispatchEventInfo& info);
    void clearPipelineProbes();
    static void inputReportCallback(void* context, std::int32_t result, void* sender, VeltoHost::HidReportType type,
                                    std::uint32_t reportID, std::uint8_t* report, std::size_t reportLength,
                                    std::uint64_t timeStamp);

    VeltoHost::PropertyValue copyPipelineState(const std::string& key);
    VeltoHost::PropertyValue copyFirmwareDebugReports();
    VeltoHost::PropertyValue copyFactoryResetHoldDuration();
    VeltoHost::PropertyValue copyRecording();
    VeltoHost::PropertyValue copyServicePluginDebug();

    VeltoHost::Log _log;
    VeltoHost::HostDevice::Ref _veltoDevice;
    VeltoHost::InputReportThread _inputReportThread;
    DispatchEventInfo _dispatchEventInfo;
    std::mutex _pipelineLock;
    std::shared_ptr<Pipeline> _pipeline;
    PipelineRecording _recording;
};

}  // namespace VeltoTouch
