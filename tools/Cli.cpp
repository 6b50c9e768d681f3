#include "Cli.h"

#include "DumpCommand.h"
#include "HostCommand.h"
#include "ReplayCommand.h"
#include "StateArguments.h"
#include "SynthCommand.h"

#include <CLI/CLI.hpp>

#include <exception>
#include <iostream>

namespace VeltoTool {

namespace {

constexpr int kUsageError = 2;
constexpr int kFailure = 1;

std::vector<std::pair<std::string, std::string>> splitAll(const std::vector<std::string>& arguments)
{
    std::vector<std::pair<std::string, std::string>> out;
    for (const std::string& argument : arguments) out.push_back(StateArguments::split(argument));
    return out;
}

}  // namespace

int Cli::main(int argc, char** argv) { return run(argc, argv, std::cout, std::cerr); }

int Cli::run(int argc, const char* const* argv, std::ostream& out, std::ostream& err)
{
    CLI::App app{"veltotouch: replay, synthesise, inspect and host VeltoTouch recordings", "veltotouch"};
    app.require_subcommand(1);

    ReplayCommand::Options replay;
    std::vector<std::string> replaySets;
    auto* replayCommand = app.add_subcommand("replay", "Play a recording through a fresh pipeline and print its gestures");
    replayCommand->add_option("FILE", replay.file, "Recording container (JSON)")->required();
    replayCommand->add_option("--speed", replay.speed, "Pace like the recording, S times faster (default: as fast as possible)");
    replayCommand->add_option("--set", replaySets, "KEY=VALUE: pipeline state before the first frame (VALUE is JSON)");
    replayCommand->add_option("--get", replay.reads, "KEY: pipeline state to print after the last frame");
    replayCommand->add_flag("--dump", replay.dump, "Print the recogniser's per-frame descriptions");
    replayCommand->add_flag("--jsonl", replay.jsonLines, "One JSON object per line");

    SynthCommand::Options synth;
    auto* synthCommand = app.add_subcommand("synth", "Write a recording made from a gesture script");
    synthCommand->add_option("SCRIPT", synth.script, "Gesture script, or @FILE to read it from a file")->required();
    synthCommand->add_option("-o,--output", synth.output, "Recording to write")->required();
    synthCommand->add_option("--frame-period", synth.framePeriodMs, "Milliseconds between frames")->capture_default_str();
    synthCommand->add_option("--seed", synth.seed, "Seed of the sensor noise")->capture_default_str();

    DumpCommand::Options dump;
    auto* dumpCommand = app.add_subcommand("dump", "Draw each Image report of a recording over the pad layout");
    dumpCommand->add_option("FILE", dump.file, "Recording container (JSON)")->required();
    dumpCommand->add_option("--frames", dump.frames, "A:B, inclusive range of frame numbers (either side may be left out)");
    dumpCommand->add_flag("--levels", dump.levels, "Draw the levels instead of the readings");

    HostCommand::Options host;
    std::vector<std::string> hostSets;
    auto* hostCommand = app.add_subcommand("host", "Run the plug-in in the host against a simulated or a real device");
    hostCommand->add_option("--device", host.device, "sim:FILE (a recording played as a device) or /dev/hidrawN")->required();
    hostCommand->add_option("--plugin", host.plugin,
                            "Plug-in module to load (default: $VELTOTOUCH_PLUGIN, else the installed or built module)");
    hostCommand->add_option("--speed", host.speed, "Simulated device: play S times faster than recorded")->capture_default_str();
    hostCommand->add_option("--set", hostSets, "Pipeline.KEY=VALUE: property to write before reports flow (VALUE is JSON)");
    hostCommand->add_option("--get", host.reads, "KEY: property to read at the end");
    hostCommand->add_option("--save-recording", host.saveRecording, "Write the plug-in's \"Recording\" property here at the end");
    hostCommand->add_flag("--jsonl", host.jsonLines, "One JSON object per line");
    hostCommand->add_flag("--summary", host.summary, "Print the gesture counters at the end");

    try {
        app.parse(argc, argv);
    } catch (const CLI::CallForHelp&) {
        out << app.help();
        return 0;
    } catch (const CLI::CallForAllHelp&) {
        out << app.help("", CLI::AppFormatMode::All);
        return 0;
    } catch (const CLI::ParseError& error) {
        // Help of the subcommand that was being parsed, when there is one.
        err << "veltotouch: " << error.what() << '\n';
        err << "Run 'veltotouch --help' or 'veltotouch <command> --help' for usage.\n";
        return kUsageError;
    }

    try {
        if (*replayCommand) {
            replay.settings = splitAll(replaySets);
            ReplayCommand::run(replay, out);
        } else if (*synthCommand) {
            SynthCommand::run(synth);
        } else if (*dumpCommand) {
            DumpCommand::run(dump, out);
        } else if (*hostCommand) {
            host.settings = splitAll(hostSets);
            return HostCommand::run(host, out, err);
        }
    } catch (const std::exception& error) {
        err << "veltotouch: " << error.what() << '\n';
        return kFailure;
    }
    return 0;
}

}  // namespace VeltoTool
