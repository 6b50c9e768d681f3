#include "EmulateCommand.h"
#include "ToolError.h"
#include "ToolFiles.h"
#include "ToolTestSupport.h"
#include "platform/devices/FakeUhidKernel.h"
#include "recording/HidRecorderReader.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <sstream>
#include <thread>
#include <utility>
#include <vector>

using namespace VeltoTool;
using namespace VeltoTool::Testing;
using VeltoTouch::HidRecorderReader;
using VeltoTouch::PipelineRecording;

namespace {

using Bytes = std::vector<std::uint8_t>;
using Reports = std::vector<std::pair<std::uint64_t, Bytes>>;

const std::string kTwoDevices = kExamples + "/hid-recorder-two-devices.hid";

// The input reports of a recording file with their times, and how many other frames it has.
Reports reportsIn(const std::string& path, std::size_t* others = nullptr,
                  std::optional<std::uint32_t> hidDevice = std::nullopt)
{
    Reports reports;
    const PipelineRecording recording = ToolFiles::readRecording(path, hidDevice);
    for (const auto& frame : recording.frames()) {
        if (frame.type == PipelineRecording::Frame::Type::InputReport) {
            reports.emplace_back(frame.timestampNs, frame.report);
        } else if (others) {
            ++*others;
        }
    }
    return reports;
}

bool isHidRecorder(const std::string& path) { return HidRecorderReader::opens(readFile(path)); }

}  // namespace

// Each sample to the other format and back: the same reports, byte for byte,
// at the same times to the microsecond, counted from the recording's first
// frame (a hid-recorder text counts from its start already).
TEST(ConvertCommand, EveryExampleGoesToTheOtherFormatAndBackWithItsReportsAndTheirMicroseconds)
{
    TempDir dir;
    const std::vector<std::string> names = exampleNames();
    ASSERT_NE(std::find(names.begin(), names.end(), "hid-recorder-two-devices"), names.end());
    for (const std::string& name : names) {
        SCOPED_TRACE(name);
        const std::string original = examplePath(name);
        const bool fromHid = isHidRecorder(original);
        std::size_t stateFrames = 0;
        Reports expected = reportsIn(original, &stateFrames);
        ASSERT_FALSE(expected.empty());
        if (!fromHid) {
            const std::uint64_t startNs = PipelineRecording(std::string_view(readFile(original))).frames().front().timestampNs;
            for (auto& [timeNs, bytes] : expected) timeNs = (timeNs - startNs) / 1000 * 1000;
        }
        const std::string there = dir.file(name + ".there").string();
        const std::string back = dir.file(name + ".back").string();
        // The other format by default, the original's named.
        const ToolRun toOther = runTool({"convert", original, "-o", there});
        ASSERT_EQ(toOther.status, 0) << toOther.err;
        const ToolRun toOriginal = runTool({"convert", there, "-o", back, "--format", fromHid ? "hid" : "container"});
        ASSERT_EQ(toOriginal.status, 0) << toOriginal.err;

        EXPECT_NE(isHidRecorder(there), fromHid);
        EXPECT_EQ(isHidRecorder(back), fromHid);
        EXPECT_EQ(reportsIn(there), expected);
        EXPECT_EQ(reportsIn(back), expected);
        EXPECT_EQ(toOther.err, stateFrames == 0 ? ""
                                                : "veltotouch: note: " + original + ": " + std::to_string(stateFrames) +
                                                      (stateFrames == 1 ? " state frame" : " state frames") +
                                                      " left out (a hid-recorder file holds input reports only)\n");
        EXPECT_EQ(toOriginal.err, "");
    }
}

TEST(ConvertCommand, WhatCannotBeConvertedIsRefusedAndAnEarlierOutputKept)
{
    TempDir dir;
    const std::string output = dir.file("output", "previous output\n").string();
    const std::string cutLine = dir.file("cut.hid", "# c\nD: 0\nR: 2 01\n").string();
    const std::string early =
        dir.file("early.json", R"({"Version": 1, "Frames": [
            {"Type": "InputReport", "Timestamp": 5000, "Report": "01 "},
            {"Type": "InputReport", "Timestamp": 4000, "Report": "02 "}]})")
            .string();
    struct Case {
        std::vector<std::string> arguments;
        int status;
        std::string error;
    };
    const Case cases[] = {
        {{cutLine, "-o", output}, 1, cutLine + ":3: report descriptor length 2 but 1 byte"},
        {{early, "-o", output}, 1,
         early + ": an input report at 4000 ns comes before the recording's start at 5000 ns"},
        {{early, "-o", output, "--format", "xml"}, 2,
         "--format: unknown format \"xml\" (container or hid) (see 'veltotouch help convert')"},
    };
    for (const Case& c : cases) {
        std::vector<std::string> arguments{"convert"};
        arguments.insert(arguments.end(), c.arguments.begin(), c.arguments.end());
        SCOPED_TRACE(c.arguments.back());
        const ToolRun run = runTool(arguments);
        EXPECT_EQ(run.status, c.status);
        EXPECT_EQ(run.err, "veltotouch: " + c.error + "\n");
        EXPECT_EQ(readFile(output), "previous output\n");
    }
}

