#include "Cli.h"

#include "ConvertCommand.h"
#include "CtlCommand.h"
#include "DaemonCommand.h"
#include "DumpCommand.h"
#include "EmulateCommand.h"
#include "EvalCommand.h"
#include "FiniteNumberCheck.h"
#include "HostCommand.h"
#include "PropertiesCommand.h"
#include "RecordCommand.h"
#include "ReplayCommand.h"
#include "ReportCommand.h"
#include "StateArguments.h"
#include "SynthCommand.h"
#include "ToolError.h"
#include "ToolVersion.h"
#include "evaluation/CorpusShard.h"
#include "evaluation/SweepGrid.h"
#include "host/BusConnection.h"
#include "host/SimulatedDevicePlayer.h"

#include <CLI/CLI.hpp>

#include <algorithm>
#include <exception>
#include <iostream>

namespace VeltoTool {

namespace {

constexpr int kUsageError = 2;
constexpr int kFailure = 1;

// Slower than this, a 10 ms gap between reports would take hours.
constexpr double kSlowestSpeed = 0.001;

// Turns a ToolError of an argument parser into a check of the command line,
// so that the argument is refused as a usage error before anything runs.
template <typename Parse>
CLI::Validator argumentCheck(const std::string& description, Parse parse)
{
    return CLI::Validator(
        [parse](std::string& text) -> std::string {
            try {
                parse(text);
            } catch (const ToolError& error) {
                return error.what();
            }
            return {};
        },
        description);
}

const CLI::Validator& busCheck()
{
    static const CLI::Validator check = argumentCheck("BUS", [](const std::string& text) {
        try {
            VeltoHost::BusConnection::Address::parse(text);
        } catch (const std::invalid_argument& error) {
            throw ToolError(error.what());
        }
    });
    return check;
}

const CLI::Validator& settingCheck()
{
    static const CLI::Validator check = argumentCheck("KEY=JSON", [](const std::string& argument) {
        const auto [key, value] = StateArguments::split(argument);
        StateArguments::parseValue(key, value);
    });
    return check;
}

// A device is a hidraw path or sim:FILE; "sim:" alone names no recording.
const CLI::Validator& deviceCheck()
{
    static const CLI::Validator check = argumentCheck("sim:FILE|/dev/hidrawN", [](const std::string& argument) {
        if (argument == VeltoHost::SimulatedDevicePlayer::kDevicePrefix) {
            throw ToolError("sim: needs a recording after the colon (sim:FILE)");
        }
        if (argument.empty()) throw ToolError("expected sim:FILE or /dev/hidrawN, got nothing");
    });
    return check;
}

const CLI::Validator& speedCheck()
{
    static const FiniteNumberCheck check(kSlowestSpeed, /*zeroAllowed=*/true);
    return check;
}

// The tool's commands in the order they were added, "replay, synth, ...",
// for the messages about a word that is none of them.
std::string commandNames(const CLI::App& app, const CLI::App* leftOut = nullptr)
{
    std::string names;
    for (const CLI::App* command : app.get_subcommands([&](const CLI::App* c) { return c != leftOut; })) {
        names += (names.empty() ? "" : ", ") + command->get_name();
    }
    return names;
}

// One line, whatever CLI11 wrote, and where to read more.
std::string usageLine(const CLI::App& app, const CLI::ParseError& error, int argc, const char* const* argv)
{
    std::string message = error.what();
    // CLI11 takes a word that is no command for a missing command.
    if (app.get_subcommands().empty() && argc > 1 && argv[1][0] != '-') {
        message = std::string("no command \"") + argv[1] + "\" (" + commandNames(app) + ")";
    }
    std::replace(message.begin(), message.end(), '\n', ' ');
    std::string help = "veltotouch help";
    for (const CLI::App* command : app.get_subcommands()) help += " " + command->get_name();
    return "veltotouch: " + message + " (see '" + help + "')";
}

// Where a command reads recordings: which device of a hid-recorder file.
void addHidDeviceOption(CLI::App* command, std::optional<std::uint32_t>& device)
{
    command->add_option("--hid-device", device,
                        "N: of a hid-recorder file holding several devices, the one to read (default: the one whose "
                        "report descriptor declares the surface's reports)");
}

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
    app.set_version_flag("--version", ToolVersion::text());

