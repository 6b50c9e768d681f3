#include "platform/runtime/SerialQueue.h"

#include <pthread.h>

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <mutex>
#include <thread>
#include <utility>

namespace VeltoHost {

namespace {

constexpr std::size_t kMaxThreadNameLength = 15;

}  // namespace

// What the worker thread needs. The worker holds its own reference, so that
// a queue whose last reference is dropped by one of its own jobs can let the
// worker finish on its own instead of joining itself.
struct SerialQueue::State {
    struct Core {
        std::mutex lock;
        std::condition_variable changed;
        // Guarded by lock.
        std::deque<std::function<void()>> jobs;
        std::uint64_t queuedCount = 0;
        std::uint64_t finishedCount = 0;
        bool closing = false;
    };

    std::string label;
    std::shared_ptr<Core> core = std::make_shared<Core>();
    std::thread worker;

    static void runWorker(const std::shared_ptr<Core>& core);
};

namespace {

// The queue whose job is running on this thread, for isCurrent().
thread_local const void* currentQueueCore = nullptr;

}  // namespace

void SerialQueue::State::runWorker(const std::shared_ptr<Core>& core)
{
    currentQueueCore = core.get();
    std::unique_lock<std::mutex> guard(core->lock);
    for (;;) {
        core->changed.wait(guard, [&] { return !core->jobs.empty() || core->closing; });
        if (core->jobs.empty()) break;  // closing and nothing left
        std::function<void()> job = std::move(core->jobs.front());
        core->jobs.pop_front();
        guard.unlock();
        job();
        // Whatever the job owns is released before drain() hears of it.
        job = nullptr;
        guard.lock();
        ++core->finishedCount;
        core->changed.notify_all();
    }
    currentQueueCore = nullptr;
}

SerialQueue::Ref SerialQueue::create(std::string label)
{
    return Ref(new SerialQueue(std::move(label)));
}

SerialQueue::SerialQueue(std::string label) : _state(std::make_unique<State>())
{
    _state->label = std::move(label);
    _state->worker = std::thread([core = _state->core, name = _state->label.substr(0, kMaxThreadNameLength)] {
        if (!name.empty()) pthread_setname_np(pthread_self(), name.c_str());
        State::runWorker(core);
    });
}

SerialQueue::~SerialQueue()
{
    {
        std::lock_guard<std::mutex> guard(_state->core->lock);
        _state->core->closing = true;
    }
    _state->core->changed.notify_all();
    if (isCurrent()) {
        // The last reference went inside one of our own jobs: the worker
        // runs what is left and ends by itself.
        _state->worker.detach();
    } else {
        _state->worker.join();
    }
}

const std::string& SerialQueue::label() const noexcept
{
    return _state->label;
}

void SerialQueue::async(std::function<void()> job)
{
    {
        std::lock_guard<std::mutex> guard(_state->core->lock);
        _state->core->jobs.push_back(std::move(job));
        ++_state->core->queuedCount;
    }
    _state->core->changed.notify_all();
}

void SerialQueue::drain()
{
    State::Core& core = *_state->core;
    std::unique_lock<std::mutex> guard(core.lock);
    std::uint64_t target = core.queuedCount;
    core.changed.wait(guard, [&] { return core.finishedCount >= target; });
}

bool SerialQueue::isCurrent() const noexcept
{
    return currentQueueCore == _state->core.get();
}

}  // namespace VeltoHost
