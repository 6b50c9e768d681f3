#pragma once

#include "pipeline/Pipeline.h"
#include "platform/HidEvent.h"

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace VeltoTouch::Test {

// The pads of a contact (letters A..O) and the raw reading each one sees.
using Contact = std::vector<std::pair<char, std::int16_t>>;

// A real pipeline fed with 73-byte Image reports frame by frame: frame
// numbers from 1, times 10 ms apart from startTimeMs. Collects every event.
class PipelineHarness {
public:
    explicit PipelineHarness(std::uint32_t startTimeMs = 1000);

    // frameCount frames of the contact's readings, every other pad 0.
    void press(const Contact& contact, int frameCount);
    void idle(int frameCount) { press({}, frameCount); }
    void release() { idle(1); }
    // The contact for durationMs (one frame per 10 ms, at least one), then a release frame.
    void tap(const Contact& contact, std::uint32_t durationMs);
    void setState(const std::string& key, VeltoHost::PropertyValue value) { pipeline.setState("Algs." + key, value); }

    // One gesture counter of "Algs.EventStats", e.g. counter("Dispatched", "numTaps").
    std::uint64_t counter(const char* group, const char* name);
    // Events as "phase region #frame", e.g. "may-begin Middle #3"; cleared by take.
    std::vector<std::string> takeEvents();
    const Algs& algs() const { return pipeline.algs(); }

    Pipeline pipeline;

private:
    std::uint32_t _frameNumber = 1;
    std::uint32_t _timeMs;
    std::uint64_t _ticks = 0;
    VeltoHost::HidEventList _events;
};

}  // namespace VeltoTouch::Test