// Every command that reads recordings takes --hid-device; the sample has
// devices 0 (a keyboard) and 1 (the surface).
TEST(ConvertCommand, EveryCommandThatReadsRecordingsReadsTheHidDeviceItIsTold)
{
    TempDir dir;
    const std::string truth = dir.file("empty.truth.jsonl", "\n").string();
    const std::vector<std::vector<std::string>> commands = {
        {"replay", kTwoDevices},
        {"dump", kTwoDevices},
        {"report", kTwoDevices, "-o", dir.file("page.html").string()},
        {"eval", kTwoDevices, "--truth", truth},
        {"host", "--device", "sim:" + kTwoDevices, "--speed", "0"},
        {"convert", kTwoDevices, "-o", dir.file("out.json").string()},
    };
    for (std::vector<std::string> arguments : commands) {
        SCOPED_TRACE(arguments[0]);
        arguments.insert(arguments.end(), {"--hid-device", "2"});
        const ToolRun run = runTool(arguments);
        EXPECT_EQ(run.status, 1);
        EXPECT_EQ(run.err, "veltotouch: " + kTwoDevices +
                               ": no device 2 in it (devices 0 \"Example USB keyboard\", 1 \"VeltoTouch surface\")\n");
    }
    // The keyboard's reports are none of the surface's: nothing happens.
    const ToolRun keyboard = runTool({"replay", kTwoDevices, "--hid-device", "0", "--get", "Algs.EventStats"});
    const ToolRun surface = runTool({"replay", kTwoDevices, "--hid-device", "1", "--get", "Algs.EventStats"});
    EXPECT_EQ(keyboard.out.find("numTaps 1"), std::string::npos) << keyboard.out;
    EXPECT_EQ(surface.out, runTool({"replay", kTwoDevices, "--get", "Algs.EventStats"}).out);
    EXPECT_NE(surface.out.find("tap          top"), std::string::npos) << surface.out;
}

// What convert writes is what emulate makes and plays: emulate reads the
// file through the same reader, and its device is the one the file describes.
TEST(ConvertCommand, AHidRecorderFilePlaysThroughEmulateAsTheDeviceItDescribes)
{
    TempDir dir;
    const std::string hid = dir.file("taps.hid").string();
    ASSERT_EQ(runTool({"convert", kExamples + "/taps.json", "-o", hid}).status, 0);
    std::string name;
    unsigned bus = 0, vendor = 0, product = 0;
    Bytes descriptor;
    std::istringstream lines(readFile(hid));
    for (std::string line; std::getline(lines, line);) {
        std::istringstream fields(line.substr(2));
        if (line.starts_with("N: ")) name = line.substr(3);
        if (line.starts_with("I: ")) fields >> std::hex >> bus >> vendor >> product;
        if (line.starts_with("R: ")) {
            std::size_t length = 0;
            fields >> length >> std::hex;
            for (unsigned byte = 0; fields >> byte;) descriptor.push_back(static_cast<std::uint8_t>(byte));
            EXPECT_EQ(descriptor.size(), length);
        }
    }

    // What emulate makes of a file: the creation and the input reports played.
    const auto emulated = [](const std::string& file, std::optional<std::uint32_t> hidDevice) {
        VeltoHost::Testing::FakeUhidKernel kernel;
        kernel.send(VeltoHost::Testing::FakeUhidKernel::event(UHID_START));
        kernel.send(VeltoHost::Testing::FakeUhidKernel::event(UHID_OPEN));
        EmulateCommand::Options options;
        options.file = file;
        options.speed = 0;
        options.hidDevice = hidDevice;
        std::ostringstream err;
        int status = -1;
        std::thread emulate([&, fd = kernel.takeDeviceEnd()] {
            try {
                status = EmulateCommand::run(options, fd, [] { return false; }, err);
            } catch (const ToolError& error) {
                err << error.what();
            }
        });
        const std::vector<uhid_event> events = kernel.receiveAll();
        emulate.join();
        EXPECT_EQ(status, 0) << err.str();
        Reports played;
        for (const uhid_event& event : events) {
            if (event.type == UHID_INPUT2) played.emplace_back(0, Bytes(event.u.input2.data, event.u.input2.data + event.u.input2.size));
        }
        return std::pair{events, played};
    };
    const auto [events, played] = emulated(hid, std::nullopt);
    ASSERT_FALSE(events.empty());
    ASSERT_EQ(events.front().type, UHID_CREATE2);
    const auto& create = events.front().u.create2;
    EXPECT_EQ(reinterpret_cast<const char*>(create.name), name);
    EXPECT_EQ((std::vector<unsigned>{create.bus, create.vendor, create.product}), (std::vector<unsigned>{bus, vendor, product}));
    EXPECT_EQ(Bytes(create.rd_data, create.rd_data + create.rd_size), descriptor);
    const auto atZero = [](Reports reports) {
        for (auto& report : reports) report.first = 0;
        return reports;
    };
    EXPECT_EQ(played, atZero(reportsIn(hid)));

    // Of a file with two devices, --hid-device picks the one played.
    const std::string twoDevices = kExamples + "/hid-recorder-two-devices.hid";
    EXPECT_EQ(emulated(twoDevices, std::nullopt).second, atZero(reportsIn(twoDevices)));
    EXPECT_EQ(emulated(twoDevices, 0).second, atZero(reportsIn(twoDevices, nullptr, 0)));
}
