#pragma once

#include "DumpCommand.h"
#include "StateArguments.h"

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch report FILE -o OUT.html`: replays a recording through a fresh
// pipeline and writes one self-contained HTML page of what the recogniser saw
// and did.
class ReportCommand {
public:
    struct Options {
        std::string file;
        std::string output;
        // Pipeline state applied before the first frame, as for replay.
        std::vector<StateArguments::Setting> settings;
        // Frame numbers to show; empty: all.
        std::optional<DumpCommand::FrameRange> frames;
        // Default: the recording's file name.
        std::string title;
        // Of a hid-recorder file holding several devices, the one to read;
        // empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
    };

    // Warnings go to `err`. Throws ToolError or the recording's own errors.
    static void run(const Options& options, std::ostream& err);

    // `report` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
