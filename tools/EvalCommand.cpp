#include "EvalCommand.h"

#include "CommandLine.h"
#include "StateArguments.h"
#include "ToolError.h"
#include "ToolFiles.h"
#include "evaluation/CorpusEvaluator.h"
#include "evaluation/EvaluationReport.h"
#include "pipeline/Pipeline.h"
#include "recording/JsonValue.h"

#include <nlohmann/json.hpp>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <iostream>
#include <memory>
#include <set>
#include <sstream>

namespace VeltoTool {

using VeltoTouch::CorpusEvaluator;
using VeltoTouch::EvaluationReport;
using VeltoTouch::EvaluationResult;
using VeltoTouch::PipelineSetting;
using VeltoTouch::PipelineSettings;
using VeltoTouch::TruthRecord;
using Kind = TruthRecord::Kind;

namespace {

constexpr int kUsageError = 2;
constexpr Kind kKinds[] = {Kind::Tap, Kind::Hold, Kind::Slide, Kind::Palm, Kind::Noise, Kind::Reset};

std::string fixed(const std::optional<double>& value, int decimals)
{
    if (!value) return "-";
    char text[32];
    std::snprintf(text, sizeof text, "%.*f", decimals, *value);
    return text;
}

std::string pad(const std::string& text, std::size_t width, bool right = true)
{
    if (text.size() >= width) return text;
    const std::string fill(width - text.size(), ' ');
    return right ? fill + text : text + fill;
}

std::vector<TruthRecord> readTruth(const std::string& path, const std::string& recording)
{
    std::string text;
    try {
        text = ToolFiles::read(path);
    } catch (const std::exception& error) {
        throw ToolError("no truth for " + recording + ": " + error.what() +
                        " (write it with synth --truth, or name it with --truth PATH)");
    }
    try {
        return TruthRecord::parseLines(text);
    } catch (const std::invalid_argument& error) {
        throw ToolError(path + ": " + error.what());
    }
}

// The settings as each evaluation applies them. They are tried on a
// pipeline first, as replay applies them, so that one the pipeline converted
// (a string stored as 0) is told before it skews the whole evaluation.
PipelineSettings settingsOf(const EvalCommand::Options& options, std::ostream& err)
{
    VeltoTouch::Pipeline pipeline;
    StateArguments::apply(pipeline, options.settings, err);
    PipelineSettings settings;
    for (const auto& [key, text, value] : options.settings) {
        settings.push_back({key, nlohmann::json::parse(VeltoTouch::JsonValue::toJson(value).dump())});
    }
    return settings;
}

void printConfusion(const EvaluationResult& result, std::ostream& out)
{
    // Rows and columns in the order of the classes, then by region; only
    // those that occur.
    const auto order = [](const std::string& label) {
        static const std::vector<std::string> kWords = {"tap", "hold", "slide", "palm", "noise", "reset",
                                                        EvaluationResult::kNone, EvaluationResult::kMissed,
                                                        EvaluationResult::kSpurious};
        static const std::vector<std::string> kRegions = {"top", "middle", "bottom", "none"};
        // "slide top>bottom": class, then first region, then second.
        std::vector<std::ptrdiff_t> key;
        std::string rest = label;
        for (char& c : rest) {
            if (c == '>') c = ' ';
        }
        std::istringstream words(rest);
        std::string word;
        words >> word;
        key.push_back(std::find(kWords.begin(), kWords.end(), word) - kWords.begin());
        while (words >> word) key.push_back(std::find(kRegions.begin(), kRegions.end(), word) - kRegions.begin());
        return key;
    };
    const auto byOrder = [&](const std::string& a, const std::string& b) { return order(a) < order(b); };
    std::set<std::string, decltype(byOrder)> rows(byOrder), columns(byOrder);
    for (const auto& [cell, count] : result.confusion) {
        rows.insert(cell.first);
        columns.insert(cell.second);
    }
    std::size_t rowWidth = 8;
    for (const std::string& row : rows) rowWidth = std::max(rowWidth, row.size());
    out << "Confusion (rows: what was done; columns: what was recognised)\n";
    out << pad("", rowWidth + 2, false);
    for (const std::string& column : columns) out << "  " << pad(column, std::max<std::size_t>(column.size(), 5));
    out << '\n';
    for (const std::string& row : rows) {
        out << "  " << pad(row, rowWidth, false);
        for (const std::string& column : columns) {
            const auto found = result.confusion.find({row, column});
            out << "  " << pad(found == result.confusion.end() ? "." : std::to_string(found->second),
                               std::max<std::size_t>(column.size(), 5));
        }
        out << '\n';
    }
}

void printResult(const EvaluationResult& result, std::ostream& out)
{
    char line[200];
    std::snprintf(line, sizeof line, "%llu recordings, %.1f minutes\n\n", static_cast<unsigned long long>(result.recordings),
                  static_cast<double>(result.durationNs) / 60e9);
    out << line;
    printConfusion(result, out);
    out << "\nclass    truths  recognised  precision  recall  latency ms: p50    p95    max\n";
    for (Kind kind : kKinds) {
        const auto& counts = result.counts(kind);
        if (counts.truths == 0 && counts.recognised == 0) continue;
        const auto latency = result.latency(kind);
        std::snprintf(line, sizeof line, "%-7s %7llu %11llu %10s %7s %17s %6s %6s\n", TruthRecord::name(kind),
                      static_cast<unsigned long long>(counts.truths), static_cast<unsigned long long>(counts.recognised),
                      fixed(result.precision(kind), 3).c_str(), fixed(result.recall(kind), 3).c_str(),
                      latency ? fixed(latency->p50, 0).c_str() : "-", latency ? fixed(latency->p95, 0).c_str() : "-",
                      latency ? fixed(latency->max, 0).c_str() : "-");
        out << line;
    }
    out << "\noverall: precision " << fixed(result.precision(), 3) << ", recall " << fixed(result.recall(), 3)
        << ", spurious " << fixed(result.spuriousPerMinute(), 2) << " per minute (" << result.spurious
        << " with no touch, " << result.unwanted << " during palm or noise), latency p95 "
        << fixed(result.latencyP95(), 0) << " ms\n";
}

void printSweep(const EvaluationReport& report, std::ostream& out)
{
    std::vector<std::size_t> widths;
    for (const std::string& key : report.sweepKeys) {
        widths.push_back(key.size());
        out << key << "  ";
    }
    out << "precision  recall  spurious/min  latency p95 ms\n";
    for (const EvaluationReport::Row& row : report.rows) {
        for (std::size_t i = 0; i < row.sweep.size(); ++i) out << pad(row.sweep[i].value.dump(), widths[i]) << "  ";
        const EvaluationResult& r = row.result;
        out << pad(fixed(r.precision(), 3), 9) << "  " << pad(fixed(r.recall(), 3), 6) << "  "
            << pad(fixed(r.spuriousPerMinute(), 2), 12) << "  " << pad(fixed(r.latencyP95(), 0), 14) << '\n';
    }
}

void print(const EvaluationReport& report, bool json, std::ostream& out)
{
    if (json) {
        out << VeltoTouch::JsonValue::dump(report.toJson(), true) << '\n';
        return;
    }
    if (!report.settings.empty()) {
        out << "settings:";
        for (const PipelineSetting& setting : report.settings) out << ' ' << setting.text();
        out << '\n';
    }
    if (report.isSweep()) {
        const std::uint64_t recordings = report.rows.empty() ? 0 : report.rows.front().result.recordings;
        out << report.rows.size() << " settings, " << recordings << " recordings each\n";
        printSweep(report, out);
    } else if (!report.rows.empty()) {
        printResult(report.rows.front().result, out);
    }
}

EvaluationReport merged(const std::vector<std::string>& files)
{
    std::optional<EvaluationReport> total;
    for (const std::string& file : files) {
        const nlohmann::json json = nlohmann::json::parse(ToolFiles::read(file), nullptr, false);
        if (json.is_discarded()) throw ToolError(file + ": not JSON (expected a report of eval --json)");
        try {
            EvaluationReport part = EvaluationReport::fromJson(json);
            if (total) total->merge(part);
            else total = std::move(part);
        } catch (const std::invalid_argument& error) {
            throw ToolError(file + ": " + error.what());
        }
    }
    return std::move(*total);
}

// "[#########           ] 45/100" on a terminal, redrawn in place.
class ProgressBar {
public:
    explicit ProgressBar(std::ostream& err) : _err(err) {}
    ~ProgressBar()
    {
        if (_drawn) _err << "\r\033[K" << std::flush;
    }
    void operator()(std::size_t done, std::size_t total)
    {
        constexpr std::size_t kWidth = 30;
        const std::size_t filled = total ? done * kWidth / total : kWidth;
        if (filled == _filled && done != total) return;
        _filled = filled;
        _drawn = true;
        _err << "\r[" << std::string(filled, '#') << std::string(kWidth - filled, ' ') << "] " << done << '/' << total
             << std::flush;
    }

private:
    std::ostream& _err;
    std::size_t _filled = SIZE_MAX;
    bool _drawn = false;
};

}  // namespace

int EvalCommand::run(const Options& options, std::ostream& out, std::ostream& err)
{
    if (options.merge) {
        if (!options.sweeps.empty() || !options.settings.empty() || options.shard || options.truth != "auto") {
            err << "veltotouch: eval --merge adds up reports; --sweep, --set, --shard and --truth do not apply\n";
            return kUsageError;
        }
        print(merged(options.files), options.json, out);
        return 0;
    }
    if (options.truth != "auto" && options.files.size() != 1) {
        err << "veltotouch: eval --truth PATH names the truth of one recording; with several, use --truth auto\n";
        return kUsageError;
    }

    EvaluationReport report;
    report.settings = settingsOf(options, err);
    for (const VeltoTouch::SweepGrid::Axis& axis : options.sweeps) report.sweepKeys.push_back(axis.key);
    std::vector<PipelineSettings> grid;
    try {
        grid = VeltoTouch::SweepGrid::combinations(options.sweeps);
    } catch (const std::invalid_argument& error) {
        // Each axis was checked with the command line; only their product is
        // left, and it is as much a usage error as one axis too long.
        err << "veltotouch: " << error.what() << '\n';
        return kUsageError;
    }

    const VeltoTouch::CorpusShard shard = options.shard.value_or(VeltoTouch::CorpusShard{});
    std::vector<CorpusEvaluator::Item> corpus;
    for (std::size_t i = 0; i < options.files.size(); ++i) {
        if (!shard.contains(i)) continue;
        const std::string& file = options.files[i];
        const std::string truthPath = options.truth == "auto" ? TruthRecord::pathBeside(file) : options.truth;
        corpus.push_back({file, readTruth(truthPath, file)});
    }

    std::vector<PipelineSettings> rowSettings;
    for (const PipelineSettings& point : grid) {
        PipelineSettings settings = report.settings;
        settings.insert(settings.end(), point.begin(), point.end());
        rowSettings.push_back(std::move(settings));
    }
    const unsigned workers = options.workers ? options.workers : CorpusEvaluator::defaultWorkers();
    std::optional<ProgressBar> bar;
    CorpusEvaluator::Progress progress;
    if (&err == &std::cerr && ::isatty(STDERR_FILENO)) {
        bar.emplace(err);
        progress = [&](std::size_t done, std::size_t total) { (*bar)(done, total); };
    }
    const std::vector<EvaluationResult> results = CorpusEvaluator::run(
        corpus, rowSettings, workers,
        [&options](const std::string& path, const VeltoTouch::ContainerStream::FrameHandler& onFrame) {
            ToolFiles::streamRecording(path, onFrame, options.hidDevice);
        },
        progress);
    bar.reset();
    for (std::size_t i = 0; i < grid.size(); ++i) report.rows.push_back({grid[i], results[i]});
    print(report, options.json, out);
    return 0;
}

void EvalCommand::addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err)
{
    auto options = std::make_shared<Options>();
    CLI::App* command =
        app.add_subcommand("eval", "Measure the recogniser on synthesised recordings against their truth");
    command->add_option("FILE", options->files, "Recordings (with --merge: reports of eval --json)")->required();
    command->add_option("--truth", options->truth, "auto (FILE with its extension replaced by .truth.jsonl) or PATH")
        ->capture_default_str();
    CommandLine::addSettings(*command, options->settings,
                             "KEY=VALUE: pipeline state before each replay (VALUE is JSON)");
    CommandLine::addParsed<std::vector<std::string>>(
        *command, "--sweep", "TEXT:KEY=FROM:TO:STEP",
        [&sweeps = options->sweeps](const std::string& text) {
            sweeps.push_back(VeltoTouch::SweepGrid::parseAxis(text));
        },
        "KEY=FROM:TO:STEP: evaluate once per value (repeat for a grid)");
    command->add_option("-j,--jobs", options->workers, "Worker threads (default: all cores)")
        ->check(CLI::Range(1u, 1024u));
    CommandLine::addParsed(
        *command, "--shard", "TEXT:I/N",
        [&shard = options->shard](const std::string& text) { shard = VeltoTouch::CorpusShard::parse(text); },
        "I/N: only every N-th recording, starting at I (0 <= I < N)");
    command->add_flag("--merge", options->merge, "FILEs are reports of eval --json (shards); print them added up");
    command->add_flag("--json", options->json, "One JSON document instead of tables");
    CommandLine::addHidDevice(*command, options->hidDevice);
    command->callback([options, &status, &out, &err] { status = run(*options, out, err); });
}

}  // namespace VeltoTool
