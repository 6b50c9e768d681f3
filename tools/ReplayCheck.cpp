#include "ReplayCheck.h"

#include "ToolError.h"
#include "ToolFiles.h"

#include <sstream>

namespace VeltoTool {

using Json = nlohmann::ordered_json;

namespace {

// The parts of an event that must agree: everything but the time stamp.
Json comparable(Json line)
{
    line.erase("timestamp");
    return line;
}

std::string frameOf(const Json& line)
{
    return line.contains("frame") ? "frame " + line["frame"].dump() : "device reset";
}

// "tap top", or the whole object when the names alone do not tell two apart.
std::string describe(const Json& line, const Json& other)
{
    std::string text = line.value("gesture", std::string("?"));
    if (line.contains("region")) text += " " + line["region"].get<std::string>();
    const bool namesDiffer = line.value("gesture", "") != other.value("gesture", "") ||
                             line.value("region", "") != other.value("region", "");
    return namesDiffer ? text : comparable(line).dump();
}

// The first place, as a dotted path, where two values differ.
std::string firstDifferingPath(const std::string& path, const Json& expected, const Json& got, std::string& detail)
{
    if (expected.is_object() && got.is_object()) {
        for (const auto& [key, value] : expected.items()) {
            if (!got.contains(key)) {
                detail = "missing";
                return path + "." + key;
            }
            if (value != got[key]) return firstDifferingPath(path + "." + key, value, got[key], detail);
        }
        for (const auto& [key, value] : got.items()) {
            if (!expected.contains(key)) {
                detail = "not expected, got " + value.dump();
                return path + "." + key;
            }
        }
    }
    detail = "expected " + expected.dump() + ", got " + got.dump();
    return path;
}

}  // namespace

ReplayCheck ReplayCheck::read(const std::string& path)
{
    ReplayCheck check;
    std::istringstream text(ToolFiles::read(path));
    std::size_t number = 0;
    for (std::string line; std::getline(text, line);) {
        ++number;
        if (line.find_first_not_of(" \t\r") == std::string::npos) continue;
        const std::string where = path + ":" + std::to_string(number) + ": ";
        Json object = Json::parse(line, nullptr, false);
        if (object.is_discarded()) throw ToolError(where + "not JSON (expected the lines replay --jsonl prints)");
        if (object.is_object() && object.contains("gesture") && object["gesture"].is_string()) {
            if (!check._values.empty()) throw ToolError(where + "an event after the values read at the end");
            check._events.push_back({std::move(object), number});
        } else if (object.is_object() && object.contains("key") && object["key"].is_string() &&
                   object.contains("value")) {
            check._values.push_back({std::move(object), number});
        } else {
            throw ToolError(where + "neither an event ({\"gesture\":...}) nor a value ({\"key\":...,\"value\":...})");
        }
    }
    return check;
}

void ReplayCheck::differ(std::string text)
{
    if (!_difference) _difference = std::move(text);
}

void ReplayCheck::event(const Json& line)
{
    const std::size_t index = _seen++;
    if (index >= _events.size()) {
        differ(frameOf(line) + ": got " + describe(line, Json::object()) + ", expected no more events (" +
               std::to_string(_events.size()) + " in all)");
        return;
    }
    const Json& expected = _events[index].line;
    if (comparable(expected) == comparable(line)) return;
    differ(frameOf(expected) + ": expected " + describe(expected, line) + ", got " + describe(line, expected) +
           " (event " + std::to_string(index + 1) + ", line " + std::to_string(_events[index].lineNumber) + ")");
}

std::vector<std::string> ReplayCheck::keys() const
{
    std::vector<std::string> keys;
    for (const Expected& value : _values) keys.push_back(value.line["key"].get<std::string>());
    return keys;
}

void ReplayCheck::value(const std::string& key, const Json& value)
{
    for (const Expected& expected : _values) {
        if (expected.line["key"] != key || expected.line["value"] == value) continue;
        std::string detail;
        const std::string path = firstDifferingPath(key, expected.line["value"], value, detail);
        differ(path + ": " + detail + " (line " + std::to_string(expected.lineNumber) + ")");
    }
}

void ReplayCheck::finish()
{
    if (_seen >= _events.size()) return;
    const Json& expected = _events[_seen].line;
    differ(frameOf(expected) + ": expected " + describe(expected, Json::object()) + ", got no more events (" +
           std::to_string(_seen) + " in all)");
}

std::string ReplayCheck::summary() const
{
    const auto count = [](std::size_t n, const char* what) {
        return std::to_string(n) + " " + what + (n == 1 ? "" : "s");
    };
    return count(_events.size(), "event") + " and " + count(_values.size(), "value") + " as expected";
}

}  // namespace VeltoTool
