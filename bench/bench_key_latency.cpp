// bench-libs: veltotouch_tool PkgConfig::evdev
//
// Latency from the write of a surface's input report into the kernel to the
// key press it causes on the daemon's virtual keyboard, against the kernel's
// own share of that path. It needs what a container's kernel lacks (/dev/uhid,
// hidraw, evdev) and a running `veltotouch daemon`, so it is meant for the VM
// that scripts/bench-key-latency boots and prepares; anywhere else both
// benchmarks skip with the reason.
//   - UhidToHidraw (the floor): a surface made here through /dev/uhid, its
//     hidraw node read here by a thread scheduled like the plug-in's
//     input-report thread; every report is timed from its write to the
//     return of that thread's read().
//   - ReportToKey: a surface with the ids of the daemon's [[match]], which
//     the daemon finds through udev and reads; the reports of taps are
//     written into it, and each report after which the daemon sends a key is
//     timed from its write to the wake-up of a thread here that reads the
//     evdev node of "VeltoTouch keys" (read_*), and to the time stamp the
//     kernel put on the key press when the daemon's key frame (press, sync)
//     reached evdev (stamp_*), which leaves out that reader's own wake-up.
//     The daemon's share is the difference of the read figures to the
//     floor's (share_*, when the floor ran first in the same process).
// Both write the same reports on the same schedule: the taps of
// examples/taps.json (top, middle, bottom), renumbered so that frame numbers
// and the reports' own clock (timeMs, which is all the recogniser goes by)
// advance by one frame and 10 ms from each report to the next over the whole
// run, as a device's do; in wall time they are written faster, `spacing_us`
// apart, far enough for every thread on the path to be asleep again when the
// next one comes (the recogniser's decisions do not depend on it: the
// daemon sends every key where the same reports played through a pipeline
// and key map here send it, which is checked key by key). Percentiles are
// counters in microseconds.
#include "ToolFiles.h"
#include "VirtualSurface.h"
#include "daemon/KeyMap.h"
#include "pipeline/Pipeline.h"
#include "platform/devices/UhidDevice.h"
#include "platform/runtime/Thread.h"
#include "recording/PipelineRecording.h"
#include "records/Gesture.h"
#include "records/InputReport.h"
#include "service/VeltoTouchHIDService.h"

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <libevdev/libevdev.h>
#include <linux/input.h>
#include <linux/uhid.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <deque>
#include <dirent.h>
#include <fstream>
#include <mutex>
#include <optional>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

namespace {

using VeltoHost::UhidDevice;
using Bytes = std::vector<std::uint8_t>;

constexpr const char* kKeyboardName = "VeltoTouch keys";
// The daemon's device must carry the ids of its [[match]] (the script's
// configuration names emulate's defaults); the floor's must not, or the daemon
// would read it too.
constexpr std::uint32_t kFloorProduct = 0x5670;
constexpr std::uint32_t kFrameMs = 10;
constexpr auto kArrivalTimeout = std::chrono::seconds(2);
constexpr auto kNodeTimeout = std::chrono::seconds(10);

std::uint64_t nowNs()
{
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000'000u + static_cast<std::uint64_t>(now.tv_nsec);
}

struct Percentiles {
    double p50 = 0;
    double p99 = 0;
    double max = 0;
};

Percentiles percentiles(std::vector<std::uint64_t> samples)
{
    std::sort(samples.begin(), samples.end());
    auto at = [&](double q) {
        return static_cast<double>(samples[static_cast<std::size_t>(q * (samples.size() - 1))]) / 1000.0;
    };
    return {at(0.50), at(0.99), static_cast<double>(samples.back()) / 1000.0};
}

void setCounters(benchmark::State& state, const std::string& prefix, const Percentiles& figures)
{
    state.counters[prefix + "p50_us"] = figures.p50;
    state.counters[prefix + "p99_us"] = figures.p99;
    state.counters[prefix + "max_us"] = figures.max;
}

// The floor's figures, for the daemon's benchmark that runs after it.
std::optional<Percentiles> floorFigures;

// What a reader thread saw: when it woke, the kernel's time stamp of the
// event (evdev only) and the key code or report ID.
struct Arrival {
    std::uint64_t readNs = 0;
    std::uint64_t stampNs = 0;
    unsigned int code = 0;
};

// Arrivals handed from a reader thread to the benchmark's thread; the
// benchmark's own wake-up is not part of any figure.
class Mailbox {
public:
    void post(const Arrival& arrival)
    {
        {
            std::lock_guard guard(_lock);
            _arrivals.push_back(arrival);
        }
        _changed.notify_one();
    }

