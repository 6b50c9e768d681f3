#pragma once

#include "recording/ContainerStream.h"
#include "recording/PipelineRecording.h"

#include <cstdint>
#include <cstdio>
#include <memory>
#include <functional>
#include <optional>
#include <string>

namespace VeltoTool {

// File access for the tool's commands, with errors (ToolError) that name the
// file and say what was wrong with it in words a user can act on. Outputs are
// written through OutputFile.
class ToolFiles {
public:
    // The whole file; a directory is refused rather than read as empty text.
    static std::string read(const std::string& path);

    // A recording read from a container file, or from a hid-recorder text
    // (told apart by its content; `hidDevice` names the device to read of
    // one that holds several, else the surface's is read). Every failure is
    // one line that starts with the path: a directory, an empty file and text
    // that is not JSON are told apart from a container with faults, whose own
    // message is kept; a fault in a hid-recorder text is PATH:LINE: what.
    static VeltoTouch::PipelineRecording readRecording(const std::string& path,
                                                       std::optional<std::uint32_t> hidDevice = std::nullopt);

    // A recording file opened for streamRecording, so that a path that cannot
    // be read is refused before anything starts.
    using File = std::unique_ptr<std::FILE, int (*)(std::FILE*)>;
    static File openRecording(const std::string& path);

    // The recording read as it arrives, each frame handed over as soon as it
    // is complete (ContainerStream), so that its length does not matter; the
    // parsing runs on a thread of its own, ahead of onFrame (ContainerReadAhead).
    // Failures as readRecording's, raised where they are reached: the frames
    // before a fault have been handed over. Returns what the file was,
    // or nothing when the read ended because a stop was requested (a signal
    // that interrupts a blocked read cuts the input short).
    static std::optional<VeltoTouch::ContainerStream::Format> streamRecording(std::FILE* file, const std::string& path,
                                                        const VeltoTouch::ContainerStream::FrameHandler& onFrame,
                                                        const std::function<bool()>& stopRequested = {},
                                                        std::optional<std::uint32_t> hidDevice = std::nullopt);
    static VeltoTouch::ContainerStream::Format streamRecording(const std::string& path,
                                         const VeltoTouch::ContainerStream::FrameHandler& onFrame,
                                         std::optional<std::uint32_t> hidDevice = std::nullopt);

private:
    // The whole file, read in pieces (a read interrupted by a signal goes on).
    static std::string readText(const std::string& path);
    static VeltoTouch::PipelineRecording recordingFromText(const std::string& path, const std::string& text,
                                                           std::optional<std::uint32_t> hidDevice);
};

}  // namespace VeltoTool
