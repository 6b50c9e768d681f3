#include "EventFormatter.h"

#include "bus/GestureFields.h"
#include "recording/JsonValue.h"
#include "records/TickConversion.h"

#include <nlohmann/json.hpp>

#include <cstdio>

namespace VeltoTool {

using VeltoHost::HidEvent;

std::string EventFormatter::format(const HidEvent& event) const
{
    return format(VeltoHost::GestureFields::of(event));
}

std::string EventFormatter::format(const VeltoHost::GestureFields& fields, std::optional<unsigned> device) const
{
    if (_jsonLines) {
        nlohmann::ordered_json line;
        if (device) line["device"] = *device;
        line["gesture"] = fields.gesture;
        if (fields.isDeviceReset) {
            line["usagePage"] = fields.usagePage;
            line["usage"] = fields.usage;
        } else {
            line["region"] = fields.region;
            line["frame"] = fields.frame;
            line["phase"] = fields.phase;
            line["eventMask"] = fields.eventMask;
            line["y"] = fields.y;
        }
        line["timestamp"] = fields.timestamp;
        return line.dump();
    }

    const std::uint64_t elapsedNs = VeltoTouch::Util::nanosecondsFromMachTime(fields.timestamp - _originTicks);
    char text[160];
    const std::string source = device ? "device " + std::to_string(*device) + "  " : "";
    if (fields.isDeviceReset) {
        std::snprintf(text, sizeof text, "%s%9.3fs  %-12s (usage page 0x%X, usage %u)", source.c_str(),
                      elapsedNs / 1e9, fields.gesture.c_str(), fields.usagePage, fields.usage);
    } else {
        std::snprintf(text, sizeof text, "%s%9.3fs  %-12s %-7s frame %lld", source.c_str(), elapsedNs / 1e9,
                      fields.gesture.c_str(), fields.region.c_str(), static_cast<long long>(fields.frame));
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
