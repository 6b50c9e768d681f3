// Service properties: the "Pipeline" domain, the diagnostic keys and the
// device's own keys, read and written while reports flow; and the device
// failures that properties and start must survive.

#include "platform/devices/SimulatedHostDevice.h"
#include "platform/values/PropertyDictionary.h"
#include "recording/PipelineRecording.h"
#include "service/ServiceHarness.h"
#include "service/ServicePropertyKey.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstdio>
#include <string>
#include <thread>
#include <vector>

using namespace VeltoHost;
using namespace VeltoTouch::Test;
using Frame = VeltoTouch::PipelineRecording::Frame;

namespace {

constexpr std::uint8_t kDebugReportIDs[] = {0x04, 0x10, 0x11, 0x12, 0x13, 0x1D, 0x32, 0x3B, 0x3C, 0x3F};

std::size_t countFrames(const VeltoTouch::PipelineRecording& recording, Frame::Type type)
{
    std::size_t count = 0;
    for (const auto& frame : recording.frames()) count += frame.type == type;
    return count;
}

// "FirmwareDebugReports": ten entries in order, each the failure text with
// the unpadded ID (and `status` when given), except `readable` with `text`.
void expectFirmwareReports(const PropertyValue& reports, const char* status, std::uint8_t readable = 0,
                           const char* text = "")
{
    ASSERT_TRUE(reports.isDictionary());
    ASSERT_EQ(reports.asDictionary().size(), 10u);
    std::size_t index = 0;
    for (const auto& [key, value] : reports.asDictionary()) {
        const std::uint8_t id = kDebugReportIDs[index++];
        char failure[40];
        std::snprintf(failure, sizeof failure, "0x%02x", id);
        EXPECT_EQ(key, failure);
        std::snprintf(failure, sizeof failure, "Failed to get report ID 0x%x: 0x", id);
        if (id == readable) {
            EXPECT_EQ(value, PropertyValue::string(text));
        } else if (*status) {
            EXPECT_EQ(value, PropertyValue::string(failure + std::string(status)));
        } else {
            EXPECT_EQ(value.asString().rfind(failure, 0), 0u) << value.asString();
        }
    }
}

}  // namespace

TEST(ServiceProperties, ReadsAndWritesWhileReportsFlow)
{
    ServiceHarness harness;
    harness.bringUp();

    constexpr int kImages = 1600;
    constexpr int kResetEvery = 200;
    std::atomic<bool> done{false};
    std::thread pusher([&] {
        for (int i = 1; i <= kImages; ++i) {
            harness.push(ReportBytes::image(static_cast<std::uint32_t>(i), static_cast<std::uint32_t>(10 * i)));
            if (i % kResetEvery == 0) harness.push(ReportBytes::deviceReset());
        }
        done = true;
    });

    std::uint32_t written = 0;
    int rounds = 0;
    while (!done || rounds < 3) {
        ++rounds;
        written = 300 + static_cast<std::uint32_t>(rounds);
        EXPECT_TRUE(harness.setProperty("Pipeline.Algs.HoldTimeoutMilliseconds", PropertyValue::uint32(written)));
        EXPECT_EQ(harness.copyProperty("Pipeline.Algs.HoldTimeoutMilliseconds"), PropertyValue::uint32(written));
        EXPECT_TRUE(harness.copyProperty("Pipeline.DebugInfo").asDictionary().get("ResetCount").isNumber());
        PropertyValue text = harness.copyProperty("Recording");
        ASSERT_TRUE(text.isString());
        VeltoTouch::PipelineRecording recording(std::string_view(text.asString()));
        EXPECT_LE(countFrames(recording, Frame::Type::InputReport), 1350u);
        EXPECT_TRUE(harness.copyProperty("ServicePluginDebug").asDictionary().contains("Recording"));
    }
    pusher.join();
    ASSERT_TRUE(harness.collector.waitFor(kImages / kResetEvery));
    harness.queue()->drain();

    // Every report went through; the counters agree with what was pushed.
    PropertyValue info = harness.copyProperty("Pipeline.DebugInfo");
    EXPECT_EQ(info.asDictionary().get("ResetCount"), PropertyValue::uint32(kImages / kResetEvery));
    EXPECT_EQ(info.asDictionary().get("DisjointImageCount"), PropertyValue::uint32(0));

    // The last write is in the recording, keyed relative to the pipeline.
    PropertyValue text = harness.copyProperty("Recording");
    VeltoTouch::PipelineRecording recording(std::string_view(text.asString()));
    const Frame* lastState = nullptr;
    for (const auto& frame : recording.frames()) {
        if (frame.type == Frame::Type::State) lastState = &frame;
        EXPECT_EQ(frame.key.rfind("Pipeline", 0), std::string::npos) << frame.key;
    }
    ASSERT_NE(lastState, nullptr);
    EXPECT_EQ(lastState->key, "Algs.HoldTimeoutMilliseconds");
    EXPECT_EQ(lastState->value.toUInt64(), written);
    EXPECT_EQ(countFrames(recording, Frame::Type::InputReport), 1350u);

    // Reading the recording does not change it; the aggregate holds exactly
    // what the separate reads give when nothing moves.
    EXPECT_EQ(harness.copyProperty("Recording"), text);
    PropertyValue debug = harness.copyProperty("ServicePluginDebug");
    const PropertyDictionary& entries = debug.asDictionary();
    for (const char* key : {"Version", "FirmwareDebugReports", "Recording", "Pipeline.DebugInfo",
                            "Pipeline.Algs.DebugInfo"}) {
        EXPECT_EQ(entries.get(key), harness.copyProperty(key)) << key;
    }
    harness.tearDown();
}

