#pragma once

#include "recording/PipelineRecording.h"

#include <string>
#include <string_view>

namespace VeltoTouch {

// The container's frame objects, read one at a time: what both readers of a
// recording share, the one that parses a whole text and the one that plays a
// file as it arrives (ContainerStream), so that a frame is accepted or
// refused, with the same message, whichever read it.
class ContainerFrames {
public:
    // The container's names, for every reader and the writer (ContainerWriter).
    static constexpr std::string_view kVersionKey = "Version";
    static constexpr std::string_view kFramesKey = "Frames";
    // A frame object's entries, and the names of its two types.
    static constexpr std::string_view kTypeKey = "Type";
    static constexpr std::string_view kTimestampKey = "Timestamp";
    static constexpr std::string_view kKeyKey = "Key";
    static constexpr std::string_view kValueKey = "Value";
    static constexpr std::string_view kReportKey = "Report";
    static constexpr std::string_view kStateType = "State";
    static constexpr std::string_view kInputReportType = "InputReport";
    // Version 0: the report list, and a report object's bytes.
    static constexpr std::string_view kReportsKey = "Reports";
    static constexpr std::string_view kReportDataKey = "ReportData";

    // A frame object of a version-1 container. Raises std::invalid_argument:
    // "frame is not an object", "invalid frame type", "invalid frame
    // timestamp", "invalid state key", "invalid state value class", "invalid
    // report", "invalid hex string", the first that applies in that order.
    static PipelineRecording::Frame read(const PropertyValue& element);

    // One entry of a frame object, as much of it as the checks need. A text
    // is kept as text, so that a reader that streams need not wrap each
    // report in a value; any other value is kept whole.
    struct Field {
        bool present = false;
        bool isText = false;
        std::string text;
        PropertyValue value;  // when not text (a value of any kind, or null for an object or array)

        static Field of(PropertyValue value);
    };
    // The entries of a frame object that mean something; `other` takes the rest.
    struct Fields {
        Field type, timestamp, key, value, report, other;
        Field& named(std::string_view name);
    };
    // The same checks and frame as read(element), from the entries alone.
    static PipelineRecording::Frame read(Fields&& fields);

    // A version-0 report object as the version-1 frame object it becomes.
    // Only presence is checked here ("report is not an object", "frame lacks
    // Timestamp", "frame lacks ReportData"); read() checks the kinds.
    static PropertyValue fromVersion0(const PropertyValue& element);
};

}  // namespace VeltoTouch
