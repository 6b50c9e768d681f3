#pragma once

#include "algs/DecisionObserver.h"
#include "algs/DecisionRecord.h"
#include "algs/EventStats.h"
#include "algs/HandStats.h"
#include "algs/Pixel.h"
#include "algs/PixelRegion.h"
#include "algs/TouchPhase.h"
#include "algs/VirtualImage.h"
#include "algs/VirtualPixel.h"
#include "platform/log/Log.h"
#include "platform/plugin/HidEvent.h"
#include "platform/values/PropertyValue.h"
#include "records/InputReport.h"

#include <array>
#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace VeltoTouch {

using VeltoHost::PropertyValue;

// The gesture recogniser. One frame in, at most one gesture event out.
class Algs {
public:
    // Integer field of every emitted event that carries its frame number.
    static constexpr std::uint32_t kFrameNumberField = 0x000B001B;

    using Readings = std::array<std::int16_t, InputReport::kPadCount>;

    Algs();

    VeltoHost::HidEventList handleImage(const InputReport::Image& image);
    // One frame of all-zero readings with frame number 0 and time 0.
    VeltoHost::HidEventList handleReset();
    void processTouchFrame(const Readings& readings, unsigned int frameNumber, unsigned int timeMs,
                           VeltoHost::HidEventList& events);
    // Forgets the statistics of the touch that has just ended.
    void Reset();

    PropertyValue getState(const std::string& key);
    void setState(const std::string& key, PropertyValue value);

    // One state key of the recogniser, declared once: getState, setState and
    // the listing of every key (veltotouch properties) all read this table.
    // An indexed key is a family: its name ends in ".N" and the key's index
    // picks one entry. Values that are not numbers count as 0 when set, and
    // nothing is range-checked: the host is trusted to tune within reason.
    struct StateKey {
        const char* name;
        const char* type;
        const char* meaning;
        // nullptr: reads as null (an action).
        PropertyValue (*get)(const Algs& algs, std::size_t index);
        // nullptr: read-only, setting it does nothing.
        void (*set)(Algs& algs, std::size_t index, const PropertyValue& value);
        bool indexed = false;
    };
    static constexpr std::size_t kStateKeyCount = 8;
    static const std::array<StateKey, kStateKeyCount>& stateKeys() noexcept;

    // One row of the event decision. Every frame the first row whose
    // condition holds for the hand statistics (and the phase of the last
    // event) decides: the event it creates, in the touch's active region, and
    // whether the touch's statistics are reset.
    struct EventRule {
        const char* name;
        bool (*holds)(const HandStats& hand, std::uint16_t lastEventPhase);
        VeltoHost::HidEventRef (*create)(PixelRegion region);  // a null reference: no event
        bool resetsTouch;
    };
    static constexpr std::size_t kEventRuleCount = 8;
    static const std::array<EventRule, kEventRuleCount>& eventRules() noexcept;

    static VeltoHost::HidEventRef createMayBeginEvent(PixelRegion region);
    static VeltoHost::HidEventRef createHoldStartEvent(PixelRegion region);
    static VeltoHost::HidEventRef createHoldChangeEvent(PixelRegion region);
    static VeltoHost::HidEventRef createHoldEndEvent(PixelRegion region);
    static VeltoHost::HidEventRef createTapEvent(PixelRegion region);
    static VeltoHost::HidEventRef createCancelEvent();

    VeltoHost::Log log{"Algs"};
    std::vector<Pixel> pixels;
    VirtualImage virtualImage;
    std::vector<VirtualPixel> virtualPixels;
    HandStats handStats;
    EventStats eventStats;
    std::uint16_t lastEventPhase = 0;
    // Told about every frame when set; not owned.
    DecisionObserver* decisionObserver = nullptr;

private:
    // What the event decision table says for one frame.
    struct EventDecision {
        VeltoHost::HidEventRef event;
        bool resetsTouch = false;
    };

    void updatePixels(const Readings& readings);
    void updateVirtualPixels();
    EventDecision decideEvent() const;
    // The entry of `key` and, for an indexed one, the key's index.
    static const StateKey* stateKeyFor(const std::string& key, std::size_t& index);
    template <std::size_t... Row>
    EventDecision decideEvent(std::index_sequence<Row...>) const;
    void emitEvent(const VeltoHost::HidEventRef& event, unsigned int frameNumber, VeltoHost::HidEventList& events);
    DecisionRecord decisionRecord(const Readings& readings, unsigned int frameNumber, unsigned int timeMs,
                                  const VeltoHost::HidEventRef& event, const EventStats& countersBefore) const;
    // The phase word of this frame and the milliseconds printed with it.
    std::pair<TouchPhase, std::int32_t> touchPhase(unsigned int timeMs) const;
};

}  // namespace VeltoTouch
