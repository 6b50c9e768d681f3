#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

struct uhid_event;

namespace VeltoHost {

// A HID device played by this process through the kernel's user-space HID
// driver: the kernel makes a device of it (with a hidraw node, as for one on
// a bus), passes on the input reports written here and asks here for the
// feature reports that readers of the node request.
//
// The kernel holds a reader that asks for a feature report until the answer
// comes (at most 5 seconds), so the owner must never wait without serving:
// every wait of a player is serveUntil() with its deadline.
//
// The descriptor is anything that speaks the protocol (one struct uhid_event
// per read and write): the opened /dev/uhid, or in tests one end of a
// SOCK_SEQPACKET socket pair whose other end plays the kernel. Nothing
// throws; a failure is a false result, and error() says what failed in one
// line.
class UhidDevice {
public:
    static constexpr const char* kDefaultPath = "/dev/uhid";

    struct Identity {
        std::string name;
        std::uint16_t bus = 0;  // BUS_USB and the others of linux/input.h
        std::uint32_t vendor = 0;
        std::uint32_t product = 0;
        std::uint32_t version = 0;
        std::uint32_t country = 0;
        std::vector<std::uint8_t> reportDescriptor;
    };

    // One feature report's bytes, report ID first, or nothing to refuse the
    // request (the reader gets EIO).
    using FeatureReportSource = std::function<std::optional<std::vector<std::uint8_t>>(std::uint8_t reportID)>;
    using StopCheck = std::function<bool()>;

    // The uhid node opened for reading and writing, or -1 with `error` set to
    // one line that starts with the path and says what to do about it.
    static int openNode(const std::string& path, std::string& error);

    // Takes `fd` over: the destructor destroys the device and closes it.
    UhidDevice(int fd, FeatureReportSource featureReports);
    ~UhidDevice();
    UhidDevice(const UhidDevice&) = delete;
    UhidDevice& operator=(const UhidDevice&) = delete;

    bool create(const Identity& identity);
    bool sendInputReport(const std::uint8_t* data, std::size_t length);

    // Answers the kernel's requests until `deadline` passes or `stop` turns
    // true (looked at between slices of the wait, so that a stop set from
    // another thread is seen promptly even if no signal cuts the wait short).
    // False when the descriptor failed.
    bool serveUntil(std::chrono::steady_clock::time_point deadline, const StopCheck& stop);
    // Answers the requests already waiting, without waiting for more.
    bool servePending();
    // Serves until a reader has the device open; false when stopped first or
    // when the descriptor failed (error() tells them apart).
    bool waitUntilOpened(const StopCheck& stop);

    bool isCreated() const noexcept { return _created; }
    // A reader has the device open (the kernel's UHID_OPEN, until UHID_CLOSE).
    bool isOpened() const noexcept { return _opened; }
    // How many times the kernel said it was opened: the same count on both
    // sides of a wait that ends open means it stayed open all along.
    std::uint64_t openings() const noexcept { return _openings; }
    const std::string& error() const noexcept { return _error; }

    // Removes the device (readers see it unplugged); the destructor does it
    // when it was not done. Harmless when there is none.
    void destroy();

private:
    // Waits at most `timeout` for one event and handles it; false on failure.
    bool serveOne(std::chrono::steady_clock::duration timeout, bool& handled);
    void handle(const uhid_event& event);
    bool write(const uhid_event& event, const char* what);
    void answerFeatureRequest(std::uint32_t requestID, std::uint8_t reportType, std::uint8_t reportID);

    int _fd;
    FeatureReportSource _featureReports;
    bool _created = false;
    bool _opened = false;
    std::uint64_t _openings = 0;
    std::string _error;
};

}  // namespace VeltoHost
