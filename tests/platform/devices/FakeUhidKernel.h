#pragma once

// The kernel's end of the uhid protocol, for tests: one end of a
// SOCK_SEQPACKET socket pair (one struct uhid_event per message, as
// /dev/uhid reads and writes them) whose other end goes to the code under
// test. The receive deadline only keeps a broken device from hanging the
// test run; nothing is measured with it.
#include <linux/uhid.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <optional>
#include <stdexcept>
#include <vector>

namespace VeltoHost::Testing {

class FakeUhidKernel {
public:
    FakeUhidKernel()
    {
        int ends[2];
        if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) throw std::runtime_error("socketpair");
        _kernel = ends[0];
        _device = ends[1];
    }
    ~FakeUhidKernel()
    {
        ::close(_kernel);
        if (_device >= 0) ::close(_device);
    }
    FakeUhidKernel(const FakeUhidKernel&) = delete;
    FakeUhidKernel& operator=(const FakeUhidKernel&) = delete;

    // The device's end; whoever takes it closes it.
    int takeDeviceEnd()
    {
        const int fd = _device;
        _device = -1;
        return fd;
    }

    static uhid_event event(std::uint32_t type)
    {
        uhid_event event;
        std::memset(&event, 0, sizeof event);
        event.type = type;
        return event;
    }
    static uhid_event getReport(std::uint32_t id, std::uint8_t reportID, std::uint8_t type = UHID_FEATURE_REPORT)
    {
        uhid_event request = event(UHID_GET_REPORT);
        request.u.get_report = {id, reportID, type};
        return request;
    }

    void send(const uhid_event& event)
    {
        if (::write(_kernel, &event, sizeof event) != static_cast<ssize_t>(sizeof event)) {
            throw std::runtime_error("write to the device's end");
        }
    }

    // The next event, or nothing when the device's end was closed.
    std::optional<uhid_event> receive()
    {
        pollfd descriptor{_kernel, POLLIN, 0};
        if (::poll(&descriptor, 1, kHangGuardMs) != 1) throw std::runtime_error("the device sent nothing");
        uhid_event received = event(0);
        const ssize_t count = ::read(_kernel, &received, sizeof received);
        if (count <= 0) return std::nullopt;
        return received;
    }

    // Every event until the device's end is closed.
    std::vector<uhid_event> receiveAll()
    {
        std::vector<uhid_event> events;
        while (auto received = receive()) events.push_back(*received);
        return events;
    }

private:
    static constexpr int kHangGuardMs = 60'000;
    int _kernel = -1;
    int _device = -1;
};

}  // namespace VeltoHost::Testing
