#include "DecisionDumpWriter.h"

#include "algs/DecisionDump.h"
#include "algs/VirtualImage.h"
#include "bus/GestureFields.h"
#include "platform/values/PropertyDictionary.h"
#include "recording/JsonValue.h"

#include <charconv>
#include <cstdlib>
#include <string>

namespace VeltoTool {

using VeltoTouch::DecisionRecord;
using VeltoTouch::Gesture;
using Json = nlohmann::ordered_json;

namespace {

const char* phaseName(VeltoTouch::TouchPhase phase)
{
    using VeltoTouch::TouchPhase;
    switch (phase) {
    case TouchPhase::Idle: return "idle";
    case TouchPhase::StartTouch: return "start-touch";
    case TouchPhase::Holding: return "holding";
    case TouchPhase::StartHold: return "start-hold";
    case TouchPhase::SuppressHold: return "suppress-hold";
    case TouchPhase::Touching: return "touching";
    case TouchPhase::EndHold: return "end-hold";
    case TouchPhase::Tap: return "tap";
    case TouchPhase::SuppressTap: return "suppress-tap";
    case TouchPhase::EndTouch: return "end-touch";
    }
    return "unknown";
}

// The entries of `after` that differ from `before`, descending into
// dictionaries, so that only the counters a frame moved are listed.
Json changedEntries(const VeltoHost::PropertyDictionary& before, const VeltoHost::PropertyDictionary& after)
{
    Json changed = Json::object();
    for (const auto& [name, value] : after) {
        const VeltoHost::PropertyValue old = before.get(name);
        if (old == value) continue;
        if (value.isDictionary() && old.isDictionary()) {
            changed[name] = changedEntries(old.asDictionary(), value.asDictionary());
        } else {
            changed[name] = VeltoTouch::JsonValue::toJson(value);
        }
    }
    return changed;
}

// A float as the shortest decimal that reads back as the same float, not as
// the seventeen digits of its double.
double shortest(float value)
{
    char text[32];
    const auto end = std::to_chars(text, text + sizeof text, value).ptr;
    return std::strtod(std::string(text, end).c_str(), nullptr);
}

}  // namespace

void DecisionDumpWriter::frameDecided(const DecisionRecord& record)
{
    if (_format == Format::JsonLines) {
        _out << VeltoTouch::JsonValue::dump(toJson(record), false) << '\n';
        return;
    }
    for (std::size_t which = 0; which < VeltoTouch::DecisionDump::kMessageCount; ++which) {
        _out << VeltoTouch::DecisionDump::message(which, record) << '\n';
    }
}

Json DecisionDumpWriter::toJson(const DecisionRecord& record)
{
    Json line;
    line["frame"] = record.frameNumber;
    line["timeMs"] = record.timeMs;
    line["readings"] = record.readings;
    line["levels"] = record.levels;
    std::string activePads;
    for (std::size_t pad = 0; pad < DecisionRecord::kPadCount; ++pad) {
        if (record.activePads & (1u << pad)) activePads += static_cast<char>('A' + pad);
    }
    line["activePads"] = activePads;
    line["virtualLevels"] = record.virtualLevels;
    Json activeGroups = Json::array();
    for (std::size_t group = 0; group < DecisionRecord::kVirtualCount; ++group) {
        if (record.activeVirtualPixels & (1u << group)) activeGroups.push_back(VeltoTouch::VirtualImage::groupName(group));
    }
    line["activeVirtualPixels"] = std::move(activeGroups);
    line["svmScore"] = shortest(record.svmScore);
    line["touchScore"] = shortest(record.touchScore);
    line["region"] = Gesture::name(record.activeRegion);
    Json scores = Json::object();
    for (std::size_t region = 0; region < record.regionScores.size(); ++region) {
        scores[std::string(Gesture::name(static_cast<Gesture::Region>(region)))] = shortest(record.regionScores[region]);
    }
    line["regionScores"] = std::move(scores);
    line["tap"] = {{"signalPerDuration", shortest(record.signalPerDuration)},
                   {"signalPerTouchDuration", shortest(record.signalPerTouchDuration)},
                   {"timeDurationRatio", shortest(record.timeDurationRatio)},
                   {"nonActivePixels", record.nonActivePixels},
                   {"score", shortest(record.tapScore)},
                   {"rejected", record.tapRejected}};
    line["flags"] = {{"touching", record.touching},         {"wasTouching", record.wasTouching},
                     {"aboveNoise", record.aboveNoise},     {"holding", record.holding},
                     {"wasHolding", record.wasHolding},     {"holdSuppressed", record.holdSuppressed},
                     {"tapCandidate", record.tapCandidate}, {"tapAccepted", record.tapAccepted}};
    line["phase"] = phaseName(record.phase);
    line["phaseMs"] = record.phaseMs;
    if (record.event) {
        const VeltoHost::GestureFields fields = VeltoHost::GestureFields::of(*record.event);
        line["event"] = {{"gesture", fields.gesture}, {"region", fields.region}, {"phase", fields.phase},
                         {"eventMask", fields.eventMask}};
    }
    line["counters"] = changedEntries(record.countersBefore.statsDictionary().asDictionary(),
                                      record.counters.statsDictionary().asDictionary());
    return line;
}

}  // namespace VeltoTool