    ReplayCommand::Options replay;
    std::vector<std::string> replaySets;
    auto* replayCommand = app.add_subcommand("replay", "Play a recording through a fresh pipeline and print its gestures");
    replayCommand->add_option("FILE", replay.file, "Recording (container, or hid-recorder text)")->required();
    replayCommand
        ->add_option("--speed", replay.speed,
                     "Pace like the recording, S times faster, S at least 0.001 (default 0: as fast as possible)")
        ->check(speedCheck());
    replayCommand
        ->add_option("--max-gap", replay.maxGapSeconds,
                     "When paced, wait at most this many seconds for one gap between reports")
        ->check(FiniteNumberCheck(0))
        ->capture_default_str();
    replayCommand->add_option("--set", replaySets, "KEY=VALUE: pipeline state before the first frame (VALUE is JSON)")
        ->check(settingCheck());
    replayCommand->add_option("--get", replay.reads, "KEY: pipeline state to print after the last frame");
    replayCommand->add_flag("--dump", replay.dump,
                            "Print the recogniser's per-frame descriptions (with --jsonl: its record of each frame)");
    replayCommand->add_flag("--jsonl", replay.jsonLines, "One JSON object per line");
    replayCommand->add_option("--check", replay.check,
                              "EXPECTED: compare the events (and the values it holds) with this file of --jsonl "
                              "lines instead of printing them; exit 1 at the first difference");
    addHidDeviceOption(replayCommand, replay.hidDevice);

    SynthCommand::Options synth;
    auto* synthCommand = app.add_subcommand("synth", "Write a recording made from a gesture script");
    auto* synthScript = synthCommand->add_option("SCRIPT", synth.script, "Gesture script, or @FILE to read it from a file");
    synthCommand->add_option("-o,--output", synth.output, "Recording to write")->required();
    synthCommand->add_option("--frame-period", synth.framePeriodMs, "Milliseconds between frames, at least 1")
        ->check(FiniteNumberCheck(1))
        ->capture_default_str();
    synthCommand->add_option("--seed", synth.seed, "Seed of the sensor noise (and of --random)")->capture_default_str();
    synthCommand
        ->add_option("--random", synth.randomTouches,
                     "N: instead of a SCRIPT, N touches drawn at random (kinds, durations, positions, sizes, noise, gaps)")
        ->check(CLI::Range(1u, 1'000'000u))
        ->excludes(synthScript);
    synthCommand->add_option("--truth", synth.truth,
                             "TRUTH.jsonl: also write one JSON line per touch, noise and reset (\"auto\": FILE with its "
                             "extension replaced by .truth.jsonl, where eval looks for it)");

    EvalCommand::Options eval;
    std::vector<std::string> evalSets;
    auto* evalCommand = app.add_subcommand("eval", "Measure the recogniser on synthesised recordings against their truth");
    evalCommand->add_option("FILE", eval.files, "Recordings (with --merge: reports of eval --json)")->required();
    evalCommand->add_option("--truth", eval.truth, "auto (FILE with its extension replaced by .truth.jsonl) or PATH")
        ->capture_default_str();
    evalCommand->add_option("--set", evalSets, "KEY=VALUE: pipeline state before each replay (VALUE is JSON)")
        ->check(settingCheck());
    evalCommand->add_option("--sweep", eval.sweeps, "KEY=FROM:TO:STEP: evaluate once per value (repeat for a grid)")
        ->check(argumentCheck("KEY=FROM:TO:STEP", [](const std::string& text) {
            try {
                VeltoTouch::SweepGrid::parseAxis(text);
            } catch (const std::invalid_argument& error) {
                throw ToolError(error.what());
            }
        }));
    evalCommand->add_option("-j,--jobs", eval.workers, "Worker threads (default: all cores)")->check(CLI::Range(1u, 1024u));
    evalCommand->add_option("--shard", eval.shard, "I/N: only every N-th recording, starting at I (0 <= I < N)")
        ->check(argumentCheck("I/N", [](const std::string& text) {
            try {
                VeltoTouch::CorpusShard::parse(text);
            } catch (const std::invalid_argument& error) {
                throw ToolError(error.what());
            }
        }));
    evalCommand->add_flag("--merge", eval.merge, "FILEs are reports of eval --json (shards); print them added up");
    evalCommand->add_flag("--json", eval.json, "One JSON document instead of tables");
    addHidDeviceOption(evalCommand, eval.hidDevice);

