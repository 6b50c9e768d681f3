#include "evaluation/EvaluationReport.h"

#include <stdexcept>

namespace VeltoTouch {

namespace {

nlohmann::ordered_json settingsJson(const PipelineSettings& settings)
{
    nlohmann::ordered_json object = nlohmann::ordered_json::object();
    for (const PipelineSetting& setting : settings) object[setting.key] = setting.value;
    return object;
}

PipelineSettings settingsFrom(const nlohmann::json& json, const char* what)
{
    if (!json.is_object()) throw std::invalid_argument(std::string("evaluation report: \"") + what + "\" must be an object");
    PipelineSettings settings;
    for (const auto& [key, value] : json.items()) settings.push_back({key, value});
    return settings;
}

}  // namespace

nlohmann::ordered_json EvaluationReport::toJson() const
{
    if (!isSweep()) {
        nlohmann::ordered_json json;
        json["settings"] = settingsJson(settings);
        const nlohmann::ordered_json result = rows.empty() ? EvaluationResult{}.toJson() : rows.front().result.toJson();
        for (const auto& [key, value] : result.items()) json[key] = value;
        return json;
    }
    nlohmann::ordered_json json;
    json["settings"] = settingsJson(settings);
    json["sweep"] = sweepKeys;
    nlohmann::ordered_json list = nlohmann::ordered_json::array();
    for (const Row& row : rows) {
        nlohmann::ordered_json entry;
        entry["set"] = settingsJson(row.sweep);
        const nlohmann::ordered_json result = row.result.toJson();
        for (const auto& [key, value] : result.items()) entry[key] = value;
        list.push_back(entry);
    }
    json["rows"] = list;
    return json;
}

EvaluationReport EvaluationReport::fromJson(const nlohmann::json& json)
{
    if (!json.is_object()) throw std::invalid_argument("evaluation report: not a JSON object");
    EvaluationReport report;
    const auto settings = json.find("settings");
    if (settings == json.end()) throw std::invalid_argument("evaluation report: \"settings\" is missing");
    report.settings = settingsFrom(*settings, "settings");
    const auto sweep = json.find("sweep");
    if (sweep == json.end()) {
        report.rows.push_back({{}, EvaluationResult::fromJson(json)});
        return report;
    }
    if (!sweep->is_array()) throw std::invalid_argument("evaluation report: \"sweep\" must be a list of keys");
    for (const nlohmann::json& key : *sweep) {
        if (!key.is_string()) throw std::invalid_argument("evaluation report: \"sweep\" must be a list of keys");
        report.sweepKeys.push_back(key.get<std::string>());
    }
    const auto rows = json.find("rows");
    if (rows == json.end() || !rows->is_array()) throw std::invalid_argument("evaluation report: \"rows\" must be a list");
    for (const nlohmann::json& row : *rows) {
        if (!row.is_object() || !row.contains("set")) throw std::invalid_argument("evaluation report: a row lacks \"set\"");
        report.rows.push_back({settingsFrom(row["set"], "set"), EvaluationResult::fromJson(row)});
    }
    return report;
}

void EvaluationReport::merge(const EvaluationReport& other)
{
    bool same = settings == other.settings && sweepKeys == other.sweepKeys && rows.size() == other.rows.size();
    for (std::size_t i = 0; same && i < rows.size(); ++i) same = rows[i].sweep == other.rows[i].sweep;
    if (!same) throw std::invalid_argument("the reports were made with different settings");
    for (std::size_t i = 0; i < rows.size(); ++i) rows[i].result.add(other.rows[i].result);
}

}  // namespace VeltoTouch
