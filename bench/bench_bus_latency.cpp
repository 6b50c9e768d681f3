// bench-libs: bus_test_support veltotouch_host
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
// Reports are spaced so that every thread sleeps when the next one comes, as
// with the real device's frame rate. Percentiles are counters in microseconds.
#include "AttachedDevice.h"
#include "host/ControlClient.h"
#include "PrivateBus.h"

#include "host/BusService.h"
#include "records/InputReport.h"
#include "platform/Log.h"
#include "platform/MonotonicClock.h"
#include "recording/PipelineRecording.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <map>
#include <optional>
#include <thread>
#include <vector>

namespace {

using namespace VeltoHost;

constexpr int kResetSamples = 3000;
constexpr int kGestureRounds = 100;
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

void BM_GestureReportToSignal(benchmark::State& state)
{
    const std::string text = readFile(std::string(VELTO_EXAMPLES_DIR) + "/taps.json");
    VeltoTouch::PipelineRecording recording{std::string_view(text)};
    std::vector<std::vector<std::uint8_t>> reports;
    for (const auto& frame : recording.frames()) {
        if (frame.type == VeltoTouch::PipelineRecording::Frame::Type::InputReport) reports.push_back(frame.report);
    }
    for (auto _ : state) {
        Setup setup;
        if (!setup.start(state)) return;
        std::vector<std::uint64_t> samples;
        for (int round = 0; round < kGestureRounds; ++round) {
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
            // The client reads the bus while the reports go in, as a watcher
            // would; a device reset after the round's last report ends the
            // round (its signal comes after every gesture of the round) and
            // leaves the recogniser idle for the next.
            const bool ended = setup.client->waitUntil([&] { return !setup.client->signalsNamed("DeviceReset").empty(); });
            pusher.join();
            if (!ended) {
                state.SkipWithError("the round's closing DeviceReset signal did not arrive");
                return;
            }
            for (const auto& signal : setup.client->signalsNamed("Gesture")) {
                const auto pushed = pushedAt.find(signal.event.frame);
                if (pushed != pushedAt.end()) samples.push_back(signal.receivedTicks - pushed->second);
            }
            setup.client->clearSignals();
        }
        reportPercentiles(state, samples);
    }
}
BENCHMARK(BM_GestureReportToSignal)->Iterations(1)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
