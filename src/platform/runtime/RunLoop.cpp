#include "platform/runtime/RunLoop.h"

#include "platform/log/Log.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <condition_variable>
#include <cstring>
#include <deque>
#include <map>
#include <mutex>
#include <thread>
#include <unordered_map>
#include <utility>
#include <vector>

namespace VeltoHost {

namespace {

// epoll data of the wake-up descriptor; source ids start at 1.
constexpr std::uint64_t kWakeToken = 0;
constexpr int kMaxEventsPerWait = 16;

const Log& runLoopLog()
{
    static const Log log("RunLoop");
    return log;
}

int millisecondsUntil(std::chrono::steady_clock::time_point deadline)
{
    auto remaining = deadline - std::chrono::steady_clock::now();
    if (remaining <= std::chrono::steady_clock::duration::zero()) return 0;
    // Round up so that the wait never ends before the deadline.
    auto milliseconds = std::chrono::ceil<std::chrono::milliseconds>(remaining).count();
    return static_cast<int>(std::min<decltype(milliseconds)>(milliseconds, INT_MAX));
}

}  // namespace

struct RunLoop::State {
    struct Source {
        int fd;
        std::string mode;
        std::function<void()> onReadable;
    };

    // Every mode has its own epoll set holding that mode's sources and the
    // shared wake-up descriptor, so a run in one mode never sees another
    // mode's descriptors become readable.
    struct Mode {
        int epollFd = -1;
        std::deque<std::function<void()>> jobs;
        std::size_t sourceCount = 0;
    };

    const std::thread::id owner = std::this_thread::get_id();
    int wakeFd = -1;

    std::mutex lock;
    std::condition_variable sourceFinished;
    // Guarded by lock.
    std::map<std::string, Mode, std::less<>> modes;
    std::unordered_map<SourceId, std::shared_ptr<Source>> sources;
    SourceId nextSourceId = 1;
    std::vector<SourceId> dispatching;  // sources whose callback is running (nested runs stack)
    bool stopRequested = false;

    Mode& modeLocked(const std::string& name)
    {
        auto it = modes.find(name);
        if (it != modes.end()) return it->second;
        Mode& mode = modes[name];
        mode.epollFd = epoll_create1(EPOLL_CLOEXEC);
        if (mode.epollFd < 0) {
            runLoopLog().error("epoll_create1 failed: %s", std::strerror(errno));
            return mode;
        }
        epoll_event event{};
        event.events = EPOLLIN;
        event.data.u64 = kWakeToken;
        if (wakeFd >= 0) epoll_ctl(mode.epollFd, EPOLL_CTL_ADD, wakeFd, &event);
        return mode;
    }

    bool takeStopRequest()
    {
        std::lock_guard<std::mutex> guard(lock);
        return std::exchange(stopRequested, false);
    }

    void drainWakeFd() const
    {
        std::uint64_t count = 0;
        while (read(wakeFd, &count, sizeof count) < 0 && errno == EINTR) {
        }
    }

