#include "platform/devices/HidrawHostDevice.h"
#include "platform/log/CaptureLogSink.h"
#include "platform/runtime/MonotonicClock.h"
#include "platform/runtime/RunLoop.h"

#include <gtest/gtest.h>

#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <functional>
#include <thread>
#include <vector>

using namespace VeltoHost;
using namespace std::chrono_literals;

namespace {

constexpr const char* kMode = "TestHidrawMode";

// A packet socket pair stands in for the hidraw node: every write on the
// peer is one read of one report on the device side.
struct ReportPipe {
    int deviceEnd = -1;
    int peerEnd = -1;
    ReportPipe()
    {
        int fds[2];
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, fds), 0);
        deviceEnd = fds[0];
        peerEnd = fds[1];
    }
    ~ReportPipe()
    {
        if (peerEnd >= 0) close(peerEnd);
    }
    void send(const std::vector<std::uint8_t>& report) const
    {
        EXPECT_EQ(write(peerEnd, report.data(), report.size()), static_cast<ssize_t>(report.size()));
    }
    void unplug() { close(std::exchange(peerEnd, -1)); }
};

struct Received {
    std::array<std::uint8_t, 6> buffer{};
    std::vector<std::pair<std::uint32_t, std::vector<std::uint8_t>>> reports;
    std::vector<std::thread::id> threads;
    // Each report's time stamp, and the clock read as its callback ran.
    std::vector<std::pair<std::uint64_t, std::uint64_t>> times;

    static void callback(void* context, std::int32_t, void*, HidReportType type, std::uint32_t reportID,
                         std::uint8_t* report, std::size_t length, std::uint64_t timeStamp)
    {
        auto* self = static_cast<Received*>(context);
        EXPECT_EQ(type, HidReportType::Input);
        self->reports.push_back({reportID, {report, report + length}});
        self->threads.push_back(std::this_thread::get_id());
        self->times.emplace_back(timeStamp, MonotonicClock::now());
    }
};

// Opens and schedules the device on a loop thread of its own, sends the
// reports from the peer and runs the loop until each has arrived; `then` runs
// on that thread before the device is unscheduled, which leaves the loop
// nothing to run.
void receive(HidrawHostDevice& device, ReportPipe& pipe, const std::vector<std::vector<std::uint8_t>>& reports,
             Received& received, const std::function<void()>& then = [] {})
{
    std::thread loop([&] {
        ASSERT_TRUE(device.open(0));
        device.registerInputReportWithTimeStampCallback(received.buffer.data(), received.buffer.size(),
                                                        &Received::callback, &received);
        device.scheduleWithRunLoop(RunLoop::current(), kMode);
        for (const auto& report : reports) pipe.send(report);
        while (received.reports.size() < reports.size()) {
            ASSERT_EQ(RunLoop::run(kMode, std::nullopt, true), RunLoop::RunResult::HandledSource);
        }
        then();
        device.unscheduleFromRunLoop(RunLoop::current(), kMode);
        EXPECT_EQ(RunLoop::run(kMode, std::nullopt, true), RunLoop::RunResult::Finished);
        device.registerInputReportWithTimeStampCallback(received.buffer.data(), received.buffer.size(), nullptr,
                                                        nullptr);
    });
    loop.join();
}

using Report = std::pair<std::uint32_t, std::vector<std::uint8_t>>;

}  // namespace

