#include "platform/devices/HidrawDescription.h"

#include <linux/hidraw.h>
#include <sys/ioctl.h>

#include <cerrno>
#include <system_error>

namespace VeltoHost {

namespace {

constexpr std::size_t kLongestText = 256;

[[noreturn]] void fail(const char* what) { throw std::system_error(errno, std::generic_category(), what); }

std::string text(int fd, unsigned long request, const char* what)
{
    char buffer[kLongestText] = {};
    if (::ioctl(fd, request, buffer) < 0) fail(what);
    return buffer;
}

}  // namespace

HidrawDescription HidrawDescription::of(int fd)
{
    HidrawDescription description;
    hidraw_devinfo info{};
    if (::ioctl(fd, HIDIOCGRAWINFO, &info) < 0) fail("cannot read the device's ids");
    description.bus = info.bustype;
    description.vendor = static_cast<std::uint16_t>(info.vendor);
    description.product = static_cast<std::uint16_t>(info.product);
    // One byte short of the buffer, so that the text always ends.
    description.name = text(fd, HIDIOCGRAWNAME(kLongestText - 1), "cannot read the device's name");
    description.phys = text(fd, HIDIOCGRAWPHYS(kLongestText - 1), "cannot read the device's physical path");

    int size = 0;
    if (::ioctl(fd, HIDIOCGRDESCSIZE, &size) < 0) fail("cannot read the report descriptor's size");
    hidraw_report_descriptor descriptor{};
    descriptor.size = static_cast<std::uint32_t>(size);
    if (::ioctl(fd, HIDIOCGRDESC, &descriptor) < 0) fail("cannot read the report descriptor");
    description.reportDescriptor.assign(descriptor.value, descriptor.value + descriptor.size);
    return description;
}

}  // namespace VeltoHost
