#include "ReportBytes.h"
#include "algs/Algs.h"
#include "pipeline/Pipeline.h"
#include "platform/PropertyDictionary.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

using namespace VeltoTouch;
using VeltoHost::HidEvent;
using VeltoHost::HidEventList;
using VeltoHost::PropertyValue;

namespace {

// A pipeline with every probe installed, writing what it sees to a trace.
struct ProbedPipeline {
    Pipeline pipeline;
    std::vector<std::string> calls;
    std::vector<HidEventList> batches;
    std::vector<std::pair<std::uint32_t, std::uint32_t>> gaps;

    ProbedPipeline()
    {
        pipeline.setTimeProbe = [this](std::uint64_t time) { calls.push_back("time " + std::to_string(time)); };
        pipeline.setStateProbe = [this](const std::string& key, const PropertyValue&) { calls.push_back("set " + key); };
        pipeline.getStateProbe = [this](const std::string& key) { calls.push_back("get " + key); };
        pipeline.inputReportProbe = [this](const std::uint8_t*, std::size_t length) {
            calls.push_back("report " + std::to_string(length));
        };
        pipeline.invalidInputReportProbe = [this](const std::uint8_t*, std::size_t length) {
            calls.push_back("invalid " + std::to_string(length));
        };
        pipeline.firmwareEventProbe = [this](const InputReport::FirmwareEvent& event) {
            calls.push_back("firmware " + std::to_string(event.event));
        };
        pipeline.imageProbe = [this](const InputReport::Image& image) {
            calls.push_back("image " + std::to_string(image.frameNumber));
        };
        pipeline.disjointImageProbe = [this](std::uint32_t previous, const InputReport::Image& image) {
            gaps.emplace_back(previous, image.frameNumber);
        };
        pipeline.hidEventsProbe = [this](const HidEventList& events) { batches.push_back(events); };
    }

    void send(const std::vector<std::uint8_t>& bytes) { pipeline.handleInputReport(bytes.data(), bytes.size()); }

    std::uint32_t debugInfo(const char* key)
    {
        return static_cast<std::uint32_t>(pipeline.getState("DebugInfo").asDictionary().get(key).toUInt64());
    }
};

}  // namespace

TEST(Pipeline, RoutesReportsByKind)
{
    ProbedPipeline p;
    p.send(ReportBytes::firmwareEvent(1));
    p.send(ReportBytes::image(10, 100));
    p.send({0x02, 0x00, 1, 2, 3, 4, 5, 6, 7});  // nine bytes: neither firmware event nor image
    p.pipeline.handleInputReport(nullptr, 0);
    p.send({0x07, 0, 0});

    std::vector<std::string> expected{"report 10", "firmware 1", "report 73", "image 10", "report 9",
                                      "invalid 9", "report 0",   "invalid 0", "report 3",  "invalid 3"};
    EXPECT_EQ(p.calls, expected);
    // A firmware event other than a reset changes nothing and emits nothing;
    // an idle frame emits nothing either, so the output probe never ran.
    EXPECT_TRUE(p.batches.empty());
    EXPECT_EQ(p.debugInfo("ResetCount"), 0u);
}

