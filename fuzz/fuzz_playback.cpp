// Playback of any readable recording at any speed into a pipeline. The waits
// are recorded instead of slept, and checked against the recorded spacing of
// the input reports divided by the speed; every frame must reach the pipeline
// once, in order, unchanged, at the replayed time, and playing must record
// nothing into the recording it plays.
//
// Input: the first 4 bytes are the speed (a little-endian float, any value,
// NaN and infinities included), the rest is the container text.
#include "FuzzInput.h"
#include "pipeline/Pipeline.h"
#include "pipeline/PipelineInput.h"
#include "platform/runtime/MonotonicClock.h"
#include "recording/PipelineRecording.h"
#include "records/TickConversion.h"

#include <cmath>
#include <cstdio>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

namespace {

using VeltoFuzz::FuzzInput;
using VeltoHost::MonotonicClock;
using VeltoTouch::Pipeline;
using VeltoTouch::PipelineRecording;
using VeltoTouch::PropertyValue;
using Frame = PipelineRecording::Frame;

// Single-precision arithmetic rounds three times on the way to a wait; a
// relative slack of a few million parts covers that and nothing more.
constexpr double kRelativeSlack = 1e-6;
constexpr double kTwoTo64 = 18446744073709551616.0;

// Stands between the recording and a real pipeline and keeps each call.
class Spy final : public VeltoTouch::PipelineInput {
public:
    struct Call {
        Frame::Type type;
        std::uint64_t time;
        std::vector<std::uint8_t> report;
        std::string key;
        const void* value;
    };

    explicit Spy(std::shared_ptr<Pipeline> pipeline) : _pipeline(std::move(pipeline)) {}

    void setTime(std::uint64_t time) override
    {
        VELTO_FUZZ_CHECK(!_time);  // one time per delivered frame
        _time = time;
        _pipeline->setTime(time);
    }
    void setState(const std::string& key, PropertyValue value) override
    {
        VELTO_FUZZ_CHECK(_time);
        calls.push_back({Frame::Type::State, *_time, {}, key, value.identity()});
        _time.reset();
        _pipeline->setState(key, std::move(value));
    }
    void handleInputReport(const std::uint8_t* data, std::size_t length) override
    {
        VELTO_FUZZ_CHECK(_time);
        calls.push_back({Frame::Type::InputReport, *_time, {data, data + length}, {}, nullptr});
        _time.reset();
        _pipeline->handleInputReport(data, length);
    }

    std::vector<Call> calls;

private:
    std::shared_ptr<Pipeline> _pipeline;
    std::optional<std::uint64_t> _time;
};

// The wait the recorded spacing asks for, in exact arithmetic.
double idealWaitMicroseconds(std::uint64_t gapNs, float speed)
{
    const double effective = speed > 0.0f ? speed : 1.0;
    return static_cast<double>(gapNs) / effective / 1000.0;
}

void checkWait(std::uint64_t wait, double ideal)
{
    if (ideal >= kTwoTo64 * (1 + kRelativeSlack)) {
        // Longer than 64 bits of microseconds hold: the longest wait there is.
        VELTO_FUZZ_CHECK(static_cast<double>(wait) >= kTwoTo64 * (1 - kRelativeSlack));
        return;
    }
    VELTO_FUZZ_CHECK(static_cast<double>(wait) <= ideal * (1 + kRelativeSlack) + 1);
    VELTO_FUZZ_CHECK(static_cast<double>(wait) >= ideal * (1 - kRelativeSlack) - 1);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    FuzzInput in(data, size);
    const float speed = in.number<float>();
    const std::vector<std::uint8_t> text = in.rest();

    std::optional<PipelineRecording> read;
    try {
        read.emplace(std::string_view(reinterpret_cast<const char*>(text.data()), text.size()));
    } catch (const std::invalid_argument&) {
        return 0;  // the reader's own target covers what is not a recording
    } catch (const std::runtime_error&) {
        return 0;
    }
    PipelineRecording& recording = *read;
    const std::vector<Frame> frames(recording.frames().begin(), recording.frames().end());

    auto pipeline = std::make_shared<Pipeline>();
    auto spy = std::make_shared<Spy>(pipeline);
    recording.pipeline = spy;
    std::vector<std::uint64_t> waits;
    recording.sleepMicroseconds = [&waits](std::uint64_t microseconds) { waits.push_back(microseconds); };

    const std::uint64_t before = MonotonicClock::now();
    recording.playReset();
    const std::uint64_t after = MonotonicClock::now();

    std::optional<std::uint64_t> lastReportNs;
    for (std::size_t i = 0; i < frames.size(); ++i) {
        VELTO_FUZZ_CHECK(recording.playCanContinue());
        waits.clear();
        recording.playNextFrame(speed);

        const Frame& frame = frames[i];
        if (frame.type == Frame::Type::InputReport) {
            // Only a report later than the previous report waits.
            if (lastReportNs && frame.timestampNs > *lastReportNs) {
                VELTO_FUZZ_CHECK(waits.size() == 1);
                checkWait(waits.front(), idealWaitMicroseconds(frame.timestampNs - *lastReportNs, speed));
            } else {
                VELTO_FUZZ_CHECK(waits.empty());
            }
            lastReportNs = frame.timestampNs;
        } else {
            VELTO_FUZZ_CHECK(waits.empty());
        }

        // Delivered once, unchanged, on a time line that starts at playReset
        // and keeps the recorded spacing whatever the speed.
        VELTO_FUZZ_CHECK(spy->calls.size() == i + 1);
        const Spy::Call& call = spy->calls.back();
        VELTO_FUZZ_CHECK(call.type == frame.type);
        if (frame.type == Frame::Type::InputReport) {
            VELTO_FUZZ_CHECK(call.report == frame.report);
        } else {
            VELTO_FUZZ_CHECK(call.key == frame.key);
            VELTO_FUZZ_CHECK(call.value == frame.value.identity());
        }
        const std::uint64_t offset =
            VeltoTouch::Util::machTimeFromNanoseconds(frame.timestampNs - frames.front().timestampNs);
        const std::uint64_t start = call.time - offset;  // wraps as the replayed time does
        VELTO_FUZZ_CHECK(start >= before && start <= after);
    }

    // Playing records nothing, and there is nothing more to play.
    VELTO_FUZZ_CHECK(recording.frames().size() == frames.size());
    VELTO_FUZZ_CHECK(!recording.playCanContinue());
    bool finished = false;
    try {
        recording.playNextFrame(speed);
    } catch (const std::runtime_error& error) {
        finished = std::string_view(error.what()) == "playback finished";
    }
    VELTO_FUZZ_CHECK(finished);
    return 0;
}
