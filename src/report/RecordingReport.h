#pragma once

#include "pipeline/Pipeline.h"
#include "recording/ContainerStream.h"
#include "recording/PipelineRecording.h"
#include "report/ReportCollector.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace VeltoTouch {

// A recording replayed into one self-contained HTML page: the pads' readings
// as a heat map, the recogniser's scores and region per frame, the gestures,
// resets, state writes and frame gaps on the same time axis, the counters at
// the end and the recording's facts. Everything the page needs is inside the
// file; it loads nothing else.
class RecordingReport {
public:
    struct Options {
        std::string title;
        // Shown among the facts: where the recording came from and the
        // settings applied before the first frame.
        std::string source;
        std::vector<std::pair<std::string, std::string>> settings;
        ReportCollector::FrameRange frames;
    };

    // Hands every frame of a recording, in order, to the function it is given
    // (ToolFiles::streamRecording reading a file) and returns what the file
    // was, which the page shows among its facts.
    using FrameSource =
        std::function<ContainerStream::Format(const std::function<void(PipelineRecording::Frame&&)>& play)>;

    // Plays every frame through `pipeline` (already set up by the caller) as
    // fast as possible, as the source hands them over, and returns the page.
    static std::string html(const FrameSource& frames, const std::shared_ptr<Pipeline>& pipeline,
                            const Options& options);
};

}  // namespace VeltoTouch
