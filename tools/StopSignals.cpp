#include "StopSignals.h"

#include <atomic>

namespace VeltoTool {

namespace {

// Lock-free, hence safe to store from a signal handler.
std::atomic<int> gStopSignal{0};
std::atomic<bool> gReloadRequested{false};
static_assert(std::atomic<int>::is_always_lock_free);
static_assert(std::atomic<bool>::is_always_lock_free);

extern "C" void recordStopSignal(int number) { gStopSignal.store(number, std::memory_order_relaxed); }
extern "C" void recordReloadSignal(int) { gReloadRequested.store(true, std::memory_order_relaxed); }

void install(int number, void (*handler)(int), struct sigaction& previous)
{
    struct sigaction action {};
    action.sa_handler = handler;
    sigemptyset(&action.sa_mask);
    action.sa_flags = 0;  // no SA_RESTART: blocking calls return EINTR
    sigaction(number, &action, &previous);
}

}  // namespace

StopSignals::StopSignals(Hangup hangup) : _hangup(hangup)
{
    gStopSignal.store(0, std::memory_order_relaxed);
    gReloadRequested.store(false, std::memory_order_relaxed);
    install(SIGINT, recordStopSignal, _previousInt);
    install(SIGTERM, recordStopSignal, _previousTerm);
    if (_hangup == Hangup::Reload) install(SIGHUP, recordReloadSignal, _previousHup);
}

StopSignals::~StopSignals()
{
    sigaction(SIGINT, &_previousInt, nullptr);
    sigaction(SIGTERM, &_previousTerm, nullptr);
    if (_hangup == Hangup::Reload) sigaction(SIGHUP, &_previousHup, nullptr);
}

bool StopSignals::requested() noexcept { return gStopSignal.load(std::memory_order_relaxed) != 0; }

bool StopSignals::takeReloadRequest() noexcept { return gReloadRequested.exchange(false, std::memory_order_relaxed); }

}  // namespace VeltoTool
