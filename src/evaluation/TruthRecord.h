#pragma once

#include "records/Gesture.h"

#include <cstdint>
#include <string>
#include <vector>

namespace VeltoTouch {

// What really happened on the surface during one scripted touch of a
// synthesised recording: the ground truth that recognised gestures are
// matched against. One JSON object per line of a truth file:
//   {"kind":"tap","region":"top","start":1200000000,"end":1320000000}
//   {"kind":"slide","region":"top","to":"bottom","start":...,"end":...}
// start and end are host clock ticks on the same time line as the
// recording's frames as a replay sets them (machTimeFromNanoseconds of the
// frame's time stamp), so that an event's time stamp minus start is the time
// from touch-down to the event.
struct TruthRecord {
    enum class Kind { Tap, Hold, Slide, Palm, Noise, Reset };
    using Region = Gesture::Region;

    Kind kind = Kind::Tap;
    // Where the touch was (tap, hold) or began (slide); None for the others.
    Region region = Region::None;
    // Slides: where the touch ended. Equal to region otherwise.
    Region to = Region::None;
    // The first frame the contact touches the surface, and the first frame
    // it is gone again (equal for a reset).
    std::uint64_t start = 0;
    std::uint64_t end = 0;

    static const char* name(Kind kind) noexcept;
    // "tap top", "slide top>bottom", "palm": how a truth or a recognised
    // gesture is shown in the confusion table.
    std::string label() const;

    // One line of JSON, without the line break.
    std::string jsonLine() const;
    // The records of a truth file. Throws std::invalid_argument naming the
    // line and what is wrong with it.
    static std::vector<TruthRecord> parseLines(const std::string& text);

    // Where the truth of a recording is kept unless named otherwise: the
    // recording's name with its extension replaced by ".truth.jsonl"
    // (taps.json -> taps.truth.jsonl; a name without one gets it appended).
    static std::string pathBeside(const std::string& recordingPath);

    friend bool operator==(const TruthRecord&, const TruthRecord&) = default;
};

}  // namespace VeltoTouch
