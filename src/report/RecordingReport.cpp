#include "report/RecordingReport.h"

#include "recording/JsonValue.h"
#include "report/ReportTemplate.h"

#include <nlohmann/json.hpp>

#include <string_view>
#include <vector>

namespace VeltoTouch {

namespace {

// The template with each slot replaced, in one pass over the template, so
// that text put into one slot is never searched for another.
std::string fillTemplate(std::string_view page, const std::vector<std::pair<std::string_view, std::string>>& slots)
{
    std::string out;
    std::size_t at = 0;
    for (;;) {
        std::size_t next = std::string_view::npos;
        const std::pair<std::string_view, std::string>* slot = nullptr;
        for (const auto& candidate : slots) {
            const std::size_t found = page.find(candidate.first, at);
            if (found < next) {
                next = found;
                slot = &candidate;
            }
        }
        if (!slot) break;
        out.append(page.substr(at, next - at));
        out += slot->second;
        at = next + slot->first.size();
    }
    out.append(page.substr(at));
    return out;
}

void replaceAll(std::string& text, std::string_view from, std::string_view to)
{
    for (std::size_t at = text.find(from); at != std::string::npos; at = text.find(from, at + to.size())) {
        text.replace(at, from.size(), to);
    }
}

std::string htmlEscaped(std::string_view text)
{
    std::string out;
    for (const char c : text) {
        switch (c) {
        case '&': out += "&amp;"; break;
        case '<': out += "&lt;"; break;
        case '>': out += "&gt;"; break;
        case '"': out += "&quot;"; break;
        default: out += c;
        }
    }
    return out;
}

// Counters can pass 2^53, beyond what the page's numbers hold exactly, so
// they travel as decimal text.
nlohmann::ordered_json countersAsText(const nlohmann::ordered_json& stats)
{
    nlohmann::ordered_json out = nlohmann::ordered_json::object();
    for (const auto& [group, counters] : stats.items()) {
        out[group] = nlohmann::ordered_json::object();
        for (const auto& [name, value] : counters.items()) out[group][name] = value.dump();
    }
    return out;
}

// What the page tells of the recording itself, counted as it plays.
struct FrameCounts {
    std::uint64_t reports = 0;
    std::uint64_t states = 0;
    std::optional<std::uint64_t> first;
    std::uint64_t last = 0;

    void add(const PipelineRecording::Frame& frame)
    {
        if (frame.type == PipelineRecording::Frame::Type::InputReport) ++reports;
        if (frame.type == PipelineRecording::Frame::Type::State) ++states;
        if (!first) first = frame.timestampNs;
        last = frame.timestampNs;
    }
};

nlohmann::ordered_json facts(const FrameCounts& counts, const ContainerStream::Format& format,
                             const RecordingReport::Options& options, std::size_t pageFrames)
{
    const std::optional<std::uint64_t>& first = counts.first;
    const std::uint64_t last = counts.last;
    nlohmann::ordered_json out;
    out["source"] = options.source;
    out["frames"] = counts.reports + counts.states;
    out["reports"] = counts.reports;
    out["stateFrames"] = counts.states;
    out["pageFrames"] = pageFrames;
    // Nanosecond time stamps pass 2^53 too.
    out["durationNs"] = first && last >= *first ? std::to_string(last - *first) : "0";
    out["format"] = format.text();
    out["firstTimestampNs"] = first ? std::to_string(*first) : "";
    out["lastTimestampNs"] = first ? std::to_string(last) : "";
    nlohmann::ordered_json settings = nlohmann::ordered_json::array();
    for (const auto& [key, value] : options.settings) settings.push_back({key, value});
    out["settings"] = std::move(settings);
    std::string range;
    if (options.frames.first || options.frames.last) {
        range = (options.frames.first ? std::to_string(*options.frames.first) : "") + ":" +
                (options.frames.last ? std::to_string(*options.frames.last) : "");
    }
    out["frameRange"] = range;
    return out;
}

}  // namespace

std::string RecordingReport::html(const FrameSource& frames, const std::shared_ptr<Pipeline>& pipeline,
                                  const Options& options)
{
    nlohmann::ordered_json payload;
    {
        ReportCollector collector(*pipeline, options.frames);
        FrameCounts counts;
        PipelineRecording::PlayClock clock;
        const ContainerStream::Format format = frames([&](PipelineRecording::Frame&& frame) {
            if (!counts.first) clock.reset();
            counts.add(frame);
            PipelineRecording::playFrame(frame, clock, *counts.first, 1.0f, {}, pipeline.get());
        });
        payload = collector.payload();
        payload["facts"] = facts(counts, format, options, collector.frameCount());
    }
    payload["title"] = options.title;
    payload["counters"] = countersAsText(JsonValue::toJson(pipeline->getState("Algs.EventStats")));

    // Inside the data's script element "<" only ever stands in a string, where
    // \u003c reads back the same and "</script>" cannot end it early.
    std::string data = JsonValue::dump(payload, false);
    replaceAll(data, "<", "\\u003c");

    return fillTemplate(ReportTemplate::kHtml, {{"{{title}}", htmlEscaped(options.title)},
                                                {"/*{{style}}*/", std::string(ReportTemplate::kStyle)},
                                                {"/*{{script}}*/", std::string(ReportTemplate::kScript)},
                                                {"{{data}}", std::move(data)}});
}

}  // namespace VeltoTouch
