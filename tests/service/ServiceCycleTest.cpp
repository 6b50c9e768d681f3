// The service driven through its tables with a simulated device and a serial
// queue: reports in, events out at the host's callback, one delivery job per
// report.

#include "platform/log/Trace.h"
#include "platform/values/PropertyDictionary.h"
#include "recording/PipelineRecording.h"
#include "records/TickConversion.h"
#include "service/ServiceHarness.h"

#include <gtest/gtest.h>

#include <mutex>
#include <string>
#include <vector>

using namespace VeltoHost;
using namespace VeltoTouch::Test;

namespace {

constexpr std::uint32_t kTraceDispatchBatch = 0x2B150184;
constexpr int kPadK = 'K' - 'A';

// Collects the delivery batches' trace points for the life of the object.
class BatchRecorder {
public:
    BatchRecorder()
    {
        _previous = Trace::setObserver([this](const TracePoint& point) {
            std::lock_guard<std::mutex> lock(_lock);
            if (point.code == kTraceDispatchBatch) _sizes.push_back(point.arg1);
        });
    }
    ~BatchRecorder() { Trace::setObserver(_previous); }

    std::vector<std::uint64_t> sizes() const
    {
        std::lock_guard<std::mutex> lock(_lock);
        return _sizes;
    }

private:
    mutable std::mutex _lock;
    std::vector<std::uint64_t> _sizes;
    Trace::Observer _previous;
};

}  // namespace

TEST(ServiceCycle, ACycleDeliversTheResetOnTheQueueAndCountsTheFrameGap)
{
    ServiceHarness harness;
    harness.bringUp();
    harness.push(ReportBytes::image(7, 1000));
    harness.push(ReportBytes::image(9, 1010));  // one frame missing
    harness.push({});
    harness.push({0x05, 0x01});
    harness.push(ReportBytes::firmwareEvent(1, 0x0102030405060708));  // not a reset: consumed silently
    harness.push(ReportBytes::deviceReset(0x1122334455667788));
    ASSERT_TRUE(harness.collector.waitFor(1));
    harness.queue()->drain();
    const PropertyValue info = harness.copyProperty("Pipeline.DebugInfo");
    EXPECT_EQ(info.asDictionary().get("DisjointImageCount"), PropertyValue::uint32(1));
    EXPECT_EQ(info.asDictionary().get("ResetCount"), PropertyValue::uint32(1));
    harness.tearDown();

    // The only event is the reset's vendor event, delivered on the queue
    // with the service interface as sender and options 0.
    const std::vector<DeliveredEvent> events = harness.collector.events();
    ASSERT_EQ(events.size(), 1u);
    EXPECT_EQ(events[0].type, HidEvent::kTypeVendorDefined);
    EXPECT_EQ(events[0].usagePage, 0xFF60u);
    EXPECT_EQ(events[0].usage, 2u);
    EXPECT_EQ(events[0].sender, harness.serviceRef());
    EXPECT_EQ(events[0].target, &harness.collector);
    EXPECT_EQ(events[0].options, 0u);
    EXPECT_TRUE(events[0].onQueue);
}

TEST(ServiceCycle, EventsArriveOnTheQueueInReportOrderOneJobPerReport)
{
    BatchRecorder batches;
    ServiceHarness harness;
    harness.bringUp();

    constexpr int kResets = 150;
    for (int i = 0; i < kResets; ++i) {
        const auto frame = static_cast<std::uint32_t>(i + 1);
        harness.push(ReportBytes::image(frame, 10 * frame));
        harness.push(ReportBytes::deviceReset(static_cast<std::uint64_t>(i)));
        harness.push(ReportBytes::firmwareEvent(3, static_cast<std::uint64_t>(i)));
    }
    ASSERT_TRUE(harness.collector.waitFor(kResets));
    harness.queue()->drain();

    std::vector<DeliveredEvent> events = harness.collector.events();
    ASSERT_EQ(events.size(), static_cast<std::size_t>(kResets));
    for (const DeliveredEvent& event : events) {
        EXPECT_TRUE(event.onQueue);
        EXPECT_EQ(event.thread, events[0].thread);
        EXPECT_EQ(event.type, HidEvent::kTypeVendorDefined);
    }

    // Each event carries the time at which the recorder took its report, so
    // the i-th event belongs to the i-th reset report of the recording.
    PropertyValue text = harness.copyProperty("Recording");
    ASSERT_TRUE(text.isString());
    VeltoTouch::PipelineRecording recording(std::string_view(text.asString()));
    std::vector<std::uint64_t> resetTimes;
    for (const auto& frame : recording.frames()) {
        if (frame.report.size() == 10 && frame.report[0] == 0x02 && frame.report[1] == 0x00) {
            resetTimes.push_back(frame.timestampNs);
        }
    }
    ASSERT_EQ(resetTimes.size(), events.size());
    for (std::size_t i = 0; i < events.size(); ++i) {
        EXPECT_EQ(VeltoTouch::Util::nanosecondsFromMachTime(events[i].timeStamp), resetTimes[i]) << i;
    }
    // One batch per report that produced events, each of one event.
    EXPECT_EQ(batches.sizes(), std::vector<std::uint64_t>(kResets, 1));
    harness.tearDown();
}

TEST(ServiceCycle, AResetDuringAHoldGoesOutAsOneJobOfTwoEvents)
{
    // A finger held on K well past the hold timeout, then the device resets:
    // the reset's frame ends the hold and the vendor event follows, both
    // from one report, so one batch delivers both, in that order.
    BatchRecorder batches;
    ServiceHarness harness;
    harness.bringUp();
    for (std::uint32_t frame = 1; frame <= 103; ++frame) {
        harness.push(frame <= 3 ? ReportBytes::image(frame, 1000 + 10 * frame)
                                : ReportBytes::imageWithPads(frame, 1000 + 10 * frame, {{kPadK, 300}}));
    }
    ASSERT_TRUE(harness.collector.waitFor(2)) << "may-begin and hold start";
    harness.queue()->drain();
    const std::size_t batchesBefore = batches.sizes().size();

    harness.push(ReportBytes::deviceReset());
    ASSERT_TRUE(harness.collector.waitFor(4));
    harness.queue()->drain();
    harness.tearDown();

    std::vector<DeliveredEvent> events = harness.collector.events();
    ASSERT_EQ(events.size(), 4u);
    EXPECT_EQ(events[0].phase, HidEvent::kPhaseMayBegin);
    EXPECT_EQ(events[1].phase, HidEvent::kPhaseBegan) << "the hold started before the reset";
    EXPECT_EQ(events[2].type, HidEvent::kTypeDigitizer);
    EXPECT_EQ(events[2].phase, HidEvent::kPhaseEnded);
    EXPECT_EQ(events[3].type, HidEvent::kTypeVendorDefined);
    EXPECT_EQ(events[2].timeStamp, events[3].timeStamp) << "both belong to the reset report";
    const std::vector<std::uint64_t> sizes = batches.sizes();
    ASSERT_EQ(sizes.size(), batchesBefore + 1);
    EXPECT_EQ(sizes.back(), 2u);
}