    DumpCommand::Options dump;
    auto* dumpCommand = app.add_subcommand("dump", "Draw each Image report of a recording over the pad layout");
    dumpCommand->add_option("FILE", dump.file, "Recording (container, or hid-recorder text)")->required();
    dumpCommand->add_option("--frames", dump.frames, "A:B, inclusive range of frame numbers (either side may be left out)")
        ->check(argumentCheck("A:B", [](const std::string& text) { DumpCommand::parseRange(text); }));
    dumpCommand->add_flag("--levels", dump.levels, "Draw the levels instead of the readings");
    addHidDeviceOption(dumpCommand, dump.hidDevice);

    HostCommand::Options host;
    std::vector<std::string> hostSets;
    auto* hostCommand = app.add_subcommand("host", "Run the plug-in in the host against a simulated or a real device");
    hostCommand->add_option("--device", host.device, "sim:FILE (a recording played as a device) or /dev/hidrawN")
        ->required()
        ->check(deviceCheck());
    hostCommand->add_option("--plugin", host.plugin,
                            "Plug-in module to load (default: $VELTOTOUCH_PLUGIN, else the installed or built module)");
    hostCommand->add_option("--speed", host.speed, "Simulated device: play S times faster than recorded")->capture_default_str()->check(speedCheck());
    hostCommand->add_option("--set", hostSets, "Pipeline.KEY=VALUE: property to write before reports flow (VALUE is JSON)")->check(settingCheck());
    hostCommand
        ->add_option("--max-gap", host.maxGapSeconds,
                     "Simulated device: wait at most this many seconds for one gap between reports")
        ->check(FiniteNumberCheck(0))
        ->capture_default_str();
    hostCommand->add_option("--get", host.reads, "KEY: property to read at the end");
    hostCommand->add_option("--save-recording", host.saveRecording, "Write the plug-in's \"Recording\" property here at the end");
    hostCommand->add_flag("--jsonl", host.jsonLines, "One JSON object per line");
    hostCommand->add_flag("--summary", host.summary, "Print the gesture counters at the end");
    addHidDeviceOption(hostCommand, host.hidDevice);

    DaemonCommand::Options daemon;
    auto* daemonCommand = app.add_subcommand("daemon", "Serve touch devices on D-Bus and turn their gestures into keys");
    daemonCommand->add_option("--config", daemon.config, "TOML settings: devices to take, key map, log level")
        ->check(CLI::ExistingFile);
    daemonCommand->add_option("--bus", daemon.bus, "system, session or a D-Bus address")
        ->capture_default_str()
        ->check(busCheck());
    daemonCommand->add_option("--device", daemon.devices, "sim:FILE (a recording played, then left attached) or /dev/hidrawN")
        ->check(deviceCheck());
    daemonCommand->add_option("--speed", daemon.speed, "Simulated devices: play S times faster than recorded (0: at once)")
        ->capture_default_str()
        ->check(speedCheck());
    daemonCommand->add_flag("!--no-udev", daemon.udev, "Take no device by itself, only those given with --device");
    daemonCommand->add_flag("!--no-keys", daemon.keys, "Make no virtual keyboard");
    daemonCommand->add_option("--plugin", daemon.plugin,
                              "Plug-in module to load (default: $VELTOTOUCH_PLUGIN, else the installed or built module)");
    addHidDeviceOption(daemonCommand, daemon.hidDevice);

    PropertiesCommand::Options properties;
    auto* propertiesCommand =
        app.add_subcommand("properties", "List every property of the plug-in: type, access, default and meaning");
    propertiesCommand->add_flag("--markdown", properties.markdown, "As a Markdown document (docs/properties.md)");

