#pragma once

#include "recording/PipelineRecording.h"

#include <string_view>

namespace VeltoTouch {

// The container's frame objects, read one at a time: what both readers of a
// recording share, the one that parses a whole text and the one that plays a
// file as it arrives (ContainerStream), so that a frame is accepted or
// refused, with the same message, whichever read it.
class ContainerFrames {
public:
    static constexpr std::string_view kVersionKey = "Version";
    static constexpr std::string_view kFramesKey = "Frames";
    // Version 0.
    static constexpr std::string_view kReportsKey = "Reports";

    // A frame object of a version-1 container. Raises std::invalid_argument:
    // "frame is not an object", "invalid frame type", "invalid frame
    // timestamp", "invalid state key", "invalid state value class", "invalid
    // report", "invalid hex string", the first that applies in that order.
    static PipelineRecording::Frame read(const PropertyValue& element);

    // A version-0 report object as the version-1 frame object it becomes.
    // Only presence is checked here ("report is not an object", "frame lacks
    // Timestamp", "frame lacks ReportData"); read() checks the kinds.
    static PropertyValue fromVersion0(const PropertyValue& element);
};

}  // namespace VeltoTouch
