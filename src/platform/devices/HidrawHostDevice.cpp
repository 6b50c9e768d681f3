#include "platform/devices/HidrawHostDevice.h"

#include "platform/runtime/MonotonicClock.h"

#include <fcntl.h>
#include <linux/hidraw.h>
#include <linux/input.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

namespace VeltoHost {

namespace {

constexpr std::size_t kMaxStringPropertyLength = 256;
// The Report ID global item of a report descriptor, size bits masked off.
constexpr std::uint8_t kReportIDItemTag = 0x84;
constexpr std::uint8_t kLongItemPrefix = 0xFE;

const char* transportName(std::uint32_t bus)
{
    switch (bus) {
    case BUS_USB: return "USB";
    case BUS_BLUETOOTH: return "Bluetooth";
    case BUS_I2C: return "I2C";
    case BUS_SPI: return "SPI";
    case BUS_VIRTUAL: return "Virtual";
    case BUS_HOST: return "Host";
    default: return "Unknown";
    }
}

}  // namespace

struct HidrawHostDevice::Descriptor {
    int fd;
    explicit Descriptor(int descriptor) : fd(descriptor) {}
    ~Descriptor()
    {
        if (fd >= 0) ::close(fd);
    }
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;
};

HidrawHostDevice::HidrawHostDevice(std::string path) : _path(std::move(path)), _log("HostDevice") {}

HidrawHostDevice::HidrawHostDevice(int fd, bool numberedReports) : _log("HostDevice")
{
    // The loop thread must never block in read().
    int flags = fcntl(fd, F_GETFL);
    if (flags >= 0) fcntl(fd, F_SETFL, flags | O_NONBLOCK);
    _descriptor = std::make_shared<const Descriptor>(fd);
    _numberedReports = numberedReports;
}

HidrawHostDevice::~HidrawHostDevice() { detachSource(); }

bool HidrawHostDevice::open(std::uint32_t options)
{
    std::lock_guard<std::mutex> guard(_lock);
    if (_gone) return false;
    if (!_descriptor) {
        int fd = ::open(_path.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC);
        // Input reports and feature reads need no write access.
        if (fd < 0 && (errno == EACCES || errno == EPERM || errno == EROFS)) {
            fd = ::open(_path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
        }
        if (fd < 0) {
            _log.error("cannot open %s (options 0x%jx): %s", _path, options, std::strerror(errno));
            return false;
        }
        _descriptor = std::make_shared<const Descriptor>(fd);
        int size = 0;
        hidraw_report_descriptor descriptor{};
        if (ioctl(fd, HIDIOCGRDESCSIZE, &size) == 0 && size > 0 && size <= HID_MAX_DESCRIPTOR_SIZE) {
            descriptor.size = static_cast<std::uint32_t>(size);
            if (ioctl(fd, HIDIOCGRDESC, &descriptor) == 0) {
                _numberedReports = descriptorUsesReportIDs(descriptor.value, descriptor.size);
            }
        }
    }
    _open = true;
    if (_source == 0 && _runLoop) _source = attachSourceLocked();
    return true;
}

void HidrawHostDevice::close(std::uint32_t /*options*/)
{
    TakenSource taken;
    {
        std::lock_guard<std::mutex> guard(_lock);
        _open = false;
        // An adopted descriptor stays with this object; a path is reopened.
        if (_path.empty()) return;
        _descriptor.reset();
        taken = takeSourceLocked(false);
    }
    taken.remove();
}

std::int32_t HidrawHostDevice::getReport(HidReportType type, std::uint32_t reportID, std::uint8_t* buffer,
                                         std::size_t& length)
{
    DescriptorRef descriptor;
    {
        std::lock_guard<std::mutex> guard(_lock);
        if (_gone) return kHostDeviceNoDevice;
        if (!_open || !_descriptor) return kHostDeviceNotOpen;
        descriptor = _descriptor;
    }
    if (buffer == nullptr || length == 0 || reportID > 0xFF) return kHostDeviceBadArgument;
    buffer[0] = static_cast<std::uint8_t>(reportID);
    unsigned long request = 0;
    switch (type) {
    case HidReportType::Input: request = HIDIOCGINPUT(length); break;
    case HidReportType::Output: request = HIDIOCGOUTPUT(length); break;
    case HidReportType::Feature: request = HIDIOCGFEATURE(length); break;
    }
    int result = ioctl(descriptor->fd, request, buffer);
    if (result < 0) {
        int error = errno;
        _log.debug("getReport type %ju ID 0x%jx of %s failed: %s", type, reportID, name(), std::strerror(error));
        return statusForErrno(error);
    }
    length = std::min(static_cast<std::size_t>(result), length);
    return kHostDeviceSuccess;
}

PropertyValue HidrawHostDevice::getProperty(const std::string& key)
{
    DescriptorRef descriptor;
    {
        std::lock_guard<std::mutex> guard(_lock);
        if (_gone) return {};
        if (auto it = _propertyOverrides.find(key); it != _propertyOverrides.end()) return it->second;
        descriptor = _descriptor;
    }
    if (!descriptor && !_path.empty()) {
        // Not opened yet: the information ioctls need only a short read-only look.
        int fd = ::open(_path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
        if (fd < 0) return {};
        descriptor = std::make_shared<const Descriptor>(fd);
    }
    return descriptor ? queryProperty(descriptor->fd, key) : PropertyValue();
}

bool HidrawHostDevice::setProperty(const std::string& key, const PropertyValue& value)
{
    std::lock_guard<std::mutex> guard(_lock);
    if (_gone) return false;
    _propertyOverrides[key] = value;
    return true;
}

bool HidrawHostDevice::isGone() const
{
    std::lock_guard<std::mutex> guard(_lock);
    return _gone;
}

bool HidrawHostDevice::descriptorUsesReportIDs(const std::uint8_t* descriptor, std::size_t length)
{
    std::size_t position = 0;
    while (position < length) {
        std::uint8_t prefix = descriptor[position];
        if (prefix == kLongItemPrefix) {
            // Long item: prefix, data size, tag, data.
            if (position + 1 >= length) break;
            position += 3 + descriptor[position + 1];
            continue;
        }
        if ((prefix & 0xFC) == kReportIDItemTag) return true;
        std::size_t dataSize = prefix & 0x03;
        position += 1 + (dataSize == 3 ? 4 : dataSize);
    }
    return false;
}

RunLoop::SourceId HidrawHostDevice::attachSourceLocked()
{
    if (!_descriptor || _gone) return 0;
    return _runLoop->addFileDescriptorSource(_descriptor->fd, _mode, [this] { onReadable(); });
}

// Runs on the scheduled loop's thread, once per readable event: one read is
// one report.
void HidrawHostDevice::onReadable()
{
    std::lock_guard<std::recursive_mutex> delivery(_deliveryLock);
    DescriptorRef descriptor;
    {
        std::lock_guard<std::mutex> guard(_lock);
        if (_gone || !_descriptor) return;
        descriptor = _descriptor;
        if (_readBuffer.empty()) _readBuffer.resize(kMaxReportSize);
    }
    ssize_t count = read(descriptor->fd, _readBuffer.data(), _readBuffer.size());
    // The report's one time stamp: the plug-in records it at this time and
    // hands the same time to its pipeline, whenever its turn comes.
    const std::uint64_t timeStamp = MonotonicClock::now();
    if (count < 0) {
        if (errno == EAGAIN || errno == EWOULDBLOCK || errno == EINTR) return;
        endReception(errno);
        return;
    }
    if (count == 0) {
        endReception(0);
        return;
    }

    Receiver receiver;
    bool numbered = true;
    {
        std::lock_guard<std::mutex> guard(_lock);
        // Reports of a closed device, or with nobody listening, are read and dropped.
        if (!_open || _receiver.callback == nullptr) return;
        receiver = _receiver;
        numbered = _numberedReports;
    }
    deliver(receiver, _readBuffer.data(), static_cast<std::size_t>(count), numbered ? _readBuffer[0] : 0, timeStamp);
}

void HidrawHostDevice::endReception(int error)
{
    TakenSource taken;
    {
        std::lock_guard<std::mutex> guard(_lock);
        if (_gone) return;
        _gone = true;
        taken = takeSourceLocked(false);
    }
    // On the loop's own thread, from inside this source's callback: no wait.
    taken.remove();
    _log.log("%s disappeared (%s); input reports stopped", name(),
             error == 0 ? std::string("end of file") : std::string(std::strerror(error)));
}

std::string HidrawHostDevice::name() const
{
    if (!_path.empty()) return _path;
    return "adopted hidraw descriptor";
}

PropertyValue HidrawHostDevice::queryProperty(int fd, const std::string& key)
{
    if (key == "VendorID" || key == "ProductID" || key == "Transport") {
        hidraw_devinfo info{};
        if (ioctl(fd, HIDIOCGRAWINFO, &info) < 0) return {};
        if (key == "Transport") return PropertyValue::string(transportName(info.bustype));
        auto id = static_cast<std::uint16_t>(key == "VendorID" ? info.vendor : info.product);
        return PropertyValue::uint32(id);
    }
    if (key == "Product" || key == "PhysicalDeviceUniqueID") {
        char text[kMaxStringPropertyLength] = {};
        unsigned long request =
            key == "Product" ? HIDIOCGRAWNAME(sizeof text - 1) : HIDIOCGRAWPHYS(sizeof text - 1);
        if (ioctl(fd, request, text) < 0) return {};
        return PropertyValue::string(text);
    }
    return {};
}

std::int32_t HidrawHostDevice::statusForErrno(int error)
{
    switch (error) {
    case ENODEV:
    case ENXIO:
    case ESHUTDOWN: return kHostDeviceNoDevice;
    case EINVAL:
    case EMSGSIZE:
    case EOVERFLOW: return kHostDeviceBadArgument;
    default: return kHostDeviceError;
    }
}

}  // namespace VeltoHost
