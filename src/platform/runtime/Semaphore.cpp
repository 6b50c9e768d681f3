#include "platform/runtime/Semaphore.h"

namespace VeltoHost {

void Semaphore::signal()
{
    // Notified under the lock: a waiter may destroy the semaphore as soon
    // as it returns, so nothing may touch it after the lock is released.
    std::lock_guard<std::mutex> guard(_lock);
    ++_count;
    _available.notify_one();
}

void Semaphore::wait()
{
    std::unique_lock<std::mutex> guard(_lock);
    _available.wait(guard, [this] { return _count > 0; });
    --_count;
}

bool Semaphore::waitFor(std::chrono::nanoseconds timeout)
{
    std::unique_lock<std::mutex> guard(_lock);
    if (!_available.wait_for(guard, timeout, [this] { return _count > 0; })) return false;
    --_count;
    return true;
}

}  // namespace VeltoHost