    // Runs the callback of source `id` when it is still attached to `mode`.
    bool dispatchSource(SourceId id, const std::string& mode)
    {
        std::shared_ptr<Source> source;
        {
            std::lock_guard<std::mutex> guard(lock);
            auto it = sources.find(id);
            if (it == sources.end() || it->second->mode != mode) return false;
            source = it->second;
            dispatching.push_back(id);
        }
        source->onReadable();
        std::lock_guard<std::mutex> guard(lock);
        dispatching.erase(std::find(dispatching.begin(), dispatching.end(), id));
        sourceFinished.notify_all();
        return true;
    }
};

RunLoop::RunLoop() : _state(std::make_unique<State>())
{
    _state->wakeFd = eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
    if (_state->wakeFd < 0) runLoopLog().error("eventfd failed: %s", std::strerror(errno));
}

RunLoop::~RunLoop()
{
    for (auto& [name, mode] : _state->modes) {
        if (mode.epollFd >= 0) ::close(mode.epollFd);
    }
    if (_state->wakeFd >= 0) ::close(_state->wakeFd);
}

RunLoop::Ref RunLoop::current()
{
    // Held by the thread for its whole life; others may keep the loop longer.
    thread_local Ref threadLoop;
    if (!threadLoop) threadLoop.reset(new RunLoop());
    return threadLoop;
}

RunLoop::RunResult RunLoop::run(const std::string& modeName, std::optional<std::chrono::nanoseconds> timeout,
                                bool returnAfterSourceHandled)
{
    Ref loop = current();
    State& state = *loop->_state;
    std::optional<std::chrono::steady_clock::time_point> deadline;
    if (timeout) deadline = std::chrono::steady_clock::now() + *timeout;

    // After something was handled, a stop request made by it wins.
    auto handled = [&state] { return state.takeStopRequest() ? RunResult::Stopped : RunResult::HandledSource; };

    for (bool firstPass = true;; firstPass = false) {
        std::function<void()> job;
        int epollFd = -1;
        {
            std::lock_guard<std::mutex> guard(state.lock);
            if (std::exchange(state.stopRequested, false)) return RunResult::Stopped;
            auto it = state.modes.find(modeName);
            if (it == state.modes.end() || (it->second.jobs.empty() && it->second.sourceCount == 0)) {
                return RunResult::Finished;
            }
            if (!firstPass && deadline && std::chrono::steady_clock::now() >= *deadline) return RunResult::TimedOut;
            State::Mode& mode = it->second;
            if (!mode.jobs.empty()) {
                job = std::move(mode.jobs.front());
                mode.jobs.pop_front();
            }
            epollFd = mode.epollFd;
        }

        if (job) {
            job();
            job = nullptr;  // whatever the job captured goes now, outside the lock
            if (returnAfterSourceHandled) return handled();
            continue;
        }

        int waitMilliseconds = deadline ? millisecondsUntil(*deadline) : -1;
        epoll_event events[kMaxEventsPerWait];
        int count = epoll_wait(epollFd, events, kMaxEventsPerWait, waitMilliseconds);
        if (count < 0) {
            if (errno == EINTR) continue;
            runLoopLog().error("epoll_wait failed: %s", std::strerror(errno));
            return RunResult::Finished;
        }
        if (count == 0 && deadline && std::chrono::steady_clock::now() >= *deadline) return RunResult::TimedOut;

        bool handledSource = false;
        for (int i = 0; i < count; ++i) {
            std::uint64_t token = events[i].data.u64;
            if (token == kWakeToken) {
                state.drainWakeFd();
                continue;
            }
            if (state.dispatchSource(token, modeName)) {
                handledSource = true;
                // Level-triggered: sources not served now are reported again.
                if (returnAfterSourceHandled) break;
            }
        }
        if (handledSource && returnAfterSourceHandled) return handled();
    }
}

void RunLoop::stopCurrent()
{
    current()->stop();
}

void RunLoop::performJob(const std::string& modeName, std::function<void()> job)
{
    {
        std::lock_guard<std::mutex> guard(_state->lock);
        _state->modeLocked(modeName).jobs.push_back(std::move(job));
    }
    // Waking is cheap and spares every caller a forgotten wakeUp().
    wakeUp();
}

void RunLoop::wakeUp()
{
    std::uint64_t one = 1;
    while (write(_state->wakeFd, &one, sizeof one) < 0 && errno == EINTR) {
    }
}

void RunLoop::stop()
{
    {
        std::lock_guard<std::mutex> guard(_state->lock);
        _state->stopRequested = true;
    }
    wakeUp();
}

RunLoop::SourceId RunLoop::addFileDescriptorSource(int fd, const std::string& modeName,
                                                   std::function<void()> onReadable)
{
    std::lock_guard<std::mutex> guard(_state->lock);
    State::Mode& mode = _state->modeLocked(modeName);
    SourceId id = _state->nextSourceId++;
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.u64 = id;
    if (mode.epollFd < 0 || epoll_ctl(mode.epollFd, EPOLL_CTL_ADD, fd, &event) != 0) {
        runLoopLog().error("cannot watch descriptor %d in mode %s: %s", fd, modeName, std::strerror(errno));
        return 0;
    }
    _state->sources.emplace(id, std::make_shared<State::Source>(State::Source{fd, modeName, std::move(onReadable)}));
    ++mode.sourceCount;
    return id;
}

void RunLoop::removeSource(SourceId id)
{
    std::shared_ptr<State::Source> removed;
    std::unique_lock<std::mutex> guard(_state->lock);
    auto it = _state->sources.find(id);
    if (it == _state->sources.end()) return;
    removed = std::move(it->second);
    _state->sources.erase(it);
    State::Mode& mode = _state->modes[removed->mode];
    // The descriptor may already be closed, in which case epoll dropped it.
    epoll_ctl(mode.epollFd, EPOLL_CTL_DEL, removed->fd, nullptr);
    --mode.sourceCount;
    // From another thread, return only once the callback is no longer
    // running, so that the caller may free what the callback uses. On the
    // loop's own thread the callback may be the caller itself.
    if (std::this_thread::get_id() != _state->owner) {
        _state->sourceFinished.wait(guard, [&] {
            return std::find(_state->dispatching.begin(), _state->dispatching.end(), id) ==
                   _state->dispatching.end();
        });
    }
    guard.unlock();
    removed.reset();
    // A run sleeping in that mode may now have nothing left to serve.
    wakeUp();
}

}  // namespace VeltoHost
