// The service driven through its tables with a simulated device and a serial
// queue: reports in, events out at the host's callback, one delivery job per
// report. That the events are those replay finds, in order, is checked end to
// end through the host and the daemon with the real module.

#include "platform/log/Trace.h"
#include "platform/values/PropertyDictionary.h"
#include "recording/PipelineRecording.h"
#include "records/TickConversion.h"
#include "service/ServiceHarness.h"
#include "service/VeltoTouchHIDService.h"

#include <gtest/gtest.h>

#include <mutex>
#include <set>
#include <vector>

using namespace VeltoHost;
using namespace VeltoTouch::Test;

namespace {

constexpr int kPadK = 'K' - 'A';

// Collects the delivery batches' trace points for the life of the object.
class BatchRecorder {
public:
    BatchRecorder()
    {
        _previous = Trace::setObserver([this](const TracePoint& point) {
            std::lock_guard<std::mutex> lock(_lock);
            if (point.code == VeltoTouch::VeltoTouchHIDService::kTraceDispatchBatch) _sizes.push_back(point.arg1);
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

// A finger held on K well past the hold timeout, then the device resets: the
// reset's frame ends the hold and the vendor event follows, both from one
// report, so one job delivers both, in that order. Before the touch, reports
// that give no event: a frame missing, an empty report, an unknown ID and a
// firmware event that is no reset.
TEST(ServiceCycle, EachReportsEventsGoOutAsOneJobOnTheQueueAtTheRecordersTime)
{
    BatchRecorder batches;
    ServiceHarness harness;
    harness.bringUp();
    harness.push(ReportBytes::image(1, 1010));
    harness.push(ReportBytes::image(3, 1030));  // frame 2 missing
    harness.push({});
    harness.push({0x05, 0x01});
    harness.push(ReportBytes::firmwareEvent(1, 0x0102030405060708));
    for (std::uint32_t frame = 4; frame <= 103; ++frame) {
        harness.push(ReportBytes::imageWithPads(frame, 1000 + 10 * frame, {{kPadK, 300}}));
    }
    ASSERT_TRUE(harness.collector.waitFor(2)) << "may-begin and hold start";
    harness.push(ReportBytes::deviceReset(0x1122334455667788));
    ASSERT_TRUE(harness.collector.waitFor(4));
    harness.queue()->drain();
    const PropertyValue info = harness.copyProperty("Pipeline.DebugInfo");
    EXPECT_EQ(info.asDictionary().get("DisjointImageCount"), PropertyValue::uint32(1));
    EXPECT_EQ(info.asDictionary().get("ResetCount"), PropertyValue::uint32(1));
    const VeltoTouch::PipelineRecording recording(std::string_view(harness.copyProperty("Recording").asString()));
    harness.tearDown();

    const std::vector<DeliveredEvent> events = harness.collector.events();
    ASSERT_EQ(events.size(), 4u);
    EXPECT_EQ(events[0].phase, HidEvent::kPhaseMayBegin);
    EXPECT_EQ(events[1].phase, HidEvent::kPhaseBegan) << "the hold started before the reset";
    EXPECT_EQ(events[2].type, HidEvent::kTypeDigitizer);
    EXPECT_EQ(events[2].phase, HidEvent::kPhaseEnded);
    EXPECT_EQ(events[3].type, HidEvent::kTypeVendorDefined);
    EXPECT_EQ(events[3].usagePage, 0xFF60u);
    EXPECT_EQ(events[3].usage, 2u);
    EXPECT_EQ(batches.sizes(), (std::vector<std::uint64_t>{1, 1, 2}));

    // Delivered on the queue, with the service interface as sender and
    // options 0, each at the time the recorder took its report.
    std::set<std::uint64_t> reportTimes;
    for (const auto& frame : recording.frames()) reportTimes.insert(frame.timestampNs);
    for (const DeliveredEvent& event : events) {
        EXPECT_TRUE(event.onQueue);
        EXPECT_EQ(event.thread, events[0].thread);
        EXPECT_EQ(event.sender, harness.serviceRef());
        EXPECT_EQ(event.target, &harness.collector);
        EXPECT_EQ(event.options, 0u);
        EXPECT_EQ(reportTimes.count(VeltoTouch::Util::nanosecondsFromMachTime(event.timeStamp)), 1u);
    }
    EXPECT_EQ(VeltoTouch::Util::nanosecondsFromMachTime(events[3].timeStamp), recording.frames().back().timestampNs);
    EXPECT_EQ(events[2].timeStamp, events[3].timeStamp) << "both belong to the reset report";
}
