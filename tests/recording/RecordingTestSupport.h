#pragma once

#include "records/InputReport.h"
#include "records/ReportBytes.h"
#include "pipeline/PipelineInput.h"
#include "recording/ContainerStream.h"
#include "recording/PipelineRecording.h"

#include <unistd.h>

#include <array>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

// Helpers shared by the recording tests.
namespace RecordingTestSupport {

using VeltoTouch::PipelineRecording;
using VeltoTouch::PropertyValue;
using Frame = PipelineRecording::Frame;

// A text in an unnamed temporary file, read from its start.
struct TempFile {
    std::unique_ptr<std::FILE, int (*)(std::FILE*)> file{std::tmpfile(), &std::fclose};
    explicit TempFile(const std::string& text)
    {
        std::fwrite(text.data(), 1, text.size(), file.get());
        std::fflush(file.get());
        ::lseek(fd(), 0, SEEK_SET);
    }
    int fd() const { return ::fileno(file.get()); }
};

inline Frame stateFrame(std::uint64_t timestampNs, std::string key, PropertyValue value)
{
    Frame frame;
    frame.type = Frame::Type::State;
    frame.timestampNs = timestampNs;
    frame.key = std::move(key);
    frame.value = std::move(value);
    return frame;
}

inline Frame reportFrame(std::uint64_t timestampNs, std::vector<std::uint8_t> bytes)
{
    Frame frame;
    frame.type = Frame::Type::InputReport;
    frame.timestampNs = timestampNs;
    frame.report = std::move(bytes);
    return frame;
}

// Frames of a container text as ContainerStream hands them over, from a
// file in memory (seekable, like a file on disk).
inline PipelineRecording::FrameList streamFrames(const std::string& text, std::size_t* handedBeforeFault = nullptr)
{
    const TempFile file(text);
    PipelineRecording::FrameList frames;
    try {
        VeltoTouch::ContainerStream::read(file.fd(), [&](Frame&& frame) { frames.push_back(std::move(frame)); });
    } catch (...) {
        if (handedBeforeFault) *handedBeforeFault = frames.size();
        throw;
    }
    return frames;
}

// A PipelineInput that remembers every call, in order, as text, plus the
// times and values it was given.
class CallLog final : public VeltoTouch::PipelineInput {
public:
    void setTime(std::uint64_t time) override
    {
        times.push_back(time);
        calls.push_back("time");
    }
    void setState(const std::string& key, PropertyValue value) override
    {
        values.push_back(value);
        calls.push_back("state " + key);
    }
    void handleInputReport(const std::uint8_t* data, std::size_t length) override
    {
        reports.emplace_back(data, data + length);
        calls.push_back("report " + std::to_string(length));
    }

    std::vector<std::string> calls;
    std::vector<std::uint64_t> times;
    std::vector<PropertyValue> values;
    std::vector<std::vector<std::uint8_t>> reports;
};

}  // namespace RecordingTestSupport
