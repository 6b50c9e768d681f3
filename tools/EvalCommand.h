#pragma once

#include "StateArguments.h"
#include "evaluation/CorpusShard.h"
#include "evaluation/SweepGrid.h"

#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch eval FILE...`: replays recordings, matches their gestures to
// the truth written by `synth --truth`, and prints how well the recogniser
// did (a confusion table, precision and recall and latency per class), or,
// with --sweep, one row per setting of a grid. With --merge the FILEs are
// reports written by `eval --json` (of shards) and are added up instead.
class EvalCommand {
public:
    struct Options {
        std::vector<std::string> files;
        // "auto" (TruthRecord::pathBeside of each recording) or one truth file
        // for a single recording.
        std::string truth = "auto";
        // Applied before every replay.
        std::vector<StateArguments::Setting> settings;
        // One axis of the grid each.
        std::vector<VeltoTouch::SweepGrid::Axis> sweeps;
        // 0: all cores.
        unsigned workers = 0;
        // Empty: every recording.
        std::optional<VeltoTouch::CorpusShard> shard;
        bool merge = false;
        bool json = false;
        // Of a hid-recorder file holding several devices, the one to read;
        // empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
    };

    // Returns the exit status: 2 for options that do not go together or a
    // sweep grid beyond its limit, 0 otherwise; throws ToolError (or the
    // recording's error) on failure.
    static int run(const Options& options, std::ostream& out, std::ostream& err);

    // `eval` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
