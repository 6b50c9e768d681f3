#include "ReportCommand.h"

#include "DumpCommand.h"
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
    if (!options.frames.empty()) {
        const DumpCommand::FrameRange range = DumpCommand::parseRange(options.frames);
        report.frames.first = range.first;
        report.frames.last = range.last;
    }
    // The recording is read as it plays, so that its length does not matter.
    // A bad output path fails before the replay; a recording that turns out
    // bad leaves an existing page as it was.
    const ToolFiles::File recording = ToolFiles::openRecording(options.file);
    OutputFile out(options.output, {options.file});
    report.source = std::filesystem::path(options.file).filename().string();
    report.title = options.title.empty() ? report.source : options.title;
    report.settings = options.settings;

    auto pipeline = std::make_shared<VeltoTouch::Pipeline>();
    StateArguments::apply(*pipeline, options.settings, err);
    out.stream() << RecordingReport::html(
        [&](const std::function<void(VeltoTouch::PipelineRecording::Frame&&)>& play) {
            return *ToolFiles::streamRecording(recording.get(), options.file, play, {}, options.hidDevice);
        },
        pipeline, report);
    out.commit();
}

}  // namespace VeltoTool
