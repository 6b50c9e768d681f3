#pragma once

#include <functional>
#include <string>

namespace VeltoHost {

// Threads of the host: detached threads and their scheduling.
class Thread {
public:
    // Starts `body` on a new detached thread; `name` shows in debuggers (at
    // most 15 characters are kept). Returns false when no thread could be
    // started: the failure is logged and `body` is released without running.
    // Never throws, so that callers on the live path can rely on the result.
    static bool startDetached(std::function<void()> body, const std::string& name = {}) noexcept;

    // Makes the next `count` calls of startDetached fail as if the system
    // had no thread to give, so that tests can reach the failure paths of
    // its callers. 0 ends a failure run early.
    static void failNextStarts(unsigned count) noexcept;

    // Sets the calling thread's scheduling policy (SCHED_RR is 2) and
    // priority; returns 0 or the error number (EPERM without the privilege).
    static int setCurrentScheduling(int policy, int priority);
};

}  // namespace VeltoHost
