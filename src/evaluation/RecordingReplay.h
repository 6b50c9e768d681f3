#pragma once

#include "evaluation/PipelineSetting.h"
#include "records/Gesture.h"
#include "pipeline/Pipeline.h"
#include "recording/PipelineRecording.h"

#include <cstdint>
#include <optional>
#include <vector>

namespace VeltoTouch {

// Plays a recording's frames, one at a time as they are read, through a fresh
// pipeline of its own as fast as it takes them, and keeps what came out.
// Unlike PipelineRecording's playback it needs no recording in memory, so one
// read of a file can feed several replays (one per setting), and it sets the
// pipeline's clock to each frame's own time stamp (in ticks) rather than to a
// time line starting now, so that the events' time stamps can be compared
// with a truth file's.
class RecordingReplay {
public:
    struct TimedGesture {
        Gesture gesture;
        std::uint64_t timestamp = 0;  // ticks
    };

    struct Outcome {
        std::vector<TimedGesture> gestures;
        // From the first frame to the last.
        std::uint64_t durationNs = 0;
    };

    explicit RecordingReplay(const PipelineSettings& settings);
    // The pipeline's event probe refers to this object.
    RecordingReplay(const RecordingReplay&) = delete;
    RecordingReplay& operator=(const RecordingReplay&) = delete;

    void play(const PipelineRecording::Frame& frame);
    const Outcome& outcome() const noexcept { return _outcome; }

private:
    Pipeline _pipeline;
    // A clock that starts at tick 0, with the time line's origin at
    // nanosecond 0: each frame plays at its own time stamp, without waiting.
    PipelineRecording::PlayClock _clock;
    std::optional<std::uint64_t> _firstTimestampNs;
    Outcome _outcome;
};

}  // namespace VeltoTouch