    CtlCommand::Options ctl;
    auto* ctlCommand = app.add_subcommand("ctl", "Ask the running daemon: devices, properties, gestures, recordings");
    ctlCommand->add_option("--bus", ctl.bus, "system, session or a D-Bus address")
        ->capture_default_str()
        ->check(busCheck());
    ctlCommand->fallthrough();
    ctlCommand->require_subcommand(1);
    const auto ctlAction = [&](const char* name, const char* description, CtlCommand::Action action) {
        CLI::App* command = ctlCommand->add_subcommand(name, description);
        command->callback([&ctl, action] { ctl.action = action; });
        if (action != CtlCommand::Action::Devices) {
            command->add_option("-d,--device", ctl.device, "N: device number (see 'ctl devices'); default the first");
        }
        return command;
    };
    ctlAction("devices", "List the attached devices: number and name", CtlCommand::Action::Devices);
    ctlAction("get", "Print a property's value as JSON", CtlCommand::Action::Get)
        ->add_option("KEY", ctl.key, "Property, e.g. Pipeline.Algs.EventStats")
        ->required();
    ctlAction("set", "Write a property", CtlCommand::Action::Set)
        ->add_option("KEY=VALUE", ctl.assignment, "VALUE is JSON")
        ->required()
        ->check(argumentCheck("KEY=JSON", [](const std::string& argument) { StateArguments::split(argument); }));
    auto* ctlEvents = ctlAction("events", "Print gestures as they happen, until interrupted (or the daemon stops)",
                                CtlCommand::Action::Events);
    ctlEvents->add_flag("--jsonl", ctl.jsonLines, "One JSON object per line");
    ctlEvents->add_flag("--follow", ctl.follow, "Go on when the daemon stops, and wait for it to come back");
    ctlAction("save-recording", "Write a device's recording to a file", CtlCommand::Action::SaveRecording)
        ->add_option("OUT", ctl.output, "File to write (opened here, with your rights)")
        ->required();
    ReportCommand::Options report;
    std::vector<std::string> reportSets;
    auto* reportCommand = app.add_subcommand("report", "Replay a recording into a self-contained HTML page");
    reportCommand->add_option("FILE", report.file, "Recording (container, or hid-recorder text)")->required();
    reportCommand->add_option("-o,--output", report.output, "HTML page to write")->required();
    reportCommand->add_option("--set", reportSets, "KEY=VALUE: pipeline state before the first frame (VALUE is JSON)")
        ->check(settingCheck());
    reportCommand->add_option("--frames", report.frames, "A:B, inclusive range of frame numbers to show")
        ->check(argumentCheck("A:B", [](const std::string& text) { DumpCommand::parseRange(text); }));
    reportCommand->add_option("--title", report.title, "Title of the page (default: the recording's file name)");
    addHidDeviceOption(reportCommand, report.hidDevice);

    EmulateCommand::Options emulate;
    auto* emulateCommand =
        app.add_subcommand("emulate", "Make a virtual surface through /dev/uhid and play a recording into it");
    emulateCommand->add_option("FILE", emulate.file, "Recording (container, or hid-recorder text)")->required();
    // Ids and durations as the daemon's configuration writes them: 0xHEX or decimal.
    const auto emulateNumber = [&](const char* name, const char* type, std::uint32_t largest, auto& target,
                                   const char* description) {
        emulateCommand
            ->add_option_function<std::string>(
                name,
                [&target, largest](const std::string& text) {
                    target = static_cast<std::remove_reference_t<decltype(target)>>(
                        EmulateCommand::parseNumber(text, largest));
                },
                description)
            ->type_name(type)
            ->check(argumentCheck("", [largest](const std::string& text) {
                EmulateCommand::parseNumber(text, largest);
            }));
    };
    emulateNumber("--vendor", "ID", 0xFFFF, emulate.vendor, "USB vendor id, 0xHEX or decimal (default 0x1234)");
    emulateNumber("--product", "ID", 0xFFFF, emulate.product, "USB product id (default 0x5678)");
    emulateCommand
        ->add_option("--speed", emulate.speed,
                     "Play S times faster than recorded, S at least 0.001 (0: as fast as the kernel takes the reports)")
        ->capture_default_str()
        ->check(speedCheck());
    emulateCommand
        ->add_option("--max-gap", emulate.maxGapSeconds, "Wait at most this many seconds for one gap between reports")
        ->check(FiniteNumberCheck(0))
        ->capture_default_str();
    emulateCommand->add_flag("--loop", emulate.loop, "Play the recording again and again until interrupted");
    emulateNumber("--hold-duration", "MS", 0xFFFFFFFF, emulate.holdDurationMs,
                  "Factory-reset hold duration the device reports (default 5000)");
    // Hidden from help: the uhid node elsewhere (the tests name one that is not there).
    emulateCommand->add_option("--uhid", emulate.uhidPath, "uhid node")->group("");
    addHidDeviceOption(emulateCommand, emulate.hidDevice);

    ConvertCommand::Options convert;
    auto* convertCommand =
        app.add_subcommand("convert", "Write a recording container as a hid-recorder text, or such a text as a container");
    convertCommand->add_option("IN", convert.input, "Recording (container, or hid-recorder text)")->required();
    convertCommand->add_option("-o,--output", convert.output, "File to write")->required();
    convertCommand
        ->add_option_function<std::string>(
            "--format", [&](const std::string& text) { convert.format = ConvertCommand::parseFormat(text); },
            "container or hid (default: the other format than IN's)")
        ->type_name("FORMAT")
        ->check(argumentCheck("container|hid", [](const std::string& text) { ConvertCommand::parseFormat(text); }));
    addHidDeviceOption(convertCommand, convert.hidDevice);

