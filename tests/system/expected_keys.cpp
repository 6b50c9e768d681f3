// Prints the key presses and releases the daemon must send for a run of
// gestures, one "KEY_NAME 1" (press) or "KEY_NAME 0" (release) per line, as
// tests/system/key_events prints what the virtual keyboard really sent.
//
//   expected_keys [--no-unplug] [FILE...]
//
// Each FILE (standard input without one, or "-") holds gesture events one
// JSON object per line, as `replay --jsonl`, `ctl events --jsonl` and the
// examples' .expected files have them; other lines ({"key":...} values,
// blank lines) are passed over. The gestures go through the daemon's own
// KeyMap with its default bindings, so that the system test compares the
// kernel's keys with the product's rules, not with a copy of them. Every
// surface in the system test ends unplugged, which releases a key still held
// (KeyMap::releaseAll()); --no-unplug leaves that out.
#include "daemon/KeyMap.h"
#include "records/Gesture.h"

#include <nlohmann/json.hpp>

#include <fstream>
#include <iostream>
#include <string>
#include <vector>

namespace {

using VeltoTouch::Gesture;
using VeltoHost::KeyMap;

void print(const KeyMap::Actions& actions)
{
    for (const KeyMap::Action& action : actions) {
        std::cout << KeyMap::keyName(action.code) << ' ' << (action.pressed ? 1 : 0) << '\n';
    }
}

// False (with a message) for a line that is not JSON or names a gesture or
// region the host does not know: a typo in an expected file must not pass as
// "no keys".
bool feed(std::istream& in, const std::string& name, KeyMap& keys)
{
    std::string text;
    for (std::size_t number = 1; std::getline(in, text); ++number) {
        if (text.find_first_not_of(" \t\r") == std::string::npos) continue;
        const nlohmann::json line = nlohmann::json::parse(text, nullptr, false);
        const std::string where = name + ":" + std::to_string(number) + ": ";
        if (line.is_discarded() || !line.is_object()) {
            std::cerr << "expected_keys: " << where << "not a JSON object\n";
            return false;
        }
        if (!line.contains("gesture")) continue;
        const auto kind = line["gesture"].is_string()
                              ? Gesture::kindFromName(line["gesture"].get<std::string>())
                              : std::nullopt;
        const auto region = Gesture::regionFromName(line.value("region", std::string("none")));
        if (!kind || !region) {
            std::cerr << "expected_keys: " << where << "unknown gesture or region\n";
            return false;
        }
        print(keys.handle(Gesture{*kind, *region}));
    }
    if (in.bad()) {
        std::cerr << "expected_keys: cannot read " << name << '\n';
        return false;
    }
    return true;
}

}  // namespace

int main(int argc, char** argv)
{
    bool unplug = true;
    std::vector<std::string> files;
    for (int i = 1; i < argc; ++i) {
        const std::string argument = argv[i];
        if (argument == "--no-unplug") {
            unplug = false;
        } else if (argument.size() > 1 && argument[0] == '-') {
            std::cerr << "usage: expected_keys [--no-unplug] [FILE...]\n";
            return 2;
        } else {
            files.push_back(argument);
        }
    }
    if (files.empty()) files.push_back("-");

    KeyMap keys(KeyMap::defaultBindings());
    for (const std::string& file : files) {
        if (file == "-") {
            if (!feed(std::cin, "standard input", keys)) return 1;
            continue;
        }
        std::ifstream in(file);
        if (!in) {
            std::cerr << "expected_keys: cannot open " << file << '\n';
            return 1;
        }
        if (!feed(in, file, keys)) return 1;
    }
    if (unplug) print(keys.releaseAll());
    std::cout.flush();
    return std::cout ? 0 : 1;
}
