#include "algs/PipelineHarness.h"

#include "platform/PropertyDictionary.h"

namespace VeltoTouch::Test {

using VeltoHost::HidEvent;

namespace {

const char* phaseName(std::uint16_t phase, std::uint32_t eventMask)
{
    switch (phase) {
    case HidEvent::kPhaseMayBegin: return "may-begin";
    case HidEvent::kPhaseBegan: return "hold-start";
    case HidEvent::kPhaseChanged: return "hold-change";
    case HidEvent::kPhaseEnded: return "hold-end";
    case HidEvent::kPhaseCancelled: return "cancel";
    case 0: return eventMask == 0x00020000 ? "tap" : "phase-0";
    default: return "phase-?";
    }
}

const char* regionName(double y)
{
    if (y == 1.0) return "Middle";
    if (y == 2.0) return "Bottom";
    if (y == 3.0) return "Top";
    return "None";
}

std::string describeEvent(const HidEvent& event)
{
    if (event.kind() == HidEvent::Kind::VendorDefined) return "vendor";
    std::string text = phaseName(event.phase(), event.digitizer().eventMask);
    if (event.phase() != HidEvent::kPhaseCancelled) {
        text += ' ';
        text += regionName(event.digitizer().y);
    }
    const auto frame = event.integerValue(Algs::kFrameNumberField);
    text += frame ? " #" + std::to_string(*frame) : std::string(" #-");
    return text;
}

}  // namespace

PipelineHarness::PipelineHarness(std::uint32_t startTimeMs) : _timeMs(startTimeMs)
{
    pipeline.hidEventsProbe = [this](const VeltoHost::HidEventList& list) {
        _events.insert(_events.end(), list.begin(), list.end());
    };
}

void PipelineHarness::press(const Contact& contact, int frameCount)
{
    InputReport::Image image;
    for (const auto& [letter, reading] : contact) image.readings.at(static_cast<std::size_t>(letter - 'A')) = reading;
    for (int i = 0; i < frameCount; ++i) {
        image.frameNumber = _frameNumber++;
        image.timeMs = _timeMs;
        _timeMs += 10;
        const std::vector<std::uint8_t> report = image.toReport();
        pipeline.setTime(++_ticks);
        pipeline.handleInputReport(report.data(), report.size());
    }
}

void PipelineHarness::tap(const Contact& contact, std::uint32_t durationMs)
{
    press(contact, static_cast<int>(durationMs > 10 ? durationMs / 10 : 1));
    release();
}

std::uint64_t PipelineHarness::counter(const char* group, const char* name)
{
    return pipeline.getState("Algs.EventStats").asDictionary().get(group).asDictionary().get(name).toUInt64();
}

std::vector<std::string> PipelineHarness::takeEvents()
{
    std::vector<std::string> described;
    for (const auto& event : _events) described.push_back(describeEvent(*event));
    _events.clear();
    return described;
}

}  // namespace VeltoTouch::Test
