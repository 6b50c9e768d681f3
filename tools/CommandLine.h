#pragma once

#include "StateArguments.h"
#include "ToolError.h"
#include "bus/BusConnection.h"

#include <CLI/CLI.hpp>

#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

namespace VeltoTool {

// What the commands share on the command line. Each command declares its
// own subcommand, options and callback (its addTo); the options here turn
// their text into the value the command takes while the line is parsed, so
// that a value the command cannot take is a usage error (exit status 2)
// before anything runs, and no command reads an argument's text again.
class CommandLine {
public:
    static constexpr int kUsageError = 2;
    static constexpr int kFailure = 1;

    // An option whose every value `store` converts and keeps. A ToolError or
    // std::invalid_argument it throws refuses the line, naming the option.
    // `Text` is std::vector<std::string> for an option that may be repeated;
    // `typeName` is what help shows after the option's name.
    template <typename Text = std::string, typename Store>
    static CLI::Option* addParsed(CLI::App& command, const std::string& name, const std::string& typeName,
                                  Store store, const std::string& description)
    {
        // The check keeps the values; it runs before the option's callback,
        // which has nothing left to do.
        return command.add_option_function<Text>(name, [](const Text&) {}, description)
            ->type_name(typeName)
            ->each([store](const std::string& text) {
                try {
                    store(text);
                } catch (const ToolError& error) {
                    throw CLI::ValidationError(error.what());
                } catch (const std::invalid_argument& error) {
                    throw CLI::ValidationError(error.what());
                }
            });
    }

    // --set KEY=VALUE (VALUE is JSON), as often as wanted.
    static CLI::Option* addSettings(CLI::App& command, std::vector<StateArguments::Setting>& settings,
                                    const std::string& description);
    // --hid-device N: which device of a hid-recorder file holding several.
    static CLI::Option* addHidDevice(CLI::App& command, std::optional<std::uint32_t>& device);
    // --bus system|session|ADDRESS, the system bus unless given.
    static CLI::Option* addBus(CLI::App& command, VeltoHost::BusConnection::Address& bus);

    // A pace: 0 (as fast as possible) or at least kSlowestSpeed.
    static const CLI::Validator& speedCheck();
    // A device: a hidraw path or sim:FILE; "sim:" alone names no recording.
    static const CLI::Validator& deviceCheck();
};

}  // namespace VeltoTool
