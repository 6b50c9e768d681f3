#include "platform/devices/FakeUhidKernel.h"
#include "platform/devices/UhidDevice.h"

#include <gtest/gtest.h>

#include <linux/input.h>
#include <memory>
#include <vector>

using VeltoHost::UhidDevice;
using VeltoHost::Testing::FakeUhidKernel;

// What the device makes of its identity, its reports, its requests and its
// destruction is seen end to end in EmulateCommandTest; here is what the
// command never reaches.
namespace {

TEST(UhidDevice, SendsAnInputReportAsLongAsTheKernelTakesAndRefusesALongerOne)
{
    FakeUhidKernel kernel;
    {
        UhidDevice device(kernel.takeDeviceEnd(), nullptr);
        ASSERT_TRUE(device.create({"test device", BUS_USB, 1, 2, 7, 0, {}})) << device.error();
        const std::vector<std::uint8_t> longest(4096, 9), tooLong(4097, 1);
        ASSERT_TRUE(device.sendInputReport(longest.data(), longest.size())) << device.error();
        EXPECT_FALSE(device.sendInputReport(tooLong.data(), tooLong.size()));
        EXPECT_EQ(device.error(), "uhid: an input report of 4097 bytes is longer than the kernel takes (4096)");
    }
    const std::vector<uhid_event> events = kernel.receiveAll();
    ASSERT_EQ(events.size(), 3u) << "the longer report wrote nothing";
    EXPECT_EQ(events[0].u.create2.version, 7u);
    EXPECT_EQ(events[1].type, UHID_INPUT2);
    EXPECT_EQ(events[1].u.input2.size, 4096u);
    EXPECT_EQ(events[2].type, UHID_DESTROY);
}

TEST(UhidDevice, WaitsForAReaderToOpenItAndNoticesTheKernelSideGoing)
{
    auto kernel = std::make_unique<FakeUhidKernel>();
    UhidDevice device(kernel->takeDeviceEnd(), nullptr);
    kernel->send(FakeUhidKernel::event(UHID_OPEN));
    ASSERT_TRUE(device.waitUntilOpened([] { return false; })) << device.error();
    EXPECT_TRUE(device.isOpened());
    kernel->send(FakeUhidKernel::event(UHID_CLOSE));
    ASSERT_TRUE(device.servePending());
    EXPECT_FALSE(device.isOpened());
    // Opened and closed again between two looks: the count tells.
    kernel->send(FakeUhidKernel::event(UHID_OPEN));
    kernel->send(FakeUhidKernel::event(UHID_CLOSE));
    ASSERT_TRUE(device.servePending());
    EXPECT_FALSE(device.isOpened());
    EXPECT_EQ(device.openings(), 2u);

    kernel.reset();
    EXPECT_FALSE(device.waitUntilOpened([] { return false; }));
    EXPECT_EQ(device.error(), "uhid: the kernel side closed the device");
}

}  // namespace
