#include "platform/Thread.h"

#include "platform/Log.h"

#include <pthread.h>
#include <sched.h>

#include <system_error>
#include <thread>
#include <utility>

namespace VeltoHost {

namespace {

// The kernel keeps 15 characters of a thread name plus the terminator.
constexpr std::size_t kMaxThreadNameLength = 15;

}  // namespace

void Thread::startDetached(std::function<void()> body, const std::string& name)
{
    try {
        std::thread thread([body = std::move(body), name = name.substr(0, kMaxThreadNameLength)]() mutable {
            if (!name.empty()) pthread_setname_np(pthread_self(), name.c_str());
            body();
            // Release what the body captured on this thread, while the thread's
            // own state (its event loop among it) still exists.
            body = nullptr;
        });
        thread.detach();
    } catch (const std::system_error& error) {
        // Out of threads: callers on the live path must not see an exception.
        static const Log log("Thread");
        log.error("cannot start thread %s: %s", name, error.what());
    }
}

int Thread::setCurrentScheduling(int policy, int priority)
{
    sched_param parameters{};
    parameters.sched_priority = priority;
    return pthread_setschedparam(pthread_self(), policy, &parameters);
}

}  // namespace VeltoHost
