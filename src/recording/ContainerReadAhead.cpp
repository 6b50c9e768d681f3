#include "recording/ContainerReadAhead.h"

#include <atomic>
#include <condition_variable>
#include <deque>
#include <exception>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

namespace VeltoTouch {

namespace {

using Frame = PipelineRecording::Frame;

// Frames travel in batches so that the two threads meet once per batch, not
// once per frame; a few batches ahead keep the player fed through the
// parser's slower stretches (state frames, a refill of its input).
constexpr std::size_t kFramesPerBatch = 512;
constexpr std::size_t kBatchesAhead = 4;

// Thrown inside the reading thread once the player has given up.
struct Abandoned {};

}  // namespace

std::uint64_t ContainerReadAhead::read(int fd, const ContainerStream::FrameHandler& onFrame,
                                       const std::function<bool()>& stopRequested,
                                       std::optional<std::uint32_t> hidDevice)
{
    std::mutex mutex;
    std::condition_variable changed;
    // Under `mutex`:
    std::deque<std::vector<Frame>> ready;
    bool finished = false;
    std::uint64_t version = 0;
    std::exception_ptr failure;
    // Read without the lock by the parser's stop check.
    std::atomic<bool> abandoned{false};

    std::thread reader([&] {
        std::vector<Frame> batch;
        // `mustWait`: a full batch waits for room; the last one never does,
        // so that the frames before a fault always arrive.
        const auto handOver = [&](bool mustWait) {
            std::unique_lock lock(mutex);
            if (mustWait) changed.wait(lock, [&] { return ready.size() < kBatchesAhead || abandoned; });
            if (abandoned) throw Abandoned{};
            if (!batch.empty()) ready.push_back(std::exchange(batch, {}));
            changed.notify_all();
        };
        std::uint64_t stated = 0;
        std::exception_ptr error;
        try {
            stated = ContainerStream::read(
                fd,
                [&](Frame&& frame) {
                    batch.push_back(std::move(frame));
                    if (batch.size() == kFramesPerBatch) handOver(true);
                },
                [&] { return abandoned || (stopRequested && stopRequested()); }, hidDevice);
        } catch (const Abandoned&) {
            return;
        } catch (...) {
            error = std::current_exception();
        }
        try {
            handOver(false);
        } catch (const Abandoned&) {
            return;
        }
        std::lock_guard lock(mutex);
        version = stated;
        failure = error;
        finished = true;
        changed.notify_all();
    });

    const auto abandon = [&] {
        {
            std::lock_guard lock(mutex);
            abandoned = true;
        }
        changed.notify_all();
        reader.join();
    };
    try {
        for (;;) {
            std::vector<Frame> batch;
            {
                std::unique_lock lock(mutex);
                changed.wait(lock, [&] { return !ready.empty() || finished; });
                if (ready.empty()) break;
                batch = std::move(ready.front());
                ready.pop_front();
            }
            changed.notify_all();
            for (Frame& frame : batch) onFrame(std::move(frame));
        }
    } catch (...) {
        abandon();
        throw;
    }
    reader.join();
    if (failure) std::rethrow_exception(failure);
    return version;
}

}  // namespace VeltoTouch
