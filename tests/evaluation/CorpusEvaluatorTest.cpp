#include "evaluation/CorpusEvaluator.h"
#include "evaluation/CorpusShard.h"
#include "evaluation/EvaluationReport.h"
#include "evaluation/SweepGrid.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <sstream>

using namespace VeltoTouch;

namespace {

std::string readAll(const std::string& path)
{
    std::ostringstream text;
    text << std::ifstream(path).rdbuf();
    return text.str();
}

// The whole-text reader (the tool streams; the two agree frame for frame).
void load(const std::string& path, const ContainerStream::FrameHandler& onFrame)
{
    const PipelineRecording recording(std::string_view(readAll(path)));
    for (PipelineRecording::Frame frame : recording.frames()) onFrame(std::move(frame));
}

// The sample recordings, synthesised with their truth beside them.
std::vector<CorpusEvaluator::Item> examples()
{
    std::vector<CorpusEvaluator::Item> corpus;
    for (const auto& entry : std::filesystem::directory_iterator(VELTO_EXAMPLES_DIR)) {
        const std::string path = entry.path().string();
        // Recordings kept for their events alone have no truth beside them.
        if (entry.path().extension() != ".json" || !std::filesystem::exists(TruthRecord::pathBeside(path))) continue;
        corpus.push_back({path, TruthRecord::parseLines(readAll(TruthRecord::pathBeside(path)))});
    }
    std::sort(corpus.begin(), corpus.end(), [](const auto& a, const auto& b) { return a.recording < b.recording; });
    return corpus;
}

}  // namespace

TEST(CorpusEvaluator, SweepRowsEqualSeparateEvaluations)
{
    const auto corpus = examples();
    ASSERT_GE(corpus.size(), 6u);
    const auto grid = SweepGrid::combinations({SweepGrid::parseAxis("Algs.HoldTimeoutMilliseconds=150:750:300"),
                                               SweepGrid::parseAxis("Algs.ActivationThreshold=100:200:100")});
    ASSERT_EQ(grid.size(), 6u);
    std::size_t progressCalls = 0;
    const auto rows = CorpusEvaluator::run(corpus, grid, 2, load, [&](std::size_t done, std::size_t total) {
        EXPECT_EQ(done, ++progressCalls);
        EXPECT_EQ(total, corpus.size() * grid.size());
    });
    ASSERT_EQ(rows.size(), grid.size());
    EXPECT_EQ(progressCalls, corpus.size() * grid.size());
    for (std::size_t i = 0; i < grid.size(); ++i) {
        EXPECT_EQ(rows[i], CorpusEvaluator::run(corpus, {grid[i]}, 1, load).front()) << grid[i][0].text();
        EXPECT_EQ(rows[i].recordings, corpus.size());
    }
    // The settings reach the pipeline: the hold timeout moves the result.
    EXPECT_NE(rows[0], rows[4]);

    // Fewer recordings than it takes to keep the workers busy: each read
    // feeds a share of the settings, and the rows stay the same.
    const std::vector<CorpusEvaluator::Item> one = {corpus[1]};
    const auto shared = CorpusEvaluator::run(one, grid, 2, load);
    for (std::size_t i = 0; i < grid.size(); ++i) EXPECT_EQ(shared[i], CorpusEvaluator::run(one, {grid[i]}, 1, load).front());
}

TEST(CorpusEvaluator, ShardsMergedEqualOneRun)
{
    const auto corpus = examples();
    const auto grid = SweepGrid::combinations({SweepGrid::parseAxis("Algs.HoldTimeoutMilliseconds=300:700:400")});
    const auto reportOf = [&](const CorpusShard& shard) {
        std::vector<CorpusEvaluator::Item> part;
        for (std::size_t i = 0; i < corpus.size(); ++i) {
            if (shard.contains(i)) part.push_back(corpus[i]);
        }
        EvaluationReport report;
        report.sweepKeys = {"Algs.HoldTimeoutMilliseconds"};
        const auto results = CorpusEvaluator::run(part, grid, 2, load);
        for (std::size_t i = 0; i < grid.size(); ++i) report.rows.push_back({grid[i], results[i]});
        // Shards meet as the JSON an array job leaves behind.
        return EvaluationReport::fromJson(nlohmann::json::parse(report.toJson().dump()));
    };
    EvaluationReport merged = reportOf(CorpusShard::parse("0/4"));
    for (const char* shard : {"1/4", "2/4", "3/4"}) merged.merge(reportOf(CorpusShard::parse(shard)));
    EXPECT_EQ(merged, reportOf(CorpusShard{}));
    EXPECT_EQ(merged.rows.front().result.recordings, corpus.size());

    EvaluationReport other = reportOf(CorpusShard::parse("0/4"));
    other.rows.front().sweep.front().value = 301;
    EXPECT_THROW(merged.merge(other), std::invalid_argument);
}
