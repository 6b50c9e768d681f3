// bench-libs: veltotouch_recording
//
// The recorder at the service's limit: writing the container (done for every
// read of the recording property), reading it back, and copying the recorder
// (what the service does while holding its pipeline lock).
#include "recording/PipelineRecording.h"

#include <benchmark/benchmark.h>

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace {

using VeltoTouch::PipelineRecording;
using VeltoTouch::PropertyValue;

constexpr std::uint64_t kServiceFrameLimit = 1350;

// 1350 image reports of 73 bytes at 8 ms spacing with a setting change every
// 100 reports, already trimmed to the limit.
PipelineRecording fullRecording()
{
    PipelineRecording recording;
    recording.setMaxFrameCount(kServiceFrameLimit);
    std::uint64_t time = 1'000'000'000;
    for (std::uint32_t frame = 0; frame < kServiceFrameLimit; ++frame) {
        if (frame % 100 == 0) {
            PipelineRecording::Frame state;
            state.type = PipelineRecording::Frame::Type::State;
            state.timestampNs = time;
            state.key = "Algs.HoldTimeoutMilliseconds";
            state.value = PropertyValue::uint64(300 + frame / 100);
            recording.appendFrame(std::move(state));
        }
        PipelineRecording::Frame report;
        report.type = PipelineRecording::Frame::Type::InputReport;
        report.timestampNs = time;
        report.report.resize(73);
        for (std::size_t i = 0; i < report.report.size(); ++i) report.report[i] = static_cast<std::uint8_t>(frame + i);
        report.report[0] = 0x01;
        recording.appendFrame(std::move(report));
        time += 8'000'000;
    }
    return recording;
}

void BM_WriteContainer(benchmark::State& state)
{
    PipelineRecording recording = fullRecording();
    for (auto _ : state) {
        std::string text = recording.json();
        benchmark::DoNotOptimize(text);
    }
}
BENCHMARK(BM_WriteContainer)->Unit(benchmark::kMicrosecond);

void BM_ReadContainer(benchmark::State& state)
{
    const std::string text = fullRecording().json();
    for (auto _ : state) {
        PipelineRecording recording{std::string_view(text)};
        benchmark::DoNotOptimize(recording.frames().size());
    }
    state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
}
BENCHMARK(BM_ReadContainer)->Unit(benchmark::kMicrosecond);

void BM_CopyRecorder(benchmark::State& state)
{
    const PipelineRecording recording = fullRecording();
    for (auto _ : state) {
        PipelineRecording copy(recording);
        benchmark::DoNotOptimize(copy.frames().size());
    }
}
BENCHMARK(BM_CopyRecorder)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
