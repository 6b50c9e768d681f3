#include "ReplayCommand.h"

#include "DecisionDumpWriter.h"
#include "EventFormatter.h"
#include "ReplayCheck.h"
#include "StateArguments.h"
#include "ToolFiles.h"
#include "pipeline/Pipeline.h"
#include "platform/MonotonicClock.h"
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

}  // namespace VeltoTool