TEST(HidrawHostDeviceTest, OneReadIsOneReportAndADisappearingDeviceEndsReception)
{
    CaptureLogSink::Scope capture;
    ReportPipe pipe;
    HidrawHostDevice device(pipe.deviceEnd, true);
    Received received;
    const std::uint64_t beforeSending = MonotonicClock::now();
    // The second is longer than the buffer.
    receive(device, pipe, {{0x01, 10, 11}, {0x02, 1, 2, 3, 4, 5, 6, 7, 8}, {0x01, 12}}, received, [&] {
        // The peer goes away: reception ends, the source leaves the loop.
        pipe.unplug();
        EXPECT_EQ(RunLoop::run(kMode, std::nullopt, true), RunLoop::RunResult::HandledSource);
        EXPECT_EQ(RunLoop::run(kMode, std::nullopt, true), RunLoop::RunResult::Finished);
    });

    EXPECT_EQ(received.reports, (std::vector<Report>{{1, {1, 10, 11}}, {2, {2, 1, 2, 3, 4, 5}}, {1, {1, 12}}}));
    ASSERT_EQ(received.threads.size(), 3u);
    for (auto thread : received.threads) EXPECT_EQ(thread, received.threads[0]);
    EXPECT_NE(received.threads[0], std::this_thread::get_id());
    // Stamped on the host's clock as each report was read, before its
    // callback: the time the plug-in records it at.
    std::uint64_t previous = beforeSending;
    for (const auto& [stamp, atCallback] : received.times) {
        EXPECT_GE(stamp, previous);
        EXPECT_LE(stamp, atCallback);
        previous = stamp;
    }

    EXPECT_TRUE(device.isGone());
    std::vector<std::string> lines = capture.sink().messages("HostDevice");
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_NE(lines[0].find("disappeared"), std::string::npos) << lines[0];
    std::array<std::uint8_t, 8> buffer{};
    std::size_t length = buffer.size();
    EXPECT_EQ(device.getReport(HidReportType::Feature, 0x1F, buffer.data(), length), kHostDeviceNoDevice);
    EXPECT_FALSE(device.open(0));
}

TEST(HidrawHostDeviceTest, UnnumberedReportsCarryReportIDZero)
{
    ReportPipe pipe;
    HidrawHostDevice device(pipe.deviceEnd, false);
    Received received;
    receive(device, pipe, {{0x07, 0x08}}, received);
    EXPECT_EQ(received.reports, (std::vector<Report>{{0, {0x07, 0x08}}}));
}

TEST(HidrawHostDeviceTest, RequestsOnANonHidrawDescriptorFailSoftly)
{
    CaptureLogSink::Scope capture;
    ReportPipe pipe;
    HidrawHostDevice device(pipe.deviceEnd, true);
    std::array<std::uint8_t, 32> buffer{};
    std::size_t length = buffer.size();
    EXPECT_EQ(device.getReport(HidReportType::Feature, 0x1F, buffer.data(), length), kHostDeviceNotOpen);
    ASSERT_TRUE(device.open(0));
    EXPECT_EQ(device.getReport(HidReportType::Feature, 0x1F, buffer.data(), length), kHostDeviceError);
    EXPECT_EQ(length, buffer.size());
    EXPECT_EQ(device.getReport(HidReportType::Feature, 0x1F, nullptr, length), kHostDeviceBadArgument);

    // No raw info behind a socket: the device has no such properties.
    EXPECT_FALSE(device.getProperty("VendorID").hasValue());
    EXPECT_FALSE(device.getProperty("Product").hasValue());
    EXPECT_TRUE(device.setProperty("Product", PropertyValue::string("Bench Surface")));
    EXPECT_EQ(device.getProperty("Product"), PropertyValue::string("Bench Surface"));

    HidrawHostDevice missing("/nonexistent/hidraw99");
    EXPECT_FALSE(missing.open(0));
    EXPECT_FALSE(missing.getProperty("VendorID").hasValue());
    std::vector<std::string> lines = capture.sink().messages("HostDevice");
    ASSERT_FALSE(lines.empty());
    EXPECT_NE(lines.back().find("/nonexistent/hidraw99"), std::string::npos);
}

TEST(HidrawHostDeviceTest, ReportDescriptorDeclaresReportIDs)
{
    // Usage page, usage, collection, report ID 1, ..., end collection.
    const std::uint8_t numbered[] = {0x06, 0x00, 0xFF, 0x09, 0x01, 0xA1, 0x01, 0x85, 0x01,
                                     0x95, 0x48, 0x75, 0x08, 0x81, 0x02, 0xC0};
    // Same without the report ID item; a long item holding the byte 0x85 in
    // its data and a four-byte item must be skipped whole.
    const std::uint8_t plain[] = {0x06, 0x00, 0xFF, 0xFE, 0x02, 0x10, 0x85, 0x01, 0x27, 0x85,
                                  0x85, 0x85, 0x85, 0xA1, 0x01, 0x95, 0x48, 0x81, 0x02, 0xC0};
    EXPECT_TRUE(HidrawHostDevice::descriptorUsesReportIDs(numbered, sizeof numbered));
    EXPECT_FALSE(HidrawHostDevice::descriptorUsesReportIDs(plain, sizeof plain));
    EXPECT_FALSE(HidrawHostDevice::descriptorUsesReportIDs(numbered, 7));
}
