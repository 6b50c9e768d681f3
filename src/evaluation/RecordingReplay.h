#pragma once

#include "evaluation/PipelineSetting.h"
#include "host/Gesture.h"
#include "recording/PipelineRecording.h"

#include <cstdint>
#include <vector>

namespace VeltoTouch {

// Plays a recording's frames through a fresh pipeline as fast as it takes
// them and keeps what came out. Unlike PipelineRecording's playback it reads
// the frames without touching the recording, so that several threads can
// replay one loaded recording at once, and it sets the pipeline's clock to
// each frame's own time stamp (in ticks) rather than to a time line starting
// now, so that the events' time stamps can be compared with a truth file's.
class RecordingReplay {
public:
    struct TimedGesture {
        VeltoHost::Gesture gesture;
        std::uint64_t timestamp = 0;  // ticks
    };

    struct Outcome {
        std::vector<TimedGesture> gestures;
        // From the first frame to the last.
        std::uint64_t durationNs = 0;
    };

    static Outcome run(const PipelineRecording::FrameList& frames, const PipelineSettings& settings);
};

}  // namespace VeltoTouch
