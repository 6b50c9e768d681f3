#include "Cli.h"

#include "CommandLine.h"
#include "ConvertCommand.h"
#include "CtlCommand.h"
#include "DaemonCommand.h"
#include "DumpCommand.h"
#include "EmulateCommand.h"
#include "EvalCommand.h"
#include "HostCommand.h"
#include "PropertiesCommand.h"
#include "RecordCommand.h"
#include "ReplayCommand.h"
#include "ReportCommand.h"
#include "SynthCommand.h"
#include "ToolVersion.h"

#include <CLI/CLI.hpp>

#include <algorithm>
#include <exception>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

namespace VeltoTool {

namespace {

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

// One line, whatever CLI11 wrote, and where to read more: the help of the
// command the line was for.
std::string usageLine(const CLI::App& app, const CLI::ParseError& error)
{
    std::string message = error.what();
    // CLI11 takes a word that names no command for a missing command.
    const std::vector<std::string> unknown = app.remaining();
    if (app.get_subcommands().empty() && !unknown.empty() && !unknown.front().starts_with('-')) {
        message = "no command \"" + unknown.front() + "\" (" + commandNames(app) + ")";
    }
    std::replace(message.begin(), message.end(), '\n', ' ');
    std::string help = "veltotouch help";
    for (const CLI::App* command : app.get_subcommands()) help += " " + command->get_name();
    return "veltotouch: " + message + " (see '" + help + "')";
}

// `help [COMMAND]`: CLI11's help of the tool, or of one command.
void addHelp(CLI::App& app, int& status, std::ostream& out, std::ostream& err)
{
    auto topic = std::make_shared<std::string>();
    CLI::App* help = app.add_subcommand("help", "Describe the commands, or one COMMAND and its options");
    help->add_option("COMMAND", *topic, "Command to describe");
    help->callback([&app, help, topic, &status, &out, &err] {
        if (topic->empty()) {
            // App::help() here would describe the help command itself.
            out << app.get_formatter()->make_help(&app, app.get_name(), CLI::AppFormatMode::Normal);
            return;
        }
        const auto commands = app.get_subcommands(
            [&](const CLI::App* command) { return command->get_name() == *topic && command != help; });
        if (commands.empty()) {
            err << "veltotouch: help: no command \"" << *topic << "\" (" << commandNames(app, help) << ")\n";
            status = CommandLine::kUsageError;
            return;
        }
        out << commands.front()->help("veltotouch");
    });
}

}  // namespace

int Cli::main(int argc, char** argv) { return run(argc, argv, std::cout, std::cerr); }

int Cli::run(int argc, const char* const* argv, std::ostream& out, std::ostream& err)
{
    CLI::App app{"veltotouch: replay, synthesise, inspect and host VeltoTouch recordings", "veltotouch"};
    app.require_subcommand(1);
    app.set_version_flag("--version", ToolVersion::text());

    // Each command runs from its callback once the whole line has been taken,
    // and leaves its exit status here.
    int status = 0;
    for (const auto addTo : {&ReplayCommand::addTo, &SynthCommand::addTo, &EvalCommand::addTo, &DumpCommand::addTo,
                             &HostCommand::addTo, &DaemonCommand::addTo, &PropertiesCommand::addTo, &CtlCommand::addTo,
                             &ReportCommand::addTo, &EmulateCommand::addTo, &ConvertCommand::addTo,
                             &RecordCommand::addTo, &addHelp}) {
        addTo(app, status, out, err);
    }

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
        err << usageLine(app, error) << '\n';
        return CommandLine::kUsageError;
    } catch (const std::exception& error) {
        err << "veltotouch: " << error.what() << '\n';
        return CommandLine::kFailure;
    }
    return status;
}

}  // namespace VeltoTool