TEST(ServiceProperties, KeysAreRoutedByDomainAndName)
{
    ServiceHarness harness;
    const SimulatedHostDevice::Ref& device = harness.device();
    device->setProperty("Pipeline", PropertyValue::string("device's own"));
    device->setProperty("Recording", PropertyValue::string("stale"));
    harness.bringUp();

    // The domain needs its dot; a bare "Pipeline" belongs to the device.
    EXPECT_EQ(harness.copyProperty("Pipeline"), PropertyValue::string("device's own"));
    // A pipeline key it does not know is null and never reaches the device.
    device->setProperty("Pipeline.Unknown", PropertyValue::string("device"));
    EXPECT_FALSE(harness.copyProperty("Pipeline.Unknown").hasValue());
    EXPECT_TRUE(harness.setProperty("Pipeline.Unknown", PropertyValue::int32(1)));
    EXPECT_FALSE(harness.copyProperty("pipeline.DebugInfo").hasValue());
    EXPECT_FALSE(harness.copyProperty(nullptr).hasValue());
    EXPECT_FALSE(harness.setProperty(nullptr, PropertyValue::int32(1)));

    // Diagnostic keys cannot be written: a write goes to the device and the
    // recording keeps its frames.
    harness.push(ReportBytes::deviceReset());
    ASSERT_TRUE(harness.collector.waitFor(1));
    PropertyValue before = harness.copyProperty("Recording");
    EXPECT_TRUE(harness.setProperty("Recording", PropertyValue::string("x")));
    EXPECT_EQ(device->getProperty("Recording"), PropertyValue::string("x"));
    PropertyValue after = harness.copyProperty("Recording");
    VeltoTouch::PipelineRecording kept(std::string_view(after.asString()));
    EXPECT_EQ(kept.frames().size(), 2u);  // the "Pipeline.Unknown" state and the reset report
    EXPECT_EQ(after, before);
    device->refusePropertyWrites(true);
    EXPECT_FALSE(harness.setProperty("Version", PropertyValue::int32(1)));

    // Every key of the service's table is its own, not the device's: the
    // device's values of the same names never come back.
    for (const VeltoTouch::ServicePropertyKey& key : VeltoTouch::kServicePropertyKeys) {
        device->setProperty(key.name, PropertyValue::string("device's own"));
        EXPECT_NE(harness.copyProperty(key.name), PropertyValue::string("device's own")) << key.name;
    }

    // The firmware reports: hex text for what the device has, the failure
    // text for the rest.
    device->setFeatureReport(0x3C, {0x3C, 0x00, 0xFF});
    expectFirmwareReports(harness.copyProperty("FirmwareDebugReports"), "", 0x3C, "3c 00 ff ");
    EXPECT_FALSE(harness.copyProperty("FactoryResetHoldDuration").hasValue());
    harness.tearDown();
}

TEST(ServiceProperties, DeviceFailuresAreSoft)
{
    // No device for the handle: start reports no resources, and the service
    // still answers everything that does not need the device.
    {
        ServiceHarness harness(false);
        EXPECT_EQ(harness.plugin().Start(harness.pluginRef(), PropertyValue::dictionary({}),
                                         ServiceHarness::kServiceHandle),
                  kVeltoNoResources);
        EXPECT_FALSE(harness.service().open(harness.serviceRef(), 0));
        harness.service().close(harness.serviceRef(), 0);

        expectFirmwareReports(harness.copyProperty("FirmwareDebugReports"), "");
        EXPECT_FALSE(harness.copyProperty("FactoryResetHoldDuration").hasValue());
        EXPECT_FALSE(harness.copyProperty("Product").hasValue());
        EXPECT_FALSE(harness.setProperty("Product", PropertyValue::int32(1)));
        EXPECT_TRUE(harness.copyProperty("Version").isArray());
        EXPECT_TRUE(harness.copyProperty("Pipeline.DebugInfo").isDictionary());
        EXPECT_TRUE(harness.setProperty("Pipeline.Algs.HoldTimeoutMilliseconds", PropertyValue::uint32(5)));

        // Scheduling without a device starts and ends the thread all the same.
        EventCollector collector;
        harness.setCallback(collector);
        harness.schedule();
        harness.unschedule();
        EXPECT_EQ(harness.plugin().Stop(harness.pluginRef()), kVeltoSuccess);
    }

    // A device whose feature reports all fail: ten failure entries carrying
    // the device's status, and no hold duration.
    {
        ServiceHarness harness;
        harness.device()->failGetReport(static_cast<std::int32_t>(0xE00002D8u));
        harness.bringUp();
        PropertyValue reports = harness.copyProperty("FirmwareDebugReports");
        expectFirmwareReports(reports, "e00002d8");
        EXPECT_FALSE(harness.copyProperty("FactoryResetHoldDuration").hasValue());
        EXPECT_EQ(harness.copyProperty("ServicePluginDebug").asDictionary().get("FirmwareDebugReports"), reports);
        harness.tearDown();
    }
}

TEST(ServiceProperties, FactoryResetHoldDurationIsNullUnlessTheReportHasItsLength)
{
    // What the device answers for feature report 0x1F, and what the property
    // makes of it. Which answers the parser takes: fuzz/fuzz_reports.cpp.
    ServiceHarness harness;
    harness.bringUp();
    harness.device()->setFeatureReport(0x1F, {0x1F, 0x10, 0x27, 0x00, 0x00});
    EXPECT_EQ(harness.copyProperty("FactoryResetHoldDuration"), PropertyValue::uint32(10000));
    harness.device()->setFeatureReport(0x1F, {0x1F, 0x10, 0x27, 0x00});  // a byte short
    EXPECT_FALSE(harness.copyProperty("FactoryResetHoldDuration").hasValue());
    harness.tearDown();
}
