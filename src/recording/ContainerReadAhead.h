#pragma once

#include "recording/ContainerStream.h"

#include <cstdint>
#include <functional>
#include <optional>

namespace VeltoTouch {

// ContainerStream::read with the parsing on a thread of its own: while the
// caller plays the frames read so far, the next ones are being parsed, so a
// long recording takes about the longer of the two instead of their sum. At
// most a few batches of frames wait between the two, so memory stays bounded.
//
// Everything else is as ContainerStream::read: the frames reach `onFrame` on
// the calling thread, in file order; a fault in the container is thrown
// after every frame before it was handed over; an exception from `onFrame`
// stops the reading thread and reaches the caller; `stopRequested` (called
// from the reading thread, so it must be safe to call from any thread) ends
// the input as if it had been cut short.
class ContainerReadAhead {
public:
    static ContainerStream::Format read(int fd, const ContainerStream::FrameHandler& onFrame,
                              const std::function<bool()>& stopRequested = {},
                              std::optional<std::uint32_t> hidDevice = std::nullopt);
};

}  // namespace VeltoTouch
