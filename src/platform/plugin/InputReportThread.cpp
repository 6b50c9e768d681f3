#include "platform/plugin/InputReportThread.h"

#include "platform/runtime/Thread.h"

#include <utility>

namespace VeltoHost {

bool InputReportThread::start(const std::string& name, Steps steps)
{
    _signal = Semaphore::create(0);
    // The thread keeps its own reference to the semaphore: the owner may drop
    // its own as soon as the second signal is seen.
    Semaphore::Ref signal = _signal;
    const bool started = Thread::startDetached(
        [this, signal, steps = std::move(steps)]() mutable {
            if (steps.begin) steps.begin();
            _runLoop = RunLoop::current();
            signal->signal();
            std::function<void()> run = std::move(steps.run);
            if (run) run();
            run = nullptr;
            std::function<void()> end = std::move(steps.end);
            steps = {};
            signal->signal();
            if (end) end();
        },
        name);
    if (!started) {
        // Nothing will ever signal: waiting would hang the caller.
        _signal.reset();
        return false;
    }
    _signal->wait();
    return true;
}

void InputReportThread::requestStop(const std::string& mode)
{
    if (!_runLoop) return;
    _runLoop->performJob(mode, [] { RunLoop::stopCurrent(); });
    _runLoop->wakeUp();
    _runLoop.reset();
}

void InputReportThread::waitUntilStopped()
{
    if (_signal) _signal->wait();
    _signal.reset();
}

}  // namespace VeltoHost
