#include "Synthesizer.h"

#include "records/InputReport.h"
#include "records/TickConversion.h"

#include <algorithm>
#include <cstdlib>

namespace VeltoTool {

using Action = GestureScript::Action;
using VeltoTouch::PipelineRecording;
using VeltoTouch::TruthRecord;

namespace {

// Recording time stamps are the host clock's; any origin will do.
constexpr std::uint64_t kRecordingOriginNs = 1'000'000'000;

}  // namespace

Synthesizer::Synthesizer(std::uint32_t framePeriodMs, std::uint32_t seed)
    : _framePeriodMs(std::max<std::uint32_t>(framePeriodMs, 1)), _model(seed)
{
}

std::uint32_t Synthesizer::frameCount(std::uint32_t durationMs) const
{
    return (durationMs + _framePeriodMs / 2) / _framePeriodMs;
}

PipelineRecording Synthesizer::synthesize(const std::vector<GestureScript::Step>& steps)
{
    PipelineRecording recording;
    synthesize(steps, [&](const PipelineRecording::Frame& frame) { recording.appendFrame(frame); });
    return recording;
}

void Synthesizer::synthesize(const std::vector<GestureScript::Step>& steps, const FrameSink& sink,
                             const TruthSink& truth)
{
    _sink = &sink;
    _truth = truth ? &truth : nullptr;
    idle(kLeadInMs, kSensorNoise);
    for (const GestureScript::Step& step : steps) {
        const std::uint64_t start = nextTicks();
        switch (step.action) {
        case Action::Idle: idle(step.durationMs, kSensorNoise); break;
        case Action::Noise:
            idle(step.durationMs, step.noise.value_or(kHeavyNoise));
            tellTruth(TruthRecord::Kind::Noise, step, start, nextTicks());
            break;
        case Action::Reset:
            resetReport();
            tellTruth(TruthRecord::Kind::Reset, step, start, start);
            break;
        case Action::Tap:
        case Action::Hold:
        case Action::Slide:
        case Action::Palm:
            touch(step);
            idle(kReleaseGapMs, kSensorNoise);
            break;
        }
    }
    _sink = nullptr;
    _truth = nullptr;
}

std::uint64_t Synthesizer::nextTicks() const
{
    return VeltoTouch::Util::machTimeFromNanoseconds(kRecordingOriginNs +
                                                     static_cast<std::uint64_t>(_timeMs - 1000) * 1'000'000u);
}

void Synthesizer::tellTruth(TruthRecord::Kind kind, const GestureScript::Step& step, std::uint64_t start,
                            std::uint64_t end)
{
    if (!_truth) return;
    TruthRecord record;
    record.kind = kind;
    record.region = step.from;
    record.to = step.to;
    if (kind != TruthRecord::Kind::Tap && kind != TruthRecord::Kind::Hold && kind != TruthRecord::Kind::Slide) {
        record.region = record.to = TruthRecord::Region::None;
    }
    record.start = start;
    record.end = end;
    (*_truth)(record);
}

void Synthesizer::idle(std::uint32_t durationMs, double noise)
{
    for (std::uint32_t i = 0, n = frameCount(durationMs); i < n; ++i) {
        appendImage(_model.read(ContactModel::Contact{}, noise));
    }
}

void Synthesizer::touch(const GestureScript::Step& step)
{
    const std::uint32_t frames = std::max<std::uint32_t>(frameCount(step.durationMs), 1);
    const std::uint32_t rise = std::max<std::uint32_t>(frameCount(kRiseMs), 1);
    const std::uint32_t fall = std::max<std::uint32_t>(frameCount(kFallMs), 1);
    const ContactModel::Point from = ContactModel::regionCentre(step.from);
    const ContactModel::Point to = ContactModel::regionCentre(step.to);
    constexpr std::uint32_t kNoReset = UINT32_MAX;
    // A reset time that rounds to the end of the touch is still within it: it
    // comes before the last frame rather than not at all.
    const std::uint32_t resetFrame = step.resetAtMs ? std::min(frameCount(*step.resetAtMs), frames - 1) : kNoReset;
    const std::uint64_t start = nextTicks();
    std::uint64_t resetTicks = 0;
    const double noise = step.noise.value_or(kSensorNoise);
    for (std::uint32_t i = 0; i < frames; ++i) {
        if (resetFrame == i) {
            resetTicks = nextTicks();
            resetReport();
        }
        // Pressure ramps up at the start and down at the end of the touch.
        const double pressure = std::min({1.0, (i + 1.0) / rise, (frames - i) / static_cast<double>(fall)});
        ContactModel::Contact contact;
        if (step.action == Action::Palm) {
            contact = ContactModel::palm(pressure);
        } else {
            const double progress = frames > 1 ? static_cast<double>(i) / (frames - 1) : 0.0;
            const ContactModel::Point centre{from.x + (to.x - from.x) * progress + step.offsetX,
                                             from.y + (to.y - from.y) * progress + step.offsetY};
            contact = ContactModel::finger(centre, pressure);
        }
        contact.radius *= step.sizeScale;
        contact.strength *= step.strengthScale;
        appendImage(_model.read(contact, noise));
    }
    const TruthRecord::Kind kind = step.action == Action::Tap    ? TruthRecord::Kind::Tap
                                   : step.action == Action::Hold ? TruthRecord::Kind::Hold
                                   : step.action == Action::Palm ? TruthRecord::Kind::Palm
                                                                 : TruthRecord::Kind::Slide;
    // The touch is gone with the first frame after its last.
    tellTruth(kind, step, start, nextTicks());
    if (resetFrame != kNoReset) tellTruth(TruthRecord::Kind::Reset, step, resetTicks, resetTicks);
}

void Synthesizer::resetReport()
{
    // The firmware's reset notice, without context.
    VeltoTouch::InputReport::FirmwareEvent reset;
    reset.event = VeltoTouch::InputReport::FirmwareEvent::kEventDeviceReset;
    appendReport(reset.toReport());
}

void Synthesizer::appendImage(const ContactModel::Readings& readings)
{
    VeltoTouch::InputReport::Image image;
    image.frameNumber = _frameNumber;
    image.timeMs = _timeMs;
    image.readings = readings;
    // Levels carry the raw magnitude; only the dump shows them.
    for (std::size_t pad = 0; pad < readings.size(); ++pad) {
        image.levels[pad] = static_cast<std::uint16_t>(std::abs(static_cast<int>(readings[pad])));
    }
    appendReport(image.toReport());
    ++_frameNumber;
    _timeMs += _framePeriodMs;
}

void Synthesizer::appendReport(std::vector<std::uint8_t> report)
{
    PipelineRecording::Frame frame;
    frame.type = PipelineRecording::Frame::Type::InputReport;
    // A reset notice arrives between two frames; it takes the time of the last one.
    frame.timestampNs = kRecordingOriginNs + static_cast<std::uint64_t>(_timeMs - 1000) * 1'000'000u;
    frame.report = std::move(report);
    (*_sink)(frame);
}

}  // namespace VeltoTool
