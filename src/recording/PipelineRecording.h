#pragma once

#include "pipeline/PipelineInput.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace VeltoTouch {

// Stands in front of another PipelineInput and records every input report and
// state change as a time-stamped frame before forwarding it unchanged. The
// recording is kept to the newest `_maxFrameCount` input reports plus the state
// frames still in force for them, can be written to and read from a JSON
// container, and can be replayed into the wrapped input.
//
// Not thread-safe: the owner serialises every call, copies included. Recording
// never throws; reading a container and playing past the end do. Final
// because it is always owned through its own type (the base has no virtual
// destructor), which also lets holders keep it in an optional or by value.
class PipelineRecording final : public PipelineInput {
public:
    struct Frame {
        enum class Type : std::uint32_t { State = 0, InputReport = 1 };

        Type type = Type::State;
        // Capture time in nanoseconds of the monotonic clock (its own origin).
        std::uint64_t timestampNs = 0;
        // State frames: the key exactly as received.
        std::string key;
        // State frames: the value as given, shared. An empty reference (no
        // value) is distinct from a value of kind null.
        PropertyValue value;
        // Input report frames: the raw bytes as delivered.
        std::vector<std::uint8_t> report;
    };
    using FrameList = std::list<Frame>;

    // The wrapped input; empty means record only.
    std::shared_ptr<PipelineInput> pipeline;

    // How playback waits between input reports. Tests replace it to run
    // without waiting; copies share it.
    std::function<void(std::uint64_t microseconds)> sleepMicroseconds;

    PipelineRecording();
    // Reads a container (UTF-8 JSON, version 0 or 1). std::nullopt stands for
    // "no data at all", which raises std::invalid_argument("json not supplied");
    // an empty text is data that is not a container. Errors of the parse and
    // of migrateSerializedContainer come as std::runtime_error prefixed with
    // "migrateSerializedContainer failed: "; errors in the frames as
    // std::invalid_argument. The result has no wrapped input, no limit and a
    // cursor that is not valid.
    //
    // A text of hid-recorder is read as well (HidRecorderReader: the events
    // of device `hidDevice`, or else of the surface's), its faults raised as
    // HidRecorderReader::Fault, a std::invalid_argument.
    explicit PipelineRecording(std::optional<std::string_view> data,
                               std::optional<std::uint32_t> hidDevice = std::nullopt);

    // A copy shares the wrapped input and the state values, has its own frame
    // list and limit, and a playback cursor that is not valid.
    PipelineRecording(const PipelineRecording& other);
    PipelineRecording& operator=(const PipelineRecording& other);
    // Moving takes the frames over; the cursor is not valid afterwards, since
    // an end position does not survive the move of a list.
    PipelineRecording(PipelineRecording&& other) noexcept;
    PipelineRecording& operator=(PipelineRecording&& other) noexcept;
    ~PipelineRecording() = default;

    // PipelineInput. The recorder keeps the time line itself (it reads the
    // clock, or takes the time a report was stamped with), so setTime is
    // ignored; each frame's time is forwarded to the wrapped input before it.
    void setTime(std::uint64_t time) override;
    void setState(const std::string& key, PropertyValue value) override;
    // Stamped with the clock's reading now.
    void handleInputReport(const std::uint8_t* data, std::size_t length) override;
    // A report stamped by its device as it was read (`timeStamp` in the
    // ticks of MonotonicClock), recorded and forwarded at that time. A
    // report is stamped before it waits for its turn, so a state written
    // meanwhile may already be recorded with a later time: then the report
    // takes that time, and the recording's time line never runs backwards.
    void handleInputReportAt(std::uint64_t timeStamp, const std::uint8_t* data, std::size_t length);

    // Adds a frame at the end and trims when the list has grown enough since
    // the last trim (see trimIsDue). Trimming later keeps the same frames as
    // trimming earlier and again later, so the moment of a trim never changes
    // what the recording holds once it is written.
    void appendFrame(Frame frame);
    // Keeps the newest `limit` input reports and, per key, the newest state
    // frame of each stretch between kept reports plus the newest one before
    // the oldest kept report. `limit` must be greater than 0.
    static void trimFrames(FrameList& frames, std::uint64_t limit);
    // 0 removes the limit; any other value trims at once.
    void setMaxFrameCount(std::uint64_t limit);
    std::uint64_t maxFrameCount() const noexcept { return _maxFrameCount; }

    const FrameList& frames() const noexcept { return _frames; }

    // Turns a parsed container of any accepted version into one of the
    // current version; raises std::invalid_argument. A current container is
    // returned as the same value.
    static PropertyValue migrateSerializedContainer(PropertyValue container);
    // The recording as an indented version-1 container. Trims to the limit
    // first, so it changes the recording.
    std::string json();

    // Playback: playReset once, then playNextFrame while playCanContinue.
    void playReset();
    bool playCanContinue() const noexcept;
    // Plays one frame into the wrapped input, first waiting as long as the
    // recorded spacing of input reports divided by `speed` (not above 0 means
    // 1.0). Throws std::runtime_error("playback finished") when there is no
    // frame to play.
    void playNextFrame(float speed);

    // Where a playback stands on the recorded time line.
    struct PlayClock {
        std::uint64_t startTimeMach = 0;
        std::optional<std::uint64_t> lastInputReportTimeNs;
        // The time line starts now; the next report does not wait.
        void reset();
    };
    // Plays one frame as playNextFrame does, for a recording that is not held
    // in memory (ContainerStream): waits the recorded spacing since the
    // previous input report divided by `speed`, sets the pipeline's time to
    // the clock's start plus the frame's offset from `originNs` (the time
    // stamp of the recording's first frame) and hands the frame over.
    // `pipeline` may be null (only the wait happens).
    static void playFrame(const Frame& frame, PlayClock& clock, std::uint64_t originNs, float speed,
                          const std::function<void(std::uint64_t microseconds)>& sleepMicroseconds,
                          PipelineInput* pipeline);

private:
    struct PlayCursor {
        bool valid = false;
        FrameList::iterator iterator;
        PlayClock clock;
    };

    bool trimIsDue() const noexcept;
    void trimToLimit();
    static void readFrames(const PropertyValue& container, FrameList& frames);

    FrameList _frames;
    std::uint64_t _maxFrameCount = 0;
    // Size of the list right after the last trim (0 before the first).
    std::uint64_t _framesKeptByLastTrim = 0;
    // The time (ticks) of the newest frame recorded live, 0 before the first.
    std::uint64_t _newestTime = 0;
    PlayCursor _play;
};

}  // namespace VeltoTouch
