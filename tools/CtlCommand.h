#pragma once

#include "bus/BusConnection.h"

#include <optional>
#include <ostream>
#include <string>
#include <utility>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch ctl`: the daemon's control interface for people who do not
// speak D-Bus. Lists the devices, reads and writes their properties (values
// as JSON text, as the daemon takes them), saves a device's recording, and
// prints gestures as they happen in the same lines as `host` and `replay`.
class CtlCommand {
public:
    enum class Action { Devices, Get, Set, Events, SaveRecording };

    struct Options {
        VeltoHost::BusConnection::Address bus;  // the system bus unless given
        Action action = Action::Devices;
        std::optional<unsigned> device;  // empty: the first attached (Events: all)
        std::string key;                 // Get
        std::pair<std::string, std::string> assignment;  // Set: KEY and VALUE (JSON, read by the daemon)
        std::string output;              // SaveRecording
        bool jsonLines = false;          // Events
        bool follow = false;             // Events: go on across a restart of the daemon
    };

    // Returns the exit status; throws ToolError when the daemon cannot be
    // reached or refuses a request, and when it stops while its events are
    // watched (unless `follow`). Warnings and notices go to `err`.
    static int run(const Options& options, std::ostream& out, std::ostream& err);

    // `ctl` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
