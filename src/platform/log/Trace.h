#pragma once

#include <cstdint>
#include <functional>

namespace VeltoHost {

struct TracePoint {
    std::uint32_t code;
    std::uint64_t arg1;
    std::uint64_t arg2;
    std::uint64_t arg3;
    std::uint64_t arg4;
};

// Kernel-visible trace points. Every emit fires the USDT probe
// "veltotouch:trace" (arguments: code, arg1..arg4), which perf or bpftrace can
// attach to in production at no cost while nothing is attached, e.g.
//   bpftrace -e 'usdt:./veltotouch:veltotouch:trace { printf("%x\n", arg0); }'
// An in-process observer, when installed, sees the same points; tests use it.
class Trace {
public:
    using Observer = std::function<void(const TracePoint&)>;

    static void emit(std::uint32_t code, std::uint64_t arg1 = 0, std::uint64_t arg2 = 0, std::uint64_t arg3 = 0,
                     std::uint64_t arg4 = 0) noexcept;

    // Installs the observer (an empty one removes it) and returns the previous one.
    // Observers are called with a lock held, one point at a time.
    static Observer setObserver(Observer observer);
};

}  // namespace VeltoHost
