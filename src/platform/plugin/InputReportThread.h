#pragma once

#include "platform/runtime/RunLoop.h"
#include "platform/runtime/Semaphore.h"

#include <functional>
#include <string>

namespace VeltoHost {

// The thread a service receives its device's reports on, with the handshake
// that makes starting and stopping it safe from the host's thread:
// start() returns only once the thread's run loop exists, and
// waitUntilStopped() only once the thread has let go of everything its steps
// held, so the service may then be destroyed.
//
// Owned by one thread (the host's); the run loop member is written by the new
// thread before the first signal and read only after it.
class InputReportThread {
public:
    struct Steps {
        // On the new thread, before start() returns.
        std::function<void()> begin;
        // On the new thread, after start() returned: runs the thread's run
        // loop until it is stopped. Destroyed (and with it what it captured)
        // before the thread signals that it is done.
        std::function<void()> run;
        // After that signal: it must not touch the owner, which may be gone.
        std::function<void()> end;
    };

    InputReportThread() = default;
    InputReportThread(const InputReportThread&) = delete;
    InputReportThread& operator=(const InputReportThread&) = delete;

    // Starts the thread and waits for its run loop. False when no thread
    // could be started: then nothing is left to stop or wait for.
    bool start(const std::string& name, Steps steps);
    // Whether a started thread has not been asked to stop yet.
    bool running() const noexcept { return _runLoop != nullptr; }
    // Stops the thread's run loop with a job in `mode` and wakes it.
    void requestStop(const std::string& mode);
    // Waits until the thread's steps are done; nothing when none was started.
    void waitUntilStopped();

private:
    RunLoop::Ref _runLoop;
    Semaphore::Ref _signal;
};

}  // namespace VeltoHost
