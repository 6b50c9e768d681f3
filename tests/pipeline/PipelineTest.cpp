// Frame gaps, resets and reports of other kinds are pinned by the
// frame-gaps example; here the pipeline's own keys.
#include "pipeline/Pipeline.h"

#include <gtest/gtest.h>

using namespace VeltoTouch;
using VeltoHost::PropertyValue;

TEST(Pipeline, RoutesStateKeys)
{
    Pipeline pipeline;
    EXPECT_TRUE(pipeline.getState("DebugInfo").isDictionary());
    for (const char* unknown : {"debuginfo", "DebugInfo.More", "Algs", "", "Pipeline.DebugInfo"}) {
        EXPECT_TRUE(pipeline.getState(unknown).isNull()) << unknown;
    }
    // Unknown keys are ignored without an error.
    pipeline.setState("Nothing", PropertyValue::uint32(1));
    EXPECT_TRUE(pipeline.getState("Nothing").isNull());
}
