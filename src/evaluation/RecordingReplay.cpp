#include "evaluation/RecordingReplay.h"

#include "pipeline/Pipeline.h"
#include "pipeline/Util.h"

namespace VeltoTouch {

RecordingReplay::Outcome RecordingReplay::run(const PipelineRecording::FrameList& frames,
                                              const PipelineSettings& settings)
{
    Outcome outcome;
    Pipeline pipeline;
    for (const PipelineSetting& setting : settings) pipeline.setState(setting.key, setting.propertyValue());
    pipeline.hidEventsProbe = [&](const VeltoHost::HidEventList& events) {
        for (const auto& event : events) outcome.gestures.push_back({VeltoHost::Gesture::of(*event), event->timeStamp()});
    };
    for (const PipelineRecording::Frame& frame : frames) {
        pipeline.setTime(Util::machTimeFromNanoseconds(frame.timestampNs));
        if (frame.type == PipelineRecording::Frame::Type::InputReport) {
            pipeline.handleInputReport(frame.report.data(), frame.report.size());
        } else if (frame.type == PipelineRecording::Frame::Type::State) {
            pipeline.setState(frame.key, frame.value);
        }
    }
    if (!frames.empty()) outcome.durationNs = frames.back().timestampNs - frames.front().timestampNs;
    return outcome;
}

}  // namespace VeltoTouch