    std::optional<Arrival> take(std::chrono::steady_clock::duration timeout)
    {
        std::unique_lock guard(_lock);
        if (!_changed.wait_for(guard, timeout, [this] { return !_arrivals.empty(); })) return std::nullopt;
        const Arrival arrival = _arrivals.front();
        _arrivals.pop_front();
        return arrival;
    }

    // Drops what is waiting; returns how many there were.
    std::size_t clear()
    {
        std::lock_guard guard(_lock);
        return std::exchange(_arrivals, {}).size();
    }

private:
    std::mutex _lock;
    std::condition_variable _changed;
    std::deque<Arrival> _arrivals;
};

// The surface as `veltotouch emulate` makes it, with its default ids (those
// the daemon's configuration in scripts/bench-key-latency names).
UhidDevice::Identity emulatedSurface()
{
    return {VeltoTool::VirtualSurface::kName, BUS_USB, 0x1234, 0x5678, 0, 0, VeltoTool::VirtualSurface::reportDescriptor()};
}

// The reports of the run and, for each, the key the daemon presses after it
// (0: none), found by playing them through a pipeline and the default key map
// here, as the daemon's plug-in and session do.
struct TapRun {
    std::vector<Bytes> reports;
    std::vector<unsigned int> keyAfter;
    std::size_t keys = 0;
};

TapRun tapRun(int rounds)
{
    const auto recording = VeltoTool::ToolFiles::readRecording(std::string(VELTO_EXAMPLES_DIR) + "/taps.json");
    std::vector<VeltoTouch::InputReport::Image> round;
    for (const auto& frame : recording.frames()) {
        if (frame.type != VeltoTouch::PipelineRecording::Frame::Type::InputReport) continue;
        if (auto image = VeltoTouch::InputReport::Image::parse(frame.report.data(), frame.report.size())) {
            round.push_back(*image);
        }
    }
    TapRun run;
    if (round.empty()) return run;
    const std::uint32_t firstFrame = round.front().frameNumber;
    const std::uint32_t firstMs = round.front().timeMs;
    std::uint32_t index = 0;
    for (int pass = 0; pass < rounds; ++pass) {
        for (VeltoTouch::InputReport::Image image : round) {
            image.frameNumber = firstFrame + index;
            image.timeMs = firstMs + index * kFrameMs;
            run.reports.push_back(image.toReport());
            ++index;
        }
    }

    VeltoTouch::Pipeline pipeline;
    VeltoHost::KeyMap keys;
    unsigned int pressed = 0;
    pipeline.hidEventsProbe = [&](const VeltoHost::HidEventList& events) {
        for (const auto& event : events) {
            for (const auto& action : keys.handle(VeltoTouch::Gesture::of(*event))) {
                if (action.pressed && pressed == 0) pressed = action.code;
            }
        }
    };
    for (const Bytes& report : run.reports) {
        pressed = 0;
        pipeline.handleInputReport(report.data(), report.size());
        run.keyAfter.push_back(pressed);
        if (pressed != 0) ++run.keys;
    }
    return run;
}

// /dev/uhid, or the benchmark skipped with why not.
int openUhid(benchmark::State& state)
{
    std::string error;
    const int fd = UhidDevice::openNode(UhidDevice::kDefaultPath, error);
    if (fd < 0) {
        error += "; this benchmark runs in a VM: scripts/bench-key-latency";
        state.SkipWithError(error.c_str());
    }
    return fd;
}

std::string readText(const std::string& path)
{
    std::ifstream file(path);
    std::stringstream text;
    text << file.rdbuf();
    return text.str();
}

std::vector<std::string> entriesOf(const std::string& directory, const std::string& prefix)
{
    std::vector<std::string> names;
    if (DIR* listing = ::opendir(directory.c_str())) {
        while (const dirent* entry = ::readdir(listing)) {
            if (std::strncmp(entry->d_name, prefix.c_str(), prefix.size()) == 0) names.push_back(entry->d_name);
        }
        ::closedir(listing);
    }
    return names;
}

// The hidraw node of the device named `name`, once the kernel has made it.
std::string hidrawNodeNamed(const std::string& name)
{
    const auto deadline = std::chrono::steady_clock::now() + kNodeTimeout;
    do {
        for (const std::string& node : entriesOf("/sys/class/hidraw", "hidraw")) {
            const std::string uevent = readText("/sys/class/hidraw/" + node + "/device/uevent");
            if (uevent.find("HID_NAME=" + name + "\n") != std::string::npos &&
                ::access(("/dev/" + node).c_str(), R_OK) == 0) {
                return "/dev/" + node;
            }
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    } while (std::chrono::steady_clock::now() < deadline);
    return {};
}

// The daemon's virtual keyboard, opened without blocking, or -1.
int openKeyboard()
{
    for (const std::string& node : entriesOf("/dev/input", "event")) {
        const int fd = ::open(("/dev/input/" + node).c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
        if (fd < 0) continue;
        libevdev* device = nullptr;
        const bool found = libevdev_new_from_fd(fd, &device) == 0 && libevdev_get_name(device) &&
                           std::strcmp(libevdev_get_name(device), kKeyboardName) == 0;
        if (device) libevdev_free(device);
        if (found) return fd;
        ::close(fd);
    }
    return -1;
}

// Reads key presses from the keyboard's evdev node on a thread of its own,
// with the kernel's time stamps on CLOCK_MONOTONIC, until destroyed.
class KeyReader {
public:
    KeyReader(int fd, Mailbox& mailbox) : _fd(fd), _mailbox(mailbox), _stop(::eventfd(0, EFD_CLOEXEC))
    {
        libevdev_new_from_fd(_fd, &_device);
        _ready = _device && _stop >= 0 && libevdev_set_clock_id(_device, CLOCK_MONOTONIC) == 0;
        if (_ready) _thread = std::thread([this] { readUntilStopped(); });
    }
    ~KeyReader()
    {
        if (_thread.joinable()) {
            const std::uint64_t one = 1;
            if (::write(_stop, &one, sizeof one) == sizeof one) _thread.join();
            else _thread.detach();
        }
        if (_device) libevdev_free(_device);
        if (_stop >= 0) ::close(_stop);
        ::close(_fd);
    }
    KeyReader(const KeyReader&) = delete;
    KeyReader& operator=(const KeyReader&) = delete;

    bool ready() const noexcept { return _ready; }

private:
    void readUntilStopped()
    {
        pollfd waits[2] = {{_fd, POLLIN, 0}, {_stop, POLLIN, 0}};
        for (;;) {
            if (::poll(waits, 2, -1) < 0) {
                if (errno == EINTR) continue;
                return;
            }
            const std::uint64_t woke = nowNs();
            if (waits[1].revents != 0 || (waits[0].revents & (POLLERR | POLLHUP)) != 0) return;
            input_event event{};
            int status = 0;
            while ((status = libevdev_next_event(_device, LIBEVDEV_READ_FLAG_NORMAL, &event)) >= 0) {
                if (status != LIBEVDEV_READ_STATUS_SUCCESS || event.type != EV_KEY || event.value != 1) continue;
                const std::uint64_t stamp = static_cast<std::uint64_t>(event.input_event_sec) * 1'000'000'000u +
                                            static_cast<std::uint64_t>(event.input_event_usec) * 1000u;
                _mailbox.post({woke, stamp, event.code});
            }
            if (status != -EAGAIN) return;
        }
    }

    int _fd;
    Mailbox& _mailbox;
    int _stop;
    libevdev* _device = nullptr;
    bool _ready = false;
    std::thread _thread;
};

// Waits, answering the kernel meanwhile, until a reader opens the device;
// false after kNodeTimeout.
bool waitForReader(UhidDevice& device)
{
    const auto deadline = std::chrono::steady_clock::now() + kNodeTimeout;
    return device.waitUntilOpened([&] { return std::chrono::steady_clock::now() > deadline; });
}

void sleepMicroseconds(std::int64_t microseconds)
{
    std::this_thread::sleep_for(std::chrono::microseconds(microseconds));
}

void BM_UhidToHidraw(benchmark::State& state)
{
    const TapRun run = tapRun(static_cast<int>(state.range(0)));
    const std::int64_t spacing = state.range(1);
    // Both runs time the taps' reports; without keys there is nothing to time.
    if (run.keys == 0) return state.SkipWithError("examples/taps.json brought no key");
    for (auto _ : state) {
        const int uhid = openUhid(state);
        if (uhid < 0) return;
        UhidDevice::Identity identity = emulatedSurface();
        identity.name = "VeltoTouch latency floor " + std::to_string(::getpid());
        identity.product = kFloorProduct;
        UhidDevice device(uhid, nullptr);
        if (!device.create(identity)) {
            state.SkipWithError(device.error().c_str());
            return;
        }
        const std::string node = hidrawNodeNamed(identity.name);
        const int hidraw = node.empty() ? -1 : ::open(node.c_str(), O_RDONLY | O_CLOEXEC);
        if (hidraw < 0) {
            state.SkipWithError("the floor's uhid device got no hidraw node that opens");
            return;
        }
        if (!waitForReader(device)) {
            ::close(hidraw);
            state.SkipWithError("uhid never said that the hidraw node was opened");
            return;
        }
        Mailbox mailbox;
        std::atomic<int> schedulingError{0};
        // Blocked in read() with the plug-in's scheduling; ends when the
        // device is destroyed (the read fails).
        std::thread reader([&] {
            using Service = VeltoTouch::VeltoTouchHIDService;
            schedulingError = VeltoHost::Thread::setCurrentScheduling(Service::kInputReportThreadPolicy,
                                                                      Service::kInputReportThreadPriority);
            std::uint8_t buffer[Service::kInputReportBufferSize];
            for (;;) {
                const ssize_t count = ::read(hidraw, buffer, sizeof buffer);
                const std::uint64_t read = nowNs();
                if (count < 0 && errno == EINTR) continue;
                if (count <= 0) return;
                mailbox.post({read, 0, buffer[0]});
            }
        });
        std::vector<std::uint64_t> samples;
        samples.reserve(run.reports.size());
        bool lost = false;
        for (std::size_t i = 0; i < run.reports.size() && !lost; ++i) {
            sleepMicroseconds(spacing);
            const std::uint64_t written = nowNs();
            if (!device.sendInputReport(run.reports[i].data(), run.reports[i].size())) break;
            const std::optional<Arrival> arrival = mailbox.take(kArrivalTimeout);
            if (!arrival) lost = true;
            else samples.push_back(arrival->readNs - written);
        }
        const std::string writeError = device.error();
        device.destroy();
        reader.join();
        ::close(hidraw);
        if (!writeError.empty()) return state.SkipWithError(writeError.c_str());
        if (lost) return state.SkipWithError("a report written into uhid never came out of hidraw");
        floorFigures = percentiles(samples);
        setCounters(state, "", *floorFigures);
        state.counters["samples"] = static_cast<double>(samples.size());
        // 0 where the process may not schedule in real time (not root): the
        // floor is then that of an ordinary thread, higher than the plug-in's.
        state.counters["realtime_reader"] = schedulingError == 0 ? 1 : 0;
    }
}
// Arguments: rounds of examples/taps.json (3 taps each), microseconds between reports.
BENCHMARK(BM_UhidToHidraw)
    ->ArgNames({"rounds", "spacing_us"})
    ->Args({100, 1000})
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

void BM_ReportToKey(benchmark::State& state)
{
    const TapRun run = tapRun(static_cast<int>(state.range(0)));
    const std::int64_t spacing = state.range(1);
    // Both runs time the taps' reports; without keys there is nothing to time.
    if (run.keys == 0) return state.SkipWithError("examples/taps.json brought no key");
    for (auto _ : state) {
        const int uhid = openUhid(state);
        if (uhid < 0) return;
        UhidDevice::Identity identity = emulatedSurface();
        const int keyboard = openKeyboard();
        if (keyboard < 0) {
            ::close(uhid);
            state.SkipWithError("no evdev node named \"VeltoTouch keys\": start `veltotouch daemon` with a [[match]] "
                                "of vendor 0x1234, product 0x5678 first (scripts/bench-key-latency does)");
            return;
        }
        Mailbox mailbox;
        KeyReader keys(keyboard, mailbox);
        if (!keys.ready()) {
            ::close(uhid);
            state.SkipWithError("cannot read \"VeltoTouch keys\" with monotonic time stamps");
            return;
        }
        identity.name = "VeltoTouch latency surface " + std::to_string(::getpid());
        UhidDevice device(uhid, nullptr);
        if (!device.create(identity)) return state.SkipWithError(device.error().c_str());
        if (!waitForReader(device)) {
            return state.SkipWithError("the daemon did not open the surface (its [[match]] must name vendor 0x1234, "
                                       "product 0x5678, and udev must be running)");
        }
        // The daemon opens the node before its plug-in's input-report thread
        // runs; the first reports wait in hidraw's queue until then, so the
        // run starts once the session is surely up.
        std::this_thread::sleep_for(std::chrono::milliseconds(500));
        std::vector<std::uint64_t> reads;
        std::vector<std::uint64_t> stamps;
        std::size_t unexpected = 0;
        std::size_t missed = 0;
        std::string failure;
        for (std::size_t i = 0; i < run.reports.size() && failure.empty(); ++i) {
            sleepMicroseconds(spacing);
            const unsigned int expected = run.keyAfter[i];
            // A key that came where none was expected would be taken for the next one.
            if (expected != 0) unexpected += mailbox.clear();
            const std::uint64_t written = nowNs();
            if (!device.sendInputReport(run.reports[i].data(), run.reports[i].size())) {
                failure = device.error();
                break;
            }
            if (expected == 0) continue;
            // A missed key is counted, not fatal: hidraw keeps 64 reports per
            // reader and drops what comes beyond, which the daemon's input
            // thread may let happen when the host stalls its virtual processor
            // for longer than 64 spacings (the daemon then logs a disjoint
            // image). A real device's 10 ms frames leave ten times the room.
            std::optional<Arrival> arrival;
            while ((arrival = mailbox.take(kArrivalTimeout)) && arrival->code != expected) ++unexpected;
            if (!arrival) {
                ++missed;
                continue;
            }
            reads.push_back(arrival->readNs - written);
            stamps.push_back(arrival->stampNs - written);
            // The uhid queue gets nothing here but what the kernel says to the
            // writer; it is emptied between taps.
            if (!device.servePending()) failure = device.error();
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
        unexpected += mailbox.clear();
        device.destroy();
        if (!failure.empty()) return state.SkipWithError(failure.c_str());
        if (reads.empty()) return state.SkipWithError("no key came from the daemon");
        const Percentiles figures = percentiles(reads);
        setCounters(state, "read_", figures);
        setCounters(state, "stamp_", percentiles(stamps));
        if (floorFigures) {
            state.counters["share_p50_us"] = figures.p50 - floorFigures->p50;
            state.counters["share_p99_us"] = figures.p99 - floorFigures->p99;
        }
        state.counters["keys"] = static_cast<double>(reads.size());
        state.counters["missed_keys"] = static_cast<double>(missed);
        state.counters["unexpected_keys"] = static_cast<double>(unexpected);
    }
}
BENCHMARK(BM_ReportToKey)
    ->ArgNames({"rounds", "spacing_us"})
    ->Args({100, 1000})
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
