#include "recording/PipelineRecording.h"

#include "platform/runtime/MonotonicClock.h"
#include "platform/values/PropertyDictionary.h"
#include "recording/ContainerFrames.h"
#include "recording/ContainerWriter.h"
#include "recording/HidRecorderReader.h"
#include "recording/JsonValue.h"
#include "records/TickConversion.h"

#include <algorithm>
#include <limits>
#include <sstream>
#include <stdexcept>
#include <string_view>
#include <unordered_set>
#include <utility>

namespace VeltoTouch {

using VeltoHost::MonotonicClock;
using VeltoHost::PropertyDictionary;

namespace {

constexpr std::uint64_t kContainerVersion = ContainerWriter::kVersion;
constexpr std::string_view kMigrationFailed = "migrateSerializedContainer failed: ";

[[noreturn]] void reject(const char* message) { throw std::invalid_argument(message); }

PropertyValue migrateVersion0(const PropertyDictionary& container)
{
    PropertyValue::Array frames;
    const PropertyValue reports = container.get(ContainerFrames::kReportsKey);
    if (reports.hasValue()) {
        if (!reports.isArray()) reject("invalid reports");
        frames.reserve(reports.asArray().size());
        for (const PropertyValue& element : reports.asArray()) frames.push_back(ContainerFrames::fromVersion0(element));
    }
    PropertyDictionary migrated;
    migrated.set(std::string(ContainerFrames::kVersionKey), PropertyValue::uint64(kContainerVersion));
    migrated.set(std::string(ContainerFrames::kFramesKey), PropertyValue::array(std::move(frames)));
    return PropertyValue::dictionary(std::move(migrated));
}

}  // namespace

PipelineRecording::PipelineRecording() : sleepMicroseconds(&MonotonicClock::sleepMicroseconds) {}

PipelineRecording::PipelineRecording(std::optional<std::string_view> data, std::optional<std::uint32_t> hidDevice)
    : PipelineRecording()
{
    if (!data) reject("json not supplied");
    if (HidRecorderReader::opens(*data)) {
        HidRecorderReader::read(*data, [&](Frame&& frame) { _frames.push_back(std::move(frame)); }, hidDevice);
        return;
    }
    PropertyValue container;
    try {
        container = migrateSerializedContainer(JsonValue::parse(*data));
    } catch (const std::exception& error) {
        throw std::runtime_error(std::string(kMigrationFailed) + error.what());
    }
    readFrames(container, _frames);
}

PipelineRecording::PipelineRecording(const PipelineRecording& other)
    : PipelineInput(other),
      pipeline(other.pipeline),
      sleepMicroseconds(other.sleepMicroseconds),
      _frames(other._frames),
      _maxFrameCount(other._maxFrameCount),
      _framesKeptByLastTrim(other._framesKeptByLastTrim),
      _newestTime(other._newestTime)
{
    // _play stays not valid: the source's position belongs to the source's list.
}

PipelineRecording& PipelineRecording::operator=(const PipelineRecording& other)
{
    if (this == &other) return *this;
    pipeline = other.pipeline;
    sleepMicroseconds = other.sleepMicroseconds;
    _frames = other._frames;
    _maxFrameCount = other._maxFrameCount;
    _framesKeptByLastTrim = other._framesKeptByLastTrim;
    _newestTime = other._newestTime;
    _play = PlayCursor{};
    return *this;
}

PipelineRecording::PipelineRecording(PipelineRecording&& other) noexcept
    : PipelineInput(other),
      pipeline(std::move(other.pipeline)),
      sleepMicroseconds(std::move(other.sleepMicroseconds)),
      _frames(std::move(other._frames)),
      _maxFrameCount(other._maxFrameCount),
      _framesKeptByLastTrim(other._framesKeptByLastTrim),
      _newestTime(other._newestTime)
{
    other._play = PlayCursor{};
}

PipelineRecording& PipelineRecording::operator=(PipelineRecording&& other) noexcept
{
    if (this == &other) return *this;
    pipeline = std::move(other.pipeline);
    sleepMicroseconds = std::move(other.sleepMicroseconds);
    _frames = std::move(other._frames);
    _maxFrameCount = other._maxFrameCount;
    _framesKeptByLastTrim = other._framesKeptByLastTrim;
    _newestTime = other._newestTime;
    _play = PlayCursor{};
    other._play = PlayCursor{};
    return *this;
}

void PipelineRecording::setTime(std::uint64_t) {}

void PipelineRecording::setState(const std::string& key, PropertyValue value)
{
    // One clock reading serves both the frame and the forwarded time, so a
    // replay sees the same time line as the live pipeline did. The clock
    // never runs back, so no report recorded before can be later.
    const std::uint64_t now = std::max(MonotonicClock::now(), _newestTime);
    _newestTime = now;
    Frame frame;
    frame.type = Frame::Type::State;
    frame.timestampNs = Util::nanosecondsFromMachTime(now);
    frame.key = key;
    frame.value = value;
    appendFrame(std::move(frame));
    if (pipeline) {
        pipeline->setTime(now);
        pipeline->setState(key, std::move(value));
    }
}

void PipelineRecording::handleInputReport(const std::uint8_t* data, std::size_t length)
{
    handleInputReportAt(MonotonicClock::now(), data, length);
}

void PipelineRecording::handleInputReportAt(std::uint64_t timeStamp, const std::uint8_t* data, std::size_t length)
{
    // As for a state: the frame and the forwarded time are the same reading.
    const std::uint64_t time = std::max(timeStamp, _newestTime);
    _newestTime = time;
    Frame frame;
    frame.type = Frame::Type::InputReport;
    frame.timestampNs = Util::nanosecondsFromMachTime(time);
    if (length > 0) frame.report.assign(data, data + length);
    appendFrame(std::move(frame));
    if (pipeline) {
        pipeline->setTime(time);
        pipeline->handleInputReport(data, length);
    }
}

void PipelineRecording::appendFrame(Frame frame)
{
    _frames.push_back(std::move(frame));
    if (trimIsDue()) {
        trimFrames(_frames, _maxFrameCount);
        _framesKeptByLastTrim = _frames.size();
    }
    _play.valid = false;
}

bool PipelineRecording::trimIsDue() const noexcept
{
    if (_maxFrameCount == 0) return false;
    const std::uint64_t count = _frames.size();
    // While trims leave at most one and a half times the limit, the list is
    // trimmed at twice the limit: at least half a limit of appends pays for
    // each pass. When state is written about as often as
    // reports come, a trim leaves up to twice the limit, and trimming at twice
    // the limit would run its pass on every append (on the real-time thread,
    // under the pipeline lock). Then the next trim waits for the limit's
    // worth of appends, or half of what was kept if that is more, so that a
    // pass visits at most three frames per append. Waiting longer would
    // lengthen the list, and with it the copy that reading the recording
    // makes under the same lock.
    const std::uint64_t kept = _framesKeptByLastTrim;
    if (kept <= _maxFrameCount || kept - _maxFrameCount <= _maxFrameCount / 2) return count / 2 >= _maxFrameCount;
    return count >= kept + std::max(_maxFrameCount, kept / 2);
}

void PipelineRecording::trimFrames(FrameList& frames, std::uint64_t limit)
{
    std::uint64_t keptReports = 0;
    // Keys of the state frames kept since the last kept report (walking back).
    // The views point into kept frames, which outlive the pass.
    std::unordered_set<std::string_view> keysSinceReport;
    for (auto it = frames.end(); it != frames.begin();) {
        --it;
        bool keep = true;
        switch (it->type) {
        case Frame::Type::InputReport:
            keep = keptReports < limit;
            if (keep) {
                ++keptReports;
                keysSinceReport.clear();
            }
            break;
        case Frame::Type::State:
            // A newer frame of the same key, up to the next kept report,
            // overrides this one.
            keep = keysSinceReport.insert(it->key).second;
            break;
        }
        if (!keep) it = frames.erase(it);
    }
}

void PipelineRecording::trimToLimit()
{
    const std::size_t before = _frames.size();
    trimFrames(_frames, _maxFrameCount);
    _framesKeptByLastTrim = _frames.size();
    // The cursor may point at an erased frame; it must not be used again.
    if (_frames.size() != before) _play.valid = false;
}

void PipelineRecording::setMaxFrameCount(std::uint64_t limit)
{
    _maxFrameCount = limit;
    if (_maxFrameCount != 0) trimToLimit();
}

PropertyValue PipelineRecording::migrateSerializedContainer(PropertyValue container)
{
    if (!container.isDictionary()) reject("invalid container");
    const PropertyDictionary& object = container.asDictionary();
    const PropertyValue version = object.get(ContainerFrames::kVersionKey);
    if (!version.isNumberOrBoolean()) reject("invalid version");
    switch (version.toUInt64()) {
    case 1:
        return container;
    case 0:
        return migrateVersion0(object);
    default:
        throw std::invalid_argument("invalid container version: " + std::to_string(version.toUInt64()));
    }
}

void PipelineRecording::readFrames(const PropertyValue& container, FrameList& frames)
{
    const PropertyValue array = container.asDictionary().get(ContainerFrames::kFramesKey);
    if (!array.isArray()) reject("invalid frames");
    // Loaded as they stand: no limit, no trimming, no check of time order.
    for (const PropertyValue& element : array.asArray()) frames.push_back(ContainerFrames::read(element));
}

std::string PipelineRecording::json()
{
    if (_maxFrameCount != 0) trimToLimit();

    std::ostringstream text;
    ContainerWriter writer(text);
    for (const Frame& frame : _frames) writer.write(frame);
    writer.finish();
    return std::move(text).str();
}

void PipelineRecording::playReset()
{
    _play.valid = true;
    _play.iterator = _frames.begin();
    _play.clock.reset();
}

bool PipelineRecording::playCanContinue() const noexcept { return _play.valid && _play.iterator != _frames.end(); }

void PipelineRecording::playNextFrame(float speed)
{
    if (!playCanContinue()) throw std::runtime_error("playback finished");
    const Frame& frame = *_play.iterator;
    ++_play.iterator;
    playFrame(frame, _play.clock, _frames.front().timestampNs, speed, sleepMicroseconds, pipeline.get());
}

void PipelineRecording::PlayClock::reset()
{
    startTimeMach = MonotonicClock::now();
    lastInputReportTimeNs.reset();
}

void PipelineRecording::playFrame(const Frame& frame, PlayClock& clock, std::uint64_t originNs, float speed,
                                  const std::function<void(std::uint64_t microseconds)>& sleepMicroseconds,
                                  PipelineInput* pipeline)
{
    if (!(speed > 0.0f)) speed = 1.0f;

    if (frame.type == Frame::Type::InputReport) {
        if (clock.lastInputReportTimeNs && frame.timestampNs > *clock.lastInputReportTimeNs) {
            // Single precision throughout, truncated to whole microseconds.
            const float elapsedNs = static_cast<float>(frame.timestampNs - *clock.lastInputReportTimeNs);
            const float microseconds = elapsedNs / speed / 1000.0f;
            // A tiny speed can push the wait past what 64 bits hold.
            constexpr float kLongestWait = 18446744073709551615.0f;
            const std::uint64_t wait = microseconds < kLongestWait ? static_cast<std::uint64_t>(microseconds)
                                                                  : std::numeric_limits<std::uint64_t>::max();
            if (sleepMicroseconds) sleepMicroseconds(wait);
        }
        clock.lastInputReportTimeNs = frame.timestampNs;
    }

    if (!pipeline) return;

    // The replayed time line keeps the recorded spacing whatever the speed.
    pipeline->setTime(clock.startTimeMach + Util::machTimeFromNanoseconds(frame.timestampNs - originNs));
    switch (frame.type) {
    case Frame::Type::InputReport:
        pipeline->handleInputReport(frame.report.data(), frame.report.size());
        break;
    case Frame::Type::State:
        pipeline->setState(frame.key, frame.value);
        break;
    }
}


}  // namespace VeltoTouch
