#pragma once

#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>

namespace VeltoHost {

// Counting semaphore shared by reference between the threads that signal and
// wait on it.
class Semaphore {
public:
    using Ref = std::shared_ptr<Semaphore>;

    static Ref create(long initialCount = 0) { return std::make_shared<Semaphore>(initialCount); }
    explicit Semaphore(long initialCount = 0) : _count(initialCount) {}

    void signal();
    // Waits with no time limit.
    void wait();
    // Returns false when `timeout` passed without a signal.
    bool waitFor(std::chrono::nanoseconds timeout);

private:
    std::mutex _lock;
    std::condition_variable _available;
    long _count;
};

}  // namespace VeltoHost
