// bench-libs: bus_test_support veltotouch_daemon
//
// Latency from a report entering a simulated device to the D-Bus signal it
// causes reaching a client: the real module in a HostEventSystem (input-
// report thread, recorder, pipeline, recogniser, the host's event queue),
// the bus service's hand-off to its connection thread, a private
// dbus-daemon, and an sd-bus client on the benchmark's thread, asleep in
// sd_bus_wait as a watching client would be.
//   - ResetReportToSignal: a device-reset report until its DeviceReset signal.
//   - GestureReportToSignal: the reports of examples/taps.json, spaced as
//     below, each Gesture signal timed from the push of the report whose
//     frame number it carries.
//   - GestureSignalDuringRecordingReads: the same, while clients on their own
//     connections read the full "Recording" back to back; the bus service
//     must keep their reads from holding up the signals.
// Reports are spaced so that every thread sleeps when the next one comes, as
// with the real device's frame rate. Percentiles are counters in microseconds.
#include "AttachedDevice.h"
#include "PrivateBus.h"
#include "bus/ControlClient.h"

#include "bus/BusService.h"
#include "platform/log/Log.h"
#include "platform/runtime/MonotonicClock.h"
#include "recording/PipelineRecording.h"
#include "records/InputReport.h"
#include "service/VeltoTouchHIDService.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <atomic>
#include <map>
#include <mutex>
#include <optional>
#include <thread>
#include <vector>

namespace {

using namespace VeltoHost;

constexpr int kResetSamples = 3000;
constexpr int kGestureRounds = 100;
// Fewer under load: enough for a p99, and the whole run stays within seconds.
constexpr int kLoadedRounds = 40;
constexpr std::uint64_t kSpacingMicroseconds = 300;
// A FirmwareEvent report announcing a device reset.
const std::vector<std::uint8_t> kResetReport = {0x02, 0x00, 0, 0, 0, 0, 0, 0, 0, 0};

double microseconds(std::uint64_t ticks)
{
    const Timebase timebase = MonotonicClock::timebase();
    return static_cast<double>(ticks) * timebase.numer / timebase.denom / 1000.0;
}

void reportPercentiles(benchmark::State& state, std::vector<std::uint64_t> samples)
{
    if (samples.empty()) {
        state.SkipWithError("no samples");
        return;
    }
    std::sort(samples.begin(), samples.end());
    auto at = [&](double q) { return microseconds(samples[static_cast<std::size_t>(q * (samples.size() - 1))]); };
    state.counters["p50_us"] = at(0.50);
    state.counters["p99_us"] = at(0.99);
    state.counters["max_us"] = microseconds(samples.back());
    state.counters["samples"] = static_cast<double>(samples.size());
}

// A private bus, the service on it, one attached device and a watching client.
struct Setup {
    PrivateBus bus;
    std::optional<BusService> service;
    std::optional<AttachedDevice> device;
    std::optional<ControlClient> client;

