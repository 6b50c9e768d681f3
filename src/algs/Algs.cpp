#include "algs/Algs.h"

#include "algs/DecisionDump.h"
#include "platform/values/PropertyDictionary.h"
#include "records/DomainKey.h"

#include <sstream>
#include <tuple>
#include <utility>

namespace VeltoTouch {

using VeltoHost::HidEvent;
using VeltoHost::HidEventList;
using VeltoHost::HidEventRef;
using VeltoHost::LogLevel;

namespace {

// Gain of each pad A..O, evening out the pads' different sizes and distances
// from the cover.
constexpr std::array<float, InputReport::kPadCount> kPadGains = {
    1.9219f, 1.8833f, 1.9281f, 1.8837f, 1.9163f, 1.8105f, 1.0081f, 1.0f,
    1.4851f, 1.5033f, 2.4154f, 1.5378f, 1.5431f, 1.04f,   1.0493f};

constexpr const char* kFactorDomain = "VirtualNormalizationFactors";

// Index after the factor domain and its dot, read as a stream reads an
// unsigned number: blanks skipped, digits up to the first other character,
// and 0 when nothing can be read.
bool factorIndexFromKey(const std::string& key, std::size_t& index)
{
    std::string rest = key;
    if (!Util::stripDomainFromKey(rest, kFactorDomain)) return false;
    std::istringstream stream(rest);
    unsigned long value = 0;
    stream >> value;
    index = value;
    return true;
}

// The recogniser's state keys (see Algs::StateKey).
using AlgsRef = const Algs&;
constexpr std::array<Algs::StateKey, Algs::kStateKeyCount> kStateKeys = {{
    {"EnableHoldSuppression", "boolean", "a long touch holds only with enough touch score; a non-zero number is true",
     [](AlgsRef a, std::size_t) { return PropertyValue::boolean(a.handStats.enableHoldSuppression); },
     [](Algs& a, std::size_t, const PropertyValue& v) { a.handStats.enableHoldSuppression = v.toBool(); }},
    {"EnableTapSuppression", "boolean", "a release is a tap only if the tap-rejection features accept it",
     [](AlgsRef a, std::size_t) { return PropertyValue::boolean(a.handStats.enableTapSuppression); },
     [](Algs& a, std::size_t, const PropertyValue& v) { a.handStats.enableTapSuppression = v.toBool(); }},
    {"HoldTimeoutMilliseconds", "uint32", "touch time after which a touch may become a hold (low 32 bits kept)",
     [](AlgsRef a, std::size_t) { return PropertyValue::uint32(a.handStats.holdTimeoutMs); },
     [](Algs& a, std::size_t, const PropertyValue& v) {
         a.handStats.holdTimeoutMs = static_cast<std::uint32_t>(v.toUInt64());
     }},
    {"ActivationThreshold", "float32", "level at which a pad or group turns active (the divisor of its ratio)",
     [](AlgsRef a, std::size_t) { return PropertyValue::float32(a.handStats.activationThreshold); },
     [](Algs& a, std::size_t, const PropertyValue& v) { a.handStats.activationThreshold = v.toFloat(); }},
    {"VirtualNormalizationFactors.N", "float32",
     "factor N (0 to 22) of the group table; null beyond it. The groups keep the gains they were built with",
     [](AlgsRef a, std::size_t n) {
         const auto& factors = a.virtualImage.normalizationFactors;
         return n < factors.size() ? PropertyValue::float32(factors[n]) : PropertyValue::null();
     },
     [](Algs& a, std::size_t n, const PropertyValue& v) {
         auto& factors = a.virtualImage.normalizationFactors;
         if (n < factors.size()) factors[n] = v.toFloat();
     },
     true},
    {"EventStats", "dictionary", "gesture counters, Dispatched and Rejected, by kind and region",
     [](AlgsRef a, std::size_t) { return a.eventStats.statsDictionary(); }, nullptr},
    {"ResetEventStats", "action", "setting it, to any value, zeroes every counter; reads as null", nullptr,
     [](Algs& a, std::size_t, const PropertyValue&) { a.eventStats.Reset(); }},
    {"DebugInfo", "dictionary", "the counters again, under the key EventStats",
     [](AlgsRef a, std::size_t) {
         VeltoHost::PropertyDictionary info;
         info.set("EventStats", a.eventStats.statsDictionary());
         return PropertyValue::dictionary(std::move(info));
     },
     nullptr},
}};

// The event decision, row by row (see Algs::EventRule).
using Hand = const HandStats&;
HidEventRef noEvent(PixelRegion) { return nullptr; }
constexpr std::array<Algs::EventRule, Algs::kEventRuleCount> kEventRules = {{
    {"a touch begins", [](Hand h, std::uint16_t) { return h.touching && !h.wasTouching; },
     &Algs::createMayBeginEvent, false},
    {"a hold begins", [](Hand h, std::uint16_t) { return h.holding && !h.wasHolding; },
     &Algs::createHoldStartEvent, false},
    {"a hold moves to another region",
     [](Hand h, std::uint16_t) { return h.holding && h.wasHolding && h.activeRegion != h.previousActiveRegion; },
     &Algs::createHoldChangeEvent, false},
    {"a hold ends", [](Hand h, std::uint16_t) { return h.wasHolding && !h.holding; }, &Algs::createHoldEndEvent,
     true},
    {"a tap is accepted", [](Hand h, std::uint16_t) { return h.tapAccepted; }, &Algs::createTapEvent, true},
    {"a touch ends right after its may-begin",
     [](Hand h, std::uint16_t lastPhase) {
         return !h.touching && h.wasTouching && lastPhase == HidEvent::kPhaseMayBegin;
     },
     [](PixelRegion) { return Algs::createCancelEvent(); }, true},
    {"a touch ends otherwise", [](Hand h, std::uint16_t) { return !h.touching && h.wasTouching; }, noEvent, true},
    {"anything else", [](Hand, std::uint16_t) { return true; }, noEvent, false},
}};

}  // namespace

Algs::Algs()
{
    pixels.reserve(kPadGains.size());
    for (std::size_t pad = 0; pad < kPadGains.size(); ++pad) pixels.emplace_back(static_cast<int>(pad), kPadGains[pad]);
    virtualPixels.reserve(virtualImage.groups.size());
    for (std::size_t group = 0; group < virtualImage.groups.size(); ++group) {
        virtualPixels.emplace_back(virtualImage.groups[group], virtualImage.normalizationFactors[group]);
    }
}

HidEventList Algs::handleImage(const InputReport::Image& image)
{
    HidEventList events;
    processTouchFrame(image.readings, image.frameNumber, image.timeMs, events);
    return events;
}

HidEventList Algs::handleReset()
{
    // A reset device reads nothing: running one empty frame releases a touch
    // in progress through the ordinary rules.
    HidEventList events;
    processTouchFrame(Readings{}, 0, 0, events);
    return events;
}

void Algs::processTouchFrame(const Readings& readings, unsigned int frameNumber, unsigned int timeMs,
                             HidEventList& events)
{
    updatePixels(readings);
    virtualImage.updateValues(pixels);
    updateVirtualPixels();
    handStats.updateHandState(pixels, virtualPixels, timeMs);

    const EventDecision decision = decideEvent();
    if (decision.resetsTouch) Reset();
    if (decision.event) emitEvent(decision.event, frameNumber, events);

    // The record is made only for someone who looks at it; the counters
    // before the frame are part of it.
    const bool dumping = log.isEnabled(LogLevel::Debug);
    if (!decisionObserver && !dumping) {
        eventStats.update(handStats);
        return;
    }
    const EventStats countersBefore = eventStats;
    eventStats.update(handStats);
    const DecisionRecord record = decisionRecord(readings, frameNumber, timeMs, decision.event, countersBefore);
    if (decisionObserver) decisionObserver->frameDecided(record);
    for (std::size_t which = 0; dumping && which < DecisionDump::kMessageCount; ++which) {
        if (log.isEnabled(LogLevel::Debug)) log.write(LogLevel::Debug, DecisionDump::message(which, record));
    }
}

// Flattened: every pad and group is updated every report, and a call per
// element costs as much as the update (a release build inlines the elements'
// code from their own files).
[[gnu::flatten]] void Algs::updatePixels(const Readings& readings)
{
    for (std::size_t pad = 0; pad < readings.size(); ++pad) {
        pixels[pad].updatePixelState(readings[pad], handStats.activationThreshold);
    }
}

[[gnu::flatten]] void Algs::updateVirtualPixels()
{
    for (std::size_t group = 0; group < virtualImage.groups.size(); ++group) {
        // The group sum travels as a pad reading would: a signed 16-bit number.
        const auto raw = static_cast<std::int16_t>(virtualImage.values[group]);
        virtualPixels[group].updatePixelState(raw, handStats.activationThreshold, virtualImage.maxIndex[group]);
    }
}

const std::array<Algs::EventRule, Algs::kEventRuleCount>& Algs::eventRules() noexcept { return kEventRules; }

// The rows are tried in order, unrolled over the constant table so that
// every condition is inlined: this runs every frame.
template <std::size_t... Row>
Algs::EventDecision Algs::decideEvent(std::index_sequence<Row...>) const
{
    EventDecision decision;
    static_cast<void>(((kEventRules[Row].holds(handStats, lastEventPhase) &&
                        (decision = {kEventRules[Row].create(handStats.activeRegion), kEventRules[Row].resetsTouch},
                         true)) ||
                       ...));
    return decision;
}

Algs::EventDecision Algs::decideEvent() const { return decideEvent(std::make_index_sequence<kEventRuleCount>()); }

void Algs::emitEvent(const HidEventRef& event, unsigned int frameNumber, HidEventList& events)
{
    event->setIntegerValue(kFrameNumberField, frameNumber);
    lastEventPhase = event->phase();
    events.push_back(event);
}

void Algs::Reset()
{
    for (Pixel& pixel : pixels) pixel.resetGlobalStats();
    for (VirtualPixel& pixel : virtualPixels) pixel.resetGlobalStats();
    handStats.Reset();
}

PropertyValue Algs::getState(const std::string& key)
{
    std::size_t index = 0;
    const StateKey* entry = stateKeyFor(key, index);
    if (!entry || !entry->get) return PropertyValue::null();
    return entry->get(*this, index);
}

void Algs::setState(const std::string& key, PropertyValue value)
{
    std::size_t index = 0;
    const StateKey* entry = stateKeyFor(key, index);
    if (entry && entry->set) entry->set(*this, index, value);
}

const Algs::StateKey* Algs::stateKeyFor(const std::string& key, std::size_t& index)
{
    for (const StateKey& entry : kStateKeys) {
        if (!entry.indexed && key == entry.name) return &entry;
        if (entry.indexed && factorIndexFromKey(key, index)) return &entry;
    }
    return nullptr;
}

const std::array<Algs::StateKey, Algs::kStateKeyCount>& Algs::stateKeys() noexcept { return kStateKeys; }

// The phase of the touch in this frame; the first row that holds decides.
std::pair<TouchPhase, std::int32_t> Algs::touchPhase(unsigned int timeMs) const
{
    const HandStats& hand = handStats;
    // Differences wrap in 32 bits and print as signed numbers.
    const auto sinceStart = static_cast<std::int32_t>(timeMs - hand.touchStartTime);
    const auto duration = static_cast<std::int32_t>(hand.touchEndTime - hand.touchStartTime);

    if (hand.touching && !hand.wasTouching) return {TouchPhase::StartTouch, sinceStart};
    if (hand.holding && hand.wasHolding) return {TouchPhase::Holding, sinceStart};
    if (hand.holding) return {TouchPhase::StartHold, sinceStart};
    if (hand.holdSuppressed) return {TouchPhase::SuppressHold, sinceStart};
    if (hand.touching) return {TouchPhase::Touching, sinceStart};
    if (hand.wasHolding) return {TouchPhase::EndHold, duration};
    if (hand.tapAccepted) return {TouchPhase::Tap, duration};
    if (hand.tapCandidate) return {TouchPhase::SuppressTap, sinceStart};
    if (hand.wasTouching) return {TouchPhase::EndTouch, duration};
    return {TouchPhase::Idle, 0};
}

DecisionRecord Algs::decisionRecord(const Readings& readings, unsigned int frameNumber, unsigned int timeMs,
                                    const HidEventRef& event, const EventStats& countersBefore) const
{
    const HandStats& hand = handStats;
    DecisionRecord record;
    record.frameNumber = frameNumber;
    record.timeMs = timeMs;
    record.readings = readings;
    for (std::size_t pad = 0; pad < DecisionRecord::kPadCount; ++pad) {
        const Pixel& pixel = pixels.at(pad);
        record.levels[pad] = pixel.value;
        if (pixel.active) record.activePads |= static_cast<std::uint16_t>(1u << pad);
    }
    for (std::size_t group = 0; group < DecisionRecord::kVirtualCount; ++group) {
        const VirtualPixel& pixel = virtualPixels.at(group);
        record.virtualLevels[group] = pixel.value;
        if (pixel.active) record.activeVirtualPixels |= 1u << group;
    }
    record.svmScore = hand.svm.score;
    record.touchScore = hand.touchScore;
    record.activeRegion = hand.activeRegion;
    record.regionScores = hand.regionMax;
    record.signalPerDuration = hand.signalPerDuration;
    record.signalPerTouchDuration = hand.signalPerTouchDuration;
    record.timeDurationRatio = hand.timeDurationRatio;
    record.nonActivePixels = hand.nonActivePixels;
    record.tapScore = hand.tapSVMScore;
    record.tapRejected = hand.tapRejected;
    record.touching = hand.touching;
    record.wasTouching = hand.wasTouching;
    record.aboveNoise = hand.aboveNoise;
    record.holding = hand.holding;
    record.wasHolding = hand.wasHolding;
    record.holdSuppressed = hand.holdSuppressed;
    record.tapCandidate = hand.tapCandidate;
    record.tapAccepted = hand.tapAccepted;
    std::tie(record.phase, record.phaseMs) = touchPhase(timeMs);
    record.event = event;
    record.countersBefore = countersBefore;
    record.counters = eventStats;
    return record;
}

HidEventRef Algs::createMayBeginEvent(PixelRegion region) { return Gesture{Gesture::Kind::MayBegin, region}.event(); }

HidEventRef Algs::createHoldStartEvent(PixelRegion region) { return Gesture{Gesture::Kind::HoldStart, region}.event(); }

HidEventRef Algs::createHoldChangeEvent(PixelRegion region)
{
    return Gesture{Gesture::Kind::HoldChange, region}.event();
}

HidEventRef Algs::createHoldEndEvent(PixelRegion region) { return Gesture{Gesture::Kind::HoldEnd, region}.event(); }

HidEventRef Algs::createTapEvent(PixelRegion region) { return Gesture{Gesture::Kind::Tap, region}.event(); }

HidEventRef Algs::createCancelEvent() { return Gesture{Gesture::Kind::Cancel, PixelRegion::None}.event(); }

}  // namespace VeltoTouch
