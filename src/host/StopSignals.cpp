#include "host/StopSignals.h"

#include <atomic>

namespace VeltoHost {

namespace {

// Lock-free, hence safe to store from a signal handler.
std::atomic<int> gStopSignal{0};
static_assert(std::atomic<int>::is_always_lock_free);

extern "C" void recordStopSignal(int number) { gStopSignal.store(number, std::memory_order_relaxed); }

}  // namespace

StopSignals::StopSignals()
{
    gStopSignal.store(0, std::memory_order_relaxed);
    struct sigaction action {};
    action.sa_handler = recordStopSignal;
    sigemptyset(&action.sa_mask);
    action.sa_flags = 0;  // no SA_RESTART: blocking calls return EINTR
    sigaction(SIGINT, &action, &_previousInt);
    sigaction(SIGTERM, &action, &_previousTerm);
}

StopSignals::~StopSignals()
{
    sigaction(SIGINT, &_previousInt, nullptr);
    sigaction(SIGTERM, &_previousTerm, nullptr);
}

bool StopSignals::requested() noexcept { return gStopSignal.load(std::memory_order_relaxed) != 0; }

}  // namespace VeltoHost
