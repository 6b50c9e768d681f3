#pragma once

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

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
        std::vector<std::pair<std::string, std::string>> settings;
        // "A:B", inclusive frame numbers to show (either side may be left out).
        std::string frames;
        // Default: the recording's file name.
        std::string title;
        // Of a hid-recorder file holding several devices, the one to read;
        // empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
    };

    // Warnings go to `err`. Throws ToolError or the recording's own errors.
    static void run(const Options& options, std::ostream& err);
};

}  // namespace VeltoTool
