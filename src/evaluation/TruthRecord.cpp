#include "evaluation/TruthRecord.h"

#include <nlohmann/json.hpp>

#include <filesystem>
#include <sstream>
#include <stdexcept>

namespace VeltoTouch {

namespace {

constexpr TruthRecord::Kind kKinds[] = {TruthRecord::Kind::Tap,  TruthRecord::Kind::Hold,  TruthRecord::Kind::Slide,
                                        TruthRecord::Kind::Palm, TruthRecord::Kind::Noise, TruthRecord::Kind::Reset};

[[noreturn]] void fail(int line, const std::string& message)
{
    throw std::invalid_argument("truth line " + std::to_string(line) + ": " + message);
}

TruthRecord::Region readRegion(const nlohmann::json& object, const char* key, int line)
{
    const auto found = object.find(key);
    if (found == object.end() || !found->is_string()) fail(line, std::string("\"") + key + "\" must be a region name");
    const auto parsed = Gesture::regionFromName(found->get<std::string>());
    if (!parsed) fail(line, "unknown region \"" + found->get<std::string>() + "\"");
    return *parsed;
}

std::uint64_t ticks(const nlohmann::json& object, const char* key, int line)
{
    const auto found = object.find(key);
    if (found == object.end() || !found->is_number_unsigned()) {
        fail(line, std::string("\"") + key + "\" must be a whole number of ticks");
    }
    return found->get<std::uint64_t>();
}

bool hasRegion(TruthRecord::Kind kind)
{
    return kind == TruthRecord::Kind::Tap || kind == TruthRecord::Kind::Hold || kind == TruthRecord::Kind::Slide;
}

}  // namespace

const char* TruthRecord::name(Kind kind) noexcept
{
    switch (kind) {
    case Kind::Tap: return "tap";
    case Kind::Hold: return "hold";
    case Kind::Slide: return "slide";
    case Kind::Palm: return "palm";
    case Kind::Noise: return "noise";
    case Kind::Reset: return "reset";
    }
    return "unknown";
}

std::string TruthRecord::label() const
{
    std::string text = name(kind);
    if (!hasRegion(kind)) return text;
    text += ' ';
    text += Gesture::name(region);
    if (kind == Kind::Slide) {
        text += '>';
        text += Gesture::name(to);
    }
    return text;
}

std::string TruthRecord::jsonLine() const
{
    nlohmann::ordered_json line;
    line["kind"] = name(kind);
    line["region"] = std::string(Gesture::name(region));
    if (kind == Kind::Slide) line["to"] = std::string(Gesture::name(to));
    line["start"] = start;
    line["end"] = end;
    return line.dump();
}

std::string TruthRecord::pathBeside(const std::string& recordingPath)
{
    std::filesystem::path path(recordingPath);
    path.replace_extension(".truth.jsonl");
    return path.string();
}

std::vector<TruthRecord> TruthRecord::parseLines(const std::string& text)
{
    std::vector<TruthRecord> records;
    std::istringstream in(text);
    int number = 0;
    for (std::string line; std::getline(in, line);) {
        ++number;
        if (line.find_first_not_of(" \t\r") == std::string::npos) continue;
        const nlohmann::json object = nlohmann::json::parse(line, nullptr, false);
        if (!object.is_object()) fail(number, "not a JSON object");
        const auto kindValue = object.find("kind");
        if (kindValue == object.end() || !kindValue->is_string()) fail(number, "\"kind\" must be a string");
        TruthRecord record;
        bool known = false;
        for (Kind kind : kKinds) {
            if (kindValue->get<std::string>() == name(kind)) {
                record.kind = kind;
                known = true;
            }
        }
        if (!known) fail(number, "unknown kind \"" + kindValue->get<std::string>() + "\" (tap, hold, slide, palm, noise, reset)");
        if (hasRegion(record.kind)) {
            record.region = readRegion(object, "region", number);
            if (record.region == Region::None) fail(number, "a " + std::string(name(record.kind)) + " needs a region");
        }
        record.to = record.kind == Kind::Slide ? readRegion(object, "to", number) : record.region;
        record.start = ticks(object, "start", number);
        record.end = ticks(object, "end", number);
        if (record.end < record.start) fail(number, "\"end\" is before \"start\"");
        records.push_back(record);
    }
    return records;
}

}  // namespace VeltoTouch