TEST(Pipeline, DeviceResetEmitsRecogniserEventsThenOneVendorEventStamped)
{
    ProbedPipeline p;
    p.pipeline.setTime(5555);
    p.send(ReportBytes::firmwareEvent(0, {9, 9, 9, 9, 9, 9, 9, 9}));

    ASSERT_EQ(p.batches.size(), 1u);
    const HidEventList& events = p.batches[0];
    ASSERT_FALSE(events.empty());
    const auto& vendor = events.back();
    EXPECT_EQ(vendor->kind(), HidEvent::Kind::VendorDefined);
    EXPECT_EQ(vendor->vendorDefined().usagePage, 0xFF60u);
    EXPECT_EQ(vendor->vendorDefined().usage, 2u);
    EXPECT_EQ(vendor->vendorDefined().version, 0u);
    EXPECT_TRUE(vendor->vendorDefined().payload.empty());
    EXPECT_FALSE(vendor->integerValue(Algs::kFrameNumberField).has_value());
    for (std::size_t i = 0; i + 1 < events.size(); ++i) EXPECT_EQ(events[i]->kind(), HidEvent::Kind::Digitizer);
    for (const auto& event : events) EXPECT_EQ(event->timeStamp(), 5555u);
    EXPECT_EQ(p.debugInfo("ResetCount"), 1u);

    p.send(ReportBytes::firmwareEvent(0));
    EXPECT_EQ(p.debugInfo("ResetCount"), 2u);
    EXPECT_EQ(p.batches.size(), 2u);
}

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
    PropertyValue info = p.pipeline.getState("DebugInfo");
    ASSERT_TRUE(info.isDictionary());
    ASSERT_EQ(info.asDictionary().size(), 2u);
    EXPECT_EQ(info.asDictionary().get("ResetCount"), PropertyValue::uint32(0));
    EXPECT_EQ(info.asDictionary().get("DisjointImageCount"), PropertyValue::uint32(0));

    for (const char* unknown : {"debuginfo", "DebugInfo.More", "Algs", "", "Pipeline.DebugInfo"}) {
        EXPECT_TRUE(p.pipeline.getState(unknown).isNull()) << unknown;
    }
    // Unknown keys are ignored without an error; "Algs." keys reach the recogniser.
    p.pipeline.setState("Nothing", PropertyValue::uint32(1));
    p.pipeline.setState("Algs.NoSuchKey", PropertyValue::uint32(1));
    EXPECT_TRUE(p.pipeline.getState("Algs.NoSuchKey").isNull());

    std::vector<std::string> expected{"get DebugInfo", "get debuginfo", "get DebugInfo.More", "get Algs",
                                      "get ",          "get Pipeline.DebugInfo", "set Nothing", "set Algs.NoSuchKey",
                                      "get Algs.NoSuchKey"};
    EXPECT_EQ(p.calls, expected);
}

TEST(Pipeline, EventsCarryTheLastTimeSet)
{
    Pipeline pipeline;
    std::vector<std::uint64_t> stamps;
    pipeline.hidEventsProbe = [&](const HidEventList& events) {
        for (const auto& event : events) stamps.push_back(event->timeStamp());
    };
    auto reset = ReportBytes::firmwareEvent(0);
    pipeline.handleInputReport(reset.data(), reset.size());  // before any setTime: 0
    pipeline.setTime(42);
    pipeline.setTime(43);
    pipeline.handleInputReport(reset.data(), reset.size());
    ASSERT_GE(stamps.size(), 2u);
    EXPECT_EQ(stamps.front(), 0u);
    EXPECT_EQ(stamps.back(), 43u);
}

TEST(Pipeline, EventConstructorsSetTheGestureFields)
{
    auto tap = Algs::createTapEvent(PixelRegion::Top);
    EXPECT_EQ(tap->kind(), HidEvent::Kind::Digitizer);
    EXPECT_EQ(tap->digitizer().transducerType, 2u);
    EXPECT_EQ(tap->digitizer().eventMask, 0x00020000u);
    EXPECT_EQ(tap->digitizer().y, 3.0);
    EXPECT_EQ(tap->phase(), 0);
    EXPECT_EQ(tap->timeStamp(), 0u);
    EXPECT_FALSE(tap->digitizer().range);
    EXPECT_FALSE(tap->digitizer().touch);

    struct Expected {
        VeltoHost::HidEventRef event;
        std::uint32_t eventMask;
        double y;
        std::uint16_t phase;
    };
    const Expected cases[] = {
        {Algs::createMayBeginEvent(PixelRegion::None), 0, 0.0, 0x80},
        {Algs::createHoldStartEvent(PixelRegion::Bottom), 2, 2.0, 0x01},
        {Algs::createHoldChangeEvent(PixelRegion::Middle), 2, 1.0, 0x02},
        {Algs::createHoldEndEvent(PixelRegion::Top), 2, 3.0, 0x04},
        {Algs::createCancelEvent(), 0, 0.0, 0x08},
    };
    for (const Expected& c : cases) {
        const auto& d = c.event->digitizer();
        EXPECT_EQ(d.eventMask, c.eventMask);
        EXPECT_EQ(d.y, c.y);
        EXPECT_EQ(c.event->phase(), c.phase);
        EXPECT_EQ(d.x, 0.0);
        EXPECT_EQ(d.index, 0u);
        EXPECT_EQ(d.identity, 0u);
        EXPECT_EQ(d.buttonMask, 0u);
        EXPECT_EQ(d.options, 0u);
    }
}
