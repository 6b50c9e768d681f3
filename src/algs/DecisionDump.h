#pragma once

#include "algs/DecisionRecord.h"

#include <cstddef>
#include <string>

namespace VeltoTouch {

// The recogniser's per-frame debug texts, drawn from its record of the
// frame: the event counters, then the pads, then the virtual pixels. The
// debug log and the tool's dumps print exactly these, so a dump read from
// either can be compared line for line.
class DecisionDump {
public:
    static constexpr std::size_t kMessageCount = 3;

    // Message 0, 1 or 2 of the frame: "Frame N @Tms, *** Event Stats ***\n...",
    // then the touch and the virtual state descriptions.
    static std::string message(std::size_t which, const DecisionRecord& record);
    static std::string touchStateDescription(const DecisionRecord& record);
    static std::string virtualStateDescription(const DecisionRecord& record);
};

}  // namespace VeltoTouch
