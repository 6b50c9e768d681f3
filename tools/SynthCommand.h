#pragma once

#include <cstdint>
#include <string>

namespace VeltoTool {

// `veltotouch synth SCRIPT -o FILE`: writes a recording container made from a
// gesture script (see GestureScript for the language).
class SynthCommand {
public:
    struct Options {
        // The script itself, or "@path" to read it from a file.
        std::string script;
        std::string output;
        std::uint32_t framePeriodMs = 10;
        std::uint32_t seed = 1;
    };

    static void run(const Options& options);
    // The container text, without touching the file system.
    static std::string containerFor(const std::string& script, std::uint32_t framePeriodMs, std::uint32_t seed);
};

}  // namespace VeltoTool
