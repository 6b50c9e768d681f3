// Raw input reports into a pipeline behind its recorder, interleaved with
// property writes and reads along the host's key path, as the service wires
// them. Besides "no crash, no throw", every step checks what the host relies on:
// at most one gesture event per image (plus the vendor event of a reset), every
// event stamped with the time the recorder handed on and tagged with its
// frame, the counters never falling except through a reset of the statistics,
// every call recorded as it was made, and the recording, replayed into a new
// pipeline, giving the same events again.
//
// Input: a sequence of operations, each introduced by one byte:
//   1 N                   the last image again N+1 times, frame number and device
//                         time advancing as a device's would (for long touches)
//   2 KEY VALUE           a property write: KLEN KEY-BYTES, then a value (below)
//   3 KEY                 a property read
//   4                     the "Recording" read: copy, write and read back
//   other LEN BYTES       an input report of LEN bytes, as the device sends it
// Any other byte stands for a report so that bytes the fuzzer shifts out of
// place mostly read as cheap reports rather than as long repeats.
// A value is a kind byte (modulo 12) and its data: 0 no value, 1 null,
// 2 boolean, 3 int32, 4 int64, 5 uint32, 6 uint64, 7 float32, 8 float64 (all
// little-endian), 9 string, 10 byte data (each LEN and bytes), 11 JSON text
// (LEN and text; malformed text gives no value).
#include "FuzzInput.h"
#include "pipeline/Pipeline.h"
#include "platform/plugin/HidEvent.h"
#include "platform/values/PropertyDictionary.h"
#include "recording/JsonValue.h"
#include "recording/PipelineRecording.h"
#include "records/DomainKey.h"
#include "records/Gesture.h"
#include "records/InputReport.h"

#include <array>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <exception>
#include <memory>
#include <numeric>
#include <optional>
#include <string>
#include <tuple>
#include <type_traits>
#include <vector>

namespace {

using VeltoFuzz::FuzzInput;
using VeltoHost::HidEvent;
using VeltoHost::HidEventList;
using VeltoHost::PropertyDictionary;
using VeltoTouch::Pipeline;
using VeltoTouch::PipelineRecording;
using VeltoTouch::PropertyValue;
namespace InputReport = VeltoTouch::InputReport;

// The service's recording limit, so that trimming runs as it does live.
constexpr std::uint64_t kFrameLimit = 1350;
constexpr std::uint32_t kFramePeriodMs = 10;
// Bounds on the work one input may ask for, so that a few bytes of repeat or
// export operations cannot make an input take seconds.
constexpr int kMaxImagesPerInput = 3000;
constexpr int kMaxExportsPerInput = 1;

// Every statistics counter, as the recogniser holds them. Taken from the
// object itself because a dictionary per frame would cost more than the frame;
// the key path is checked against it after every property operation.
using Counters = std::array<std::uint64_t, sizeof(VeltoTouch::EventStats) / sizeof(std::uint64_t)>;
static_assert(std::is_trivially_copyable_v<VeltoTouch::EventStats>);
static_assert(sizeof(VeltoTouch::EventStats) % sizeof(std::uint64_t) == 0);

std::uint64_t sumOfCounters(const PropertyValue& value)
{
    if (!value.isDictionary()) {
        VELTO_FUZZ_CHECK(value.isNumber());
        return value.toUInt64();
    }
    std::uint64_t sum = 0;
    for (const auto& entry : value.asDictionary()) sum += sumOfCounters(entry.second);
    return sum;
}

PropertyValue decodeValue(FuzzInput& in)
{
    switch (in.byte() % 12) {
    case 0: return PropertyValue();
    case 1: return PropertyValue::null();
    case 2: return PropertyValue::boolean(in.byte() & 1);
    case 3: return PropertyValue::int32(in.number<std::int32_t>());
    case 4: return PropertyValue::int64(in.number<std::int64_t>());
    case 5: return PropertyValue::uint32(in.number<std::uint32_t>());
    case 6: return PropertyValue::uint64(in.number<std::uint64_t>());
    case 7: return PropertyValue::float32(in.number<float>());
    case 8: return PropertyValue::float64(in.number<double>());
    case 9: return PropertyValue::string(in.text(in.byte()));
    case 10: return PropertyValue::bytes(in.bytes(in.byte()));
    default:
        return VeltoTouch::JsonValue::parse(in.text(in.byte()), VeltoTouch::JsonValue::TopLevel::AnyValue);
    }
}

// The host hands keys over as C strings: whatever follows a NUL never arrives.
std::string decodeKey(FuzzInput& in)
{
    const std::string raw = in.text(in.byte());
    return raw.substr(0, std::strlen(raw.c_str()));
}

bool sameBits(float a, float b) { return std::memcmp(&a, &b, sizeof a) == 0; }

// An event as the host tells it apart; the time stamps of a replay differ.
using Gesture = std::tuple<HidEvent::Kind, std::uint16_t, double, std::optional<std::int64_t>, std::uint32_t>;

Gesture gestureOf(const HidEvent& event)
{
    return {event.kind(), event.phase(), event.digitizer().y,
            event.integerValue(VeltoTouch::Algs::kFrameNumberField), event.vendorDefined().usage};
}

// What the pipeline's probes saw during one operation.
struct Observed {
    int setTimeCalls = 0;
    std::uint64_t time = 0;
    int setStateCalls = 0;
    std::string stateKey;
    const void* stateValue = nullptr;
    int eventBatches = 0;
    HidEventList events;
    int invalidReports = 0;
};

class Harness {
public:
    Harness() : _pipeline(std::make_shared<Pipeline>())
    {
        _recording.pipeline = _pipeline;
        _recording.setMaxFrameCount(kFrameLimit);
        _pipeline->setTimeProbe = [this](std::uint64_t time) {
            ++_seen.setTimeCalls;
            _seen.time = time;
        };
        _pipeline->setStateProbe = [this](const std::string& key, const PropertyValue& value) {
            ++_seen.setStateCalls;
            _seen.stateKey = key;
            _seen.stateValue = value.identity();
        };
        _pipeline->hidEventsProbe = [this](const HidEventList& events) {
            ++_seen.eventBatches;
            _seen.events.insert(_seen.events.end(), events.begin(), events.end());
            for (const auto& event : events) _liveEvents.push_back(gestureOf(*event));
        };
        _pipeline->invalidInputReportProbe = [this](const std::uint8_t*, std::size_t) { ++_seen.invalidReports; };
        _counters = counters();
    }

