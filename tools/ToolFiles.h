#pragma once

#include "recording/ContainerStream.h"
#include "recording/PipelineRecording.h"

#include <fstream>
#include <functional>
#include <optional>
#include <string>

namespace VeltoTool {

// File access for the tool's commands, with errors (ToolError) that name the
// file and say what was wrong with it in words a user can act on.
class ToolFiles {
public:
    // The whole file; a directory is refused rather than read as empty text.
    static std::string read(const std::string& path);
    static void write(const std::string& path, const std::string& text);

    // Opens `path` for writing, emptying it, so that a bad output path fails
    // before any work is done.
    static std::ofstream create(const std::string& path);
    // Throws, naming the file, once a write to `out` has failed.
    static void checkWritten(const std::ostream& out, const std::string& path);
    // Closes a file made by create(); throws when any write to it failed.
    static void close(std::ofstream& out, const std::string& path);

    // A recording read from a container file. Every failure is one line that
    // starts with the path: a directory, an empty file and text that is not
    // JSON are told apart from a container with faults, whose own message is
    // kept.
    static VeltoTouch::PipelineRecording readRecording(const std::string& path);
    // The same, read in pieces so that a stop request ends it at once, also
    // when a read is blocked (a pipe, a stalled disk: the stop's signal
    // interrupts it). Empty when stopped.
    static std::optional<VeltoTouch::PipelineRecording> readRecordingUnlessStopped(
        const std::string& path, const std::function<bool()>& stopRequested);

    // The recording at `path` read as it arrives, each frame handed over as
    // soon as it is complete (ContainerStream), so that its length does not
    // matter. Failures as readRecording's, raised where they are reached: the
    // frames before a fault have been handed over.
    static void streamRecording(const std::string& path, const VeltoTouch::ContainerStream::FrameHandler& onFrame);

private:
    // The whole file in pieces, so that a stop request (or the signal behind
    // it interrupting a blocked read) ends it; empty when stopped.
    static std::optional<std::string> readText(const std::string& path, const std::function<bool()>& stopRequested);
    static VeltoTouch::PipelineRecording recordingFromText(const std::string& path, const std::string& text);
};

}  // namespace VeltoTool
