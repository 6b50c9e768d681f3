#include "algs/EventStats.h"

#include "platform/values/PropertyDictionary.h"

#include <string_view>

namespace VeltoTouch {

using VeltoHost::PropertyDictionary;
using VeltoHost::PropertyValue;

namespace {

// Adds one to the counter of the region: top, bottom or middle; None and a
// missing counter (nullptr) count nothing.
void countRegion(PixelRegion region, std::uint64_t* top, std::uint64_t* bottom, std::uint64_t* middle)
{
    std::uint64_t* counter = nullptr;
    switch (region) {
    case PixelRegion::Top: counter = top; break;
    case PixelRegion::Bottom: counter = bottom; break;
    case PixelRegion::Middle: counter = middle; break;
    case PixelRegion::None: break;
    }
    if (counter) ++*counter;
}

}  // namespace

void EventStats::update(const HandStats& h)
{
    const PixelRegion region = h.activeRegion;
    if (h.touching && !h.wasTouching) return;  // the first frame of a touch says nothing yet
    if (h.holdSuppressed) {
        updateSuppressedHold(h);
    } else if (h.holding) {
        updateHold(h);
    } else if (h.wasHolding) {
        ++numEndHold;
    } else if (!h.holdTimeExceeded && h.wasHoldTimeExceeded) {
        ++numRejectedEndHold;  // a suppressed long touch was released
    } else if (h.tapCandidate && !h.tapAccepted) {
        ++numRejectedTap;
        countRegion(region, &numRejectedVolumeUp, &numRejectedVolumeDown, &numRejectedPlayPause);
    } else if (h.tapAccepted) {
        ++numTaps;
        countRegion(region, &numVolumeUp, &numVolumeDown, &numPlayPause);
    }
}

void EventStats::updateSuppressedHold(const HandStats& h)
{
    const PixelRegion region = h.activeRegion;
    if (h.wasHolding) ++numHolding2Suppressed;
    if (!h.holdTimeExceeded) {
        countRegion(region, &numRejectedVolumeIncrement, &numRejectedVolumeDecrement, nullptr);
    } else if (!h.wasHoldTimeExceeded) {
        ++numRejectedBeginHold;
        countRegion(region, &numRejectedVolumeIncrement, &numRejectedVolumeDecrement, &numRejectedOvriCall);
    } else {
        ++numRejectedIncrementHold;
        countRegion(region, &numRejectedVolumeIncrement, &numRejectedVolumeDecrement, &numRejectedOvriCallIncrement);
    }
}

void EventStats::updateHold(const HandStats& h)
{
    const PixelRegion region = h.activeRegion;
    if (h.wasHolding) {
        ++numIncrementHold;
        countRegion(region, &numVolumeIncrement, &numVolumeDecrement, &numOvriCallIncrement);
    } else {
        if (h.wasHoldSuppressed) ++numSuppressed2Holding;
        ++numBeginHold;
        countRegion(region, &numVolumeIncrement, &numVolumeDecrement, &numOvriCall);
    }
}

const std::array<EventStats::Counter, EventStats::kCounterCount>& EventStats::counters() noexcept
{
    static constexpr const char* kDispatched = "Dispatched";
    static constexpr const char* kRejected = "Rejected";
    static constexpr std::array<Counter, kCounterCount> kCounters = {{
        {kDispatched, "numTaps", &EventStats::numTaps},
        {kDispatched, "numBeginHold", &EventStats::numBeginHold},
        {kDispatched, "numIncrementHold", &EventStats::numIncrementHold},
        {kDispatched, "numEndHold", &EventStats::numEndHold},
        {kDispatched, "numHolding2Suppressed", &EventStats::numHolding2Suppressed},
        {kDispatched, "numVolumeUp", &EventStats::numVolumeUp},
        {kDispatched, "numVolumeIncrement", &EventStats::numVolumeIncrement},
        {kDispatched, "numVolumeDown", &EventStats::numVolumeDown},
        {kDispatched, "numVolumeDecrement", &EventStats::numVolumeDecrement},
        {kDispatched, "numPlayPause", &EventStats::numPlayPause},
        {kDispatched, "numOvriCall", &EventStats::numOvriCall},
        {kDispatched, "numOvriCallIncrement", &EventStats::numOvriCallIncrement},
        {kRejected, "numRejectedTap", &EventStats::numRejectedTap},
        {kRejected, "numRejectedBeginHold", &EventStats::numRejectedBeginHold},
        {kRejected, "numRejectedIncrementHold", &EventStats::numRejectedIncrementHold},
        {kRejected, "numRejectedEndHold", &EventStats::numRejectedEndHold},
        {kRejected, "numSuppressed2Holding", &EventStats::numSuppressed2Holding},
        {kRejected, "numRejectedVolumeUp", &EventStats::numRejectedVolumeUp},
        {kRejected, "numRejectedVolumeIncrement", &EventStats::numRejectedVolumeIncrement},
        {kRejected, "numRejectedVolumeDown", &EventStats::numRejectedVolumeDown},
        {kRejected, "numRejectedVolumeDecrement", &EventStats::numRejectedVolumeDecrement},
        {kRejected, "numRejectedPlayPause", &EventStats::numRejectedPlayPause},
        {kRejected, "numRejectedOvriCall", &EventStats::numRejectedOvriCall},
        {kRejected, "numRejectedOvriCallIncrement", &EventStats::numRejectedOvriCallIncrement},
    }};
    return kCounters;
}

PropertyValue EventStats::statsDictionary() const
{
    PropertyDictionary stats;
    PropertyDictionary group;
    const char* groupName = nullptr;
    for (const Counter& counter : counters()) {
        if (groupName && std::string_view(groupName) != counter.group) {
            stats.set(groupName, PropertyValue::dictionary(std::move(group)));
            group = PropertyDictionary();
        }
        groupName = counter.group;
        group.set(counter.name, PropertyValue::uint64(this->*counter.member));
    }
    if (groupName) stats.set(groupName, PropertyValue::dictionary(std::move(group)));
    return PropertyValue::dictionary(std::move(stats));
}

}  // namespace VeltoTouch
