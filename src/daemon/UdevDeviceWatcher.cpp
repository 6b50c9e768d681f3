#include "daemon/UdevDeviceWatcher.h"

#include <libudev.h>

#include <charconv>
#include <stdexcept>
#include <utility>

namespace VeltoHost {

namespace {

constexpr const char* kSubsystem = "hidraw";
constexpr const char* kHidSubsystem = "hid";
constexpr const char* kHidIdProperty = "HID_ID";

bool parseHex(std::string_view text, std::uint32_t& value)
{
    if (text.empty()) return false;
    auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value, 16);
    return error == std::errc() && end == text.data() + text.size();
}

// The device node and ids of a hidraw device, when it has both.
std::optional<DeviceWatcher::Device> describe(udev_device* device)
{
    const char* node = udev_device_get_devnode(device);
    udev_device* hid = udev_device_get_parent_with_subsystem_devtype(device, kHidSubsystem, nullptr);
    const char* hidId = hid ? udev_device_get_property_value(hid, kHidIdProperty) : nullptr;
    if (!node || !hidId) return std::nullopt;
    std::optional<DeviceWatcher::Device> found = UdevDeviceWatcher::identityFromHidId(hidId);
    if (found) found->path = node;
    return found;
}

}  // namespace

UdevDeviceWatcher::UdevDeviceWatcher(RunLoop::Ref runLoop, std::string mode)
    : _runLoop(std::move(runLoop)), _mode(std::move(mode))
{
}

UdevDeviceWatcher::~UdevDeviceWatcher() { stop(); }

std::optional<DeviceWatcher::Device> UdevDeviceWatcher::identityFromHidId(std::string_view hidId)
{
    std::uint32_t parts[3];
    for (std::uint32_t& part : parts) {
        const std::size_t colon = hidId.find(':');
        if (!parseHex(hidId.substr(0, colon), part) || part > 0xFFFF) return std::nullopt;
        hidId = colon == std::string_view::npos ? std::string_view() : hidId.substr(colon + 1);
        if (&part != &parts[2] && colon == std::string_view::npos) return std::nullopt;
    }
    if (!hidId.empty()) return std::nullopt;
    return Device{{}, static_cast<std::uint16_t>(parts[0]), static_cast<std::uint16_t>(parts[1]),
                  static_cast<std::uint16_t>(parts[2])};
}

void UdevDeviceWatcher::start(Added added, Removed removed)
{
    if (_udev) throw std::logic_error("device watcher already started");
    _added = std::move(added);
    _removed = std::move(removed);
    _udev = udev_new();
    if (!_udev) throw std::runtime_error("cannot reach the device manager (udev)");

    // The monitor first, so that a device that appears during the
    // enumeration is not missed (it may then be reported twice; the daemon
    // takes a path once).
    _monitor = udev_monitor_new_from_netlink(_udev, "udev");
    if (_monitor && udev_monitor_filter_add_match_subsystem_devtype(_monitor, kSubsystem, nullptr) == 0 &&
        udev_monitor_enable_receiving(_monitor) == 0) {
        _source = _runLoop->addFileDescriptorSource(udev_monitor_get_fd(_monitor), _mode,
                                                    [this] { onMonitorReadable(); });
    }

    udev_enumerate* enumerate = udev_enumerate_new(_udev);
    if (!enumerate) return;
    udev_enumerate_add_match_subsystem(enumerate, kSubsystem);
    udev_enumerate_scan_devices(enumerate);
    udev_list_entry* entry = nullptr;
    udev_list_entry_foreach(entry, udev_enumerate_get_list_entry(enumerate))
    {
        udev_device* device = udev_device_new_from_syspath(_udev, udev_list_entry_get_name(entry));
        if (!device) continue;
        if (auto found = describe(device)) _added(*found);
        udev_device_unref(device);
    }
    udev_enumerate_unref(enumerate);
}

void UdevDeviceWatcher::stop()
{
    if (_source != 0) _runLoop->removeSource(std::exchange(_source, 0));
    if (_monitor) udev_monitor_unref(std::exchange(_monitor, nullptr));
    if (_udev) udev_unref(std::exchange(_udev, nullptr));
}

void UdevDeviceWatcher::onMonitorReadable()
{
    udev_device* device = udev_monitor_receive_device(_monitor);
    if (!device) return;
    const std::string_view action = udev_device_get_action(device) ? udev_device_get_action(device) : "";
    if (action == "add") {
        if (auto found = describe(device)) _added(*found);
    } else if (action == "remove") {
        if (const char* node = udev_device_get_devnode(device)) _removed(node);
    }
    udev_device_unref(device);
}

}  // namespace VeltoHost
