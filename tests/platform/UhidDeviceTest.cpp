#include "platform/FakeUhidKernel.h"
#include "platform/UhidDevice.h"

#include <gtest/gtest.h>

#include <atomic>
#include <linux/input.h>
#include <string>
#include <thread>
#include <vector>

using VeltoHost::UhidDevice;
using VeltoHost::Testing::FakeUhidKernel;

namespace {

constexpr std::uint8_t kKnownFeature = 0x05;
const std::vector<std::uint8_t> kKnownFeatureBytes = {kKnownFeature, 0xAA, 0xBB};

UhidDevice::FeatureReportSource knownFeatureOnly()
{
    return [](std::uint8_t reportID) -> std::optional<std::vector<std::uint8_t>> {
        if (reportID == kKnownFeature) return kKnownFeatureBytes;
        return std::nullopt;
    };
}

std::vector<std::uint8_t> bytes(const std::uint8_t* data, std::size_t size) { return {data, data + size}; }

TEST(UhidDevice, CreatesWithItsIdentitySendsReportsInOrderAndDestroysLast)
{
    FakeUhidKernel kernel;
    const UhidDevice::Identity identity{"test device", BUS_USB, 0x1234, 0x5678, 7, 0, {0x06, 0x00, 0xFF, 0xC0}};
    const std::vector<std::vector<std::uint8_t>> reports = {{0x01, 2, 3}, {0x02}, std::vector<std::uint8_t>(4096, 9)};
    {
        UhidDevice device(kernel.takeDeviceEnd(), knownFeatureOnly());
        ASSERT_TRUE(device.create(identity)) << device.error();
        for (const auto& report : reports) ASSERT_TRUE(device.sendInputReport(report.data(), report.size()));
        // Longer than the protocol carries: refused, nothing written.
        const std::vector<std::uint8_t> tooLong(4097, 1);
        EXPECT_FALSE(device.sendInputReport(tooLong.data(), tooLong.size()));
        EXPECT_EQ(device.error(), "uhid: an input report of 4097 bytes is longer than the kernel takes (4096)");
    }
    const std::vector<uhid_event> events = kernel.receiveAll();
    ASSERT_EQ(events.size(), 1 + reports.size() + 1);
    const auto& create = events.front().u.create2;
    EXPECT_EQ(events.front().type, UHID_CREATE2);
    EXPECT_STREQ(reinterpret_cast<const char*>(create.name), "test device");
    EXPECT_EQ(create.bus, BUS_USB);
    EXPECT_EQ(create.vendor, 0x1234u);
    EXPECT_EQ(create.product, 0x5678u);
    EXPECT_EQ(create.version, 7u);
    EXPECT_EQ(bytes(create.rd_data, create.rd_size), identity.reportDescriptor);
    for (std::size_t i = 0; i < reports.size(); ++i) {
        ASSERT_EQ(events[1 + i].type, UHID_INPUT2);
        EXPECT_EQ(bytes(events[1 + i].u.input2.data, events[1 + i].u.input2.size), reports[i]) << i;
    }
    EXPECT_EQ(events.back().type, UHID_DESTROY);
}

// The kernel holds a reader until its request is answered: every request is
// answered while the device waits, and the wait goes on until told to stop.
TEST(UhidDevice, AnswersRequestsWhileItWaits)
{
    struct Case {
        uhid_event request;
        std::uint32_t replyType;
        std::uint16_t error;
        std::vector<std::uint8_t> data;
    };
    uhid_event setReport = FakeUhidKernel::event(UHID_SET_REPORT);
    setReport.u.set_report.id = 14;
    const Case cases[] = {
        {FakeUhidKernel::getReport(11, kKnownFeature), UHID_GET_REPORT_REPLY, 0, kKnownFeatureBytes},
        {FakeUhidKernel::getReport(12, 0x77), UHID_GET_REPORT_REPLY, EIO, {}},
        // Only feature reports are kept; input and output reports are not.
        {FakeUhidKernel::getReport(13, kKnownFeature, UHID_INPUT_REPORT), UHID_GET_REPORT_REPLY, EIO, {}},
        {setReport, UHID_SET_REPORT_REPLY, EIO, {}},
    };

    FakeUhidKernel kernel;
    UhidDevice device(kernel.takeDeviceEnd(), knownFeatureOnly());
    std::atomic<bool> stop{false};
    bool served = false;
    std::thread waiting([&] {
        const auto inAnHour = std::chrono::steady_clock::now() + std::chrono::hours(1);
        served = device.serveUntil(inAnHour, [&] { return stop.load(); });
    });
    for (const Case& c : cases) {
        kernel.send(c.request);
        const auto reply = kernel.receive();
        ASSERT_TRUE(reply);
        ASSERT_EQ(reply->type, c.replyType);
        if (c.replyType == UHID_GET_REPORT_REPLY) {
            const auto& answer = reply->u.get_report_reply;
            EXPECT_EQ(answer.id, c.request.u.get_report.id);
            EXPECT_EQ(answer.err, c.error);
            EXPECT_EQ(bytes(answer.data, answer.size), c.data);
        } else {
            EXPECT_EQ(reply->u.set_report_reply.id, 14u);
            EXPECT_EQ(reply->u.set_report_reply.err, c.error);
        }
    }
    stop = true;
    waiting.join();
    EXPECT_TRUE(served) << device.error();
}

TEST(UhidDevice, WaitsForAReaderToOpenItAndNoticesTheKernelSideGoing)
{
    auto kernel = std::make_unique<FakeUhidKernel>();
    UhidDevice device(kernel->takeDeviceEnd(), knownFeatureOnly());
    kernel->send(FakeUhidKernel::event(UHID_START));
    kernel->send(FakeUhidKernel::event(UHID_OPEN));
    ASSERT_TRUE(device.waitUntilOpened([] { return false; })) << device.error();
    EXPECT_TRUE(device.isOpened());
    kernel->send(FakeUhidKernel::event(UHID_CLOSE));
    ASSERT_TRUE(device.servePending());
    EXPECT_FALSE(device.isOpened());

    kernel.reset();
    EXPECT_FALSE(device.waitUntilOpened([] { return false; }));
    EXPECT_EQ(device.error(), "uhid: the kernel side closed the device");
}

TEST(UhidDevice, ANodeThatCannotBeOpenedIsOneLineWithWhatToDo)
{
    struct Case {
        std::string path;
        std::string error;
    };
    const Case cases[] = {
        {"/no/such/uhid",
         "/no/such/uhid: No such file or directory (the uhid module is not loaded? 'modprobe uhid' loads it)"},
        {"/", "/: Is a directory"},
    };
    for (const Case& c : cases) {
        std::string error;
        EXPECT_EQ(UhidDevice::openNode(c.path, error), -1) << c.path;
        EXPECT_EQ(error, c.error);
    }
}

}  // namespace
