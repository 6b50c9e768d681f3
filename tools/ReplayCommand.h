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

// `veltotouch replay FILE`: plays a recording through a fresh pipeline and
// prints the gestures it produces.
class ReplayCommand {
public:
    struct Options {
        std::string file;
        // 0 plays as fast as possible; otherwise paced like the recording, this many times faster.
        float speed = 0;
        // Paced playback waits at most this long for one gap between reports.
        double maxGapSeconds = VeltoHost::GapCap::kDefaultMaxSeconds;
        // Pipeline state applied before the first frame: key relative to the
        // pipeline ("Algs.HoldTimeoutMilliseconds") and a JSON value.
        std::vector<StateArguments::Setting> settings;
        // Pipeline state read after the last frame.
        std::vector<std::string> reads;
        bool dump = false;
        // Every line of `out` is then one JSON object, dumps included.
        bool jsonLines = false;
        // A file of expected events and values (as --jsonl prints them) to
        // compare the replay with, instead of printing it.
        std::string check;
        // Of a hid-recorder file holding several devices, the one to read;
        // empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
    };

    // Writes events, dumps and reads to `out`; warnings and notes to `err`.
    // With a check, one line: the verdict to `out`, or the first difference
    // to `err` and exit status 1. Throws ToolError or the recording's own errors.
    static int run(const Options& options, std::ostream& out, std::ostream& err);

    // `replay` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
