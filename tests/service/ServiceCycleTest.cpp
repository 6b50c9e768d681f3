// The service driven through its tables with a simulated device and a serial
// queue: reports in, events out at the host's callback, with the log lines and
// trace points of the input-report thread and the delivery jobs.

#include "pipeline/Util.h"
#include "platform/CaptureLogSink.h"
#include "platform/Log.h"
#include "platform/Trace.h"
#include "recording/PipelineRecording.h"
#include "service/ServiceHarness.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <condition_variable>
#include <mutex>
#include <string>
#include <vector>

using namespace VeltoHost;
using namespace VeltoTouch::Test;

namespace {

constexpr std::uint32_t kTraceInputReport = 0x2B150180;
constexpr std::uint32_t kTraceDispatchBatch = 0x2B150184;
constexpr std::uint32_t kTraceDispatchEvent = 0x2B150188;
constexpr std::uint32_t kTraceFirmwareEvent = 0x2B15018C;

// Installs a trace observer for the life of the object and lets a test wait
// for a point.
class TraceRecorder {
public:
    TraceRecorder()
    {
        _previous = Trace::setObserver([this](const TracePoint& point) {
            std::lock_guard<std::mutex> lock(_lock);
            _points.push_back(point);
            _changed.notify_all();
        });
    }
    ~TraceRecorder() { Trace::setObserver(_previous); }

    std::vector<TracePoint> points(std::initializer_list<std::uint32_t> codes) const
    {
        std::lock_guard<std::mutex> lock(_lock);
        std::vector<TracePoint> out;
        for (const TracePoint& point : _points) {
            if (std::find(codes.begin(), codes.end(), point.code) != codes.end()) out.push_back(point);
        }
        return out;
    }

    bool waitFor(std::uint32_t code)
    {
        std::unique_lock<std::mutex> lock(_lock);
        return _changed.wait_for(lock, std::chrono::seconds(20), [&] {
            return std::any_of(_points.begin(), _points.end(), [&](const TracePoint& p) { return p.code == code; });
        });
    }

private:
    mutable std::mutex _lock;
    std::condition_variable _changed;
    std::vector<TracePoint> _points;
    Trace::Observer _previous;
};

std::vector<std::uint64_t> args(const TracePoint& point) { return {point.arg1, point.arg2, point.arg3, point.arg4}; }

bool isDeliveryLine(const std::string& message)
{
    return message.rfind("Dispatch event: ", 0) == 0 || message.find("event(s) land") != std::string::npos;
}

// The device's time stamp differs from run to run; everything else of the
// line is fixed.
std::string withoutTimeStamp(std::string message)
{
    auto at = message.find("timestampMach ");
    if (at != std::string::npos) message = message.substr(0, at) + "timestampMach *)";
    return message;
}

LogLevel expectedLevel(const std::string& message)
{
    for (const char* prefix : {"Received image frame", "Firmware event probe", "Dispatch event: "}) {
        if (message.rfind(prefix, 0) == 0) return LogLevel::Default;
    }
    if (message.rfind("Disjoint image", 0) == 0) return LogLevel::Error;
    return LogLevel::Debug;
}

}  // namespace

