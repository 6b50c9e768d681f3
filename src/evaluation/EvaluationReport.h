#pragma once

#include "evaluation/EvaluationResult.h"
#include "evaluation/PipelineSetting.h"

#include <nlohmann/json.hpp>

#include <string>
#include <vector>

namespace VeltoTouch {

// What `eval` reports: one result per setting evaluated (one row for a plain
// evaluation, one per grid point for a sweep), with the settings applied to
// every row and the settings of the row itself. Its JSON form is what
// `eval --json` writes and what `eval --merge` reads back: reports of
// shards of one corpus, made with the same settings, add up row by row.
struct EvaluationReport {
    struct Row {
        // The sweep's values for this row; empty for a plain evaluation.
        PipelineSettings sweep;
        EvaluationResult result;

        friend bool operator==(const Row&, const Row&) = default;
    };

    // Applied to every row (--set), in order, before the row's own.
    PipelineSettings settings;
    // The swept keys; empty for a plain evaluation.
    std::vector<std::string> sweepKeys;
    std::vector<Row> rows;

    bool isSweep() const noexcept { return !sweepKeys.empty(); }

    // A plain evaluation is its one result with the settings beside it; a
    // sweep lists its rows.
    nlohmann::ordered_json toJson() const;
    // Throws std::invalid_argument when the JSON is not a report.
    static EvaluationReport fromJson(const nlohmann::json& json);
    // Adds the rows of `other`; throws std::invalid_argument unless it was
    // made with the same settings.
    void merge(const EvaluationReport& other);

    friend bool operator==(const EvaluationReport&, const EvaluationReport&) = default;
};

}  // namespace VeltoTouch
