#pragma once

#include "ContactModel.h"
#include "GestureScript.h"
#include "evaluation/TruthRecord.h"
#include "recording/PipelineRecording.h"

#include <cstdint>
#include <functional>
#include <vector>

namespace VeltoTool {

// Turns a gesture script into the input reports a device would send: one
// Image report per frame period, with the contact model's readings, frame
// numbers counting up from 1 and device time from 1000 ms.
//
// Every recording starts with kLeadInMs of untouched surface, and every touch
// (tap, hold, slide, palm) is followed by kReleaseGapMs without touch, so that
// consecutive gestures are separate touches.
class Synthesizer {
public:
    static constexpr std::uint32_t kLeadInMs = 200;
    static constexpr std::uint32_t kReleaseGapMs = 150;
    // Fingers do not arrive or leave within one frame.
    static constexpr std::uint32_t kRiseMs = 30;
    static constexpr std::uint32_t kFallMs = 20;
    static constexpr double kSensorNoise = 5.0;
    static constexpr double kHeavyNoise = 25.0;

    using FrameSink = std::function<void(const VeltoTouch::PipelineRecording::Frame&)>;
    // The truth of each touch, noise and reset, in the order they begin.
    using TruthSink = std::function<void(const VeltoTouch::TruthRecord&)>;

    Synthesizer(std::uint32_t framePeriodMs, std::uint32_t seed);

    // Hands each frame to `sink` as soon as it is made, so that a script of
    // any length is synthesised in constant memory.
    void synthesize(const std::vector<GestureScript::Step>& steps, const FrameSink& sink,
                    const TruthSink& truth = {});
    // The whole recording at once, for short scripts.
    VeltoTouch::PipelineRecording synthesize(const std::vector<GestureScript::Step>& steps);

private:
    void idle(std::uint32_t durationMs, double noise);
    void touch(const GestureScript::Step& step);
    void resetReport();
    void tellTruth(VeltoTouch::TruthRecord::Kind kind, const GestureScript::Step& step, std::uint64_t start,
                   std::uint64_t end);
    // The host clock ticks at which the next report will be stamped.
    std::uint64_t nextTicks() const;
    void appendImage(const ContactModel::Readings& readings);
    void appendReport(std::vector<std::uint8_t> report);
    std::uint32_t frameCount(std::uint32_t durationMs) const;

    std::uint32_t _framePeriodMs;
    ContactModel _model;
    const FrameSink* _sink = nullptr;
    const TruthSink* _truth = nullptr;
    std::uint32_t _frameNumber = 1;
    std::uint32_t _timeMs = 1000;
};

}  // namespace VeltoTool
