#pragma once

#include "ConvertCommand.h"

#include <functional>
#include <optional>
#include <ostream>
#include <string>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch record [DEVICE] -o FILE`: captures every input report a surface
// sends, for as long as it runs. Each report is written as it arrives,
// stamped with the host clock as the plug-in stamps what it receives, so a
// capture of any length takes no more memory than one of a second; SIGINT,
// SIGTERM, the end of --duration or an unplug close the file as a complete
// recording. hidraw hands every reader its own copy of each report, so a
// capture can run beside the daemon serving the same surface.
class RecordCommand {
public:
    struct Options {
        // A hidraw node; empty: the first surface `config` names.
        std::string device;
        std::string output;
        // Empty: until a stop signal or an unplug.
        std::optional<double> durationSeconds;
        // Empty: hid for an output ending in ".hid", else container.
        std::optional<ConvertCommand::Format> format;
        // Whose [[match]] ids find the surface when no device is given.
        std::string config;
    };
    using StopCheck = std::function<bool()>;

    // Everything that can be refused (a path that is no hidraw node, a device
    // that cannot be opened, an output that cannot be written, no surface to
    // find) is refused with a ToolError before the first report is read.
    static int run(const Options& options, std::ostream& err);
    // The same, stopping when `stopRequested` turns true (it is asked at least
    // every tenth of a second).
    static int run(const Options& options, const StopCheck& stopRequested, std::ostream& err);

    // The first hidraw node (by number) whose ids one of the configuration's
    // [[match]] tables names, found through udev. Throws ToolError.
    static std::string findSurface(const std::string& config);

    // `record` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
