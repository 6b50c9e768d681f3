#include "evaluation/RecordingReplay.h"

#include "pipeline/Pipeline.h"

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
    // A clock that starts at tick 0, with the time line's origin at
    // nanosecond 0: each frame plays at its own time stamp, without waiting.
    PipelineRecording::PlayClock clock;
    for (const PipelineRecording::Frame& frame : frames) {
        PipelineRecording::playFrame(frame, clock, 0, 1.0f, {}, &pipeline);
    }
    if (!frames.empty()) outcome.durationNs = frames.back().timestampNs - frames.front().timestampNs;
    return outcome;
}

}  // namespace VeltoTouch
