// bench-libs: veltotouch_pipeline
//
// One Image report through the pipeline and the recogniser, debug log off,
// on a stream that mixes idle stretches, taps, holds and a palm.
#include "pipeline/Pipeline.h"
#include "platform/log/Log.h"

#include <benchmark/benchmark.h>

#include <array>
#include <cstdint>
#include <utility>
#include <vector>

namespace {

using Report = std::array<std::uint8_t, VeltoTouch::InputReport::Image::kLength>;
using Contact = std::vector<std::pair<char, std::int16_t>>;

class StreamBuilder {
public:
    void add(const Contact& contact, int frames)
    {
        for (int i = 0; i < frames; ++i) {
            Report report{};
            report[0] = VeltoTouch::InputReport::Image::kReportID;
            putU32(report, 1, _frameNumber++);
            putU32(report, 5, _timeMs);
            _timeMs += 10;
            for (const auto& [letter, reading] : contact) {
                const auto offset = static_cast<std::size_t>(43 + 2 * (letter - 'A'));
                report[offset] = static_cast<std::uint8_t>(reading & 0xFF);
                report[offset + 1] = static_cast<std::uint8_t>(static_cast<std::uint16_t>(reading) >> 8);
            }
            _reports.push_back(report);
        }
    }
    std::vector<Report> take() { return std::move(_reports); }

private:
    static void putU32(Report& report, std::size_t offset, std::uint32_t value)
    {
        for (std::size_t i = 0; i < 4; ++i) report[offset + i] = static_cast<std::uint8_t>(value >> (8 * i));
    }

    std::uint32_t _frameNumber = 1;
    std::uint32_t _timeMs = 1000;
    std::vector<Report> _reports;
};

std::vector<Report> realisticStream()
{
    // Sensor noise on a few pads while idle, as a real surface shows it.
    const Contact idle = {{'A', 8}, {'E', -5}, {'K', 12}, {'M', 3}};
    const Contact fingerOnK = {{'K', 300}, {'J', 40}, {'L', 35}};
    const Contact fingerOnG = {{'G', 400}, {'H', 60}, {'I', 50}};
    const Contact fingerOnM = {{'M', 300}, {'L', 80}, {'N', 40}};
    const Contact palm = {{'A', 120}, {'B', 120}, {'C', 120}, {'D', 120}, {'E', 120},
                          {'F', 120}, {'K', 100}, {'J', 100}, {'L', 100}};
    StreamBuilder stream;
    for (int round = 0; round < 4; ++round) {
        stream.add(idle, 100);
        stream.add(fingerOnK, 12);  // tap
        stream.add(idle, 40);
        stream.add(fingerOnG, 8);  // tap
        stream.add(idle, 60);
        stream.add(fingerOnM, 90);  // hold
        stream.add(fingerOnK, 10);  // the hold moves
        stream.add(idle, 80);
        stream.add(palm, 70);  // suppressed hold
        stream.add(idle, 50);
    }
    return stream.take();
}

void BM_PipelineImageReport(benchmark::State& state)
{
    VeltoHost::Log::setThreshold(VeltoHost::LogLevel::Error);
    const std::vector<Report> stream = realisticStream();
    VeltoTouch::Pipeline pipeline;
    std::size_t eventCount = 0;
    pipeline.hidEventsProbe = [&eventCount](const VeltoHost::HidEventList& events) { eventCount += events.size(); };
    std::size_t next = 0;
    std::uint64_t ticks = 0;
    for (auto _ : state) {
        const Report& report = stream[next];
        pipeline.setTime(++ticks);
        pipeline.handleInputReport(report.data(), report.size());
        if (++next == stream.size()) next = 0;
    }
    benchmark::DoNotOptimize(eventCount);
    state.counters["events"] = benchmark::Counter(static_cast<double>(eventCount));
}
BENCHMARK(BM_PipelineImageReport);

}  // namespace

BENCHMARK_MAIN();
