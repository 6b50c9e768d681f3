#pragma once

#include "recording/PipelineRecording.h"

#include <cstdint>
#include <ostream>

namespace VeltoTouch {

// Writes a version-1 recording container to a stream frame by frame, so that
// a recording of any length can be written without holding its frames, or a
// JSON tree of them, in memory. PipelineRecording::json() writes through this
// class too, so a container streamed here and one written from a whole
// recording are the same bytes.
//
// The writer never throws for the stream's sake; the owner checks the
// stream's state after finish().
class ContainerWriter {
public:
    // The container version written; readers migrate older ones to it.
    static constexpr std::uint64_t kVersion = 1;

    // Writes the container's opening at once.
    explicit ContainerWriter(std::ostream& out);
    ContainerWriter(const ContainerWriter&) = delete;
    ContainerWriter& operator=(const ContainerWriter&) = delete;
    ~ContainerWriter() = default;

    // Appends one frame; a frame of a type the container has no form for is
    // skipped, as json() skips it.
    void write(const PipelineRecording::Frame& frame);
    // Closes the frame list and the container. Frames written afterwards are
    // ignored; calling it again does nothing.
    void finish();

    std::uint64_t framesWritten() const noexcept { return _framesWritten; }

private:
    void beginFrame();
    void writeStateFrame(const PipelineRecording::Frame& frame);
    void writeReportFrame(const PipelineRecording::Frame& frame);

    std::ostream& _out;
    std::uint64_t _framesWritten = 0;
    bool _finished = false;
};

}  // namespace VeltoTouch
