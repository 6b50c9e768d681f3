#pragma once

#include <cstdint>
#include <ostream>
#include <string>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch synth SCRIPT -o FILE`: writes a recording container made from a
// gesture script (see GestureScript for the language).
class SynthCommand {
public:
    struct Options {
        // The script itself, or "@path" to read it from a file.
        std::string script;
        // Instead of a script: this many touches drawn at random (RandomScript).
        std::uint32_t randomTouches = 0;
        std::string output;
        // The truth file (one JSON line per touch), or "auto" for the name
        // eval looks for beside the output (TruthRecord::pathBeside).
        std::string truth;
        std::uint32_t framePeriodMs = 10;
        std::uint32_t seed = 1;
    };

    static void run(const Options& options);
    // The container text, without touching the file system.
    static std::string containerFor(const std::string& script, std::uint32_t framePeriodMs, std::uint32_t seed);

    // `synth` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