TEST(ServiceCycle, ReportsBecomeEventsWithTheirLogLinesAndTracePoints)
{
    CaptureLogSink::Scope capture(LogLevel::Debug);
    TraceRecorder traces;
    std::vector<DeliveredEvent> events;
    {
        ServiceHarness harness;
        harness.bringUp();
        harness.push(imageReport(7, 1000));
        harness.push(imageReport(9, 1010));  // one frame missing
        harness.push({});
        harness.push({0x05, 0x01});
        harness.push(firmwareEventReport(1, 0x0102030405060708));  // not a reset: consumed silently
        harness.push(deviceResetReport(0x1122334455667788));
        ASSERT_TRUE(harness.collector.waitFor(1));
        harness.queue()->drain();
        harness.tearDown();
        events = harness.collector.events();

        // The only event is the reset's vendor event, delivered on the queue
        // with the service interface as sender and options 0.
        ASSERT_EQ(events.size(), 1u);
        EXPECT_EQ(events[0].type, HidEvent::kTypeVendorDefined);
        EXPECT_EQ(events[0].usagePage, 0xFF60u);
        EXPECT_EQ(events[0].usage, 2u);
        EXPECT_EQ(events[0].sender, harness.serviceRef());
        EXPECT_EQ(events[0].target, &harness.collector);
        EXPECT_EQ(events[0].options, 0u);
        EXPECT_TRUE(events[0].onQueue);
    }

    std::vector<std::string> hostAndThread;
    std::vector<std::string> delivery;
    std::vector<LogRecord> records = capture.sink().records();
    for (const LogRecord& record : records) {
        if (record.category != "HIDService") continue;
        EXPECT_EQ(record.subsystem.substr(record.subsystem.size() - 15), ".hid.VeltoTouch");
        if (record.message.rfind("pthread_setschedparam failed: ", 0) == 0) {
            // Refused without the privilege; the thread carries on.
            EXPECT_EQ(record.level, LogLevel::Error);
            continue;
        }
        if (record.message == "input report thread end") continue;  // checked below: its place is free
        EXPECT_EQ(record.level, expectedLevel(record.message)) << record.message;
        (isDeliveryLine(record.message) ? delivery : hostAndThread).push_back(withoutTimeStamp(record.message));
    }
    EXPECT_EQ(hostAndThread, (std::vector<std::string>{
                                 "startWithService:properties:",
                                 "openWithOptions:0",
                                 "setEventCallback:target:refcon:",
                                 "scheduleWithDispatchQueue:",
                                 "input report thread start",
                                 "Received input report (type 0, reportID 1, reportLength 73, timestampMach *)",
                                 "Input report probe",
                                 "Received image frame: 7",
                                 "Received input report (type 0, reportID 1, reportLength 73, timestampMach *)",
                                 "Input report probe",
                                 "Received image frame: 9",
                                 "Disjoint image (frame number: 7 -> 9)\n\n",
                                 "Received input report (type 0, reportID 0, reportLength 0, timestampMach *)",
                                 "Input report probe",
                                 "Invalid input report len==0",
                                 "Received input report (type 0, reportID 5, reportLength 2, timestampMach *)",
                                 "Input report probe",
                                 "Invalid input report with ID 5",
                                 "Received input report (type 0, reportID 2, reportLength 10, timestampMach *)",
                                 "Input report probe",
                                 "Firmware event probe; event: 1, context: 102030405060708",
                                 "Received input report (type 0, reportID 2, reportLength 10, timestampMach *)",
                                 "Input report probe",
                                 "Firmware event probe; event: 0, context: 1122334455667788",
                                 "HID events probe: 1 event(s)",
                                 "Dispatch 1 event(s) takeoff",
                                 "unscheduleWithDispatchQueue:",
                                 "signalling input report thread to exit",
                                 "waiting for input report thread to exit",
                                 "input report thread exited",
                                 "closeWithOptions:0",
                                 "stop",
                                 "dealloc",
                             }));
    ASSERT_EQ(delivery.size(), 2u);
    EXPECT_EQ(delivery[0], "Dispatch 1 event(s) land");
    EXPECT_EQ(delivery[1].rfind("Dispatch event: HidEvent type=1(vendor-defined)", 0), 0u) << delivery[1];

    // The thread's last line comes after it was told to exit.
    std::vector<std::string> all = capture.sink().messages("HIDService");
    auto signalling = std::find(all.begin(), all.end(), "signalling input report thread to exit");
    auto end = std::find(all.begin(), all.end(), "input report thread end");
    ASSERT_NE(end, all.end());
    EXPECT_LT(signalling, end);

    // Input-report thread: every report, then the firmware events.
    std::vector<TracePoint> thread = traces.points({kTraceInputReport, kTraceFirmwareEvent});
    std::vector<std::vector<std::uint64_t>> threadArgs;
    std::vector<std::uint32_t> threadCodes;
    for (const TracePoint& point : thread) {
        threadCodes.push_back(point.code);
        threadArgs.push_back(args(point));
    }
    EXPECT_EQ(threadCodes, (std::vector<std::uint32_t>{kTraceInputReport, kTraceInputReport, kTraceInputReport,
                                                      kTraceInputReport, kTraceInputReport, kTraceFirmwareEvent,
                                                      kTraceInputReport, kTraceFirmwareEvent}));
    EXPECT_EQ(threadArgs, (std::vector<std::vector<std::uint64_t>>{
                              {0x01, 7, 0, 0},
                              {0x01, 9, 0, 0},
                              {0, 0, 0, 0},  // nothing beyond the length is read
                              {0x05, 0x01, 0, 0},
                              {0x02, 0x01, 0x01, 0x02},
                              {1, 0x0102030405060708, 0, 0},
                              {0x02, 0x00, 0x11, 0x22},
                              {0, 0x1122334455667788, 0, 0},
                          }));
    std::vector<TracePoint> queue = traces.points({kTraceDispatchBatch, kTraceDispatchEvent});
    ASSERT_EQ(queue.size(), 2u);
    EXPECT_EQ(queue[0].code, kTraceDispatchBatch);
    EXPECT_EQ(args(queue[0]), (std::vector<std::uint64_t>{1, 0, 0, 0}));
    EXPECT_EQ(queue[1].code, kTraceDispatchEvent);
    EXPECT_EQ(args(queue[1]), (std::vector<std::uint64_t>{HidEvent::kTypeVendorDefined, 0, 0, 0}));
}

