#pragma once

#include "platform/devices/UhidDevice.h"
#include "recording/GapCap.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <ostream>
#include <string>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch emulate FILE`: a virtual surface. Makes a HID device through
// the kernel's uhid driver that looks to its readers like the real surface
// (its report descriptor declares the surface's input reports and the
// feature reports the plug-in reads), waits until a reader keeps it open,
// plays the recording's input reports into it with their recorded spacing
// (pausing while no reader has it open) and answers the feature-report
// requests meanwhile. At the end of the recording (with --loop: at
// SIGINT/SIGTERM) the device is removed, so that the reader sees an unplug.
class EmulateCommand {
public:
    static constexpr std::uint16_t kDefaultVendor = 0x1234;
    static constexpr std::uint16_t kDefaultProduct = 0x5678;
    static constexpr std::uint32_t kDefaultHoldDurationMs = 5000;

    struct Options {
        std::string file;
        std::uint16_t vendor = kDefaultVendor;
        std::uint16_t product = kDefaultProduct;
        // Recorded spacing divided by this; 0 writes as fast as the kernel takes the reports.
        double speed = 1.0;
        // One gap between reports is waited for at most this long (a clock
        // jump in a recording must not stall the device).
        double maxGapSeconds = VeltoHost::GapCap::kDefaultMaxSeconds;
        bool loop = false;
        // What the factory-reset hold duration feature report carries.
        std::uint32_t holdDurationMs = kDefaultHoldDurationMs;
        std::string uhidPath = VeltoHost::UhidDevice::kDefaultPath;
        // Of a hid-recorder file holding several devices, the one to play;
        // empty: the one with the surface's reports.
        std::optional<std::uint32_t> hidDevice;
    };
    using StopCheck = std::function<bool()>;

    // Opens the uhid node and plays until the end or SIGINT/SIGTERM. Returns
    // the exit status; throws ToolError for what the user can fix (a missing
    // or faulty recording, no uhid node or no access to it).
    static int run(const Options& options, std::ostream& err);
    // The same on a descriptor that speaks the uhid protocol (taken over and
    // closed), stopping when `stopRequested` turns true; it may be called
    // from another thread.
    static int run(const Options& options, int uhidFd, const StopCheck& stopRequested, std::ostream& err);

    // A vendor or product id, or a hold duration: decimal, or hexadecimal
    // after 0x, not above `largest`. Throws ToolError.
    static std::uint32_t parseNumber(const std::string& text, std::uint32_t largest);

    // `emulate` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
