#pragma once

#include "evaluation/TruthRecord.h"

#include <nlohmann/json.hpp>

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace VeltoTouch {

// How well the recogniser did on one or more recordings: raw counts and
// latency samples, from which precision, recall and percentiles are derived
// when asked. Results of parts of a corpus add up to the result of the whole,
// so a corpus can be evaluated in shards and merged.
class EvaluationResult {
public:
    static constexpr std::size_t kClassCount = 6;  // one per TruthRecord::Kind

    struct ClassCounts {
        std::uint64_t truths = 0;      // truths of this kind
        std::uint64_t met = 0;         // of them, met by what was recognised
        std::uint64_t recognised = 0;  // gestures recognised as this kind (tap, hold, slide, reset)
        std::uint64_t correct = 0;     // of them, meeting the truth they were taken for
        // From touch start to the deciding event, per met truth; kept sorted.
        std::vector<double> latenciesMs;

        friend bool operator==(const ClassCounts&, const ClassCounts&) = default;
    };

    struct Latency {
        double p50 = 0;
        double p95 = 0;
        double max = 0;
    };

    // Confusion rows are truth labels ("tap top") and "spurious"; columns are
    // recognised labels and "missed" (a gesture that brought nothing) or
    // "none" (a palm or noise that rightly brought nothing).
    static constexpr const char* kSpurious = "spurious";
    static constexpr const char* kMissed = "missed";
    static constexpr const char* kNone = "none";

    std::map<std::pair<std::string, std::string>, std::uint64_t> confusion;
    std::array<ClassCounts, kClassCount> classes{};
    // Recognised gestures that no truth took.
    std::uint64_t spurious = 0;
    // Gestures recognised during a palm or noise, where none was wanted.
    std::uint64_t unwanted = 0;
    std::uint64_t recordings = 0;
    std::uint64_t durationNs = 0;

    ClassCounts& counts(TruthRecord::Kind kind) { return classes[static_cast<std::size_t>(kind)]; }
    const ClassCounts& counts(TruthRecord::Kind kind) const { return classes[static_cast<std::size_t>(kind)]; }

    void add(const EvaluationResult& other);

    // Empty where there is nothing to divide by; precision also for palm and
    // noise, which are never recognised.
    std::optional<double> precision(TruthRecord::Kind kind) const;
    std::optional<double> recall(TruthRecord::Kind kind) const;
    std::optional<Latency> latency(TruthRecord::Kind kind) const;

    // Over every class: correct gestures among all recognised, met truths
    // among all truths, gestures where none was wanted (spurious or during a
    // palm or noise) per minute of recording, and the 95th percentile of the
    // latencies of taps, holds and slides.
    std::optional<double> precision() const;
    std::optional<double> recall() const;
    std::optional<double> spuriousPerMinute() const;
    std::optional<double> latencyP95() const;

    // The derived figures for reading, and the raw counts for merging.
    nlohmann::ordered_json toJson() const;
    // Reads what toJson wrote; throws std::invalid_argument when it is not that.
    static EvaluationResult fromJson(const nlohmann::json& json);

    // Nearest-rank percentile of sorted samples.
    static double percentile(const std::vector<double>& sorted, double percent);

    friend bool operator==(const EvaluationResult&, const EvaluationResult&) = default;
};

}  // namespace VeltoTouch
