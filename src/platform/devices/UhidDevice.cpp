#include "platform/devices/UhidDevice.h"

#include <fcntl.h>
#include <linux/uhid.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

namespace VeltoHost {

namespace {

using Clock = std::chrono::steady_clock;

// Waits are cut into slices this long: a stop requested from another thread
// (or by a signal that reached another thread) ends them this promptly.
constexpr auto kWaitSlice = std::chrono::milliseconds(20);

uhid_event emptyEvent(std::uint32_t type)
{
    uhid_event event;
    std::memset(&event, 0, sizeof event);
    event.type = type;
    return event;
}

timespec timespecOf(Clock::duration duration)
{
    const auto nanoseconds = std::chrono::duration_cast<std::chrono::nanoseconds>(duration).count();
    return {static_cast<time_t>(nanoseconds / 1'000'000'000), static_cast<long>(nanoseconds % 1'000'000'000)};
}

}  // namespace

int UhidDevice::openNode(const std::string& path, std::string& error)
{
    const int fd = ::open(path.c_str(), O_RDWR | O_CLOEXEC);
    if (fd >= 0) return fd;
    const int number = errno;
    error = path + ": " + std::strerror(number);
    if (number == ENOENT) {
        error += " (the uhid module is not loaded? 'modprobe uhid' loads it)";
    } else if (number == EACCES || number == EPERM) {
        error += " (making a device needs read and write access to it: run as root, or grant it with a udev rule)";
    }
    return -1;
}

UhidDevice::UhidDevice(int fd, FeatureReportSource featureReports)
    : _fd(fd), _featureReports(std::move(featureReports))
{
}

UhidDevice::~UhidDevice()
{
    destroy();
    if (_fd >= 0) ::close(_fd);
}

bool UhidDevice::create(const Identity& identity)
{
    uhid_event event = emptyEvent(UHID_CREATE2);
    auto& request = event.u.create2;
    if (identity.reportDescriptor.size() > sizeof request.rd_data) {
        _error = "uhid: a report descriptor of " + std::to_string(identity.reportDescriptor.size()) +
                 " bytes is longer than the kernel takes (" + std::to_string(sizeof request.rd_data) + ")";
        return false;
    }
    // The name is cut to fit and always ends in a zero byte.
    const std::size_t nameLength = std::min(identity.name.size(), sizeof request.name - 1);
    std::memcpy(request.name, identity.name.data(), nameLength);
    request.rd_size = static_cast<std::uint16_t>(identity.reportDescriptor.size());
    request.bus = identity.bus;
    request.vendor = identity.vendor;
    request.product = identity.product;
    request.version = identity.version;
    request.country = identity.country;
    std::copy(identity.reportDescriptor.begin(), identity.reportDescriptor.end(), request.rd_data);
    if (!write(event, "creating the device")) return false;
    _created = true;
    return true;
}

bool UhidDevice::sendInputReport(const std::uint8_t* data, std::size_t length)
{
    uhid_event event = emptyEvent(UHID_INPUT2);
    if (length > sizeof event.u.input2.data) {
        _error = "uhid: an input report of " + std::to_string(length) + " bytes is longer than the kernel takes (" +
                 std::to_string(sizeof event.u.input2.data) + ")";
        return false;
    }
    event.u.input2.size = static_cast<std::uint16_t>(length);
    std::copy(data, data + length, event.u.input2.data);
    return write(event, "writing an input report");
}

bool UhidDevice::serveUntil(Clock::time_point deadline, const StopCheck& stop)
{
    for (Clock::time_point now = Clock::now(); now < deadline; now = Clock::now()) {
        if (stop && stop()) return true;
        const auto wait = std::min<Clock::duration>(deadline - now, kWaitSlice);
        bool handled = false;
        if (!serveOne(wait, handled)) return false;
    }
    return servePending();
}

bool UhidDevice::servePending()
{
    for (bool handled = true; handled;) {
        if (!serveOne(Clock::duration::zero(), handled)) return false;
    }
    return true;
}

bool UhidDevice::waitUntilOpened(const StopCheck& stop)
{
    while (!_opened) {
        if (stop && stop()) return false;
        bool handled = false;
        if (!serveOne(kWaitSlice, handled)) return false;
    }
    return true;
}

void UhidDevice::destroy()
{
    if (!_created) return;
    _created = false;
    _opened = false;
    write(emptyEvent(UHID_DESTROY), "destroying the device");
}

bool UhidDevice::serveOne(Clock::duration timeout, bool& handled)
{
    handled = false;
    pollfd descriptor{_fd, POLLIN, 0};
    const timespec wait = timespecOf(timeout);
    const int ready = ::ppoll(&descriptor, 1, &wait, nullptr);
    if (ready < 0) {
        if (errno == EINTR) return true;
        _error = std::string("uhid: waiting for the kernel failed: ") + std::strerror(errno);
        return false;
    }
    if (ready == 0) return true;
    if ((descriptor.revents & POLLIN) == 0) {
        _error = "uhid: the kernel side closed the device";
        return false;
    }
    uhid_event event = emptyEvent(0);
    const ssize_t count = ::read(_fd, &event, sizeof event);
    if (count < 0) {
        if (errno == EINTR || errno == EAGAIN) return true;
        _error = std::string("uhid: reading from the kernel failed: ") + std::strerror(errno);
        return false;
    }
    if (count == 0) {
        _error = "uhid: the kernel side closed the device";
        return false;
    }
    handle(event);
    handled = true;
    return _error.empty();
}

void UhidDevice::handle(const uhid_event& event)
{
    switch (event.type) {
    case UHID_OPEN:
        _opened = true;
        ++_openings;
        break;
    case UHID_CLOSE: _opened = false; break;
    case UHID_GET_REPORT:
        answerFeatureRequest(event.u.get_report.id, event.u.get_report.rtype, event.u.get_report.rnum);
        break;
    case UHID_SET_REPORT: {
        // Nothing here takes reports from readers; a refusal frees the
        // writer at once instead of after the kernel's timeout.
        uhid_event reply = emptyEvent(UHID_SET_REPORT_REPLY);
        reply.u.set_report_reply.id = event.u.set_report.id;
        reply.u.set_report_reply.err = EIO;
        write(reply, "answering a set-report request");
        break;
    }
    default:
        // UHID_START, UHID_STOP and output reports need no answer.
        break;
    }
}

void UhidDevice::answerFeatureRequest(std::uint32_t requestID, std::uint8_t reportType, std::uint8_t reportID)
{
    uhid_event reply = emptyEvent(UHID_GET_REPORT_REPLY);
    auto& answer = reply.u.get_report_reply;
    answer.id = requestID;
    std::optional<std::vector<std::uint8_t>> bytes;
    if (reportType == UHID_FEATURE_REPORT && _featureReports) bytes = _featureReports(reportID);
    if (bytes) {
        answer.size = static_cast<std::uint16_t>(std::min(bytes->size(), sizeof answer.data));
        std::copy_n(bytes->begin(), answer.size, answer.data);
    } else {
        answer.err = EIO;
    }
    write(reply, "answering a get-report request");
}

bool UhidDevice::write(const uhid_event& event, const char* what)
{
    ssize_t count = 0;
    do {
        count = ::write(_fd, &event, sizeof event);
    } while (count < 0 && errno == EINTR);
    if (count == static_cast<ssize_t>(sizeof event)) return true;
    if (_error.empty()) {
        _error = std::string("uhid: ") + what + " failed: " + (count < 0 ? std::strerror(errno) : "short write");
    }
    return false;
}

}  // namespace VeltoHost
