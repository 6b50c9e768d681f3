#pragma once

#include <ostream>
#include <string>
#include <utility>
#include <vector>

namespace VeltoTool {

// `veltotouch host`: starts the host event system, loads the plug-in module,
// runs it against a simulated device (a recording played as a device) or a
// real hidraw device, prints every event the host's callback receives, and
// shuts everything down in order at the end of the stream or on SIGINT/SIGTERM.
class HostCommand {
public:
    struct Options {
        std::string device;  // "sim:FILE" or a /dev/hidrawN path
        std::string plugin = defaultPluginPath();
        float speed = 1.0f;
        // Properties written before reports flow ("Pipeline.Algs.HoldTimeoutMilliseconds" and a JSON value).
        std::vector<std::pair<std::string, std::string>> settings;
        std::vector<std::string> reads;
        std::string saveRecording;
        bool jsonLines = false;
        bool summary = false;
    };

    static int run(const Options& options, std::ostream& out, std::ostream& err);

    // The module built beside the tool, found relative to the running executable.
    static std::string defaultPluginPath();
};

}  // namespace VeltoTool
