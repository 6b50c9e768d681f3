#include "EventFormatter.h"

#include "algs/Algs.h"
#include "host/Gesture.h"
#include "pipeline/Util.h"
#include "recording/JsonValue.h"

#include <nlohmann/json.hpp>

#include <cstdio>

namespace VeltoTool {

using VeltoHost::HidEvent;

namespace {

std::int64_t frameNumberOf(const HidEvent& event)
{
    return event.integerValue(VeltoTouch::Algs::kFrameNumberField).value_or(0);
}

}  // namespace

std::string EventFormatter::format(const HidEvent& event) const
{
    const VeltoHost::Gesture meaning = VeltoHost::Gesture::of(event);
    const std::string gesture(VeltoHost::Gesture::name(meaning.kind));
    const std::string region(VeltoHost::Gesture::name(meaning.region));
    if (_jsonLines) {
        nlohmann::ordered_json line;
        line["gesture"] = gesture;
        if (event.kind() == HidEvent::Kind::VendorDefined) {
            line["usagePage"] = event.vendorDefined().usagePage;
            line["usage"] = event.vendorDefined().usage;
        } else {
            const auto& digitizer = event.digitizer();
            line["region"] = region;
            line["frame"] = frameNumberOf(event);
            line["phase"] = event.phase();
            line["eventMask"] = digitizer.eventMask;
            line["y"] = static_cast<std::int64_t>(digitizer.y);
        }
        line["timestamp"] = event.timeStamp();
        return line.dump();
    }

    const std::uint64_t elapsedNs = VeltoTouch::Util::nanosecondsFromMachTime(event.timeStamp() - _originTicks);
    char text[128];
    if (event.kind() == HidEvent::Kind::VendorDefined) {
        std::snprintf(text, sizeof text, "%9.3fs  %-12s (usage page 0x%X, usage %u)", elapsedNs / 1e9,
                      gesture.c_str(), event.vendorDefined().usagePage, event.vendorDefined().usage);
    } else {
        std::snprintf(text, sizeof text, "%9.3fs  %-12s %-7s frame %lld", elapsedNs / 1e9, gesture.c_str(),
                      region.c_str(), static_cast<long long>(frameNumberOf(event)));
    }
    return text;
}

std::string EventFormatter::formatState(const std::string& key, const VeltoHost::PropertyValue& value) const
{
    if (_jsonLines) {
        nlohmann::ordered_json line;
        line["key"] = key;
        line["value"] = VeltoTouch::JsonValue::toJson(value);
        return VeltoTouch::JsonValue::dump(line, false);
    }
    return key + " = " + VeltoTouch::JsonValue::write(value, false);
}

}  // namespace VeltoTool
