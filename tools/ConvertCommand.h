#pragma once

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>

namespace CLI {
class App;
class Option;
}

namespace VeltoTool {

// `veltotouch convert IN -o OUT`: a recording container as a hid-recorder
// text and back. The hid-recorder file describes the surface as `veltotouch
// emulate` makes it (VirtualSurface, emulate's default ids), so that a player
// of such files can play it as the surface; its times are those of the
// container's input reports from the recording's first frame, in whole
// microseconds. State frames have no place in it and are left out.
class ConvertCommand {
public:
    enum class Format { Container, HidRecorder };

    struct Options {
        std::string input;
        std::string output;
        // Empty: the other format than the input's.
        std::optional<Format> format;
        // Of a hid-recorder input holding several devices, the one to read;
        // empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
    };

    // The name on the command line: "container" or "hid". Throws ToolError.
    static Format parseFormat(const std::string& text);
    // --format, as convert and record take it.
    static CLI::Option* addFormat(CLI::App& command, std::optional<Format>& format, const std::string& description);

    // Writes OUT through OutputFile (replaced only once complete); the count
    // of frames left out goes to `err`, one line. Throws ToolError or the
    // recording's own errors.
    static void run(const Options& options, std::ostream& err);

    // `convert` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
