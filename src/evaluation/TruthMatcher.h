#pragma once

#include "evaluation/EvaluationResult.h"
#include "evaluation/RecordingReplay.h"
#include "evaluation/TruthRecord.h"

#include <cstdint>
#include <vector>

namespace VeltoTouch {

// Matches the gestures recognised in one recording against its truth.
//
// The events are first read as gestures: a tap; a hold from hold-start to
// hold-end, which is a slide when its region at the end differs from the one
// it started in; a device reset. May-begin and cancel are no gestures. A
// gesture belongs to a truth whose window holds the gesture's first event:
// from the touch's start to kLateMs after its end (a reset's window starts
// at the reset). A truth is met by
//   tap    a tap in its region
//   hold   a hold in its region that kept it
//   slide  a hold whose region changed to the slide's end region
//   reset  the device-reset event
//   palm, noise  no gesture at all
// Each gesture goes to at most one truth and each truth takes at most one
// gesture: first every gesture that meets a truth, in time order, takes the
// earliest truth it meets; then each remaining gesture takes a remaining
// truth, the touch in progress if any, else the earliest. What no truth
// takes is spurious. Latency is from the truth's start to the deciding
// event: the tap, the hold-start, the hold-change into the end region, the
// reset.
class TruthMatcher {
public:
    static constexpr std::uint64_t kLateMs = 200;

    static EvaluationResult match(const std::vector<TruthRecord>& truths, const RecordingReplay::Outcome& replay);
};

}  // namespace VeltoTouch