    RecordCommand::Options record;
    record.config = VELTO_DEFAULT_CONFIG;
    auto* recordCommand = app.add_subcommand("record", "Capture a surface's input reports to a recording as they arrive");
    recordCommand->add_option("DEVICE", record.device,
                              "hidraw node (default: the first surface the configuration's [[match]] ids name)");
    recordCommand->add_option("-o,--output", record.output, "Recording to write")->required();
    recordCommand->add_option("--duration", record.durationSeconds,
                              "Stop after this many seconds (default: at Ctrl-C, SIGTERM or an unplug)")
        ->check(FiniteNumberCheck(0.001));
    recordCommand
        ->add_option_function<std::string>(
            "--format", [&](const std::string& text) { record.format = ConvertCommand::parseFormat(text); },
            "container or hid (default: hid for an output ending in .hid, else container)")
        ->type_name("FORMAT")
        ->check(argumentCheck("container|hid", [](const std::string& text) { ConvertCommand::parseFormat(text); }));
    recordCommand->add_option("--config", record.config, "TOML settings whose [[match]] ids find the surface")
        ->capture_default_str();

    std::string helpTopic;
    auto* helpCommand = app.add_subcommand("help", "Describe the commands, or one COMMAND and its options");
    helpCommand->add_option("COMMAND", helpTopic, "Command to describe");

    try {
        app.parse(argc, argv);
    } catch (const CLI::CallForHelp&) {
        out << app.help();
        return 0;
    } catch (const CLI::CallForAllHelp&) {
        out << app.help("", CLI::AppFormatMode::All);
        return 0;
    } catch (const CLI::CallForVersion& version) {
        out << version.what() << '\n';
        return 0;
    } catch (const CLI::ParseError& error) {
        err << usageLine(app, error, argc, argv) << '\n';
        return kUsageError;
    }

    if (*helpCommand) {
        if (helpTopic.empty()) {
            // The whole tool's help: App::help() would describe the help command itself.
            out << app.get_formatter()->make_help(&app, app.get_name(), CLI::AppFormatMode::Normal);
            return 0;
        }
        const auto commands = app.get_subcommands([&](const CLI::App* command) {
            return command->get_name() == helpTopic && command != helpCommand;
        });
        if (commands.empty()) {
            err << "veltotouch: help: no command \"" << helpTopic << "\" (" << commandNames(app, helpCommand) << ")\n";
            return kUsageError;
        }
        out << commands.front()->help("veltotouch");
        return 0;
    }

    // Said here rather than with CLI11's excludes, whose help lists the
    // excluded options in no fixed order.
    if (*replayCommand && !replay.check.empty() && (replay.jsonLines || replay.dump || !replay.reads.empty())) {
        err << "veltotouch: --check compares instead of printing: it takes no --jsonl, --dump or --get (see "
               "'veltotouch help replay')\n";
        return kUsageError;
    }

    try {
        if (*replayCommand) {
            replay.settings = splitAll(replaySets);
            return ReplayCommand::run(replay, out, err);
        } else if (*synthCommand) {
            SynthCommand::run(synth);
        } else if (*evalCommand) {
            eval.settings = splitAll(evalSets);
            return EvalCommand::run(eval, out, err);
        } else if (*dumpCommand) {
            DumpCommand::run(dump, out);
        } else if (*propertiesCommand) {
            PropertiesCommand::run(properties, out);
        } else if (*reportCommand) {
            report.settings = splitAll(reportSets);
            ReportCommand::run(report, err);
        } else if (*hostCommand) {
            host.settings = splitAll(hostSets);
            return HostCommand::run(host, out, err);
        } else if (*daemonCommand) {
            return DaemonCommand::run(daemon, err);
        } else if (*ctlCommand) {
            return CtlCommand::run(ctl, out, err);
        } else if (*emulateCommand) {
            return EmulateCommand::run(emulate, err);
        } else if (*convertCommand) {
            ConvertCommand::run(convert, err);
        } else if (*recordCommand) {
            return RecordCommand::run(record, err);
        }
    } catch (const std::exception& error) {
        err << "veltotouch: " << error.what() << '\n';
        return kFailure;
    }
    return 0;
}

}  // namespace VeltoTool
