#pragma once

#include "bus/BusConnection.h"

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch daemon`: the system service. Serves every configured device
// (found by udev) and every device given by hand on the bus, turns gestures
// into key presses, reads its configuration again on SIGHUP, and runs until
// SIGINT or SIGTERM, then takes the devices apart in the order they came.
class DaemonCommand {
public:
    struct Options {
        std::string config;                // TOML file; empty: built-in defaults
        VeltoHost::BusConnection::Address bus;  // the system bus unless given
        std::vector<std::string> devices;  // sim:FILE or /dev/hidrawN
        double speed = 1.0;
        // Of a sim:FILE that is a hid-recorder text of several devices, the
        // one to play; empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
        bool udev = true;
        bool keys = true;
        std::string plugin;  // empty: look for it (PluginLocator)
    };

    // The exit status when the command line and the configuration leave
    // nothing to serve: sysexits' EX_CONFIG, which the unit names in
    // RestartPreventExitStatus=, since restarting cannot help until an
    // administrator adds a [[match]].
    static constexpr int kNothingToServe = 78;

    // Returns the exit status (0 when stopped by a signal; kNothingToServe,
    // with its reason on err); throws ToolError (or the readers' errors) for
    // what keeps the service from starting or running: no bus, the bus lost.
    static int run(const Options& options, std::ostream& err);

    // `daemon` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
