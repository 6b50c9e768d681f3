#include "platform/devices/HidrawNode.h"

#include "platform/devices/FileKind.h"

#include <libudev.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <cerrno>
#include <cstring>
#include <memory>

namespace VeltoHost {

namespace {

constexpr const char* kHidrawSubsystem = "hidraw";

struct UdevDeleter {
    void operator()(udev* context) const { udev_unref(context); }
    void operator()(udev_device* device) const { udev_device_unref(device); }
};

}  // namespace

std::string HidrawNode::whatElse(const std::string& path)
{
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
        return errno == ENOENT ? "does not exist" : std::string("cannot be examined: ") + std::strerror(errno);
    }
    if (!S_ISCHR(status.st_mode)) return "is " + fileKind(status.st_mode);

    const std::string number = std::to_string(major(status.st_rdev)) + ":" + std::to_string(minor(status.st_rdev));
    std::unique_ptr<udev, UdevDeleter> context(udev_new());
    if (!context) return "is a character device (" + number + ") that the device database cannot describe";
    std::unique_ptr<udev_device, UdevDeleter> device(udev_device_new_from_devnum(context.get(), 'c', status.st_rdev));
    const char* subsystem = device ? udev_device_get_subsystem(device.get()) : nullptr;
    if (subsystem && std::strcmp(subsystem, kHidrawSubsystem) == 0) return {};
    if (!subsystem) return "is a character device (" + number + ") unknown to the device database";
    return "is a character device of the \"" + std::string(subsystem) + "\" subsystem (" + number + ")";
}

std::string HidrawNode::refusal(const std::string& path, std::string_view orElse)
{
    const std::string what = whatElse(path);
    if (what.empty()) return what;
    return path + " " + what + "; expected a hidraw device node (/dev/hidrawN)" + std::string(orElse);
}

}  // namespace VeltoHost
