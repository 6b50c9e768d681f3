#pragma once

#include <functional>
#include <string>

namespace VeltoHost {

// Threads of the host: detached threads and their scheduling.
class Thread {
public:
    // Starts `body` on a new detached thread; `name` shows in debuggers (at
    // most 15 characters are kept).
    static void startDetached(std::function<void()> body, const std::string& name = {});

    // Sets the calling thread's scheduling policy (SCHED_RR is 2) and
    // priority; returns 0 or the error number (EPERM without the privilege).
    static int setCurrentScheduling(int policy, int priority);
};

}  // namespace VeltoHost
