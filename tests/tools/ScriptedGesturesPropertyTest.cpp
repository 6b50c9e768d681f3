// Whatever the seed: every tap, hold and slide of a script of ordinary
// fingers, at an ordinary sensor noise, comes out of the real pipeline as
// scripted, and nothing else does.
#include "GestureScript.h"
#include "Synthesizer.h"
#include "evaluation/RecordingReplay.h"
#include "evaluation/TruthMatcher.h"

#include <gtest/gtest.h>

#include <random>
#include <vector>

using namespace VeltoTool;
using VeltoTouch::PixelRegion;
using VeltoTouch::TruthRecord;
using Action = GestureScript::Action;

namespace {

// A script of `count` touches with random kinds, regions, durations within
// what the recogniser is calibrated for, noise and gaps.
std::vector<GestureScript::Step> scriptFor(std::uint32_t seed, double noise, int count)
{
    std::mt19937 random(seed);
    const auto between = [&](std::uint32_t low, std::uint32_t high) {
        return std::uniform_int_distribution<std::uint32_t>(low, high)(random);
    };
    const PixelRegion regions[] = {PixelRegion::Top, PixelRegion::Middle, PixelRegion::Bottom};
    std::vector<GestureScript::Step> steps;
    for (int i = 0; i < count; ++i) {
        GestureScript::Step touch;
        touch.action = std::array{Action::Tap, Action::Hold, Action::Slide}[between(0, 2)];
        touch.from = touch.to = regions[between(0, 2)];
        touch.noise = noise;
        if (touch.action == Action::Tap) touch.durationMs = between(80, 160);
        if (touch.action == Action::Hold) touch.durationMs = between(800, 1500);
        if (touch.action == Action::Slide) {
            touch.to = regions[(between(1, 2) + static_cast<std::uint32_t>(touch.from)) % 3];
            touch.durationMs = between(800, 1200);
        }
        GestureScript::Step gap;
        gap.action = Action::Idle;
        gap.durationMs = between(300, 800);
        gap.noise = noise;
        steps.push_back(touch);
        steps.push_back(gap);
    }
    return steps;
}

TEST(ScriptedGestures, EveryTapHoldAndSlideComesOutAsScriptedWhateverTheSeed)
{
    for (const std::uint32_t seed : {1u, 2u, 3u, 17u, 1234u, 98765u}) {
        for (const double noise : {2.0, Synthesizer::kSensorNoise, 8.0}) {
            SCOPED_TRACE("seed " + std::to_string(seed) + ", noise " + std::to_string(noise));
            const std::vector<GestureScript::Step> script = scriptFor(seed, noise, 12);
            std::vector<TruthRecord> truths;
            VeltoTouch::RecordingReplay replay({});
            Synthesizer(10, seed).synthesize(
                script, [&](const VeltoTouch::PipelineRecording::Frame& frame) { replay.play(frame); },
                [&](const TruthRecord& truth) { truths.push_back(truth); });
            const VeltoTouch::EvaluationResult result = VeltoTouch::TruthMatcher::match(truths, replay.outcome());

            for (const TruthRecord::Kind kind : {TruthRecord::Kind::Tap, TruthRecord::Kind::Hold,
                                                 TruthRecord::Kind::Slide}) {
                const auto& counts = result.counts(kind);
                EXPECT_EQ(counts.met, counts.truths) << "missed " << static_cast<int>(kind);
                EXPECT_EQ(counts.correct, counts.recognised) << "wrong " << static_cast<int>(kind);
            }
            EXPECT_EQ(result.spurious, 0u);
        }
    }
}

}  // namespace
