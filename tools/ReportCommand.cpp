#include "ReportCommand.h"

#include "DumpCommand.h"
#include "StateArguments.h"
#include "ToolFiles.h"
#include "report/RecordingReport.h"

#include <filesystem>
#include <memory>

namespace VeltoTool {

using VeltoTouch::RecordingReport;

void ReportCommand::run(const Options& options, std::ostream& err)
{
    RecordingReport::Options report;
    if (!options.frames.empty()) {
        const DumpCommand::FrameRange range = DumpCommand::parseRange(options.frames);
        report.frames.first = range.first;
        report.frames.last = range.last;
    }
    // The recording is read before the output is opened, so that a bad
    // recording leaves no empty page behind; a bad output path still fails
    // before the replay.
    VeltoTouch::PipelineRecording recording = ToolFiles::readRecording(options.file);
    report.containerVersion = RecordingReport::containerVersion(ToolFiles::read(options.file));
    std::ofstream out = ToolFiles::create(options.output);
    report.source = std::filesystem::path(options.file).filename().string();
    report.title = options.title.empty() ? report.source : options.title;
    report.settings = options.settings;

    auto pipeline = std::make_shared<VeltoTouch::Pipeline>();
    StateArguments::apply(*pipeline, options.settings, err);
    out << RecordingReport::html(recording, pipeline, report);
    ToolFiles::close(out, options.output);
}

}  // namespace VeltoTool
