// bench-libs: veltotouch_recording
//
// The recorder at the service's limit: recording one frame (done for every
// report and every pipeline property write, under the pipeline lock), writing
// the container (done for every read of the recording property), reading it
// back, and copying the recorder (what the service does while holding its
// pipeline lock).
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

// Cost of one recorded frame through the recorder's own entry points (clock
// reading included), with no wrapped pipeline, once the recording is full and
// trimming has reached its steady rhythm. Every iteration records exactly one
// frame; `stateEvery` is how many frames make one cycle of the pattern, the
// first of which is a state write (0: reports only).
void recordFrames(benchmark::State& state, std::uint64_t stateEvery)
{
    PipelineRecording recording;
    recording.setMaxFrameCount(kServiceFrameLimit);
    std::vector<std::uint8_t> report(73, 0);
    report[0] = 0x01;
    const std::string key = "Algs.HoldTimeoutMilliseconds";
    const PropertyValue value = PropertyValue::uint64(300);
    std::uint64_t count = 0;
    auto recordOne = [&] {
        if (stateEvery != 0 && count % stateEvery == 0) {
            recording.setState(key, value);
        } else {
            report[1] = static_cast<std::uint8_t>(count);
            recording.handleInputReport(report.data(), report.size());
        }
        ++count;
    };
    // Several trims' worth first, so that the timed part sees the steady state.
    for (std::uint64_t i = 0; i < 8 * kServiceFrameLimit; ++i) recordOne();
    for (auto _ : state) recordOne();
    state.counters["frames"] = static_cast<double>(recording.frames().size());
}

void BM_RecordReportsOnly(benchmark::State& state) { recordFrames(state, 0); }
BENCHMARK(BM_RecordReportsOnly);

// A state write for every report, as when the host tunes the recogniser as
// often as the device reports.
void BM_RecordStateWritePerReport(benchmark::State& state) { recordFrames(state, 2); }
BENCHMARK(BM_RecordStateWritePerReport);

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

void copyRecorder(benchmark::State& state, const PipelineRecording& recording)
{
    for (auto _ : state) {
        PipelineRecording copy(recording);
        benchmark::DoNotOptimize(copy.frames().size());
    }
    state.counters["frames"] = static_cast<double>(recording.frames().size());
}

void BM_CopyRecorder(benchmark::State& state) { copyRecorder(state, fullRecording()); }
BENCHMARK(BM_CopyRecorder)->Unit(benchmark::kMicrosecond);

// The longest list the state-write-per-report pattern leaves between two
// trims: recorded until a trim, then until one frame short of the length
// before it.
void BM_CopyRecorderStateWritePerReport(benchmark::State& state)
{
    PipelineRecording recording;
    recording.setMaxFrameCount(kServiceFrameLimit);
    std::vector<std::uint8_t> report(73, 0);
    report[0] = 0x01;
    std::uint64_t count = 0;
    auto recordOne = [&] {
        if (count++ % 2 == 0) {
            recording.setState("Algs.HoldTimeoutMilliseconds", PropertyValue::uint64(count));
        } else {
            recording.handleInputReport(report.data(), report.size());
        }
    };
    for (std::uint64_t i = 0; i < 8 * kServiceFrameLimit; ++i) recordOne();
    std::size_t longest = 0;
    while (recording.frames().size() >= longest) {
        longest = recording.frames().size();
        recordOne();
    }
    while (recording.frames().size() + 1 < longest) recordOne();
    copyRecorder(state, recording);
}
BENCHMARK(BM_CopyRecorderStateWritePerReport)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