    bool start(benchmark::State& state)
    {
        // Each round restarts the frame numbers, which the plug-in logs as a gap.
        Log::setThreshold(Log::kOff);
        if (bus.address().empty()) {
            state.SkipWithError(bus.error().c_str());
            return false;
        }
        service.emplace(BusConnection::Address::at(bus.address()));
        device.emplace(*service, "sim:bench");
        client.emplace(BusConnection::Address::at(bus.address()));
        if (!client->connected() || !client->watchSignals()) {
            state.SkipWithError("the client could not watch the bus");
            return false;
        }
        client->listDevices();  // a round trip: the match is in place from here on
        client->clearSignals();
        return true;
    }
};

void BM_ResetReportToSignal(benchmark::State& state)
{
    for (auto _ : state) {
        Setup setup;
        if (!setup.start(state)) return;
        std::vector<std::uint64_t> samples;
        samples.reserve(kResetSamples);
        for (int i = 0; i < kResetSamples; ++i) {
            MonotonicClock::sleepMicroseconds(kSpacingMicroseconds);
            const std::uint64_t pushed = MonotonicClock::now();
            setup.device->device()->pushInputReport(kResetReport);
            if (!setup.client->waitUntil([&] { return !setup.client->signals().empty(); })) {
                state.SkipWithError("no DeviceReset signal arrived");
                return;
            }
            samples.push_back(setup.client->signals().front().receivedTicks - pushed);
            setup.client->clearSignals();
        }
        reportPercentiles(state, samples);
    }
}
BENCHMARK(BM_ResetReportToSignal)->Iterations(1)->Unit(benchmark::kMillisecond);

// The input reports of examples/taps.json, one round of taps.
std::vector<std::vector<std::uint8_t>> tapReports()
{
    const std::string text = readFile(std::string(VELTO_EXAMPLES_DIR) + "/taps.json");
    VeltoTouch::PipelineRecording recording{std::string_view(text)};
    std::vector<std::vector<std::uint8_t>> reports;
    for (const auto& frame : recording.frames()) {
        if (frame.type == VeltoTouch::PipelineRecording::Frame::Type::InputReport) reports.push_back(frame.report);
    }
    return reports;
}

// Pushes one round of reports, spaced, and adds the latency of each of its
// Gesture signals to `samples`, timed from the push of the report whose frame
// number it carries. False, with the benchmark skipped, when the round never
// ended.
bool timeGestureRound(benchmark::State& state, Setup& setup, const std::vector<std::vector<std::uint8_t>>& reports,
                      std::vector<std::uint64_t>& samples)
{
    // Frame numbers repeat from round to round: each round is timed on its own.
    std::map<std::uint32_t, std::uint64_t> pushedAt;
    std::thread pusher([&] {
        for (const auto& report : reports) {
            MonotonicClock::sleepMicroseconds(kSpacingMicroseconds);
            const auto image = VeltoTouch::InputReport::Image::parse(report.data(), report.size());
            if (image) pushedAt[image->frameNumber] = MonotonicClock::now();
            setup.device->device()->pushInputReport(report);
        }
        MonotonicClock::sleepMicroseconds(kSpacingMicroseconds);
        setup.device->device()->pushInputReport(kResetReport);
    });
    // The client reads the bus while the reports go in, as a watcher would; a
    // device reset after the round's last report ends the round (its signal
    // comes after every gesture of the round) and leaves the recogniser idle
    // for the next.
    const bool ended = setup.client->waitUntil([&] { return !setup.client->signalsNamed("DeviceReset").empty(); });
    pusher.join();
    if (!ended) {
        state.SkipWithError("the round's closing DeviceReset signal did not arrive");
        return false;
    }
    for (const auto& signal : setup.client->signalsNamed("Gesture")) {
        const auto pushed = pushedAt.find(signal.event.frame);
        if (pushed != pushedAt.end()) samples.push_back(signal.receivedTicks - pushed->second);
    }
    setup.client->clearSignals();
    return true;
}

void BM_GestureReportToSignal(benchmark::State& state)
{
    const auto reports = tapReports();
    for (auto _ : state) {
        Setup setup;
        if (!setup.start(state)) return;
        std::vector<std::uint64_t> samples;
        for (int round = 0; round < kGestureRounds; ++round) {
            if (!timeGestureRound(state, setup, reports, samples)) return;
        }
        reportPercentiles(state, samples);
    }
}
BENCHMARK(BM_GestureReportToSignal)->Iterations(1)->Unit(benchmark::kMillisecond);

// Clients reading "Recording" back to back, each on a connection and a thread
// of its own and asking again as soon as its answer is in, as scripts polling
// a device for its raw data would.
class RecordingReaders {
public:
    RecordingReaders(const std::string& address, const std::string& path, int count) : _count(count)
    {
        for (int i = 0; i < count; ++i) _threads.emplace_back([this, address, path] { readUntilStopped(address, path); });
    }
    ~RecordingReaders() { stop(); }
    RecordingReaders(const RecordingReaders&) = delete;
    RecordingReaders& operator=(const RecordingReaders&) = delete;

    // Waits until every reader has had a first answer, so that the load is
    // at full strength from here on; false when a reader failed.
    bool waitUntilReading()
    {
        while (_reading.load() < _count) {
            if (failed()) return false;
            MonotonicClock::sleepMicroseconds(1000);
        }
        return !failed();
    }

