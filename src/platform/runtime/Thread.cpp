#include "platform/runtime/Thread.h"

#include "platform/log/Log.h"

#include <pthread.h>
#include <sched.h>

#include <atomic>
#include <exception>
#include <thread>
#include <utility>

namespace VeltoHost {

namespace {

// The kernel keeps 15 characters of a thread name plus the terminator.
constexpr std::size_t kMaxThreadNameLength = 15;

std::atomic<unsigned>& startsToFail()
{
    static std::atomic<unsigned> count{0};
    return count;
}

// Takes one of the failures asked for by failNextStarts, if any is left.
bool takeInjectedFailure() noexcept
{
    unsigned left = startsToFail().load();
    while (left > 0 && !startsToFail().compare_exchange_weak(left, left - 1)) {
    }
    return left > 0;
}

void logStartFailure(const std::string& name, const char* reason) noexcept
{
    try {
        static const Log log("Thread");
        log.error("cannot start thread %s: %s", name, reason);
    } catch (...) {
        // Out of memory for the line itself: the caller still learns of the
        // failure from the result.
    }
}

}  // namespace

bool Thread::startDetached(std::function<void()> body, const std::string& name) noexcept
{
    if (takeInjectedFailure()) {
        logStartFailure(name, "failure injected by failNextStarts");
        return false;
    }
    try {
        std::thread thread([body = std::move(body), name = name.substr(0, kMaxThreadNameLength)]() mutable {
            if (!name.empty()) pthread_setname_np(pthread_self(), name.c_str());
            body();
            // Release what the body captured on this thread, while the thread's
            // own state (its event loop among it) still exists.
            body = nullptr;
        });
        thread.detach();
        return true;
    } catch (const std::exception& error) {
        // Out of threads or memory: callers on the live path must not see an
        // exception, and must not wait for a thread that never ran.
        logStartFailure(name, error.what());
        return false;
    }
}

void Thread::failNextStarts(unsigned count) noexcept { startsToFail().store(count); }

int Thread::setCurrentScheduling(int policy, int priority)
{
    sched_param parameters{};
    parameters.sched_priority = priority;
    return pthread_setschedparam(pthread_self(), policy, &parameters);
}

}  // namespace VeltoHost
