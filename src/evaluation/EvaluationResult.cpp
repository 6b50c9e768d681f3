#include "evaluation/EvaluationResult.h"

#include <algorithm>
#include <cmath>
#include <stdexcept>

namespace VeltoTouch {

using Kind = TruthRecord::Kind;

namespace {

constexpr Kind kAllKinds[] = {Kind::Tap, Kind::Hold, Kind::Slide, Kind::Palm, Kind::Noise, Kind::Reset};

bool recognisable(Kind kind) { return kind != Kind::Palm && kind != Kind::Noise; }

std::optional<double> ratio(std::uint64_t part, std::uint64_t whole)
{
    if (whole == 0) return std::nullopt;
    return static_cast<double>(part) / static_cast<double>(whole);
}

nlohmann::json optionalNumber(const std::optional<double>& value)
{
    if (!value) return nullptr;
    return *value;
}

std::uint64_t count(const nlohmann::json& object, const char* key)
{
    const auto found = object.find(key);
    if (found == object.end() || !found->is_number_unsigned()) {
        throw std::invalid_argument(std::string("evaluation result: \"") + key + "\" must be a count");
    }
    return found->get<std::uint64_t>();
}

const nlohmann::json& member(const nlohmann::json& object, const char* key, bool (nlohmann::json::*is)() const noexcept)
{
    const auto found = object.find(key);
    if (found == object.end() || !((*found).*is)()) {
        throw std::invalid_argument(std::string("evaluation result: \"") + key + "\" is missing or of the wrong kind");
    }
    return *found;
}

}  // namespace

void EvaluationResult::add(const EvaluationResult& other)
{
    for (const auto& [cell, n] : other.confusion) confusion[cell] += n;
    for (std::size_t i = 0; i < kClassCount; ++i) {
        ClassCounts& mine = classes[i];
        const ClassCounts& theirs = other.classes[i];
        mine.truths += theirs.truths;
        mine.met += theirs.met;
        mine.recognised += theirs.recognised;
        mine.correct += theirs.correct;
        mine.latenciesMs.insert(mine.latenciesMs.end(), theirs.latenciesMs.begin(), theirs.latenciesMs.end());
        std::sort(mine.latenciesMs.begin(), mine.latenciesMs.end());
    }
    spurious += other.spurious;
    unwanted += other.unwanted;
    recordings += other.recordings;
    durationNs += other.durationNs;
}

double EvaluationResult::percentile(const std::vector<double>& sorted, double percent)
{
    if (sorted.empty()) return 0;
    const auto rank = static_cast<std::size_t>(std::ceil(percent / 100.0 * static_cast<double>(sorted.size())));
    return sorted[std::clamp<std::size_t>(rank, 1, sorted.size()) - 1];
}

std::optional<double> EvaluationResult::precision(Kind kind) const
{
    if (!recognisable(kind)) return std::nullopt;
    return ratio(counts(kind).correct, counts(kind).recognised);
}

std::optional<double> EvaluationResult::recall(Kind kind) const { return ratio(counts(kind).met, counts(kind).truths); }

std::optional<EvaluationResult::Latency> EvaluationResult::latency(Kind kind) const
{
    const std::vector<double>& samples = counts(kind).latenciesMs;
    if (samples.empty()) return std::nullopt;
    return Latency{percentile(samples, 50), percentile(samples, 95), samples.back()};
}

std::optional<double> EvaluationResult::precision() const
{
    std::uint64_t correct = 0, recognised = 0;
    for (const ClassCounts& c : classes) {
        correct += c.correct;
        recognised += c.recognised;
    }
    return ratio(correct, recognised);
}

std::optional<double> EvaluationResult::recall() const
{
    std::uint64_t met = 0, truths = 0;
    for (const ClassCounts& c : classes) {
        met += c.met;
        truths += c.truths;
    }
    return ratio(met, truths);
}

std::optional<double> EvaluationResult::spuriousPerMinute() const
{
    if (durationNs == 0) return std::nullopt;
    return static_cast<double>(spurious + unwanted) / (static_cast<double>(durationNs) / 60e9);
}

std::optional<double> EvaluationResult::latencyP95() const
{
    std::vector<double> all;
    for (Kind kind : {Kind::Tap, Kind::Hold, Kind::Slide}) {
        all.insert(all.end(), counts(kind).latenciesMs.begin(), counts(kind).latenciesMs.end());
    }
    if (all.empty()) return std::nullopt;
    std::sort(all.begin(), all.end());
    return percentile(all, 95);
}

nlohmann::ordered_json EvaluationResult::toJson() const
{
    nlohmann::ordered_json json;
    json["recordings"] = recordings;
    json["durationNs"] = durationNs;
    json["precision"] = optionalNumber(precision());
    json["recall"] = optionalNumber(recall());
    json["spuriousPerMinute"] = optionalNumber(spuriousPerMinute());
    json["latencyP95Ms"] = optionalNumber(latencyP95());
    json["spurious"] = spurious;
    json["unwanted"] = unwanted;
    nlohmann::ordered_json classList = nlohmann::ordered_json::object();
    for (Kind kind : kAllKinds) {
        const ClassCounts& c = counts(kind);
        nlohmann::ordered_json entry;
        entry["truths"] = c.truths;
        entry["met"] = c.met;
        entry["recognised"] = c.recognised;
        entry["correct"] = c.correct;
        entry["precision"] = optionalNumber(precision(kind));
        entry["recall"] = optionalNumber(recall(kind));
        const auto l = latency(kind);
        entry["latencyMs"] = l ? nlohmann::ordered_json{{"p50", l->p50}, {"p95", l->p95}, {"max", l->max}}
                               : nlohmann::ordered_json(nullptr);
        entry["latencySamplesMs"] = c.latenciesMs;
        classList[TruthRecord::name(kind)] = entry;
    }
    json["classes"] = classList;
    nlohmann::ordered_json cells = nlohmann::ordered_json::array();
    for (const auto& [cell, n] : confusion) {
        cells.push_back({{"truth", cell.first}, {"recognised", cell.second}, {"count", n}});
    }
    json["confusion"] = cells;
    return json;
}

EvaluationResult EvaluationResult::fromJson(const nlohmann::json& json)
{
    if (!json.is_object()) throw std::invalid_argument("evaluation result: not a JSON object");
    EvaluationResult result;
    result.recordings = count(json, "recordings");
    result.durationNs = count(json, "durationNs");
    result.spurious = count(json, "spurious");
    result.unwanted = count(json, "unwanted");
    const nlohmann::json& classList = member(json, "classes", &nlohmann::json::is_object);
    for (Kind kind : kAllKinds) {
        const nlohmann::json& entry = member(classList, TruthRecord::name(kind), &nlohmann::json::is_object);
        ClassCounts& c = result.counts(kind);
        c.truths = count(entry, "truths");
        c.met = count(entry, "met");
        c.recognised = count(entry, "recognised");
        c.correct = count(entry, "correct");
        for (const nlohmann::json& sample : member(entry, "latencySamplesMs", &nlohmann::json::is_array)) {
            if (!sample.is_number()) throw std::invalid_argument("evaluation result: a latency sample is not a number");
            c.latenciesMs.push_back(sample.get<double>());
        }
        std::sort(c.latenciesMs.begin(), c.latenciesMs.end());
    }
    for (const nlohmann::json& cell : member(json, "confusion", &nlohmann::json::is_array)) {
        if (!cell.is_object()) throw std::invalid_argument("evaluation result: a confusion cell is not an object");
        const nlohmann::json& truth = member(cell, "truth", &nlohmann::json::is_string);
        const nlohmann::json& recognised = member(cell, "recognised", &nlohmann::json::is_string);
        result.confusion[{truth.get<std::string>(), recognised.get<std::string>()}] += count(cell, "count");
    }
    return result;
}

}  // namespace VeltoTouch
