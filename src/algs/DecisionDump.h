#pragma once

#include "algs/DecisionRecord.h"

#include <array>
#include <string>

namespace VeltoTouch {

// The recogniser's per-frame debug texts, drawn from its record of the
// frame: the event counters, then the pads, then the virtual pixels. The
// debug log and the tool's dumps print exactly these, so a dump read from
// either can be compared line for line.
class DecisionDump {
public:
    static constexpr std::size_t kMessageCount = 3;

    // "Frame N @Tms, *** Event Stats ***\n..." and its two followers.
    static std::array<std::string, kMessageCount> messages(const DecisionRecord& record);
    static std::string touchStateDescription(const DecisionRecord& record);
    static std::string virtualStateDescription(const DecisionRecord& record);
};

}  // namespace VeltoTouch
