// bench-libs: veltotouch_service
//
// Latency through the real service: a report pushed into the simulated device
// until the host's callback holds its event (input-report thread, recorder,
// pipeline, recogniser, dispatch job on the host's queue), beside the floor
// measured in the same run, a bare wake-up hand-off between two threads. And
// the longest stall of the input-report thread while the host reads
// "Recording" again and again: the time from a report's push until the
// pipeline sees it (its input-report trace point), which includes the wait for
// the pipeline lock behind the recording copy.
//
// Reports are spaced so that every thread is asleep when the next one comes,
// as with the real device's frame rate; each benchmark runs its samples once
// and reports percentiles as counters in microseconds.
#include "platform/devices/HostDeviceRegistry.h"
#include "platform/devices/SimulatedHostDevice.h"
#include "platform/log/Log.h"
#include "platform/log/Trace.h"
#include "platform/runtime/MonotonicClock.h"
#include "platform/runtime/RunLoop.h"
#include "platform/runtime/Semaphore.h"
#include "platform/runtime/SerialQueue.h"
#include "platform/runtime/Thread.h"
#include "platform/values/PropertyDictionary.h"
#include "platform/values/PropertyValue.h"
#include "records/InputReport.h"
#include "service/VeltoTouchHIDService.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <thread>
#include <vector>

