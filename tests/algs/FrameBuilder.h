#pragma once

#include "pipeline/Pipeline.h"
#include "platform/HidEvent.h"

#include <array>
#include <cstdint>
#include <initializer_list>
#include <string>
#include <utility>
#include <vector>

namespace VeltoTouch::Test {

// Pad index of a pad letter A..O.
constexpr int pad(char letter) { return letter - 'A'; }

// The pads of a contact and the raw reading each one sees.
using Contact = std::vector<std::pair<char, std::int16_t>>;

// Builds 73-byte Image reports frame by frame: the current contact's
// readings, a frame number that rises by one and a time that advances by the
// frame interval with each frame taken.
class FrameBuilder {
public:
    explicit FrameBuilder(std::uint32_t firstFrameNumber = 1, std::uint32_t startTimeMs = 1000,
                          std::uint32_t intervalMs = 10);

    void setContact(const Contact& contact);  // these readings, every other pad 0
    // The report of the current frame; the next frame comes one interval later.
    std::vector<std::uint8_t> next();
    std::uint32_t intervalMs() const { return _intervalMs; }

private:
    std::uint32_t _frameNumber;
    std::uint32_t _timeMs;
    std::uint32_t _intervalMs;
    std::array<std::int16_t, 15> _readings{};
};

// A real pipeline fed by a FrameBuilder, collecting every event it emits.
class PipelineHarness {
public:
    PipelineHarness();

    // n frames of the current readings (idle after construction or release).
    void frames(int n);
    void idle(int n);
    // The contact for durationMs (one frame per interval, at least one), then
    // one release frame with every pad at 0.
    void tap(const Contact& contact, std::uint32_t durationMs);
    void press(const Contact& contact, int frameCount);
    void release();
    // The device announces a reset (firmware event 0).
    void deviceReset();
    void setState(const std::string& key, VeltoHost::PropertyValue value) { pipeline.setState("Algs." + key, value); }

    // Events as "phase region #frame", e.g. "may-begin Middle #3"; cleared by take.
    std::vector<std::string> takeEvents();
    const Algs& algs() const { return pipeline.algs(); }

    Pipeline pipeline;
    FrameBuilder builder;
    VeltoHost::HidEventList events;

private:
    void send(const std::vector<std::uint8_t>& report);
    std::uint64_t _ticks = 0;
};

std::string describeEvent(const VeltoHost::HidEvent& event);

}  // namespace VeltoTouch::Test