    void run(FuzzInput& in)
    {
        int images = 0;
        int exports = 0;
        while (!in.empty() && images < kMaxImagesPerInput) {
            switch (in.byte()) {
            case 1:
                for (int n = in.byte() + 1; n > 0 && images < kMaxImagesPerInput; --n, ++images) nextImage();
                break;
            case 2: {
                const std::string key = decodeKey(in);
                propertyWrite(key, decodeValue(in));
                break;
            }
            case 3: propertyRead(decodeKey(in)); break;
            case 4:
                if (exports++ < kMaxExportsPerInput) recordingRead();
                break;
            default: {
                const std::vector<std::uint8_t> report = in.bytes(in.byte());
                images += report.size() >= InputReport::Image::kLength;
                inputReport(report);
                break;
            }
            }
        }
        checkCountersByKey();
        checkReplayMatches();
    }

private:
    // The service's write path: keys in the "Pipeline" domain go, without
    // their domain, through the recorder; every other key goes to the device,
    // which is not part of this test.
    void propertyWrite(const std::string& hostKey, const PropertyValue& value)
    {
        std::string key = hostKey;
        if (!VeltoTouch::Util::stripDomainFromKey(key, "Pipeline")) return;
        _seen = Observed{};
        _recording.setState(key, value);
        ++_recordedCalls;

        VELTO_FUZZ_CHECK(_seen.setTimeCalls == 1);
        VELTO_FUZZ_CHECK(_seen.setStateCalls == 1);
        VELTO_FUZZ_CHECK(_seen.stateKey == key);
        VELTO_FUZZ_CHECK(_seen.stateValue == value.identity());  // shared, not copied
        VELTO_FUZZ_CHECK(_seen.eventBatches == 0);
        const PipelineRecording::Frame& frame = _recording.frames().back();
        VELTO_FUZZ_CHECK(frame.type == PipelineRecording::Frame::Type::State);
        VELTO_FUZZ_CHECK(frame.key == key);
        VELTO_FUZZ_CHECK(frame.value.identity() == value.identity());
        checkRecordingBound();

        // Writes change no counter, except the one that zeroes the statistics.
        const Counters now = counters();
        if (key == "Algs.ResetEventStats") {
            for (std::uint64_t count : now) VELTO_FUZZ_CHECK(count == 0);
        } else {
            VELTO_FUZZ_CHECK(now == _counters);
        }
        _counters = now;
        checkCountersByKey();
        checkDebugInfo();
        checkSettingReadsBack(key, value);
    }

    void checkSettingReadsBack(const std::string& key, const PropertyValue& value)
    {
        const PropertyValue stored = _pipeline->getState(key);
        if (key == "Algs.EnableHoldSuppression" || key == "Algs.EnableTapSuppression") {
            VELTO_FUZZ_CHECK(stored == PropertyValue::boolean(value.toBool()));
        } else if (key == "Algs.HoldTimeoutMilliseconds") {
            VELTO_FUZZ_CHECK(stored == PropertyValue::uint32(static_cast<std::uint32_t>(value.toUInt64())));
        } else if (key == "Algs.ActivationThreshold") {
            VELTO_FUZZ_CHECK(stored.isNumber() && sameBits(stored.toFloat(), value.toFloat()));
        }
    }

