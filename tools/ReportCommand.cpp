#include "ReportCommand.h"

#include "CommandLine.h"
#include "OutputFile.h"
#include "StateArguments.h"
#include "ToolFiles.h"
#include "report/RecordingReport.h"

#include <filesystem>
#include <functional>
#include <memory>
#include <string>

namespace VeltoTool {

using VeltoTouch::RecordingReport;

void ReportCommand::run(const Options& options, std::ostream& err)
{
    RecordingReport::Options report;
    if (options.frames) {
        report.frames.first = options.frames->first;
        report.frames.last = options.frames->last;
    }
    // The recording is read as it plays, so that its length does not matter.
    // A bad output path fails before the replay; a recording that turns out
    // bad leaves an existing page as it was.
    const ToolFiles::File recording = ToolFiles::openRecording(options.file);
    OutputFile out(options.output, {options.file});
    report.source = std::filesystem::path(options.file).filename().string();
    report.title = options.title.empty() ? report.source : options.title;
    for (const StateArguments::Setting& setting : options.settings) {
        report.settings.emplace_back(setting.key, setting.text);
    }

    auto pipeline = std::make_shared<VeltoTouch::Pipeline>();
    StateArguments::apply(*pipeline, options.settings, err);
    out.stream() << RecordingReport::html(
        [&](const std::function<void(VeltoTouch::PipelineRecording::Frame&&)>& play) {
            return *ToolFiles::streamRecording(recording.get(), options.file, play, {}, options.hidDevice);
        },
        pipeline, report);
    out.commit();
}

void ReportCommand::addTo(CLI::App& app, int&, std::ostream&, std::ostream& err)
{
    auto options = std::make_shared<Options>();
    CLI::App* command = app.add_subcommand("report", "Replay a recording into a self-contained HTML page");
    command->add_option("FILE", options->file, "Recording (container, or hid-recorder text)")->required();
    command->add_option("-o,--output", options->output, "HTML page to write")->required();
    CommandLine::addSettings(*command, options->settings,
                             "KEY=VALUE: pipeline state before the first frame (VALUE is JSON)");
    CommandLine::addParsed(
        *command, "--frames", "TEXT:A:B",
        [&frames = options->frames](const std::string& text) { frames = DumpCommand::parseRange(text); },
        "A:B, inclusive range of frame numbers to show");
    command->add_option("--title", options->title, "Title of the page (default: the recording's file name)");
    CommandLine::addHidDevice(*command, options->hidDevice);
    command->callback([options, &err] { run(*options, err); });
}

}  // namespace VeltoTool
