#pragma once

#include <functional>
#include <memory>
#include <string>

namespace VeltoHost {

// The host's serial event queue: jobs run asynchronously, one at a time, in
// the order they were queued, on one worker thread of the queue's own.
// Destroying the queue runs the jobs already queued, then joins the worker.
class SerialQueue : public std::enable_shared_from_this<SerialQueue> {
public:
    using Ref = std::shared_ptr<SerialQueue>;

    static Ref create(std::string label);
    ~SerialQueue();

    const std::string& label() const noexcept;

    // Queues `job`; never blocks on running jobs. Safe from any thread,
    // including from a job on this queue.
    void async(std::function<void()> job);

    // Blocks until every job queued before the call has run. Must not be
    // called from a job on this queue.
    void drain();

    // True when called from a job running on this queue.
    bool isCurrent() const noexcept;

private:
    explicit SerialQueue(std::string label);
    struct State;
    std::unique_ptr<State> _state;
};

}  // namespace VeltoHost
