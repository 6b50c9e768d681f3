#include "ReplayCommand.h"

#include "AlgsDumpSink.h"
#include "EventFormatter.h"
#include "StateArguments.h"
#include "ToolFiles.h"
#include "pipeline/Pipeline.h"
#include "recording/PipelineRecording.h"

#include <memory>
#include <optional>

namespace VeltoTool {

using VeltoTouch::Pipeline;
using VeltoTouch::PipelineRecording;

void ReplayCommand::run(const Options& options, std::ostream& out)
{
    const std::string text = ToolFiles::read(options.file);
    PipelineRecording recording{std::string_view(text)};

    auto pipeline = std::make_shared<Pipeline>();
    for (const auto& [key, valueText] : options.settings) {
        pipeline->setState(key, StateArguments::parseValue(key, valueText));
    }

    // The first time the playback sets is its start; readable lines count from there.
    EventFormatter formatter(options.jsonLines);
    std::optional<std::uint64_t> origin;
    pipeline->setTimeProbe = [&](std::uint64_t time) {
        if (!origin) {
            origin = time;
            formatter.setOrigin(time);
        }
    };
    pipeline->hidEventsProbe = [&](const VeltoHost::HidEventList& events) {
        for (const auto& event : events) out << formatter.format(*event) << '\n';
    };

    std::optional<AlgsDumpSink::Scope> dumps;
    if (options.dump) dumps.emplace(out);

    recording.pipeline = pipeline;
    if (options.speed <= 0) recording.sleepMicroseconds = [](std::uint64_t) {};
    const float speed = options.speed > 0 ? options.speed : 1.0f;
    recording.playReset();
    while (recording.playCanContinue()) recording.playNextFrame(speed);
    dumps.reset();

    for (const std::string& key : options.reads) {
        out << formatter.formatState(key, pipeline->getState(key)) << '\n';
    }
}

}  // namespace VeltoTool
