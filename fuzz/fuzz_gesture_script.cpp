// Any text as a synth script. Parsing must end (no crash, no hang) either in
// steps that say what the text said or in a ToolError whose message is the one
// line the tool prints, naming a line of the script. Scripts short enough to
// synthesise quickly are synthesised, and the reports must be what a device
// would send for them: one image per frame period with consecutive frame
// numbers, and every reset the script asked for.
#include "FuzzInput.h"
#include "GestureScript.h"
#include "Synthesizer.h"
#include "ToolError.h"
#include "records/InputReport.h"
#include "recording/PipelineRecording.h"

#include <algorithm>
#include <cstdio>
#include <exception>
#include <string>
#include <vector>

namespace {

using VeltoTool::GestureScript;
using VeltoTouch::PipelineRecording;
using VeltoTouch::PixelRegion;
using Action = GestureScript::Action;
namespace InputReport = VeltoTouch::InputReport;

constexpr std::uint32_t kFramePeriodMs = 10;
constexpr std::uint32_t kLongestHourMs = 3'600'000;
// Synthesis costs a frame per period; longer scripts are only parsed.
constexpr std::uint64_t kLongestSynthesisMs = 10'000;

void checkError(const std::string& message, const std::string& text)
{
    VELTO_FUZZ_CHECK(message.find('\n') == std::string::npos);
    VELTO_FUZZ_CHECK(message.find('\r') == std::string::npos);
    const std::string prefix = "script line ";
    VELTO_FUZZ_CHECK(message.compare(0, prefix.size(), prefix) == 0);
    const long line = std::strtol(message.c_str() + prefix.size(), nullptr, 10);
    VELTO_FUZZ_CHECK(line >= 1 && line <= std::count(text.begin(), text.end(), '\n') + 1);
}

void checkSteps(const std::vector<GestureScript::Step>& steps, const std::string& text)
{
    const long lines = std::count(text.begin(), text.end(), '\n') + 1;
    int previousLine = 1;
    for (const GestureScript::Step& step : steps) {
        VELTO_FUZZ_CHECK(step.line >= previousLine && step.line <= lines);
        previousLine = step.line;
        VELTO_FUZZ_CHECK(step.durationMs <= kLongestHourMs);
        const bool touch = step.action == Action::Tap || step.action == Action::Hold || step.action == Action::Slide;
        VELTO_FUZZ_CHECK(touch == (step.from != PixelRegion::None));
        VELTO_FUZZ_CHECK(touch == (step.to != PixelRegion::None));
        if (step.action != Action::Slide) VELTO_FUZZ_CHECK(step.from == step.to);
        if (step.resetAtMs) {
            VELTO_FUZZ_CHECK(step.action == Action::Hold);
            VELTO_FUZZ_CHECK(*step.resetAtMs < step.durationMs);
        }
        if (step.action == Action::Reset) VELTO_FUZZ_CHECK(step.durationMs == 0);
    }
}

std::uint64_t scriptLengthMs(const std::vector<GestureScript::Step>& steps)
{
    std::uint64_t total = VeltoTool::Synthesizer::kLeadInMs;
    for (const GestureScript::Step& step : steps) total += step.durationMs + VeltoTool::Synthesizer::kReleaseGapMs;
    return total;
}

void checkSynthesis(const std::vector<GestureScript::Step>& steps)
{
    VeltoTool::Synthesizer synthesizer(kFramePeriodMs, 7);
    PipelineRecording recording = synthesizer.synthesize(steps);

    const auto askedResets = std::count_if(steps.begin(), steps.end(), [](const GestureScript::Step& step) {
        return step.action == Action::Reset || step.resetAtMs.has_value();
    });
    long resets = 0;
    std::uint32_t images = 0;
    std::uint64_t previousNs = 0;
    for (const PipelineRecording::Frame& frame : recording.frames()) {
        VELTO_FUZZ_CHECK(frame.type == PipelineRecording::Frame::Type::InputReport);
        VELTO_FUZZ_CHECK(frame.timestampNs >= previousNs);
        previousNs = frame.timestampNs;
        if (auto image = InputReport::Image::parse(frame.report.data(), frame.report.size())) {
            VELTO_FUZZ_CHECK(image->frameNumber == images + 1);
            VELTO_FUZZ_CHECK(image->timeMs == 1000 + images * kFramePeriodMs);
            ++images;
        } else {
            const auto event = InputReport::FirmwareEvent::parse(frame.report.data(), frame.report.size());
            VELTO_FUZZ_CHECK(event && event->event == InputReport::FirmwareEvent::kEventDeviceReset);
            ++resets;
        }
    }
    VELTO_FUZZ_CHECK(resets == askedResets);
    VELTO_FUZZ_CHECK(images * kFramePeriodMs >= VeltoTool::Synthesizer::kLeadInMs);

    const std::string written = recording.json();
    const PipelineRecording again{std::string_view(written)};
    VELTO_FUZZ_CHECK(again.frames().size() == recording.frames().size());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string text(reinterpret_cast<const char*>(data), size);
    std::vector<GestureScript::Step> steps;
    try {
        steps = GestureScript::parse(text);
    } catch (const VeltoTool::ToolError& error) {
        checkError(error.what(), text);
        return 0;
    } catch (const std::exception& error) {
        std::fprintf(stderr, "script parse threw something other than ToolError: %s\n", error.what());
        std::abort();
    }
    checkSteps(steps, text);
    // The same text parses to the same steps.
    const std::vector<GestureScript::Step> again = GestureScript::parse(text);
    VELTO_FUZZ_CHECK(again.size() == steps.size());

    if (scriptLengthMs(steps) <= kLongestSynthesisMs) checkSynthesis(steps);
    return 0;
}
