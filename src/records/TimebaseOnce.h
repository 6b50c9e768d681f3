#pragma once

#include "platform/runtime/MonotonicClock.h"

#include <functional>
#include <mutex>

namespace VeltoTouch {

// Reads the clock's timebase once, on first use, and serves the stored pair
// from then on without locking. The time conversions share one instance; tests
// make their own with another source.
class TimebaseOnce {
public:
    using Source = std::function<VeltoHost::Timebase()>;

    explicit TimebaseOnce(Source source) : _source(std::move(source)) {}

    const VeltoHost::Timebase& get()
    {
        std::call_once(_once, [this] { _timebase = _source(); });
        return _timebase;
    }

private:
    Source _source;
    std::once_flag _once;
    VeltoHost::Timebase _timebase;
};

}  // namespace VeltoTouch
