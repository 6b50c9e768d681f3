#include "CommandLine.h"

#include "FiniteNumberCheck.h"
#include "recording/SimulatedDevicePlayer.h"

namespace VeltoTool {

namespace {

// Slower than this, a 10 ms gap between reports would take hours.
constexpr double kSlowestSpeed = 0.001;

}  // namespace

CLI::Option* CommandLine::addSettings(CLI::App& command, std::vector<StateArguments::Setting>& settings,
                                      const std::string& description)
{
    return addParsed<std::vector<std::string>>(
        command, "--set", "TEXT:KEY=JSON",
        [&settings](const std::string& text) { settings.push_back(StateArguments::parseSetting(text)); }, description);
}

CLI::Option* CommandLine::addHidDevice(CLI::App& command, std::optional<std::uint32_t>& device)
{
    return command.add_option("--hid-device", device,
                              "N: of a hid-recorder file holding several devices, the one to read (default: the one "
                              "whose report descriptor declares the surface's reports)");
}

CLI::Option* CommandLine::addBus(CLI::App& command, VeltoHost::BusConnection::Address& bus)
{
    return addParsed(
               command, "--bus", "TEXT:BUS",
               [&bus](const std::string& text) { bus = VeltoHost::BusConnection::Address::parse(text); },
               "system, session or a D-Bus address")
        ->default_str("system");
}

const CLI::Validator& CommandLine::speedCheck()
{
    static const FiniteNumberCheck check(kSlowestSpeed, /*zeroAllowed=*/true);
    return check;
}

const CLI::Validator& CommandLine::deviceCheck()
{
    static const CLI::Validator check(
        [](const std::string& argument) -> std::string {
            if (argument == VeltoHost::SimulatedDevicePlayer::kDevicePrefix) {
                return "sim: needs a recording after the colon (sim:FILE)";
            }
            if (argument.empty()) return "expected sim:FILE or /dev/hidrawN, got nothing";
            return {};
        },
        "sim:FILE|/dev/hidrawN");
    return check;
}

}  // namespace VeltoTool
