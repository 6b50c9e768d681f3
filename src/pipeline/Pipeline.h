#pragma once

#include "algs/Algs.h"
#include "pipeline/PipelineInput.h"
#include "pipeline/PipelineOutput.h"
#include "platform/plugin/HidEvent.h"
#include "records/InputReport.h"

#include <functional>
#include <optional>

namespace VeltoTouch {

// Parses raw input reports, routes images to the recogniser and device resets
// to its reset, stamps every resulting event with the current time and hands
// the list to hidEventsProbe, its only output. It is also the root of the
// dotted state keys.
//
// Not thread-safe: the owner serialises every call and every probe change.
// Probes run synchronously on the caller's thread; an empty probe is skipped.
class Pipeline final : public PipelineInput, public PipelineOutput {
public:
    // The pipeline's own state key, beside the recogniser's under "Algs.":
    // a dictionary of ResetCount and DisjointImageCount.
    static constexpr const char* kDebugInfoKey = "DebugInfo";
    static constexpr const char* kAlgsDomain = "Algs";

    std::function<void(std::uint64_t time)> setTimeProbe;
    std::function<void(const std::string& key, const PropertyValue& value)> setStateProbe;
    std::function<void(const std::uint8_t* data, std::size_t length)> inputReportProbe;
    std::function<void(const std::uint8_t* data, std::size_t length)> invalidInputReportProbe;
    std::function<void(const InputReport::FirmwareEvent& event)> firmwareEventProbe;
    std::function<void(const InputReport::Image& image)> imageProbe;
    std::function<void(std::uint32_t previousFrameNumber, const InputReport::Image& image)> disjointImageProbe;
    std::function<void(const VeltoHost::HidEventList& events)> hidEventsProbe;
    std::function<void(const std::string& key)> getStateProbe;

    // Device-defined usage of the event that announces a device reset.
    static constexpr std::uint32_t kResetEventUsagePage = 0xFF60;
    static constexpr std::uint32_t kResetEventUsage = 2;

    void setTime(std::uint64_t time) override;
    void setState(const std::string& key, PropertyValue value) override;
    void handleInputReport(const std::uint8_t* data, std::size_t length) override;
    PropertyValue getState(const std::string& key) override;

    // The recogniser, for diagnostics that need more than its state keys.
    const Algs& algs() const noexcept { return _algs; }
    // Receives the recogniser's record of every frame from now on; nullptr stops it.
    void setDecisionObserver(DecisionObserver* observer) noexcept { _algs.decisionObserver = observer; }

private:
    void handleFirmwareEvent(const InputReport::FirmwareEvent& event);
    void handleImage(const InputReport::Image& image);
    void handleHIDEvents(const VeltoHost::HidEventList& events);

    std::uint64_t _time = 0;
    std::optional<std::uint32_t> _lastFrameNumber;
    std::uint32_t _resetCount = 0;
    std::uint32_t _disjointImageCount = 0;
    Algs _algs;
};

}  // namespace VeltoTouch
