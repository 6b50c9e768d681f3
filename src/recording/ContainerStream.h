#pragma once

#include "recording/PipelineRecording.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace VeltoTouch {

// Reads a recording container as it arrives and hands over each frame as
// soon as it is complete, so that a recording of any length plays in bounded
// memory: the frame objects one at a time, nothing else kept.
//
// A recording in the text of hid-recorder is read too, told apart by its
// first character (HidRecorderReader::opensWith): its events, of the device
// `hidDevice` or else of the surface's, become input report frames, and its
// faults are HidRecorderReader::Fault. Every reader of recording files comes
// through here or through PipelineRecording(data), so both take both.
//
// It accepts and refuses what PipelineRecording(data) does, with the same
// messages, but each fault is raised where it is reached: the frames before
// it have already been handed over. Where a container has more than one
// fault, the first in the file is the one reported (the whole-text reader
// reports malformed JSON anywhere first, and version-0 presence checks before
// kinds). Two shapes cannot be read as they arrive:
// - the frames come before "Version" (key order carries no meaning): the
//   file is then read whole and handed over from memory, when it can be read
//   again from its start; otherwise std::runtime_error says why;
// - "Version", "Frames" or "Reports" is repeated after frames were handed
//   over: refused as an invalid container, since the frames already played
//   cannot be taken back.
class ContainerStream {
public:
    // Called with each frame in file order; may throw to stop the read (the
    // exception reaches the caller of read()).
    using FrameHandler = std::function<void(PipelineRecording::Frame&& frame)>;

    // What the file turned out to be, for whoever shows where a recording came from.
    struct Format {
        bool hidRecorder = false;  // hid-recorder text rather than a container
        std::uint64_t version = 0;  // the container's version (0 or 1) as it states it
        // "container version 1", "hid-recorder text"
        std::string text() const;
    };

    // Reads from the descriptor's current position to its end; it stays
    // open. When `stopRequested` turns true, the input ends there as if it
    // had been cut short (the caller, who asked, tells a stop from a fault),
    // also while waiting for input that has not come (a pipe).
    static Format read(int fd, const FrameHandler& onFrame, const std::function<bool()>& stopRequested = {},
                              std::optional<std::uint32_t> hidDevice = std::nullopt);
};

}  // namespace VeltoTouch
