#pragma once

#include "pipeline/Pipeline.h"

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace VeltoTouch::Test {

// The pads of a contact (letters A..O) and the raw reading each one sees.
using Contact = std::vector<std::pair<char, std::int16_t>>;

// A real pipeline fed with 73-byte Image reports frame by frame: frame
// numbers from 1, times 10 ms apart from startTimeMs. Gesture scenarios are
// recordings in examples/ (scripts/make-scenarios); this drives the
// recogniser where a test reads its state.
class PipelineHarness {
public:
    explicit PipelineHarness(std::uint32_t startTimeMs = 1000);

    // frameCount frames of the contact's readings, every other pad 0.
    void press(const Contact& contact, int frameCount);
    void idle(int frameCount) { press({}, frameCount); }
    void release() { idle(1); }
    void setState(const std::string& key, VeltoHost::PropertyValue value) { pipeline.setState("Algs." + key, value); }

    const Algs& algs() const { return pipeline.algs(); }

    Pipeline pipeline;

private:
    std::uint32_t _frameNumber = 1;
    std::uint32_t _timeMs;
    std::uint64_t _ticks = 0;
};

}  // namespace VeltoTouch::Test
