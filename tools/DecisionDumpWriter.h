#pragma once

#include "algs/DecisionObserver.h"

#include <nlohmann/json.hpp>

#include <ostream>

namespace VeltoTool {

// Prints the recogniser's record of every frame as `replay --dump` shows it:
// as text, the three debug messages of the frame (counters, pads, virtual
// pixels), exactly as the debug log writes them; as JSON Lines, the record
// itself as one object per frame (toJson).
class DecisionDumpWriter final : public VeltoTouch::DecisionObserver {
public:
    enum class Format { Text, JsonLines };

    DecisionDumpWriter(std::ostream& out, Format format) : _out(out), _format(format) {}
    void frameDecided(const VeltoTouch::DecisionRecord& record) override;

    // {"frame", "timeMs", "readings", "levels", "activePads", "virtualLevels",
    //  "activeVirtualPixels", "svmScore", "touchScore", "region", "regionScores",
    //  "tap": {...}, "flags": {...}, "phase", "phaseMs", "event" (when one was
    //  emitted), "counters" (those this frame moved, with their new values)}
    static nlohmann::ordered_json toJson(const VeltoTouch::DecisionRecord& record);

private:
    std::ostream& _out;
    Format _format;
};

}  // namespace VeltoTool
