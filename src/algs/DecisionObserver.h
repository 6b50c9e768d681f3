#pragma once

#include "algs/DecisionRecord.h"

namespace VeltoTouch {

// Receives the recogniser's record of each frame, synchronously, after the
// frame's event and counters are settled. The recogniser builds records only
// while an observer is set, so the live path pays nothing for them.
class DecisionObserver {
public:
    virtual ~DecisionObserver() = default;
    virtual void frameDecided(const DecisionRecord& record) = 0;
};

}  // namespace VeltoTouch
