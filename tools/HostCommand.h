#pragma once

#include "StateArguments.h"
#include "recording/GapCap.h"

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch host`: starts the host event system, loads the plug-in module,
// runs it against a simulated device (a recording played as a device) or a
// real hidraw device, prints every event the host's callback receives, and
// shuts everything down in order at the end of the stream or on SIGINT/SIGTERM.
//
// At the end (or on a signal) it first stops the flow of reports and lets the
// plug-in finish what it was given, then reads the --get properties and the
// recording, so that what it prints and saves is exactly what was processed.
class HostCommand {
public:
    struct Options {
        std::string device;  // "sim:FILE" or a /dev/hidrawN path
        std::string plugin;  // empty: look for it (PluginLocator)
        double speed = 1.0;
        double maxGapSeconds = VeltoHost::GapCap::kDefaultMaxSeconds;
        // Properties written before reports flow ("Pipeline.Algs.HoldTimeoutMilliseconds" and a JSON value).
        std::vector<StateArguments::Setting> settings;
        std::vector<std::string> reads;
        std::string saveRecording;
        bool jsonLines = false;
        bool summary = false;
        // Of a hid-recorder file holding several devices, the one to read;
        // empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
    };

    // Returns the exit status; throws ToolError for what the user can fix.
    static int run(const Options& options, std::ostream& out, std::ostream& err);

    // `host` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
