#include "SynthCommand.h"

#include "GestureScript.h"
#include "RandomScript.h"
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
                    std::uint32_t framePeriodMs, std::uint32_t seed, std::ostream* truth = nullptr,
                    const std::string& truthName = {})
{
    Synthesizer synthesizer(framePeriodMs, seed);
    ContainerWriter writer(out);
    Synthesizer::TruthSink truthSink;
    if (truth) {
        truthSink = [&](const VeltoTouch::TruthRecord& record) {
            *truth << record.jsonLine() << '\n';
            ToolFiles::checkWritten(*truth, truthName);
        };
    }
    synthesizer.synthesize(
        steps,
        [&](const PipelineRecording::Frame& frame) {
            writer.write(frame);
            ToolFiles::checkWritten(out, name);
        },
        truthSink);
    writer.finish();
}

void removeRegularFile(const std::string& path)
{
    // Only a regular file is removed: the output may be a device (/dev/null).
    std::error_code ignored;
    if (std::filesystem::is_regular_file(path, ignored)) std::filesystem::remove(path, ignored);
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
    if (options.script.empty() == (options.randomTouches == 0)) {
        throw ToolError("synth needs either a SCRIPT or --random N with N at least 1");
    }
    std::vector<GestureScript::Step> steps;
    if (options.randomTouches > 0) {
        steps = RandomScript::generate(options.randomTouches, options.seed);
    } else {
        // A faulty script leaves an existing output alone.
        const std::string script = options.script[0] == '@' ? ToolFiles::read(options.script.substr(1)) : options.script;
        steps = GestureScript::parse(script);
    }
    const std::string truthPath =
        options.truth == "auto" ? VeltoTouch::TruthRecord::pathBeside(options.output) : options.truth;
    // A bad output path fails before anything is generated.
    std::ofstream out = ToolFiles::create(options.output);
    std::ofstream truth;
    bool truthCreated = false;
    try {
        if (!truthPath.empty()) {
            truth = ToolFiles::create(truthPath);
            truthCreated = true;
        }
        synthesizeInto(out, options.output, steps, options.framePeriodMs, options.seed,
                       truthPath.empty() ? nullptr : &truth, truthPath);
        ToolFiles::close(out, options.output);
        if (!truthPath.empty()) ToolFiles::close(truth, truthPath);
    } catch (...) {
        // Half a container is no recording, and a truth without its
        // recording is none; leave neither behind.
        out.close();
        removeRegularFile(options.output);
        if (truthCreated) {
            truth.close();
            removeRegularFile(truthPath);
        }
        throw;
    }
}

}  // namespace VeltoTool
