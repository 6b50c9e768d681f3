#include "recording/ContainerReadAhead.h"

#include "platform/runtime/BoundedQueue.h"

#include <exception>
#include <thread>
#include <utility>
#include <vector>

namespace VeltoTouch {

namespace {

using Frame = PipelineRecording::Frame;
using Batch = std::vector<Frame>;

// Frames travel in batches so that the two threads meet once per batch, not
// once per frame; a few batches ahead keep the player fed through the
// parser's slower stretches (state frames, a refill of its input).
constexpr std::size_t kFramesPerBatch = 512;
constexpr std::size_t kBatchesAhead = 4;

// Thrown inside the reading thread once the player has given up.
struct Abandoned {};

}  // namespace

ContainerStream::Format ContainerReadAhead::read(int fd, const ContainerStream::FrameHandler& onFrame,
                                                 const std::function<bool()>& stopRequested,
                                                 std::optional<std::uint32_t> hidDevice)
{
    // The player closes it when it gives up, the reader when the input ends.
    VeltoHost::BoundedQueue<Batch> ready(kBatchesAhead);
    // Written by the reader before it closes the queue, read after the join.
    ContainerStream::Format format;
    std::exception_ptr failure;

    std::thread reader([&] {
        Batch batch;
        const auto handOver = [&] {
            if (!batch.empty() && !ready.push(std::exchange(batch, {}))) throw Abandoned{};
        };
        try {
            format = ContainerStream::read(
                fd,
                [&](Frame&& frame) {
                    batch.push_back(std::move(frame));
                    if (batch.size() == kFramesPerBatch) handOver();
                },
                [&] { return ready.closed() || (stopRequested && stopRequested()); }, hidDevice);
        } catch (const Abandoned&) {
            return;
        } catch (...) {
            failure = std::current_exception();
        }
        // The frames before a fault arrive before it.
        try {
            handOver();
        } catch (const Abandoned&) {
            return;
        }
        ready.close();
    });

    try {
        while (std::optional<Batch> batch = ready.pop()) {
            for (Frame& frame : *batch) onFrame(std::move(frame));
        }
    } catch (...) {
        ready.close();
        reader.join();
        throw;
    }
    reader.join();
    if (failure) std::rethrow_exception(failure);
    return format;
}

}  // namespace VeltoTouch