    void propertyRead(const std::string& hostKey)
    {
        std::string key = hostKey;
        if (!VeltoTouch::Util::stripDomainFromKey(key, "Pipeline")) return;
        _seen = Observed{};
        const PropertyValue value = _pipeline->getState(key);
        // Unknown keys read as null, never as nothing; reads change nothing.
        VELTO_FUZZ_CHECK(value.hasValue());
        VELTO_FUZZ_CHECK(_seen.setTimeCalls == 0 && _seen.setStateCalls == 0 && _seen.eventBatches == 0);
        checkCountersByKey();
    }

    void recordingRead()
    {
        const std::size_t liveFrames = _recording.frames().size();
        PipelineRecording copy = _recording;
        const std::string text = copy.json();
        std::optional<PipelineRecording> read;
        try {
            read.emplace(std::string_view(text));
        } catch (const std::exception& error) {
            std::fprintf(stderr, "a written recording does not read back: %s\n", error.what());
            std::abort();
        }
        const PipelineRecording& again = *read;
        VELTO_FUZZ_CHECK(_recording.frames().size() == liveFrames);
        VELTO_FUZZ_CHECK(again.frames().size() == copy.frames().size());
        auto it = again.frames().begin();
        for (const PipelineRecording::Frame& frame : copy.frames()) {
            VELTO_FUZZ_CHECK(it->type == frame.type);
            VELTO_FUZZ_CHECK(it->timestampNs == frame.timestampNs);
            VELTO_FUZZ_CHECK(it->report == frame.report);
            VELTO_FUZZ_CHECK(it->value.hasValue() == frame.value.hasValue());
            ++it;
        }
    }

    void nextImage()
    {
        InputReport::Image image;
        if (_lastImage) {
            image = *_lastImage;
            image.frameNumber += 1;
            image.timeMs += kFramePeriodMs;
        }
        inputReport(image.toReport());
    }

    void inputReport(const std::vector<std::uint8_t>& report)
    {
        _seen = Observed{};
        _recording.handleInputReport(report.data(), report.size());
        ++_recordedCalls;

        VELTO_FUZZ_CHECK(_seen.setTimeCalls == 1);
        VELTO_FUZZ_CHECK(_seen.setStateCalls == 0);
        const PipelineRecording::Frame& frame = _recording.frames().back();
        VELTO_FUZZ_CHECK(frame.type == PipelineRecording::Frame::Type::InputReport);
        VELTO_FUZZ_CHECK(frame.report == report);
        checkRecordingBound();
        // One batch per report at most, never an empty one, all of it stamped
        // with the time the recorder handed on.
        VELTO_FUZZ_CHECK(_seen.eventBatches <= 1);
        VELTO_FUZZ_CHECK((_seen.eventBatches == 1) == !_seen.events.empty());
        for (const auto& event : _seen.events) VELTO_FUZZ_CHECK(event->timeStamp() == _seen.time);

        const Counters now = counters();
        if (auto event = InputReport::FirmwareEvent::parse(report.data(), report.size())) {
            VELTO_FUZZ_CHECK(_seen.invalidReports == 0);
            if (event->event == InputReport::FirmwareEvent::kEventDeviceReset) {
                ++_resets;
                checkResetEvents();
                checkCountersGrew(now);
            } else {
                VELTO_FUZZ_CHECK(_seen.events.empty());
                VELTO_FUZZ_CHECK(now == _counters);
            }
        } else if (auto image = InputReport::Image::parse(report.data(), report.size())) {
            VELTO_FUZZ_CHECK(_seen.invalidReports == 0);
            if (_lastImage && image->frameNumber != static_cast<std::uint32_t>(_lastImage->frameNumber + 1)) {
                ++_disjointImages;
            }
            _lastImage = image;
            VELTO_FUZZ_CHECK(_seen.events.size() <= 1);
            for (const auto& event : _seen.events) checkGestureEvent(*event, image->frameNumber);
            checkCountersGrew(now);
        } else {
            VELTO_FUZZ_CHECK(_seen.invalidReports == 1);
            VELTO_FUZZ_CHECK(_seen.events.empty());
            VELTO_FUZZ_CHECK(now == _counters);
        }
        _counters = now;
        checkDebugInfo();
    }

