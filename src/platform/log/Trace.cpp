#include "platform/log/Trace.h"

#include <atomic>
#include <mutex>
#include <sys/sdt.h>

namespace VeltoHost {

namespace {

struct ObserverSlot {
    std::atomic<bool> installed{false};
    std::mutex lock;
    Trace::Observer observer;
};

ObserverSlot& observerSlot()
{
    static ObserverSlot slot;
    return slot;
}

}  // namespace

void Trace::emit(std::uint32_t code, std::uint64_t arg1, std::uint64_t arg2, std::uint64_t arg3,
                 std::uint64_t arg4) noexcept
{
    DTRACE_PROBE5(veltotouch, trace, code, arg1, arg2, arg3, arg4);
    ObserverSlot& slot = observerSlot();
    // The flag keeps the common case (no observer) free of the lock.
    if (!slot.installed.load(std::memory_order_acquire)) return;
    std::lock_guard guard(slot.lock);
    if (slot.observer) {
        try {
            slot.observer(TracePoint{code, arg1, arg2, arg3, arg4});
        } catch (...) {
            // An observer is diagnostics; it must never break the traced path.
        }
    }
}

Trace::Observer Trace::setObserver(Observer observer)
{
    ObserverSlot& slot = observerSlot();
    std::lock_guard guard(slot.lock);
    slot.installed.store(static_cast<bool>(observer), std::memory_order_release);
    slot.observer.swap(observer);
    return observer;
}

}  // namespace VeltoHost
