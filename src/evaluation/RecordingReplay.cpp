#include "evaluation/RecordingReplay.h"

namespace VeltoTouch {

RecordingReplay::RecordingReplay(const PipelineSettings& settings)
{
    for (const PipelineSetting& setting : settings) _pipeline.setState(setting.key, setting.propertyValue());
    _pipeline.hidEventsProbe = [this](const VeltoHost::HidEventList& events) {
        for (const auto& event : events) {
            _outcome.gestures.push_back({Gesture::of(*event), event->timeStamp()});
        }
    };
}

void RecordingReplay::play(const PipelineRecording::Frame& frame)
{
    PipelineRecording::playFrame(frame, _clock, 0, 1.0f, {}, &_pipeline);
    if (!_firstTimestampNs) _firstTimestampNs = frame.timestampNs;
    _outcome.durationNs = frame.timestampNs - *_firstTimestampNs;
}

}  // namespace VeltoTouch
