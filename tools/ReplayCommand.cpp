#include "ReplayCommand.h"

#include "CommandLine.h"
#include "DecisionDumpWriter.h"
#include "EventFormatter.h"
#include "FiniteNumberCheck.h"
#include "ReplayCheck.h"
#include "StateArguments.h"
#include "ToolFiles.h"
#include "pipeline/Pipeline.h"
#include "platform/runtime/MonotonicClock.h"
#include "recording/JsonValue.h"
#include "recording/PipelineRecording.h"

#include <functional>
#include <memory>
#include <optional>

namespace VeltoTool {

using VeltoTouch::Pipeline;
using VeltoTouch::PipelineRecording;

int ReplayCommand::run(const Options& options, std::ostream& out, std::ostream& err)
{
    // A faulty expected file is refused before anything is played.
    std::optional<ReplayCheck> check;
    if (!options.check.empty()) check = ReplayCheck::read(options.check);

    auto pipeline = std::make_shared<Pipeline>();
    StateArguments::apply(*pipeline, options.settings, err);

    // The first time the playback sets is its start; readable lines count from there.
    EventFormatter formatter(options.jsonLines || check);
    std::optional<std::uint64_t> origin;
    pipeline->setTimeProbe = [&](std::uint64_t time) {
        if (!origin) {
            origin = time;
            formatter.setOrigin(time);
        }
    };
    pipeline->hidEventsProbe = [&](const VeltoHost::HidEventList& events) {
        for (const auto& event : events) {
            if (check) {
                check->event(nlohmann::ordered_json::parse(formatter.format(*event)));
            } else {
                out << formatter.format(*event) << '\n';
            }
        }
    };

    DecisionDumpWriter dumps(out, options.jsonLines ? DecisionDumpWriter::Format::JsonLines
                                                    : DecisionDumpWriter::Format::Text);
    if (options.dump) pipeline->setDecisionObserver(&dumps);

    VeltoHost::GapCap gapCap(options.maxGapSeconds, [&](const std::string& note) { err << "veltotouch: note: " << note << '\n'; });
    std::function<void(std::uint64_t)> sleep;
    if (options.speed > 0) {
        // Whatever was printed is let out before each wait: into a pipe the
        // output is block-buffered, and a paced run stopped with Ctrl-C would
        // otherwise end with nothing shown.
        sleep = [&](std::uint64_t microseconds) {
            out.flush();
            VeltoHost::MonotonicClock::sleepMicroseconds(gapCap(microseconds));
        };
    }
    const float speed = options.speed > 0 ? options.speed : 1.0f;

    // Played as it is read, so that a recording of any length fits in memory.
    PipelineRecording::PlayClock clock;
    std::optional<std::uint64_t> firstTimestampNs;
    ToolFiles::streamRecording(options.file, [&](PipelineRecording::Frame&& frame) {
        if (!firstTimestampNs) {
            firstTimestampNs = frame.timestampNs;
            clock.reset();
        }
        PipelineRecording::playFrame(frame, clock, *firstTimestampNs, speed, sleep, pipeline.get());
    }, options.hidDevice);
    pipeline->setDecisionObserver(nullptr);

    if (!check) {
        for (const std::string& key : options.reads) {
            out << formatter.formatState(key, pipeline->getState(key)) << '\n';
        }
        return 0;
    }
    for (const std::string& key : check->keys()) {
        // Read back as the expected file was written: through its JSON text.
        const std::string text = VeltoTouch::JsonValue::dump(VeltoTouch::JsonValue::toJson(pipeline->getState(key)), false);
        check->value(key, nlohmann::ordered_json::parse(text));
    }
    check->finish();
    if (const auto& difference = check->firstDifference()) {
        err << "veltotouch: " << options.file << ": " << *difference << '\n';
        return 1;
    }
    out << options.file << ": " << check->summary() << '\n';
    return 0;
}

void ReplayCommand::addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err)
{
    auto options = std::make_shared<Options>();
    CLI::App* command =
        app.add_subcommand("replay", "Play a recording through a fresh pipeline and print its gestures");
    command->add_option("FILE", options->file, "Recording (container, or hid-recorder text)")->required();
    command
        ->add_option("--speed", options->speed,
                     "Pace like the recording, S times faster, S at least 0.001 (default 0: as fast as possible)")
        ->check(CommandLine::speedCheck());
    command
        ->add_option("--max-gap", options->maxGapSeconds,
                     "When paced, wait at most this many seconds for one gap between reports")
        ->check(FiniteNumberCheck(0))
        ->capture_default_str();
    CommandLine::addSettings(*command, options->settings,
                             "KEY=VALUE: pipeline state before the first frame (VALUE is JSON)");
    command->add_option("--get", options->reads, "KEY: pipeline state to print after the last frame");
    command->add_flag("--dump", options->dump,
                      "Print the recogniser's per-frame descriptions (with --jsonl: its record of each frame)");
    command->add_flag("--jsonl", options->jsonLines, "One JSON object per line");
    command->add_option("--check", options->check,
                        "EXPECTED: compare the events (and the values it holds) with this file of --jsonl lines "
                        "instead of printing them; exit 1 at the first difference");
    CommandLine::addHidDevice(*command, options->hidDevice);
    command->callback([options, &status, &out, &err] {
        // Said here rather than with CLI11's excludes, whose help lists the
        // excluded options in no fixed order.
        if (!options->check.empty() && (options->jsonLines || options->dump || !options->reads.empty())) {
            throw CLI::ValidationError("--check compares instead of printing: it takes no --jsonl, --dump or --get");
        }
        status = run(*options, out, err);
    });
}

}  // namespace VeltoTool
