#pragma once

#include "bus/GestureFields.h"
#include "platform/plugin/HidEvent.h"
#include "platform/values/PropertyValue.h"

#include <cstdint>
#include <optional>
#include <string>

namespace VeltoTool {

// How the tool prints gesture events: a readable line, or one JSON object per
// line in the shape scripts rely on:
//   {"gesture":"tap","region":"middle","frame":1234,"phase":0,"eventMask":131072,"y":1,"timestamp":987654321}
//   {"gesture":"device-reset","usagePage":65376,"usage":2,"timestamp":987654321}
class EventFormatter {
public:
    // Readable lines show the time since `originTicks` (the first event of a
    // run, or the start of playback), so that they do not change from run to run.
    explicit EventFormatter(bool jsonLines, std::uint64_t originTicks = 0)
        : _jsonLines(jsonLines), _originTicks(originTicks)
    {
    }

    void setOrigin(std::uint64_t ticks) noexcept { _originTicks = ticks; }

    std::string format(const VeltoHost::HidEvent& event) const;
    // An event watched from elsewhere (the daemon's signals). With `device`,
    // the line says which device sent it: "device 1  " before a readable
    // line, a leading "device" member in a JSON one.
    std::string format(const VeltoHost::GestureFields& fields, std::optional<unsigned> device = {}) const;
    // A state or property read: {"key":"Algs.EventStats","value":{...}} or "KEY = VALUE".
    std::string formatState(const std::string& key, const VeltoHost::PropertyValue& value) const;

private:
    bool _jsonLines;
    std::uint64_t _originTicks;
};

}  // namespace VeltoTool
