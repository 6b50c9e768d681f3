// bench-libs: veltotouch_platform
//
// Hand-off latencies of the host side, each reported as p50 and p99 in
// microseconds (counters) with the iteration time set to the measured
// latency (manual time):
//   - WakeupHandoff: one thread signals a semaphore, another wakes. The floor
//     for any cross-thread step.
//   - RunLoopJobHandoff: a job queued on a sleeping run loop starts running.
//   - SimulatedDeviceToQueue: a report pushed into the simulated device runs
//     the device callback on the run loop's thread, which queues a job on a
//     SerialQueue; measured from the push to the job's start. This is the
//     host's share of the report path; the full path through a plug-in adds
//     the plug-in's work between the callback and the queue.
// New paths reuse LatencySamples, LoopThread and reportLatency.

#include "platform/devices/SimulatedHostDevice.h"
#include "platform/runtime/MonotonicClock.h"
#include "platform/runtime/RunLoop.h"
#include "platform/runtime/Semaphore.h"
#include "platform/runtime/SerialQueue.h"

#include <benchmark/benchmark.h>

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cmath>
#include <thread>
#include <vector>

using namespace VeltoHost;

namespace {

std::uint64_t nanosecondsFromTicks(std::uint64_t ticks)
{
    static const Timebase timebase = MonotonicClock::timebase();
    return ticks * timebase.numer / timebase.denom;
}

// Latencies of one benchmark run, in nanoseconds.
class LatencySamples {
public:
    void reserve(std::size_t count) { _samples.reserve(count); }
    void addTicks(std::uint64_t startTicks, std::uint64_t endTicks)
    {
        _samples.push_back(static_cast<double>(nanosecondsFromTicks(endTicks - startTicks)));
    }
    std::size_t size() const { return _samples.size(); }
    double last() const { return _samples.empty() ? 0 : _samples.back(); }

    // Nearest-rank percentile (p in [0, 100]).
    double percentile(double p) const
    {
        if (_samples.empty()) return 0;
        std::vector<double> sorted = _samples;
        std::sort(sorted.begin(), sorted.end());
        auto rank = static_cast<std::size_t>(std::ceil(p / 100.0 * static_cast<double>(sorted.size())));
        return sorted[std::clamp<std::size_t>(rank, 1, sorted.size()) - 1];
    }

private:
    std::vector<double> _samples;
};

void recordIteration(benchmark::State& state, LatencySamples& samples, std::uint64_t startTicks,
                     std::uint64_t endTicks)
{
    samples.addTicks(startTicks, endTicks);
    state.SetIterationTime(samples.last() * 1e-9);
}

void reportLatency(benchmark::State& state, const LatencySamples& samples)
{
    state.counters["p50_us"] = samples.percentile(50) / 1000.0;
    state.counters["p99_us"] = samples.percentile(99) / 1000.0;
    state.counters["samples"] = static_cast<double>(samples.size());
}

// A thread running its run loop in one mode until stopped. An idle pipe
// keeps the mode from being empty when nothing else is attached.
class LoopThread {
public:
    static constexpr const char* kMode = "BenchMode";

    LoopThread()
    {
        if (pipe2(_idle.data(), O_CLOEXEC) != 0) _idle = {-1, -1};
        Semaphore ready;
        _thread = std::thread([this, &ready] {
            _loop = RunLoop::current();
            _loop->addFileDescriptorSource(_idle[0], kMode, [] {});
            ready.signal();
            while (RunLoop::run(kMode, std::nullopt, false) != RunLoop::RunResult::Stopped) {
            }
        });
        ready.wait();
    }
    ~LoopThread()
    {
        _loop->performJob(kMode, [] { RunLoop::stopCurrent(); });
        _thread.join();
        for (int fd : _idle) {
            if (fd >= 0) close(fd);
        }
    }
    const RunLoop::Ref& loop() const { return _loop; }

