#pragma once

#include "daemon/KeyboardSink.h"

#include <memory>
#include <set>
#include <string>

struct libevdev_uinput;

namespace VeltoHost {

// A virtual keyboard created through the kernel's uinput: a new input device
// named "VeltoTouch keys" that offers exactly the keys it is created with, so
// that desktops and key-binding tools see it as a media keyboard and nothing
// more.
//
// Creating it can fail for ordinary reasons (no uinput module in a container,
// no write access for the daemon's user); that is not an error of the
// program, so create() answers with a reason instead of throwing, and the
// caller carries on without key output.
class UinputKeyboard final : public KeyboardSink {
public:
    static constexpr const char* kDeviceName = "VeltoTouch keys";
    static constexpr const char* kDefaultUinputPath = "/dev/uinput";

    struct Created {
        std::unique_ptr<UinputKeyboard> keyboard;  // null on failure
        std::string error;                         // why, as a sentence a user can act on
    };

    static Created create(const std::set<unsigned int>& keyCodes, const std::string& uinputPath = kDefaultUinputPath);

    ~UinputKeyboard() override;
    UinputKeyboard(const UinputKeyboard&) = delete;
    UinputKeyboard& operator=(const UinputKeyboard&) = delete;

    bool emitKey(unsigned int code, bool pressed) override;
    bool sync() override;

    // The event node of the created device (/dev/input/eventN); empty when
    // the kernel did not say.
    std::string devnode() const;
    const std::set<unsigned int>& keyCodes() const noexcept { return _keyCodes; }

private:
    UinputKeyboard(libevdev_uinput* device, int fd, std::set<unsigned int> keyCodes);

    libevdev_uinput* _device;
    int _fd;
    std::set<unsigned int> _keyCodes;
};

}  // namespace VeltoHost
