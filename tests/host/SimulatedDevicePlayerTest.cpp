#include "host/SimulatedDevicePlayer.h"

#include "platform/MonotonicClock.h"
#include "platform/RunLoop.h"
#include "platform/Semaphore.h"

#include <gtest/gtest.h>

#include <array>
#include <atomic>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

using namespace VeltoHost;
using VeltoTouch::PipelineRecording;

namespace {

constexpr const char* kMode = "PlayerTestMode";

// A plug-in stand-in that takes its time over each report, as a loaded
// recogniser on a busy machine does, and notes what reached it in order.
class SlowConsumer {
public:
    explicit SlowConsumer(SimulatedHostDevice::Ref device) : _device(std::move(device))
    {
        Semaphore ready;
        _thread = std::thread([this, &ready] {
            _device->open(0);
            _device->registerInputReportWithTimeStampCallback(_buffer.data(), _buffer.size(), &callback, this);
            _loop = RunLoop::current();
            _device->scheduleWithRunLoop(_loop, kMode);
            ready.signal();
            while (!_stop) RunLoop::run(kMode, std::chrono::milliseconds(20), false);
            _device->unscheduleFromRunLoop(_loop, kMode);
        });
        ready.wait();
    }
    ~SlowConsumer()
    {
        _stop = true;
        _loop->wakeUp();
        _thread.join();
    }
    void note(const std::string& entry)
    {
        std::lock_guard guard(_lock);
        _seen.push_back(entry);
    }
    std::vector<std::string> seen()
    {
        std::lock_guard guard(_lock);
        return _seen;
    }

private:
    static void callback(void* context, std::int32_t, void*, HidReportType, std::uint32_t, std::uint8_t* report,
                         std::size_t length, std::uint64_t)
    {
        MonotonicClock::sleepMicroseconds(300);
        static_cast<SlowConsumer*>(context)->note("R" + std::to_string(length ? report[0] : 0));
    }

    SimulatedHostDevice::Ref _device;
    std::array<std::uint8_t, 8> _buffer{};
    RunLoop::Ref _loop;
    std::atomic<bool> _stop{false};
    std::thread _thread;
    std::mutex _lock;
    std::vector<std::string> _seen;  // guarded by _lock
};

PipelineRecording::Frame report(std::uint8_t id, std::uint64_t timestampNs)
{
    PipelineRecording::Frame frame;
    frame.type = PipelineRecording::Frame::Type::InputReport;
    frame.timestampNs = timestampNs;
    frame.report = {id};
    return frame;
}

PipelineRecording::Frame state(const std::string& key)
{
    PipelineRecording::Frame frame;
    frame.type = PipelineRecording::Frame::Type::State;
    frame.key = key;
    frame.value = PropertyValue::uint32(1);
    return frame;
}

}  // namespace

TEST(SimulatedDevicePlayerTest, StateWritesLandBetweenTheReportsAroundThemAtEverySpeed)
{
    for (double speed : {0.0, 1000.0}) {
        SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
        SlowConsumer consumer(device);
        SimulatedDevicePlayer player(
            device, [&](const std::string& key, const PropertyValue&) { consumer.note("S:" + key); },
            [] { return false; }, {speed, 512});

        std::vector<std::string> expected;
        for (std::uint8_t id = 1; id <= 60; ++id) {
            ASSERT_TRUE(player.play(report(id, id * 1'000'000ull)));
            expected.push_back("R" + std::to_string(id));
            if (id % 20 == 0) {
                ASSERT_TRUE(player.play(state("K" + std::to_string(id))));
                expected.push_back("S:K" + std::to_string(id));
            }
        }
        ASSERT_TRUE(player.waitUntilTaken());
        EXPECT_EQ(consumer.seen(), expected) << "speed " << speed;
        EXPECT_EQ(player.reportsPushed(), 60u);
        EXPECT_EQ(player.statesWritten(), 3u);
    }
}

TEST(SimulatedDevicePlayerTest, AStopRequestEndsEveryWait)
{
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();  // never scheduled: nothing is taken
    std::atomic<bool> stop{false};
    std::vector<std::string> notices;
    SimulatedDevicePlayer player(
        device, [](const std::string&, const PropertyValue&) { ADD_FAILURE() << "state written"; },
        [&] { return stop.load(); }, {1.0, 512},
        GapCap(3600.0, [&](const std::string& text) { notices.push_back(text); }));

    ASSERT_TRUE(player.play(report(1, 0)));
    std::thread stopper([&] {
        MonotonicClock::sleepMicroseconds(50'000);
        stop = true;
    });
    // A gap of a year, and a state write that waits for a report nobody takes:
    // both return once the stop is requested.
    EXPECT_FALSE(player.play(report(2, 365ull * 24 * 3600 * 1'000'000'000ull)));
    EXPECT_FALSE(player.play(state("K")));
    EXPECT_FALSE(player.waitUntilTaken());
    stopper.join();
    EXPECT_EQ(player.reportsPushed(), 1u);
    ASSERT_EQ(notices.size(), 1u);
    EXPECT_NE(notices[0].find("--max-gap"), std::string::npos);
}
