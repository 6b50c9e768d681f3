#include "daemon/UinputKeyboard.h"

#include <libevdev/libevdev-uinput.h>
#include <libevdev/libevdev.h>
#include <linux/input.h>

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>

namespace VeltoHost {

namespace {

std::string openFailure(const std::string& path, int error)
{
    std::string reason = "cannot open " + path + ": " + std::strerror(error);
    if (error == ENOENT || error == ENODEV) reason += " (is the uinput kernel module loaded?)";
    if (error == EACCES || error == EPERM) reason += " (the daemon's user needs write access to it)";
    return reason;
}

// The description the kernel copies when it creates the device: its name, a
// virtual bus, and key events limited to the given codes.
struct Template {
    libevdev* device = libevdev_new();
    Template() = default;
    ~Template() { libevdev_free(device); }
    Template(const Template&) = delete;
    Template& operator=(const Template&) = delete;
};

bool describe(libevdev* device, const std::set<unsigned int>& keyCodes)
{
    libevdev_set_name(device, UinputKeyboard::kDeviceName);
    libevdev_set_id_bustype(device, BUS_VIRTUAL);
    if (libevdev_enable_event_type(device, EV_KEY) != 0) return false;
    for (unsigned int code : keyCodes) {
        if (libevdev_enable_event_code(device, EV_KEY, code, nullptr) != 0) return false;
    }
    return true;
}

}  // namespace

UinputKeyboard::Created UinputKeyboard::create(const std::set<unsigned int>& keyCodes, const std::string& uinputPath)
{
    if (keyCodes.empty()) return {nullptr, "no keys to offer: the key map binds none"};
    Template description;
    if (!description.device || !describe(description.device, keyCodes)) {
        return {nullptr, "cannot describe a keyboard with key code " + std::to_string(*keyCodes.rbegin()) +
                             " (the largest is " + std::to_string(KEY_MAX) + ")"};
    }
    const int fd = ::open(uinputPath.c_str(), O_RDWR | O_CLOEXEC);
    if (fd < 0) return {nullptr, openFailure(uinputPath, errno)};
    libevdev_uinput* device = nullptr;
    const int rc = libevdev_uinput_create_from_device(description.device, fd, &device);
    if (rc != 0) {
        ::close(fd);
        return {nullptr, "cannot create a virtual keyboard through " + uinputPath + ": " + std::strerror(-rc)};
    }
    return {std::unique_ptr<UinputKeyboard>(new UinputKeyboard(device, fd, keyCodes)), ""};
}

UinputKeyboard::UinputKeyboard(libevdev_uinput* device, int fd, std::set<unsigned int> keyCodes)
    : _device(device), _fd(fd), _keyCodes(std::move(keyCodes))
{
}

UinputKeyboard::~UinputKeyboard()
{
    // The device goes first; the descriptor it was created through is ours.
    libevdev_uinput_destroy(_device);
    ::close(_fd);
}

bool UinputKeyboard::emitKey(unsigned int code, bool pressed)
{
    // The kernel drops a key the device does not offer without a word; say so
    // here instead, so that a map and its keyboard that disagree are noticed.
    if (!_keyCodes.contains(code)) return false;
    return libevdev_uinput_write_event(_device, EV_KEY, code, pressed ? 1 : 0) == 0;
}

bool UinputKeyboard::sync() { return libevdev_uinput_write_event(_device, EV_SYN, SYN_REPORT, 0) == 0; }

std::string UinputKeyboard::devnode() const
{
    const char* node = libevdev_uinput_get_devnode(_device);
    return node ? node : "";
}

}  // namespace VeltoHost
