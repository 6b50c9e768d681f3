#pragma once

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch dump FILE`: draws the pad readings of each Image report of a
// recording over the pad layout.
class DumpCommand {
public:
    struct FrameRange {
        std::uint32_t first = 0;
        std::uint32_t last = UINT32_MAX;
        bool contains(std::uint32_t frame) const noexcept { return frame >= first && frame <= last; }
    };
    // "A:B", "A:" or ":B", inclusive; throws ToolError for text that is not a range.
    static FrameRange parseRange(const std::string& text);

    struct Options {
        std::string file;
        // Image frame numbers to draw; every frame unless given.
        FrameRange frames;
        // Draw the levels instead of the readings.
        bool levels = false;
        // Of a hid-recorder file holding several devices, the one to read;
        // empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
    };

    static void run(const Options& options, std::ostream& out);

    // `dump` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
