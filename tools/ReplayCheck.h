#pragma once

#include <nlohmann/json.hpp>

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

namespace VeltoTool {

// What `replay FILE --check EXPECTED` compares: the events of a replay, in
// order, and state read after it, against a file in the form `replay --jsonl`
// prints (one event object per line, then {"key":...,"value":...} lines).
// Time stamps are not compared: they follow the host clock's timebase, while
// the frame numbers say when an event came. The first difference is kept.
class ReplayCheck {
public:
    // Throws ToolError "PATH:LINE: ..." for a line that is not a JSON object
    // of either kind.
    static ReplayCheck read(const std::string& path);

    // One event of the replay, as `--jsonl` prints it.
    void event(const nlohmann::ordered_json& line);
    // The keys whose values the file holds, in its order, and their values
    // read back after the last frame.
    std::vector<std::string> keys() const;
    void value(const std::string& key, const nlohmann::ordered_json& value);
    // After the replay: an expected event that never came is a difference too.
    void finish();

    // "frame 32: expected tap top, got cancel top", or nothing when all agreed.
    const std::optional<std::string>& firstDifference() const noexcept { return _difference; }
    // "6 events and 1 value as expected".
    std::string summary() const;

private:
    struct Expected {
        nlohmann::ordered_json line;
        std::size_t lineNumber = 0;
    };
    void differ(std::string text);

    std::vector<Expected> _events;
    std::vector<Expected> _values;
    std::size_t _seen = 0;
    std::optional<std::string> _difference;
};

}  // namespace VeltoTool
