#include "daemon/UdevDeviceWatcher.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <optional>
#include <string>
#include <vector>

using VeltoHost::DeviceWatcher;
using VeltoHost::RunLoop;
using VeltoHost::UdevDeviceWatcher;

TEST(UdevDeviceWatcherTest, HidIdentitiesAreReadFromTheirHexFields)
{
    using Device = DeviceWatcher::Device;
    struct Case {
        std::string text;
        std::optional<Device> expected;
    };
    const Case cases[] = {
        {"0003:0000046D:0000C52B", Device{"", 3, 0x046D, 0xC52B}},
        {"0005:00001234:0000abcd", Device{"", 5, 0x1234, 0xABCD}},
        {"3:46d:c52b", Device{"", 3, 0x046D, 0xC52B}},
        {"0003:00010000:00000001", std::nullopt},  // a vendor wider than 16 bits
        {"0003:0000046D", std::nullopt},
        {"0003:0000046D:0000C52B:1", std::nullopt},
        {"0003::0000C52B", std::nullopt},
        {"0003:0000046G:0000C52B", std::nullopt},
        {"", std::nullopt},
    };
    for (const Case& c : cases) EXPECT_EQ(UdevDeviceWatcher::identityFromHidId(c.text), c.expected) << c.text;
}

TEST(UdevDeviceWatcherTest, ReportsTheHidrawDevicesPresentAtStart)
{
    std::vector<DeviceWatcher::Device> added;
    UdevDeviceWatcher watcher(RunLoop::current(), "UdevWatcherTest");
    watcher.start([&](const DeviceWatcher::Device& device) { added.push_back(device); },
                  [](const std::string&) {});
    std::size_t nodes = 0;
    for (const auto& entry : std::filesystem::directory_iterator("/dev")) {
        nodes += entry.path().filename().string().rfind("hidraw", 0) == 0;
    }
    watcher.stop();
    if (nodes == 0) {
        EXPECT_TRUE(added.empty());
        GTEST_SKIP() << "no hidraw device on this machine: only the empty enumeration was checked";
    }
    EXPECT_EQ(added.size(), nodes);
    for (const auto& device : added) EXPECT_EQ(device.path.rfind("/dev/hidraw", 0), 0u) << device.path;
}
