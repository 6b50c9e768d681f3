#include "SynthCommand.h"

#include "GestureScript.h"
#include "Synthesizer.h"
#include "ToolError.h"
#include "ToolFiles.h"
#include "recording/ContainerWriter.h"

#include <filesystem>
#include <sstream>

namespace VeltoTool {

using VeltoTouch::ContainerWriter;
using VeltoTouch::PipelineRecording;

namespace {

void checkFramePeriod(std::uint32_t framePeriodMs)
{
    if (framePeriodMs == 0) throw ToolError("--frame-period must be at least 1 ms");
}

// Frames go to the writer as they are made: an hour of 1 ms frames is
// millions of them, and neither they nor their JSON may pile up in memory.
// A write that fails (a full disk) ends the synthesis at once instead of
// after the rest of the script.
void synthesizeInto(std::ostream& out, const std::string& name, const std::vector<GestureScript::Step>& steps,
                    std::uint32_t framePeriodMs, std::uint32_t seed)
{
    Synthesizer synthesizer(framePeriodMs, seed);
    ContainerWriter writer(out);
    synthesizer.synthesize(steps, [&](const PipelineRecording::Frame& frame) {
        writer.write(frame);
        ToolFiles::checkWritten(out, name);
    });
    writer.finish();
}

}  // namespace

std::string SynthCommand::containerFor(const std::string& script, std::uint32_t framePeriodMs, std::uint32_t seed)
{
    checkFramePeriod(framePeriodMs);
    std::ostringstream text;
    synthesizeInto(text, "container", GestureScript::parse(script), framePeriodMs, seed);
    return std::move(text).str();
}

void SynthCommand::run(const Options& options)
{
    checkFramePeriod(options.framePeriodMs);
    const std::string script =
        !options.script.empty() && options.script[0] == '@' ? ToolFiles::read(options.script.substr(1)) : options.script;
    // A faulty script leaves an existing output alone; a bad output path
    // fails before anything is generated.
    const std::vector<GestureScript::Step> steps = GestureScript::parse(script);
    std::ofstream out = ToolFiles::create(options.output);
    try {
        synthesizeInto(out, options.output, steps, options.framePeriodMs, options.seed);
        ToolFiles::close(out, options.output);
    } catch (...) {
        // Half a container is no recording; leave none behind. Only a
        // regular file is removed: the output may be a device (/dev/null).
        out.close();
        std::error_code ignored;
        if (std::filesystem::is_regular_file(options.output, ignored)) std::filesystem::remove(options.output, ignored);
        throw;
    }
}

}  // namespace VeltoTool
