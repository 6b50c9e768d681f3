#include "RecordingTestSupport.h"
#include "recording/ContainerReadAhead.h"

#include <gtest/gtest.h>

#include <unistd.h>

#include <cstdio>
#include <memory>
#include <stdexcept>
#include <string>

using namespace RecordingTestSupport;
using VeltoTouch::ContainerReadAhead;

namespace {

// Enough reports for several batches and for the reader to run ahead of a
// slow player until it must wait.
std::string container(std::size_t reports, const std::string& end)
{
    std::string text = R"({"Version": 1, "Frames": [)";
    for (std::size_t i = 0; i < reports; ++i) {
        text += i ? ", " : "";
        text += R"({"Type": "InputReport", "Timestamp": )" + std::to_string(1000 + i) +
                R"(, "Report": "02 00 a5 a5 a5 a5 a5 a5 a5 )" + (i % 2 ? "a5" : "5a") + R"("})";
    }
    return text + end;
}

using RecordingTestSupport::TempFile;

}  // namespace

TEST(ContainerReadAhead, HandsOverWhatTheStreamReadsInOrderThenItsFault)
{
    const PipelineRecording::FrameList reference = streamFrames(container(3000, "]}"));
    ASSERT_EQ(reference.size(), 3000u);
    for (const std::string end : {"]}", R"(, {"Type": 7}]})"}) {
        const std::string text = container(3000, end);
        std::string streamError;
        try {
            streamFrames(text);
        } catch (const std::exception& error) {
            streamError = error.what();
        }

        const TempFile file(text);
        PipelineRecording::FrameList ahead;
        std::string aheadError;
        try {
            EXPECT_EQ(ContainerReadAhead::read(file.fd(), [&](Frame&& frame) { ahead.push_back(std::move(frame)); }).text(),
                      "container version 1");
        } catch (const std::exception& error) {
            aheadError = error.what();
        }
        EXPECT_EQ(aheadError, streamError);
        EXPECT_EQ(aheadError.empty(), end == "]}");
        // Every frame before the fault, in file order.
        ASSERT_EQ(ahead.size(), reference.size()) << end;
        auto frame = ahead.begin();
        for (const Frame& want : reference) {
            EXPECT_EQ(frame->timestampNs, want.timestampNs);
            EXPECT_EQ(frame->report, want.report);
            ++frame;
        }
    }
}

TEST(ContainerReadAhead, AFailingPlayerStopsTheReaderAndGetsItsOwnError)
{
    const TempFile file(container(6000, "]}"));
    std::size_t played = 0;
    EXPECT_THROW(ContainerReadAhead::read(file.fd(),
                                          [&](Frame&&) {
                                              if (++played == 700) throw std::logic_error("the player gave up");
                                          }),
                 std::logic_error);
    EXPECT_EQ(played, 700u);
}
