#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

namespace VeltoHost {

// A per-thread event loop. Sources (file descriptors) and jobs are attached
// for a named mode; running the loop in a mode serves only that mode's
// sources and jobs. Built on epoll, with an eventfd for wake-ups.
//
// Threading: run() and stopCurrent() act on the calling thread's loop. The
// other operations may be called from any thread.
class RunLoop {
public:
    using Ref = std::shared_ptr<RunLoop>;

    enum class RunResult : std::int32_t {
        Finished = 1,       // the mode has no sources and no jobs
        Stopped = 2,        // stop() was called (or stopCurrent() from a job)
        TimedOut = 3,       // the time limit passed
        HandledSource = 4,  // returnAfterSourceHandled and one source or job was handled
    };

    using SourceId = std::uint64_t;

    ~RunLoop();

    // The calling thread's loop, created on first use and kept for the life of
    // the thread (and longer while someone holds a reference).
    static Ref current();

    // Runs the calling thread's loop in `mode`. Must be called on the loop's
    // own thread. `timeout` empty means no time limit.
    static RunResult run(const std::string& mode, std::optional<std::chrono::nanoseconds> timeout,
                         bool returnAfterSourceHandled);

    // Stops the calling thread's loop: the innermost run() returns Stopped.
    static void stopCurrent();

    // Queues a job to run on this loop's thread when it runs in `mode`. Jobs
    // run in the order they were queued. Call wakeUp() to have a sleeping
    // loop notice it at once.
    void performJob(const std::string& mode, std::function<void()> job);
    void wakeUp();
    // Makes the current (or next) run() of this loop return Stopped.
    void stop();

    // Attaches a readable file descriptor: `onReadable` runs on the loop's
    // thread whenever `fd` is readable and the loop runs in `mode`. The
    // loop does not own the descriptor.
    SourceId addFileDescriptorSource(int fd, const std::string& mode, std::function<void()> onReadable);
    void removeSource(SourceId id);

private:
    RunLoop();
    struct State;
    std::unique_ptr<State> _state;
};

}  // namespace VeltoHost