TEST(ServiceCycle, EventsArriveOnTheQueueInReportOrderOneJobPerReport)
{
    TraceRecorder traces;
    ServiceHarness harness;
    harness.bringUp();

    constexpr int kResets = 150;
    std::thread pusher([&] {
        std::uint32_t frame = 1;
        for (int i = 0; i < kResets; ++i) {
            harness.push(imageReport(frame, 10 * frame));
            ++frame;
            harness.push(deviceResetReport(static_cast<std::uint64_t>(i)));
            harness.push(firmwareEventReport(3, static_cast<std::uint64_t>(i)));
        }
    });
    pusher.join();
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
    std::vector<TracePoint> batches = traces.points({kTraceDispatchBatch});
    EXPECT_EQ(batches.size(), static_cast<std::size_t>(kResets));
    for (const TracePoint& batch : batches) EXPECT_EQ(batch.arg1, 1u);
    harness.tearDown();
}

TEST(ServiceCycle, ATapAndAResetArriveAsTheirEventsInOrderStampedWithTheirReportsTimes)
{
    constexpr int kPadK = 'K' - 'A';
    ServiceHarness harness;
    harness.bringUp();
    // Three idle frames, a finger on K for ten frames, the release; the
    // recogniser answers the first touched frame and the release.
    std::uint32_t frame = 1;
    auto push = [&](std::initializer_list<std::pair<int, std::int16_t>> readings) {
        harness.push(imageReport(frame, 1000 + 10 * (frame - 1), readings));
        ++frame;
    };
    for (int i = 0; i < 3; ++i) push({});
    for (int i = 0; i < 10; ++i) push({{kPadK, 300}});
    push({});
    harness.push(deviceResetReport());
    ASSERT_TRUE(harness.collector.waitFor(3));
    harness.queue()->drain();
    harness.tearDown();

    std::vector<DeliveredEvent> events = harness.collector.events();
    ASSERT_EQ(events.size(), 3u);
    EXPECT_EQ(events[0].type, HidEvent::kTypeDigitizer);
    EXPECT_EQ(events[0].phase, HidEvent::kPhaseMayBegin);
    EXPECT_EQ(events[0].y, 1.0);  // the middle region
    EXPECT_EQ(events[1].type, HidEvent::kTypeDigitizer);
    EXPECT_EQ(events[1].y, 1.0);
    EXPECT_EQ(events[2].type, HidEvent::kTypeVendorDefined);

    // Frames 4 (first touch) and 14 (release) and the reset report gave the
    // events, each stamped with the time its report was recorded.
    PropertyValue text = harness.copyProperty("Recording");
    VeltoTouch::PipelineRecording recording(std::string_view(text.asString()));
    std::vector<std::uint64_t> reportTimes;
    for (const auto& recorded : recording.frames()) reportTimes.push_back(recorded.timestampNs);
    ASSERT_EQ(reportTimes.size(), 15u);
    EXPECT_EQ(VeltoTouch::Util::nanosecondsFromMachTime(events[0].timeStamp), reportTimes[3]);
    EXPECT_EQ(VeltoTouch::Util::nanosecondsFromMachTime(events[1].timeStamp), reportTimes[13]);
    EXPECT_EQ(VeltoTouch::Util::nanosecondsFromMachTime(events[2].timeStamp), reportTimes[14]);
}

