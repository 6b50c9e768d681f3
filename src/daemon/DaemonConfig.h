#pragma once

#include "daemon/KeyMap.h"

#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

namespace VeltoHost {

// The daemon's settings, from a TOML file (commented example:
// packaging/veltotouch.toml):
//
//   log_level = "default"             # "debug", "default", "error" or "off"
//
//   [[match]]                          # one table per device model to take
//   vendor = 0x1234                    # USB or Bluetooth ids, 0 to 0xFFFF
//   product = 0x5678
//
//   [keys]                             # GESTURE.REGION = "Linux key name"
//   tap.middle = "KEY_MUTE"            # replaces that one default binding
//   hold-change.middle = "KEY_NEXTSONG"
//   hold.middle = ""                   # "" removes a default binding
//
// GESTURE is one of the gestures with a region (may-begin, tap, hold-start,
// hold-change, hold-end), which press and release the key once, or "hold",
// which keeps the key down from hold-start until the touch ends (KeyMap).
// REGION is top, middle, bottom or none. Bindings the file does not name keep
// their defaults, so a file that changes one key does not lose the others.
//
// A file is all or nothing: the first problem raises Error with a message
// "FILE:LINE:COLUMN: what is wrong" that points at the offending key or value.
// What is harmless but likely a slip (a [[match]] that repeats an earlier one)
// is taken once and left as a warning in the same form, for the caller to log.
class DaemonConfig {
public:
    struct DeviceMatch {
        std::uint16_t vendor = 0;
        std::uint16_t product = 0;
        friend bool operator==(const DeviceMatch&, const DeviceMatch&) = default;
    };

    class Error : public std::runtime_error {
    public:
        using std::runtime_error::runtime_error;
    };

    // No device taken by id (only those given by hand), the default key map,
    // and the log level left to the environment.
    DaemonConfig() = default;

    static DaemonConfig load(const std::string& path);
    // `sourceName` stands for the file in error messages.
    static DaemonConfig parse(std::string_view text, const std::string& sourceName);

    // Whether a device with these ids is one the daemon should take.
    bool takes(std::uint16_t vendor, std::uint16_t product) const noexcept;

    std::vector<DeviceMatch> matches;
    KeyMap::Bindings keys = KeyMap::defaultBindings();
    // A Log threshold (a LogLevel's value, or Log::kOff); empty when the file
    // does not say, so that VELTOTOUCH_LOG_LEVEL still decides.
    std::optional<int> logThreshold;
    // "FILE:LINE:COLUMN: what looks wrong", in the order of the file.
    std::vector<std::string> warnings;
};

}  // namespace VeltoHost
