#include "GestureScript.h"
#include "Synthesizer.h"
#include "records/InputReport.h"

#include <gtest/gtest.h>

#include <string>

using namespace VeltoTool;
namespace InputReport = VeltoTouch::InputReport;

namespace {

struct ResetCount {
    int resets = 0;
    // Images between the first report and the reset, and after it.
    int imagesBefore = 0;
    int imagesAfter = 0;
};

ResetCount resetsIn(const std::string& script)
{
    Synthesizer synthesizer(10, 7);
    const VeltoTouch::PipelineRecording recording = synthesizer.synthesize(GestureScript::parse(script));
    ResetCount count;
    for (const auto& frame : recording.frames()) {
        if (auto event = InputReport::FirmwareEvent::parse(frame.report.data(), frame.report.size())) {
            if (event->event == InputReport::FirmwareEvent::kEventDeviceReset) ++count.resets;
        } else {
            ++(count.resets == 0 ? count.imagesBefore : count.imagesAfter);
        }
    }
    return count;
}

}  // namespace

TEST(Synthesizer, EveryResetAskedForDuringAHoldIsSent)
{
    // Lead-in 200 ms = 20 frames; the release gap after a touch 150 ms = 15.
    struct Case {
        const char* script;
        int imagesBefore;
        int imagesAfter;
    };
    const Case cases[] = {
        {"hold top 1s reset@500ms", 20 + 50, 50 + 15},
        // A reset time that rounds to the end of the touch still falls within
        // it: before its last frame.
        {"hold top 600ms reset@596ms", 20 + 59, 1 + 15},
        {"hold middle 14ms reset@13ms", 20 + 0, 1 + 15},
        {"hold bottom 1s reset@0ms", 20 + 0, 100 + 15},
    };
    for (const Case& c : cases) {
        const ResetCount count = resetsIn(c.script);
        EXPECT_EQ(count.resets, 1) << c.script;
        EXPECT_EQ(count.imagesBefore, c.imagesBefore) << c.script;
        EXPECT_EQ(count.imagesAfter, c.imagesAfter) << c.script;
    }
}
