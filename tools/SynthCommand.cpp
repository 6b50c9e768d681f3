#include "SynthCommand.h"

#include "CommandLine.h"
#include "FiniteNumberCheck.h"
#include "GestureScript.h"
#include "OutputFile.h"
#include "RandomScript.h"
#include "Synthesizer.h"
#include "ToolError.h"
#include "ToolFiles.h"
#include "recording/ContainerWriter.h"

#include <functional>
#include <memory>
#include <optional>
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
// after the rest of the script: `checkWritten` throws once one has.
void synthesizeInto(std::ostream& out, const std::function<void()>& checkWritten,
                    const std::vector<GestureScript::Step>& steps, std::uint32_t framePeriodMs, std::uint32_t seed,
                    OutputFile* truth = nullptr)
{
    Synthesizer synthesizer(framePeriodMs, seed);
    ContainerWriter writer(out);
    Synthesizer::TruthSink truthSink;
    if (truth) {
        truthSink = [&](const VeltoTouch::TruthRecord& record) {
            truth->stream() << record.jsonLine() << '\n';
            truth->checkWritten();
        };
    }
    synthesizer.synthesize(
        steps,
        [&](const PipelineRecording::Frame& frame) {
            writer.write(frame);
            checkWritten();
        },
        truthSink);
    writer.finish();
}

// The truth written over its own recording would leave neither; the check
// goes by path too, as neither may exist yet.
void refuseTruthOverRecording(const SynthCommand::Options& options, const std::string& truthPath)
{
    if (truthPath.empty() || !OutputFile::sameFile(truthPath, options.output)) return;
    throw ToolError(truthPath + ": is the same file as the recording " + options.output +
                    "; write the truth elsewhere");
}

}  // namespace

std::string SynthCommand::containerFor(const std::string& script, std::uint32_t framePeriodMs, std::uint32_t seed)
{
    checkFramePeriod(framePeriodMs);
    std::ostringstream text;
    synthesizeInto(text, [] {}, GestureScript::parse(script), framePeriodMs, seed);
    return std::move(text).str();
}

void SynthCommand::run(const Options& options)
{
    checkFramePeriod(options.framePeriodMs);
    if (options.script.empty() == (options.randomTouches == 0)) {
        throw ToolError("synth needs either a SCRIPT or --random N with N at least 1");
    }
    const std::string truthPath =
        options.truth == "auto" ? VeltoTouch::TruthRecord::pathBeside(options.output) : options.truth;
    const bool scriptFile = options.randomTouches == 0 && options.script[0] == '@';
    std::vector<std::string> inputs;
    if (scriptFile) inputs.push_back(options.script.substr(1));
    refuseTruthOverRecording(options, truthPath);

    std::vector<GestureScript::Step> steps;
    if (options.randomTouches > 0) {
        steps = RandomScript::generate(options.randomTouches, options.seed);
    } else {
        // A faulty script leaves an existing output alone.
        steps = GestureScript::parse(scriptFile ? ToolFiles::read(inputs.front()) : options.script);
    }
    // A bad output path fails before anything is generated. Half a container
    // is no recording, and a truth without its recording is none: both are
    // committed only once both are complete.
    OutputFile out(options.output, inputs);
    std::optional<OutputFile> truth;
    if (!truthPath.empty()) truth.emplace(truthPath, inputs);
    synthesizeInto(out.stream(), [&] { out.checkWritten(); }, steps, options.framePeriodMs, options.seed,
                   truth ? &*truth : nullptr);
    out.commit();
    if (truth) truth->commit();
}

void SynthCommand::addTo(CLI::App& app, int&, std::ostream&, std::ostream&)
{
    auto options = std::make_shared<Options>();
    CLI::App* command = app.add_subcommand("synth", "Write a recording made from a gesture script");
    CLI::Option* script =
        command->add_option("SCRIPT", options->script, "Gesture script, or @FILE to read it from a file");
    command->add_option("-o,--output", options->output, "Recording to write")->required();
    command->add_option("--frame-period", options->framePeriodMs, "Milliseconds between frames, at least 1")
        ->check(FiniteNumberCheck(1))
        ->capture_default_str();
    command->add_option("--seed", options->seed, "Seed of the sensor noise (and of --random)")->capture_default_str();
    command
        ->add_option("--random", options->randomTouches,
                     "N: instead of a SCRIPT, N touches drawn at random (kinds, durations, positions, sizes, noise, "
                     "gaps)")
        ->check(CLI::Range(1u, 1'000'000u))
        ->excludes(script);
    command->add_option("--truth", options->truth,
                        "TRUTH.jsonl: also write one JSON line per touch, noise and reset (\"auto\": FILE with its "
                        "extension replaced by .truth.jsonl, where eval looks for it)");
    command->callback([options] { run(*options); });
}

}  // namespace VeltoTool
