#include "daemon/UinputKeyboard.h"

#include <gtest/gtest.h>
#include <libevdev/libevdev.h>
#include <linux/input.h>

#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

using VeltoHost::KeyMap;
using VeltoHost::UinputKeyboard;

TEST(UinputKeyboardTest, FailsSoftlyWithAReasonWhereNoKeyboardCanBeMade)
{
    struct Case {
        std::string name;
        std::set<unsigned int> codes;
        std::string path;
        std::string reason;
    };
    const std::vector<Case> cases = {
        {"no keys", {}, "/dev/null", "no keys to offer"},
        {"no such node", {KEY_MUTE}, "/nonexistent/uinput",
         "cannot open /nonexistent/uinput: No such file or directory (is the uinput kernel module loaded?)"},
        {"not a uinput node", {KEY_MUTE}, "/dev/null", "cannot create a virtual keyboard through /dev/null: "},
        {"code beyond the key range", {KEY_MUTE, KEY_MAX + 1}, "/dev/null", "cannot describe a keyboard with key code"},
    };
    for (const Case& each : cases) {
        UinputKeyboard::Created created = UinputKeyboard::create(each.codes, each.path);
        EXPECT_EQ(created.keyboard, nullptr) << each.name;
        EXPECT_EQ(created.error.rfind(each.reason, 0), 0u) << each.name << ": " << created.error;
    }
}

namespace {

struct ReadBack {
    int fd = -1;
    libevdev* device = nullptr;
    ~ReadBack()
    {
        libevdev_free(device);
        if (fd >= 0) ::close(fd);
    }
};

// The key events that arrive within a second, each as "+CODE"/"-CODE", with
// "|" for a sync.
std::string readKeys(ReadBack& node, std::size_t syncs)
{
    std::string text;
    for (std::size_t seen = 0; seen < syncs;) {
        pollfd ready{node.fd, POLLIN, 0};
        if (::poll(&ready, 1, 1000) <= 0) return text + "(timed out)";
        input_event event{};
        while (libevdev_next_event(node.device, LIBEVDEV_READ_FLAG_NORMAL, &event) == LIBEVDEV_READ_STATUS_SUCCESS) {
            if (event.type == EV_KEY) text += (event.value ? "+" : "-") + KeyMap::keyName(event.code) + " ";
            if (event.type == EV_SYN && event.code == SYN_REPORT) {
                text += "| ";
                ++seen;
            }
        }
    }
    return text;
}

}  // namespace

TEST(UinputKeyboardTest, KernelDeviceOffersExactlyTheMapsKeysAndDeliversThem)
{
    if (::access(UinputKeyboard::kDefaultUinputPath, F_OK) != 0) {
        GTEST_SKIP() << UinputKeyboard::kDefaultUinputPath << " does not exist here (" << std::strerror(errno)
                     << "): the kernel path cannot be tried";
    }
    const KeyMap map;
    UinputKeyboard::Created created = UinputKeyboard::create(map.keyCodes());
    if (!created.keyboard && created.error.find("access") != std::string::npos) GTEST_SKIP() << created.error;
    ASSERT_NE(created.keyboard, nullptr) << created.error;
    UinputKeyboard& keyboard = *created.keyboard;
    ASSERT_FALSE(keyboard.devnode().empty());

    ReadBack node;
    node.fd = ::open(keyboard.devnode().c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    ASSERT_GE(node.fd, 0) << keyboard.devnode() << ": " << std::strerror(errno);
    ASSERT_EQ(libevdev_new_from_fd(node.fd, &node.device), 0);
    EXPECT_STREQ(libevdev_get_name(node.device), "VeltoTouch keys");
    std::set<unsigned int> offered;
    for (unsigned int code = 0; code <= KEY_MAX; ++code) {
        if (libevdev_has_event_code(node.device, EV_KEY, code)) offered.insert(code);
    }
    EXPECT_EQ(offered, map.keyCodes());

    EXPECT_TRUE(keyboard.play({{KEY_VOLUMEUP, true}, {KEY_VOLUMEUP, false}, {KEY_VOICECOMMAND, true}}));
    EXPECT_FALSE(keyboard.emitKey(KEY_A, true)) << "a key the device does not offer";
    EXPECT_TRUE(keyboard.play({{KEY_VOICECOMMAND, false}}));
    EXPECT_EQ(readKeys(node, 4),
              "+KEY_VOLUMEUP | -KEY_VOLUMEUP | +KEY_VOICECOMMAND | -KEY_VOICECOMMAND | ");
}