namespace {

using namespace VeltoHost;
using VeltoTouch::VeltoTouchHIDService;

constexpr std::uint32_t kServiceHandle = 0xBE7C;
constexpr std::uint32_t kTraceInputReport = 0x2B150180;
constexpr std::uint32_t kTraceDispatchBatch = 0x2B150184;
constexpr int kSamples = 5000;
constexpr std::uint64_t kSpacingMicroseconds = 200;

double microseconds(std::uint64_t ticks)
{
    Timebase timebase = MonotonicClock::timebase();
    return static_cast<double>(ticks) * timebase.numer / timebase.denom / 1000.0;
}

void reportPercentiles(benchmark::State& state, std::vector<std::uint64_t> samples, const char* prefix)
{
    std::sort(samples.begin(), samples.end());
    auto at = [&](double q) { return microseconds(samples[static_cast<std::size_t>(q * (samples.size() - 1))]); };
    state.counters[std::string(prefix) + "p50_us"] = at(0.50);
    state.counters[std::string(prefix) + "p99_us"] = at(0.99);
    state.counters[std::string(prefix) + "max_us"] = microseconds(samples.back());
}

std::vector<std::uint8_t> deviceResetReport() { return {0x02, 0x00, 0, 0, 0, 0, 0, 0, 0, 0}; }

std::vector<std::uint8_t> imageReport(std::uint32_t frameNumber)
{
    VeltoTouch::InputReport::Image image;
    image.frameNumber = frameNumber;
    image.timeMs = frameNumber * 8;
    return image.toReport();
}

// The floor: one thread wakes another through a semaphore, the same kind of
// hand-off that each of the service's two thread crossings costs. With the
// argument 1 the receiver asks for the input-report thread's real-time
// priority first, as the service's thread does: where that is granted, the
// kernel's wake-up of a real-time thread is itself part of the floor.
void BM_HandOffFloor(benchmark::State& state)
{
    const bool realTime = state.range(0) != 0;
    for (auto _ : state) {
        Semaphore go;
        Semaphore done;
        std::atomic<std::uint64_t> sent{0};
        std::vector<std::uint64_t> samples;
        samples.reserve(kSamples);
        int schedulingError = -1;
        std::thread receiver([&] {
            if (realTime) {
                schedulingError = Thread::setCurrentScheduling(VeltoTouchHIDService::kInputReportThreadPolicy,
                                                               VeltoTouchHIDService::kInputReportThreadPriority);
            }
            for (int i = 0; i < kSamples; ++i) {
                go.wait();
                samples.push_back(MonotonicClock::now() - sent.load(std::memory_order_acquire));
                done.signal();
            }
        });
        for (int i = 0; i < kSamples; ++i) {
            MonotonicClock::sleepMicroseconds(kSpacingMicroseconds);
            sent.store(MonotonicClock::now(), std::memory_order_release);
            go.signal();
            done.wait();
        }
        receiver.join();
        reportPercentiles(state, samples, "");
        state.counters["real_time"] = schedulingError == 0 ? 1 : 0;
    }
}

// The host's own path without the service: the simulated device delivers to
// a plain thread running its event loop, whose callback hands one job to a
// serial queue. The same two thread crossings as the service's path, with
// nothing in between; what the service adds is the difference. With the
// argument 1 the loop's thread asks for real-time priority like the service's.
void BM_HostPathFloor(benchmark::State& state)
{
    const bool realTime = state.range(0) != 0;
    int schedulingError = -1;
    static constexpr const char* kMode = "bench";
    struct Context {
        SerialQueue::Ref queue;
        Semaphore delivered;
        std::atomic<std::uint64_t> deliveredAt{0};
    };
    for (auto _ : state) {
        SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
        Context context;
        context.queue = SerialQueue::create("bench.floor");
        device->open(0);
        Semaphore started;
        Semaphore ended;
        RunLoop::Ref loop;
        std::vector<std::uint8_t> buffer(VeltoTouchHIDService::kInputReportBufferSize);
        Thread::startDetached([&] {
            if (realTime) {
                schedulingError = Thread::setCurrentScheduling(VeltoTouchHIDService::kInputReportThreadPolicy,
                                                               VeltoTouchHIDService::kInputReportThreadPriority);
            }
            loop = RunLoop::current();
            device->registerInputReportWithTimeStampCallback(
                buffer.data(), buffer.size(),
                [](void* target, std::int32_t, void*, HidReportType, std::uint32_t, std::uint8_t*, std::size_t,
                   std::uint64_t) {
                    auto* ctx = static_cast<Context*>(target);
                    ctx->queue->async([ctx] {
                        ctx->deliveredAt.store(MonotonicClock::now(), std::memory_order_release);
                        ctx->delivered.signal();
                    });
                },
                &context);
            device->scheduleWithRunLoop(loop, kMode);
            started.signal();
            while (RunLoop::run(kMode, std::nullopt, true) == RunLoop::RunResult::HandledSource) {
            }
            device->unscheduleFromRunLoop(loop, kMode);
            device->registerInputReportWithTimeStampCallback(buffer.data(), buffer.size(), nullptr, nullptr);
            ended.signal();
        });
        started.wait();
        std::vector<std::uint64_t> samples;
        samples.reserve(kSamples);
        for (int i = 0; i < kSamples; ++i) {
            MonotonicClock::sleepMicroseconds(kSpacingMicroseconds);
            std::uint64_t pushed = MonotonicClock::now();
            device->pushInputReport(deviceResetReport());
            context.delivered.wait();
            samples.push_back(context.deliveredAt.load(std::memory_order_acquire) - pushed);
        }
        loop->performJob(kMode, [] { RunLoop::stopCurrent(); });
        ended.wait();
        context.queue->drain();
        reportPercentiles(state, samples, "");
        state.counters["real_time"] = schedulingError == 0 ? 1 : 0;
    }
}

// A started, opened and scheduled service on a simulated device.
class RunningService {
public:
    RunningService()
        : device(SimulatedHostDevice::create()), queue(SerialQueue::create("bench.events")),
          service(new VeltoTouchHIDService())
    {
        HostDeviceRegistry::shared().set(kServiceHandle, device);
        service->startWithService(kServiceHandle, PropertyValue::dictionary({}));
        service->openWithOptions(0);
        service->setEventCallback(callback, this, nullptr);
        service->scheduleWithDispatchQueue(queue);
    }
    ~RunningService()
    {
        service->unscheduleWithDispatchQueue(queue);
        service->closeWithOptions(0);
        service->stop();
        service->release();
        queue->drain();
        HostDeviceRegistry::shared().remove(kServiceHandle);
    }

    // Pushes one report and returns the push time; waits for the pipeline to
    // see it (when watched), and for its event when it gives one.
    std::uint64_t send(const std::vector<std::uint8_t>& report, bool watched, bool expectEvent)
    {
        std::uint64_t pushed = MonotonicClock::now();
        device->pushInputReport(report);
        if (watched) seen.wait();
        if (expectEvent) delivered.wait();
        return pushed;
    }

    static void callback(void* target, void*, void*, HidEvent*, std::uint32_t)
    {
        auto& self = *static_cast<RunningService*>(target);
        self.deliveredAt.store(MonotonicClock::now(), std::memory_order_release);
        self.delivered.signal();
    }