TEST(ServiceCycle, AResetDuringAHoldGoesOutAsOneJobOfTwoEvents)
{
    // A finger held on K well past the hold timeout, then the device resets:
    // the reset's frame ends the hold and the vendor event follows, both
    // from one report, so one batch delivers both, in that order.
    constexpr int kPadK = 'K' - 'A';
    constexpr std::uint32_t kFrameIntervalMs = 10;
    TraceRecorder traces;
    ServiceHarness harness;
    harness.bringUp();
    std::uint32_t frame = 1;
    auto push = [&](std::initializer_list<std::pair<int, std::int16_t>> readings) {
        harness.push(imageReport(frame, 1000 + kFrameIntervalMs * (frame - 1), readings));
        ++frame;
    };
    for (int i = 0; i < 3; ++i) push({});
    for (int i = 0; i < 100; ++i) push({{kPadK, 300}});
    ASSERT_TRUE(harness.collector.waitFor(2)) << "may-begin and hold start";
    harness.queue()->drain();
    const std::size_t batchesBefore = traces.points({kTraceDispatchBatch}).size();
    const std::size_t eventsBefore = harness.collector.count();

    harness.push(deviceResetReport());
    ASSERT_TRUE(harness.collector.waitFor(eventsBefore + 2));
    harness.queue()->drain();
    harness.tearDown();

    std::vector<DeliveredEvent> events = harness.collector.events();
    ASSERT_EQ(events.size(), 4u);
    EXPECT_EQ(events[0].phase, HidEvent::kPhaseMayBegin);
    EXPECT_EQ(events[1].phase, HidEvent::kPhaseBegan) << "the hold started before the reset";
    EXPECT_EQ(events[2].type, HidEvent::kTypeDigitizer);
    EXPECT_EQ(events[2].phase, HidEvent::kPhaseEnded);
    EXPECT_EQ(events[3].type, HidEvent::kTypeVendorDefined);
    EXPECT_EQ(events[3].usagePage, 0xFF60u);
    EXPECT_EQ(events[2].timeStamp, events[3].timeStamp) << "both belong to the reset report";

    // The reset's delivery: one batch trace point with 2, then one per event.
    std::vector<TracePoint> delivery = traces.points({kTraceDispatchBatch, kTraceDispatchEvent});
    std::vector<TracePoint> batches = traces.points({kTraceDispatchBatch});
    ASSERT_EQ(batches.size(), batchesBefore + 1);
    EXPECT_EQ(args(batches.back()), (std::vector<std::uint64_t>{2, 0, 0, 0}));
    ASSERT_GE(delivery.size(), 3u);
    const std::vector<TracePoint> last(delivery.end() - 3, delivery.end());
    EXPECT_EQ(last[0].code, kTraceDispatchBatch);
    EXPECT_EQ(last[1].code, kTraceDispatchEvent);
    EXPECT_EQ(args(last[1]), (std::vector<std::uint64_t>{HidEvent::kTypeDigitizer, HidEvent::kPhaseEnded, 0, 0}));
    EXPECT_EQ(last[2].code, kTraceDispatchEvent);
    EXPECT_EQ(args(last[2]), (std::vector<std::uint64_t>{HidEvent::kTypeVendorDefined, 0, 0, 0}));
}
