#include "DumpCommand.h"

#include "CommandLine.h"
#include "ImageDrawing.h"
#include "ToolError.h"
#include "ToolFiles.h"
#include "recording/PipelineRecording.h"
#include "records/InputReport.h"

#include <charconv>
#include <memory>

namespace VeltoTool {

namespace {

std::uint32_t parseFrameNumber(const std::string& text, const std::string& range)
{
    std::uint32_t value = 0;
    auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error != std::errc() || end != text.data() + text.size()) {
        throw ToolError("invalid frame range \"" + range + "\" (expected A:B with frame numbers)");
    }
    return value;
}

}  // namespace

DumpCommand::FrameRange DumpCommand::parseRange(const std::string& text)
{
    FrameRange range;
    if (text.empty()) return range;
    const auto colon = text.find(':');
    if (colon == std::string::npos) {
        range.first = range.last = parseFrameNumber(text, text);
        return range;
    }
    const std::string first = text.substr(0, colon);
    const std::string last = text.substr(colon + 1);
    if (!first.empty()) range.first = parseFrameNumber(first, text);
    if (!last.empty()) range.last = parseFrameNumber(last, text);
    if (range.first > range.last) throw ToolError("invalid frame range \"" + text + "\" (first frame after last)");
    return range;
}

void DumpCommand::run(const Options& options, std::ostream& out)
{
    const VeltoTouch::PipelineRecording recording = ToolFiles::readRecording(options.file, options.hidDevice);
    for (const auto& frame : recording.frames()) {
        if (frame.type != VeltoTouch::PipelineRecording::Frame::Type::InputReport) continue;
        auto image = VeltoTouch::InputReport::Image::parse(frame.report.data(), frame.report.size());
        if (!image || !options.frames.contains(image->frameNumber)) continue;
        out << VeltoTouch::Util::stringFromImage(*image, options.levels) << '\n';
    }
}

void DumpCommand::addTo(CLI::App& app, int&, std::ostream& out, std::ostream&)
{
    auto options = std::make_shared<Options>();
    CLI::App* command = app.add_subcommand("dump", "Draw each Image report of a recording over the pad layout");
    command->add_option("FILE", options->file, "Recording (container, or hid-recorder text)")->required();
    CommandLine::addParsed(
        *command, "--frames", "TEXT:A:B",
        [&frames = options->frames](const std::string& text) { frames = parseRange(text); },
        "A:B, inclusive range of frame numbers (either side may be left out)");
    command->add_flag("--levels", options->levels, "Draw the levels instead of the readings");
    CommandLine::addHidDevice(*command, options->hidDevice);
    command->callback([options, &out] { run(*options, out); });
}

}  // namespace VeltoTool