    // A recording is there to reproduce what happened: played into a new
    // pipeline, an untrimmed recording must give the same events as the live
    // one did.
    void checkReplayMatches()
    {
        if (_recording.frames().size() != _recordedCalls) return;  // trimmed
        PipelineRecording copy = _recording;
        auto replayed = std::make_shared<Pipeline>();
        std::vector<Gesture> events;
        replayed->hidEventsProbe = [&events](const HidEventList& list) {
            for (const auto& event : list) events.push_back(gestureOf(*event));
        };
        copy.pipeline = replayed;
        copy.sleepMicroseconds = [](std::uint64_t) {};
        copy.playReset();
        while (copy.playCanContinue()) copy.playNextFrame(1.0f);
        VELTO_FUZZ_CHECK(events == _liveEvents);
    }

    // The recogniser's frame of the reset may end a gesture; the vendor event
    // that announces the reset comes last and only once.
    void checkResetEvents()
    {
        VELTO_FUZZ_CHECK(_seen.events.size() == 1 || _seen.events.size() == 2);
        const HidEvent& vendor = *_seen.events.back();
        VELTO_FUZZ_CHECK(vendor.kind() == HidEvent::Kind::VendorDefined);
        VELTO_FUZZ_CHECK(vendor.vendorDefined().usagePage == Pipeline::kResetEventUsagePage);
        VELTO_FUZZ_CHECK(vendor.vendorDefined().usage == Pipeline::kResetEventUsage);
        VELTO_FUZZ_CHECK(vendor.vendorDefined().payload.empty());
        if (_seen.events.size() == 2) checkGestureEvent(*_seen.events.front(), 0);
    }

    static void checkGestureEvent(const HidEvent& event, std::uint32_t frameNumber)
    {
        VELTO_FUZZ_CHECK(event.kind() == HidEvent::Kind::Digitizer);
        VELTO_FUZZ_CHECK(event.integerValue(VeltoTouch::Algs::kFrameNumberField) == std::int64_t{frameNumber});
        // One of the six gesture moments, its fields exactly as the gesture
        // encodes them; only a cancel has no region.
        const VeltoTouch::Gesture gesture = VeltoTouch::Gesture::of(event);
        const VeltoHost::HidEventRef encoded = gesture.event();
        VELTO_FUZZ_CHECK(encoded != nullptr);
        VELTO_FUZZ_CHECK(event.phase() == encoded->phase());
        VELTO_FUZZ_CHECK(event.digitizer().eventMask == encoded->digitizer().eventMask);
        VELTO_FUZZ_CHECK(event.digitizer().y == encoded->digitizer().y);
        if (gesture.kind == VeltoTouch::Gesture::Kind::Cancel) {
            VELTO_FUZZ_CHECK(gesture.region == VeltoTouch::Gesture::Region::None);
        }
    }

    void checkCountersGrew(const Counters& now) const
    {
        for (std::size_t i = 0; i < now.size(); ++i) VELTO_FUZZ_CHECK(now[i] >= _counters[i]);
    }

    void checkDebugInfo() const
    {
        const PropertyValue info = _pipeline->getState("DebugInfo");
        VELTO_FUZZ_CHECK(info.isDictionary());
        VELTO_FUZZ_CHECK(info.asDictionary().get("ResetCount") == PropertyValue::uint32(_resets));
        VELTO_FUZZ_CHECK(info.asDictionary().get("DisjointImageCount") == PropertyValue::uint32(_disjointImages));
    }

    // Trimming keeps the live recording below twice its limit.
    void checkRecordingBound() const { VELTO_FUZZ_CHECK(_recording.frames().size() < 2 * kFrameLimit); }

    Counters counters() const
    {
        Counters out;
        std::memcpy(out.data(), &_pipeline->algs().eventStats, sizeof out);
        return out;
    }

    // What the host reads under "EventStats" holds the same counters.
    void checkCountersByKey() const
    {
        const Counters now = counters();
        const std::uint64_t sum = std::accumulate(now.begin(), now.end(), std::uint64_t{0});
        VELTO_FUZZ_CHECK(sumOfCounters(_pipeline->getState("Algs.EventStats")) == sum);
    }

    std::shared_ptr<Pipeline> _pipeline;
    PipelineRecording _recording;
    Observed _seen;
    Counters _counters;
    // The test's own account of what the pipeline must have counted.
    std::optional<InputReport::Image> _lastImage;
    std::uint32_t _resets = 0;
    std::uint32_t _disjointImages = 0;
    std::vector<Gesture> _liveEvents;
    std::size_t _recordedCalls = 0;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    FuzzInput in(data, size);
    try {
        Harness harness;
        harness.run(in);
    } catch (const std::exception& error) {
        // The live path never throws, whatever the device or the host sends.
        std::fprintf(stderr, "live path threw: %s\n", error.what());
        std::abort();
    }
    return 0;
}
