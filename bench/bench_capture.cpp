// bench-libs: veltotouch_recording
//
// Captures of a surface's input reports, both ways:
// - what `veltotouch record` spends on each report it captures: waiting for
//   it and reading it (poll and read, here on a packet socket, which hands
//   out one message a read as hidraw hands out one report), and writing it
//   in either format;
// - an hour of reports (100 a second, Image reports of 73 bytes with
//   changing readings) read as the commands read a recording file: streamed
//   from a descriptor by ContainerStream, which tells the format by its
//   content. The same reports as a container and as a hid-recorder text, so
//   that the two readers can be compared.
#include "recording/ContainerStream.h"
#include "recording/ContainerWriter.h"
#include "recording/HidRecorderWriter.h"

#include <benchmark/benchmark.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdint>
#include <sstream>
#include <string>
#include <vector>

namespace {

using VeltoTouch::PipelineRecording;

constexpr std::uint64_t kReportsPerHour = 100 * 3600;

// Takes the text and keeps none of it: the cost measured is the formatting.
class Discard : public std::streambuf {
protected:
    int_type overflow(int_type c) override { return traits_type::not_eof(c); }
    std::streamsize xsputn(const char*, std::streamsize count) override { return count; }
};

std::vector<PipelineRecording::Frame> anHour()
{
    std::vector<PipelineRecording::Frame> frames(kReportsPerHour);
    std::uint64_t time = 1'000'000'000;
    std::uint32_t noise = 12345;
    for (std::uint64_t number = 0; number < frames.size(); ++number) {
        PipelineRecording::Frame& frame = frames[number];
        frame.type = PipelineRecording::Frame::Type::InputReport;
        frame.timestampNs = time;
        frame.report.resize(73);
        frame.report[0] = 0x01;
        for (std::size_t i = 1; i < frame.report.size(); ++i) {
            noise = noise * 1103515245 + 12345;
            frame.report[i] = static_cast<std::uint8_t>(noise >> 16);
        }
        time += 10'000'000 + (noise >> 20);  // 10 ms and up to a millisecond of jitter, in whole nanoseconds
    }
    return frames;
}

VeltoTouch::HidRecorderWriter::Device surfaceDevice()
{
    VeltoTouch::HidRecorderWriter::Device surface;
    surface.name = "surface";
    surface.reportDescriptor = {0x06, 0x00, 0xff, 0x09, 0x01, 0xa1, 0x01, 0x75, 0x08, 0x85, 0x01, 0x95, 0x48,
                                0x81, 0x02, 0x85, 0x02, 0x95, 0x09, 0x81, 0x02, 0xc0};
    return surface;
}

std::string asContainer()
{
    std::ostringstream out;
    VeltoTouch::ContainerWriter writer(out);
    for (const auto& frame : anHour()) writer.write(frame);
    writer.finish();
    return std::move(out).str();
}

std::string asHidRecorder()
{
    std::ostringstream out;
    VeltoTouch::HidRecorderWriter writer(out, surfaceDevice());
    for (const auto& frame : anHour()) writer.write(frame);
    return std::move(out).str();
}

// One report waited for and read, as the capture loop does it.
void BM_PollAndReadAReport(benchmark::State& state)
{
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) {
        state.SkipWithError("socketpair failed");
        return;
    }
    const std::vector<std::uint8_t> sent = anHour().front().report;
    std::vector<std::uint8_t> received(16384);
    for (auto _ : state) {
        state.PauseTiming();
        if (::send(ends[1], sent.data(), sent.size(), 0) != static_cast<ssize_t>(sent.size())) {
            state.SkipWithError("send failed");
            break;
        }
        state.ResumeTiming();
        pollfd ready{ends[0], POLLIN, 0};
        ::poll(&ready, 1, 100);
        benchmark::DoNotOptimize(::read(ends[0], received.data(), received.size()));
    }
    ::close(ends[0]);
    ::close(ends[1]);
}
BENCHMARK(BM_PollAndReadAReport);

template <typename Write>
void writeReports(benchmark::State& state, Write write)
{
    const std::vector<PipelineRecording::Frame> frames = anHour();
    std::size_t next = 0;
    for (auto _ : state) {
        write(frames[next]);
        next = next + 1 == frames.size() ? 0 : next + 1;
    }
}

void BM_WriteAReportToAContainer(benchmark::State& state)
{
    Discard discard;
    std::ostream out(&discard);
    VeltoTouch::ContainerWriter writer(out);
    writeReports(state, [&](const PipelineRecording::Frame& frame) { writer.write(frame); });
}
BENCHMARK(BM_WriteAReportToAContainer);

void BM_WriteAReportToAHidRecorderText(benchmark::State& state)
{
    Discard discard;
    std::ostream out(&discard);
    VeltoTouch::HidRecorderWriter writer(out, surfaceDevice(), 0);
    writeReports(state, [&](const PipelineRecording::Frame& frame) {
        writer.writeReport(frame.timestampNs, frame.report.data(), frame.report.size());
    });
}
BENCHMARK(BM_WriteAReportToAHidRecorderText);

void readStreamed(benchmark::State& state, const std::string& text)
{
    const int fd = ::memfd_create("recording", MFD_CLOEXEC);
    if (fd < 0 || ::write(fd, text.data(), text.size()) != static_cast<ssize_t>(text.size())) {
        state.SkipWithError("memfd_create or write failed");
        return;
    }
    std::uint64_t frames = 0;
    for (auto _ : state) {
        ::lseek(fd, 0, SEEK_SET);
        frames = 0;
        VeltoTouch::ContainerStream::read(fd, [&](PipelineRecording::Frame&&) { ++frames; });
    }
    ::close(fd);
    if (frames != kReportsPerHour) state.SkipWithError("not every report was read");
    state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * text.size()));
    state.counters["reports"] = static_cast<double>(frames);
}

void BM_ReadAnHourOfContainer(benchmark::State& state)
{
    static const std::string text = asContainer();
    readStreamed(state, text);
}
BENCHMARK(BM_ReadAnHourOfContainer)->Unit(benchmark::kMillisecond)->Iterations(3);

void BM_ReadAnHourOfHidRecorderText(benchmark::State& state)
{
    static const std::string text = asHidRecorder();
    readStreamed(state, text);
}
BENCHMARK(BM_ReadAnHourOfHidRecorderText)->Unit(benchmark::kMillisecond)->Iterations(3);

}  // namespace

BENCHMARK_MAIN();
