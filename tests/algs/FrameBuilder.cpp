#include "algs/FrameBuilder.h"

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

}  // namespace

FrameBuilder::FrameBuilder(std::uint32_t firstFrameNumber, std::uint32_t startTimeMs, std::uint32_t intervalMs)
    : _frameNumber(firstFrameNumber), _timeMs(startTimeMs), _intervalMs(intervalMs)
{
}

void FrameBuilder::setContact(const Contact& contact)
{
    _readings.fill(0);
    for (const auto& [letter, reading] : contact) _readings.at(static_cast<std::size_t>(pad(letter))) = reading;
}

std::vector<std::uint8_t> FrameBuilder::next()
{
    InputReport::Image image;
    image.frameNumber = _frameNumber++;
    image.timeMs = _timeMs;
    image.readings = _readings;
    _timeMs += _intervalMs;
    return image.toReport();
}

PipelineHarness::PipelineHarness()
{
    pipeline.hidEventsProbe = [this](const VeltoHost::HidEventList& list) {
        events.insert(events.end(), list.begin(), list.end());
    };
}

void PipelineHarness::send(const std::vector<std::uint8_t>& report)
{
    pipeline.setTime(++_ticks);
    pipeline.handleInputReport(report.data(), report.size());
}

void PipelineHarness::frames(int n)
{
    for (int i = 0; i < n; ++i) send(builder.next());
}

void PipelineHarness::idle(int n)
{
    builder.setContact({});
    frames(n);
}

void PipelineHarness::tap(const Contact& contact, std::uint32_t durationMs)
{
    const std::uint32_t interval = builder.intervalMs();
    press(contact, static_cast<int>(durationMs > interval ? durationMs / interval : 1));
    release();
}

void PipelineHarness::press(const Contact& contact, int frameCount)
{
    builder.setContact(contact);
    frames(frameCount);
}

void PipelineHarness::release() { idle(1); }

void PipelineHarness::deviceReset()
{
    const std::vector<std::uint8_t> report = {0x02, 0x00, 1, 2, 3, 4, 5, 6, 7, 8};
    send(report);
}

std::vector<std::string> PipelineHarness::takeEvents()
{
    std::vector<std::string> described;
    for (const auto& event : events) described.push_back(describeEvent(*event));
    events.clear();
    return described;
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

}  // namespace VeltoTouch::Test
