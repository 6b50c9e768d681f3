#include "algs/EventStats.h"

#include "platform/PropertyDictionary.h"

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

PropertyValue EventStats::statsDictionary() const
{
    PropertyDictionary dispatched;
    dispatched.set("numTaps", PropertyValue::uint64(numTaps));
    dispatched.set("numBeginHold", PropertyValue::uint64(numBeginHold));
    dispatched.set("numIncrementHold", PropertyValue::uint64(numIncrementHold));
    dispatched.set("numEndHold", PropertyValue::uint64(numEndHold));
    dispatched.set("numHolding2Suppressed", PropertyValue::uint64(numHolding2Suppressed));
    dispatched.set("numVolumeUp", PropertyValue::uint64(numVolumeUp));
    dispatched.set("numVolumeIncrement", PropertyValue::uint64(numVolumeIncrement));
    dispatched.set("numVolumeDown", PropertyValue::uint64(numVolumeDown));
    dispatched.set("numVolumeDecrement", PropertyValue::uint64(numVolumeDecrement));
    dispatched.set("numPlayPause", PropertyValue::uint64(numPlayPause));
    dispatched.set("numOvriCall", PropertyValue::uint64(numOvriCall));
    dispatched.set("numOvriCallIncrement", PropertyValue::uint64(numOvriCallIncrement));

    PropertyDictionary rejected;
    rejected.set("numRejectedTap", PropertyValue::uint64(numRejectedTap));
    rejected.set("numRejectedBeginHold", PropertyValue::uint64(numRejectedBeginHold));
    rejected.set("numRejectedIncrementHold", PropertyValue::uint64(numRejectedIncrementHold));
    rejected.set("numRejectedEndHold", PropertyValue::uint64(numRejectedEndHold));
    rejected.set("numSuppressed2Holding", PropertyValue::uint64(numSuppressed2Holding));
    rejected.set("numRejectedVolumeUp", PropertyValue::uint64(numRejectedVolumeUp));
    rejected.set("numRejectedVolumeIncrement", PropertyValue::uint64(numRejectedVolumeIncrement));
    rejected.set("numRejectedVolumeDown", PropertyValue::uint64(numRejectedVolumeDown));
    rejected.set("numRejectedVolumeDecrement", PropertyValue::uint64(numRejectedVolumeDecrement));
    rejected.set("numRejectedPlayPause", PropertyValue::uint64(numRejectedPlayPause));
    rejected.set("numRejectedOvriCall", PropertyValue::uint64(numRejectedOvriCall));
    rejected.set("numRejectedOvriCallIncrement", PropertyValue::uint64(numRejectedOvriCallIncrement));

    PropertyDictionary stats;
    stats.set("Dispatched", PropertyValue::dictionary(std::move(dispatched)));
    stats.set("Rejected", PropertyValue::dictionary(std::move(rejected)));
    return PropertyValue::dictionary(std::move(stats));
}

}  // namespace VeltoTouch
