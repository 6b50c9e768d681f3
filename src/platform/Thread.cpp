#include "platform/Thread.h"

#include <pthread.h>
#include <sched.h>

#include <thread>
#include <utility>

namespace VeltoHost {

namespace {

// The kernel keeps 15 characters of a thread name plus the terminator.
constexpr std::size_t kMaxThreadNameLength = 15;

}  // namespace

void Thread::startDetached(std::function<void()> body, const std::string& name)
{
    std::thread thread([body = std::move(body), name = name.substr(0, kMaxThreadNameLength)]() mutable {
        if (!name.empty()) pthread_setname_np(pthread_self(), name.c_str());
        body();
        // Release what the body captured on this thread, while the thread's
        // own state (its event loop among it) still exists.
        body = nullptr;
    });
    thread.detach();
}

int Thread::setCurrentScheduling(int policy, int priority)
{
    sched_param parameters{};
    parameters.sched_priority = priority;
    return pthread_setschedparam(pthread_self(), policy, &parameters);
}

}  // namespace VeltoHost