    SimulatedHostDevice::Ref device;
    SerialQueue::Ref queue;
    VeltoTouchHIDService* service;
    Semaphore seen;
    Semaphore delivered;
    std::atomic<std::uint64_t> deliveredAt{0};
    std::atomic<std::uint64_t> seenAt{0};
};

// Watches the input-report trace point, which the pipeline fires once it has
// the report, inside the pipeline lock.
class PipelineEntryWatch {
public:
    explicit PipelineEntryWatch(RunningService& service)
    {
        _previous = Trace::setObserver([&service](const TracePoint& point) {
            if (point.code != kTraceInputReport) return;
            service.seenAt.store(MonotonicClock::now(), std::memory_order_release);
            service.seen.signal();
        });
    }
    ~PipelineEntryWatch() { Trace::setObserver(_previous); }

private:
    Trace::Observer _previous;
};

// Notes when the pipeline takes a report and when its batch lands on the
// host's queue, without waking anybody, to split the latency into the two
// thread crossings.
class StageWatch {
public:
    StageWatch()
    {
        _previous = Trace::setObserver([this](const TracePoint& point) {
            if (point.code == kTraceInputReport) entered.store(MonotonicClock::now(), std::memory_order_release);
            if (point.code == kTraceDispatchBatch) landed.store(MonotonicClock::now(), std::memory_order_release);
        });
    }
    ~StageWatch() { Trace::setObserver(_previous); }

    std::atomic<std::uint64_t> entered{0};
    std::atomic<std::uint64_t> landed{0};

private:
    Trace::Observer _previous;
};

void BM_ServiceReportToCallback(benchmark::State& state)
{
    Log::setThreshold(Log::kOff);
    for (auto _ : state) {
        RunningService running;
        StageWatch stages;
        std::vector<std::uint64_t> samples;
        std::vector<std::uint64_t> toPipeline;
        std::vector<std::uint64_t> toQueue;
        std::vector<std::uint64_t> toCallback;
        samples.reserve(kSamples);
        for (int i = 0; i < kSamples; ++i) {
            MonotonicClock::sleepMicroseconds(kSpacingMicroseconds);
            std::uint64_t pushed = running.send(deviceResetReport(), false, true);
            std::uint64_t entered = stages.entered.load(std::memory_order_acquire);
            std::uint64_t landed = stages.landed.load(std::memory_order_acquire);
            std::uint64_t delivered = running.deliveredAt.load(std::memory_order_acquire);
            samples.push_back(delivered - pushed);
            toPipeline.push_back(entered - pushed);
            toQueue.push_back(landed - entered);
            toCallback.push_back(delivered - landed);
        }
        reportPercentiles(state, samples, "");
        reportPercentiles(state, toPipeline, "device_to_pipeline_");
        reportPercentiles(state, toQueue, "pipeline_to_queue_");
        reportPercentiles(state, toCallback, "queue_to_callback_");
    }
}

// Report stream (images with a reset after every ninth) while another thread
// reads "Recording" back to back. The recording is filled to its trimming
// point first, so that every copy is of full size.
void BM_ServiceStallDuringRecordingReads(benchmark::State& state)
{
    Log::setThreshold(Log::kOff);
    const bool reading = state.range(0) != 0;
    for (auto _ : state) {
        RunningService running;
        PipelineEntryWatch watch(running);
        std::uint32_t frame = 1;
        for (int i = 0; i < 2650; ++i) running.send(imageReport(frame++), true, false);

        std::atomic<bool> stop{false};
        std::atomic<std::uint64_t> reads{0};
        std::thread reader;
        if (reading) {
            reader = std::thread([&] {
                while (!stop.load(std::memory_order_relaxed)) {
                    VeltoHost::PropertyValue text = running.service->getPropertyForKey("Recording");
                    benchmark::DoNotOptimize(text);
                    reads.fetch_add(1, std::memory_order_relaxed);
                }
            });
        }
        std::vector<std::uint64_t> entry;
        std::vector<std::uint64_t> latency;
        for (int i = 0; i < kSamples; ++i) {
            MonotonicClock::sleepMicroseconds(kSpacingMicroseconds);
            bool reset = i % 10 == 9;
            std::uint64_t pushed = running.send(reset ? deviceResetReport() : imageReport(frame++), true, reset);
            entry.push_back(running.seenAt.load(std::memory_order_acquire) - pushed);
            if (reset) latency.push_back(running.deliveredAt.load(std::memory_order_acquire) - pushed);
        }
        stop = true;
        if (reader.joinable()) reader.join();
        reportPercentiles(state, entry, "entry_");
        reportPercentiles(state, latency, "callback_");
        state.counters["recording_reads"] = static_cast<double>(reads.load());
    }
}

}  // namespace

BENCHMARK(BM_HandOffFloor)->Arg(0)->Arg(1)->Iterations(1)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_HostPathFloor)->Arg(0)->Arg(1)->Iterations(1)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ServiceReportToCallback)->Iterations(1)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_ServiceStallDuringRecordingReads)->Arg(0)->Arg(1)->Iterations(1)->Unit(benchmark::kMillisecond);

BENCHMARK_MAIN();