    // Runs `job` on the loop thread and waits for it.
    template <typename Job>
    void runSync(Job job)
    {
        Semaphore done;
        _loop->performJob(kMode, [&] {
            job();
            done.signal();
        });
        done.wait();
    }

private:
    std::array<int, 2> _idle{};
    RunLoop::Ref _loop;
    std::thread _thread;
};

void BM_WakeupHandoff(benchmark::State& state)
{
    Semaphore go;
    Semaphore back;
    std::atomic<std::uint64_t> wokeAt{0};
    std::atomic<bool> running{true};
    std::thread waiter([&] {
        for (;;) {
            go.wait();
            if (!running.load()) break;
            wokeAt.store(MonotonicClock::now());
            back.signal();
        }
    });
    LatencySamples samples;
    samples.reserve(static_cast<std::size_t>(state.max_iterations));
    for (auto _ : state) {
        std::uint64_t start = MonotonicClock::now();
        go.signal();
        back.wait();
        recordIteration(state, samples, start, wokeAt.load());
    }
    running.store(false);
    go.signal();
    waiter.join();
    reportLatency(state, samples);
}
BENCHMARK(BM_WakeupHandoff)->UseManualTime()->Iterations(20000);

void BM_RunLoopJobHandoff(benchmark::State& state)
{
    LoopThread loopThread;
    Semaphore ran;
    std::uint64_t ranAt = 0;  // written by the job, read after the semaphore
    LatencySamples samples;
    samples.reserve(static_cast<std::size_t>(state.max_iterations));
    for (auto _ : state) {
        std::uint64_t start = MonotonicClock::now();
        loopThread.loop()->performJob(LoopThread::kMode, [&] {
            ranAt = MonotonicClock::now();
            ran.signal();
        });
        ran.wait();
        recordIteration(state, samples, start, ranAt);
    }
    reportLatency(state, samples);
}
BENCHMARK(BM_RunLoopJobHandoff)->UseManualTime()->Iterations(20000);

// Device callback context: queue a job stamped with the report's time.
struct DeviceToQueue {
    SerialQueue::Ref queue = SerialQueue::create("bench.events");
    Semaphore jobStarted;
    std::uint64_t reportTime = 0;  // written on the queue, read after the semaphore
    std::uint64_t jobTime = 0;
    std::array<std::uint8_t, 512> buffer{};

    static void callback(void* context, std::int32_t, void*, HidReportType, std::uint32_t, std::uint8_t*,
                         std::size_t, std::uint64_t timeStamp)
    {
        auto* self = static_cast<DeviceToQueue*>(context);
        self->queue->async([self, timeStamp] {
            self->reportTime = timeStamp;
            self->jobTime = MonotonicClock::now();
            self->jobStarted.signal();
        });
    }
};

void BM_SimulatedDeviceToQueue(benchmark::State& state)
{
    LoopThread loopThread;
    DeviceToQueue path;
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    device->open(0);
    loopThread.runSync([&] {
        device->registerInputReportWithTimeStampCallback(path.buffer.data(), path.buffer.size(),
                                                         &DeviceToQueue::callback, &path);
        device->scheduleWithRunLoop(RunLoop::current(), LoopThread::kMode);
    });
    // An Image report's size.
    const std::vector<std::uint8_t> report(73, 0x01);
    LatencySamples samples;
    samples.reserve(static_cast<std::size_t>(state.max_iterations));
    for (auto _ : state) {
        device->pushInputReport(report);
        path.jobStarted.wait();
        recordIteration(state, samples, path.reportTime, path.jobTime);
    }
    loopThread.runSync([&] {
        device->unscheduleFromRunLoop(RunLoop::current(), LoopThread::kMode);
        device->registerInputReportWithTimeStampCallback(path.buffer.data(), path.buffer.size(), nullptr, nullptr);
    });
    path.queue->drain();
    reportLatency(state, samples);
}
BENCHMARK(BM_SimulatedDeviceToQueue)->UseManualTime()->Iterations(20000);

}  // namespace

BENCHMARK_MAIN();
