#pragma once

#include <csignal>

namespace VeltoTool {

// SIGINT and SIGTERM, turned from "kill the process" into a request that the
// host's main thread polls, so that it can stop feeding, let the plug-in
// finish and save what it was asked to save. A service may also take SIGHUP,
// the conventional "read your configuration again", as a reload request
// polled the same way; every other command leaves SIGHUP alone, so that
// closing the terminal still ends it.
//
// The handlers are installed without SA_RESTART: a blocking read or sleep is
// interrupted by the signal (EINTR) instead of resuming, so that a host
// waiting on a slow input (a pipe, a stalled disk) notices the request at
// once. One instance at a time; the previous dispositions come back when it
// goes.
class StopSignals {
public:
    enum class Hangup { Unchanged, Reload };

    explicit StopSignals(Hangup hangup = Hangup::Unchanged);
    ~StopSignals();
    StopSignals(const StopSignals&) = delete;
    StopSignals& operator=(const StopSignals&) = delete;

    // True once SIGINT or SIGTERM arrived while installed.
    static bool requested() noexcept;
    // True when SIGHUP arrived (installed with Hangup::Reload) since the last
    // call: each call takes the request, so several signals before one reload
    // ask for that one reload.
    static bool takeReloadRequest() noexcept;

private:
    const Hangup _hangup;
    struct sigaction _previousInt {};
    struct sigaction _previousTerm {};
    struct sigaction _previousHup {};
};

}  // namespace VeltoTool
