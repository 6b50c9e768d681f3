#pragma once

#include <csignal>

namespace VeltoHost {

// SIGINT and SIGTERM, turned from "kill the process" into a request that the
// host's main thread polls, so that it can stop feeding, let the plug-in
// finish and save what it was asked to save.
//
// The handlers are installed without SA_RESTART: a blocking read or sleep is
// interrupted by the signal (EINTR) instead of resuming, so that a host
// waiting on a slow input (a pipe, a stalled disk) notices the request at
// once. One instance at a time; the previous dispositions come back when it
// goes.
class StopSignals {
public:
    StopSignals();
    ~StopSignals();
    StopSignals(const StopSignals&) = delete;
    StopSignals& operator=(const StopSignals&) = delete;

    // True once SIGINT or SIGTERM arrived while installed.
    static bool requested() noexcept;

private:
    struct sigaction _previousInt {};
    struct sigaction _previousTerm {};
};

}  // namespace VeltoHost
