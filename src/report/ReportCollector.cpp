#include "report/ReportCollector.h"

#include "records/Gesture.h"
#include "records/TickConversion.h"
#include "recording/JsonValue.h"

#include <algorithm>

namespace VeltoTouch {

using Kind = ColumnEncoder::Kind;

namespace {

// Column order is the payload's order; the page finds columns by name.
enum ColumnIndex : std::size_t {
    kTime,
    kFrame,
    kTimeMs,
    kReadings,
    kLevels = kReadings + DecisionRecord::kPadCount,
    kActive = kLevels + DecisionRecord::kPadCount,
    kFlags,
    kRegion,
    kPhase,
    kPhaseMs,
    kNonActive,
    kSvm,
    kTouch,
    kTap,
    kSignalPerDuration,
    kSignalPerTouchDuration,
    kTimeDurationRatio,
    kColumnCount
};

// Bits of the "flags" column.
enum FlagBit : unsigned {
    kTouching = 1u << 0,
    kAboveNoise = 1u << 1,
    kHolding = 1u << 2,
    kHoldSuppressed = 1u << 3,
    kTapCandidate = 1u << 4,
    kTapAccepted = 1u << 5,
    kTapRejected = 1u << 6,
    kWasTouching = 1u << 7,
    kWasHolding = 1u << 8,
};

std::vector<std::string> columnNames()
{
    std::vector<std::string> names = {"t", "frame", "timeMs"};
    for (std::size_t pad = 0; pad < DecisionRecord::kPadCount; ++pad) names.push_back("r" + std::to_string(pad));
    for (std::size_t pad = 0; pad < DecisionRecord::kPadCount; ++pad) names.push_back("l" + std::to_string(pad));
    for (const char* name : {"active", "flags", "region", "phase", "phaseMs", "nonActive", "svm", "touch", "tap",
                             "signalPerDuration", "signalPerTouchDuration", "timeDurationRatio"}) {
        names.emplace_back(name);
    }
    return names;
}

}  // namespace

ReportCollector::ReportCollector(Pipeline& pipeline, FrameRange range) : _pipeline(pipeline), _range(range)
{
    const std::vector<std::string> names = columnNames();
    for (std::size_t index = 0; index < names.size(); ++index) {
        _columns.push_back({names[index], ColumnEncoder(index >= kSvm ? Kind::Float32 : Kind::DeltaVarint)});
    }

    _pipeline.setTimeProbe = [this](std::uint64_t ticks) { setTime(ticks); };
    _pipeline.hidEventsProbe = [this](const VeltoHost::HidEventList& events) { addEvents(events); };
    _pipeline.setStateProbe = [this](const std::string& key, const PropertyValue& value) {
        nlohmann::ordered_json mark;
        mark["t"] = _nowUs;
        mark["key"] = key;
        mark["value"] = JsonValue::dump(JsonValue::toJson(value), false);
        holdForNextFrame(MarkList::States, std::move(mark));
    };
    _pipeline.disjointImageProbe = [this](std::uint32_t previous, const InputReport::Image& image) {
        nlohmann::ordered_json mark;
        mark["t"] = _nowUs;
        mark["previous"] = previous;
        mark["frame"] = image.frameNumber;
        holdForNextFrame(MarkList::Gaps, std::move(mark));
    };
    _pipeline.invalidInputReportProbe = [this](const std::uint8_t*, std::size_t) { ++_ignoredReports; };
    _pipeline.setDecisionObserver(this);
}

ReportCollector::~ReportCollector()
{
    _pipeline.setDecisionObserver(nullptr);
    _pipeline.setTimeProbe = nullptr;
    _pipeline.hidEventsProbe = nullptr;
    _pipeline.setStateProbe = nullptr;
    _pipeline.disjointImageProbe = nullptr;
    _pipeline.invalidInputReportProbe = nullptr;
}

void ReportCollector::setTime(std::uint64_t ticks)
{
    if (!_originTicks) _originTicks = ticks;
    // The axis never runs backwards: a recording whose time stamps do is
    // drawn with those frames stacked at the latest time so far.
    const auto us = static_cast<std::int64_t>(Util::nanosecondsFromMachTime(ticks - *_originTicks) / 1000);
    _nowUs = std::max(_nowUs, us);
}

void ReportCollector::holdForNextFrame(MarkList list, nlohmann::ordered_json mark)
{
    _pending.emplace_back(list, std::move(mark));
}

void ReportCollector::frameDecided(const DecisionRecord& record)
{
    _lastFrameIncluded = _range.contains(record.frameNumber);
    if (!_lastFrameIncluded) {
        _pending.clear();
        return;
    }
    const auto index = static_cast<std::int64_t>(_frameCount);
    for (auto& [list, mark] : _pending) {
        mark["i"] = index;
        (list == MarkList::States ? _states : _gaps).push_back(std::move(mark));
    }
    _pending.clear();

    column(kTime).pushInteger(_nowUs);
    column(kFrame).pushInteger(record.frameNumber);
    column(kTimeMs).pushInteger(record.timeMs);
    for (std::size_t pad = 0; pad < DecisionRecord::kPadCount; ++pad) {
        column(kReadings + pad).pushInteger(record.readings[pad]);
        column(kLevels + pad).pushInteger(record.levels[pad]);
    }
    column(kActive).pushInteger(record.activePads);
    unsigned flags = 0;
    if (record.touching) flags |= kTouching;
    if (record.aboveNoise) flags |= kAboveNoise;
    if (record.holding) flags |= kHolding;
    if (record.holdSuppressed) flags |= kHoldSuppressed;
    if (record.tapCandidate) flags |= kTapCandidate;
    if (record.tapAccepted) flags |= kTapAccepted;
    if (record.tapRejected) flags |= kTapRejected;
    if (record.wasTouching) flags |= kWasTouching;
    if (record.wasHolding) flags |= kWasHolding;
    column(kFlags).pushInteger(flags);
    column(kRegion).pushInteger(static_cast<std::int64_t>(record.activeRegion));
    column(kPhase).pushInteger(static_cast<std::int64_t>(record.phase));
    column(kPhaseMs).pushInteger(record.phaseMs);
    column(kNonActive).pushInteger(record.nonActivePixels);
    column(kSvm).pushFloat(record.svmScore);
    column(kTouch).pushFloat(record.touchScore);
    column(kTap).pushFloat(record.tapScore);
    column(kSignalPerDuration).pushFloat(record.signalPerDuration);
    column(kSignalPerTouchDuration).pushFloat(record.signalPerTouchDuration);
    column(kTimeDurationRatio).pushFloat(record.timeDurationRatio);
    ++_frameCount;
}

// Events come after the frame that made them: a gesture from the recogniser's
// frame, a device reset right after the reset frame.
void ReportCollector::addEvents(const VeltoHost::HidEventList& events)
{
    if (!_lastFrameIncluded || _frameCount == 0) return;
    for (const auto& event : events) {
        const Gesture gesture = Gesture::of(*event);
        nlohmann::ordered_json mark;
        mark["i"] = _frameCount - 1;
        mark["t"] = _nowUs;
        mark["gesture"] = std::string(Gesture::name(gesture.kind));
        // A reset is in no region, and is handled as frame 0, the frame
        // number its hold end carries.
        mark["region"] = std::string(Gesture::name(gesture.region));
        const bool reset = gesture.kind == Gesture::Kind::DeviceReset;
        mark["frame"] = reset ? 0 : event->integerValue(Algs::kFrameNumberField).value_or(0);
        _events.push_back(std::move(mark));
    }
}

nlohmann::ordered_json ReportCollector::payload() const
{
    nlohmann::ordered_json columns = nlohmann::ordered_json::object();
    for (const Column& entry : _columns) {
        columns[entry.name] = {{"kind", entry.encoder.kind() == Kind::Float32 ? "float32" : "delta-varint"},
                               {"data", entry.encoder.base64()}};
    }
    nlohmann::ordered_json out;
    out["frameCount"] = _frameCount;
    out["columns"] = std::move(columns);
    out["events"] = _events;
    out["states"] = _states;
    out["gaps"] = _gaps;
    out["ignoredReports"] = _ignoredReports;
    return out;
}

}  // namespace VeltoTouch
