#include "RandomScript.h"

#include <random>

namespace VeltoTool {

using Action = GestureScript::Action;
using VeltoTouch::PixelRegion;

std::vector<GestureScript::Step> RandomScript::generate(std::uint32_t count, std::uint32_t seed)
{
    // Its own stream, apart from the sensor noise's, which takes the same seed.
    std::mt19937 random(seed ^ 0x5eed5eedu);
    const auto uniform = [&](double low, double high) { return std::uniform_real_distribution<double>(low, high)(random); };
    const auto milliseconds = [&](double low, double high) { return static_cast<std::uint32_t>(uniform(low, high)); };
    const auto region = [&] {
        constexpr PixelRegion kRegions[] = {PixelRegion::Top, PixelRegion::Middle, PixelRegion::Bottom};
        return kRegions[std::uniform_int_distribution<int>(0, 2)(random)];
    };
    // How often each kind is drawn: mostly the gestures people make.
    std::discrete_distribution<int> kind({30, 22, 15, 13, 13, 7});

    std::vector<GestureScript::Step> steps;
    for (std::uint32_t i = 0; i < count; ++i) {
        GestureScript::Step step;
        step.line = static_cast<int>(i) + 1;
        switch (kind(random)) {
        case 0:
            step.action = Action::Tap;
            step.from = step.to = region();
            step.durationMs = milliseconds(60, 220);
            break;
        case 1:
            step.action = Action::Hold;
            step.from = step.to = region();
            step.durationMs = milliseconds(700, 2500);
            break;
        case 2:
            step.action = Action::Slide;
            step.from = region();
            do step.to = region();
            while (step.to == step.from);
            step.durationMs = milliseconds(600, 1600);
            break;
        case 3:
            step.action = Action::Palm;
            step.durationMs = milliseconds(400, 2000);
            break;
        case 4:
            step.action = Action::Noise;
            step.durationMs = milliseconds(200, 1000);
            step.noise = uniform(15, 35);
            break;
        default: step.action = Action::Reset; break;
        }
        if (step.action == Action::Tap || step.action == Action::Hold || step.action == Action::Slide ||
            step.action == Action::Palm) {
            // Within a pad pitch or so of the region's centre, a finger a
            // little narrower or broader, lighter or firmer than the standard.
            step.offsetX = uniform(-0.6, 0.6);
            step.offsetY = uniform(-0.4, 0.4);
            step.sizeScale = uniform(0.8, 1.3);
            step.strengthScale = uniform(0.75, 1.25);
            step.noise = uniform(3, 10);
        }
        steps.push_back(step);
        GestureScript::Step gap;
        gap.action = Action::Idle;
        gap.line = step.line;
        gap.durationMs = milliseconds(100, 800);
        steps.push_back(gap);
    }
    return steps;
}

}  // namespace VeltoTool
