#include "records/ReportBytes.h"
#include "pipeline/Pipeline.h"
#include "platform/PropertyDictionary.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

using namespace VeltoTouch;
using VeltoHost::PropertyValue;

namespace {

// A pipeline that notes each gap in the frame numbers it is given.
struct ProbedPipeline {
    Pipeline pipeline;
    std::vector<std::pair<std::uint32_t, std::uint32_t>> gaps;

    ProbedPipeline()
    {
        pipeline.disjointImageProbe = [this](std::uint32_t previous, const InputReport::Image& image) {
            gaps.emplace_back(previous, image.frameNumber);
        };
    }

    void send(const std::vector<std::uint8_t>& bytes) { pipeline.handleInputReport(bytes.data(), bytes.size()); }

    std::uint32_t debugInfo(const char* key)
    {
        return static_cast<std::uint32_t>(pipeline.getState("DebugInfo").asDictionary().get(key).toUInt64());
    }
};

}  // namespace

TEST(Pipeline, CountsFrameGapsIncludingAcrossResetsAndWrapAround)
{
    ProbedPipeline p;
    p.send(ReportBytes::image(5, 0));  // the first image is never a gap
    p.send(ReportBytes::image(6, 10));
    p.send(ReportBytes::image(8, 20));
    EXPECT_EQ(p.gaps, (std::vector<std::pair<std::uint32_t, std::uint32_t>>{{6, 8}}));
    EXPECT_EQ(p.debugInfo("DisjointImageCount"), 1u);

    p.send(ReportBytes::firmwareEvent(0));  // does not forget frame 8
    p.send(ReportBytes::image(0, 30));
    EXPECT_EQ(p.debugInfo("DisjointImageCount"), 2u);

    p.send(ReportBytes::image(0xFFFFFFFFu, 40));
    p.send(ReportBytes::image(0, 50));  // wrap-around is continuous
    EXPECT_EQ(p.debugInfo("DisjointImageCount"), 3u);
    EXPECT_EQ(p.gaps.back(), (std::pair<std::uint32_t, std::uint32_t>{0, 0xFFFFFFFFu}));
}

TEST(Pipeline, RoutesStateKeys)
{
    ProbedPipeline p;
    EXPECT_TRUE(p.pipeline.getState("DebugInfo").isDictionary());
    for (const char* unknown : {"debuginfo", "DebugInfo.More", "Algs", "", "Pipeline.DebugInfo"}) {
        EXPECT_TRUE(p.pipeline.getState(unknown).isNull()) << unknown;
    }
    // Unknown keys are ignored without an error.
    p.pipeline.setState("Nothing", PropertyValue::uint32(1));
    EXPECT_TRUE(p.pipeline.getState("Nothing").isNull());
}