    std::uint64_t reads() const noexcept { return _reads.load(); }
    std::size_t answerBytes() const noexcept { return _answerBytes.load(); }

    // Ends the reads; returns why the first failed read failed, empty when none did.
    std::string stop()
    {
        _stop = true;
        for (auto& thread : _threads) {
            if (thread.joinable()) thread.join();
        }
        std::lock_guard guard(_errorLock);
        return _error;
    }

private:
    void readUntilStopped(const std::string& address, const std::string& path)
    {
        ControlClient client(BusConnection::Address::at(address));
        if (!client.connected()) return fail("a reader could not connect: " + client.connectError());
        bool first = true;
        while (!_stop.load(std::memory_order_relaxed)) {
            const ControlClient::Reply reply = client.getProperty(path, "Recording");
            if (!reply.ok()) return fail("a Recording read failed: " + reply.error + ": " + reply.message);
            _answerBytes = reply.value.size();
            _reads.fetch_add(1);
            if (first) _reading.fetch_add(1);
            first = false;
        }
    }

    void fail(const std::string& why)
    {
        std::lock_guard guard(_errorLock);
        if (_error.empty()) _error = why;
    }

    bool failed()
    {
        std::lock_guard guard(_errorLock);
        return !_error.empty();
    }

    const int _count;
    std::atomic<bool> _stop{false};
    std::atomic<int> _reading{0};
    std::atomic<std::uint64_t> _reads{0};
    std::atomic<std::size_t> _answerBytes{0};
    std::mutex _errorLock;
    std::string _error;  // guarded by _errorLock
    std::vector<std::thread> _threads;  // last: started once everything they use exists
};

// Plays rounds of taps until the recording holds as many frames as it keeps,
// so that every read is of full size (the rounds that follow keep it full),
// then ends with a device reset so that the recogniser starts idle.
bool fillRecording(benchmark::State& state, Setup& setup)
{
    const std::string taps = std::string(VELTO_EXAMPLES_DIR) + "/taps.json";
    std::uint64_t played = 0;
    while (played < VeltoTouch::VeltoTouchHIDService::kRecordingMaxFrameCount) played += setup.device->play(taps);
    setup.device->device()->pushInputReport(kResetReport);
    if (!setup.client->waitUntil([&] { return !setup.client->signalsNamed("DeviceReset").empty(); })) {
        state.SkipWithError("no DeviceReset signal arrived after the recording was filled");
        return false;
    }
    setup.client->clearSignals();
    return true;
}

// Gesture latency while Arg readers read "Recording" back to back for the
// whole measurement; with none, the same run without the load, for comparison.
// reads_per_s counts the readers' answers over the measurement, read_kB the
// size of one answer.
void BM_GestureSignalDuringRecordingReads(benchmark::State& state)
{
    const auto reports = tapReports();
    const int readerCount = static_cast<int>(state.range(0));
    for (auto _ : state) {
        Setup setup;
        if (!setup.start(state) || !fillRecording(state, setup)) return;
        RecordingReaders readers(setup.bus.address(), setup.device->path(), readerCount);
        if (!readers.waitUntilReading()) {
            const std::string failure = readers.stop();
            state.SkipWithError(failure.c_str());
            return;
        }
        const std::uint64_t readsBefore = readers.reads();
        const std::uint64_t start = MonotonicClock::now();
        std::vector<std::uint64_t> samples;
        for (int round = 0; round < kLoadedRounds; ++round) {
            if (!timeGestureRound(state, setup, reports, samples)) return;
        }
        const double seconds = microseconds(MonotonicClock::now() - start) / 1e6;
        const std::uint64_t reads = readers.reads() - readsBefore;
        if (const std::string failure = readers.stop(); !failure.empty()) {
            state.SkipWithError(failure.c_str());
            return;
        }
        reportPercentiles(state, samples);
        state.counters["reads_per_s"] = static_cast<double>(reads) / seconds;
        state.counters["read_kB"] = static_cast<double>(readers.answerBytes()) / 1000.0;
    }
}
BENCHMARK(BM_GestureSignalDuringRecordingReads)
    ->ArgName("readers")
    ->Arg(0)
    ->Arg(4)
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
