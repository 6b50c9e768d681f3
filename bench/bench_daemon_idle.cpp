// bench-libs: bus_test_support veltotouch_daemon
//
// What the daemon costs while nothing happens: `veltotouch daemon` with two
// simulated devices (examples/taps.json and holds.json, played at once and
// then left attached, idle) on a private bus. After the playback, the
// process's CPU time over kIdleSeconds of wall time and its resident memory
// are read from /proc. Counters: cpu_percent (of one core), rss_kib,
// peak_rss_kib, threads.
#include "PrivateBus.h"
#include "tools/ToolProcessSupport.h"

#include "bus/ControlClient.h"

#include <benchmark/benchmark.h>

#include <unistd.h>

#include <fstream>
#include <sstream>
#include <string>
#include <thread>

namespace {

using namespace VeltoHost;
using VeltoTool::Testing::ToolProcess;

constexpr int kIdleSeconds = 30;

// utime + stime of /proc/PID/stat, in clock ticks.
double cpuTicks(pid_t pid)
{
    std::ifstream stat("/proc/" + std::to_string(pid) + "/stat");
    std::string text((std::istreambuf_iterator<char>(stat)), std::istreambuf_iterator<char>());
    // Fields after the command name, which is in parentheses and may hold spaces.
    std::istringstream fields(text.substr(text.rfind(')') + 2));
    std::string field;
    double utime = 0;
    double stime = 0;
    for (int index = 3; fields >> field; ++index) {
        if (index == 14) utime = std::stod(field);
        if (index == 15) {
            stime = std::stod(field);
            break;
        }
    }
    return utime + stime;
}

// A "Name:  value kB" line of /proc/PID/status.
double statusValue(pid_t pid, const std::string& name)
{
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    for (std::string line; std::getline(status, line);) {
        if (line.rfind(name + ":", 0) == 0) return std::stod(line.substr(name.size() + 1));
    }
    return 0;
}

void DaemonIdleWithTwoDevices(benchmark::State& state)
{
    PrivateBus bus;
    if (bus.address().empty()) {
        state.SkipWithError(bus.error().c_str());
        return;
    }
    ControlClient client(BusConnection::Address::at(bus.address()));
    if (!client.connected() || !client.watchSignals()) {
        state.SkipWithError("no bus client");
        return;
    }
    client.listDevices();
    const std::string examples = VELTO_EXAMPLES_DIR;
    ToolProcess daemon({"daemon", "--bus", bus.address(), "--no-udev", "--no-keys", "--speed", "0", "--device",
                        "sim:" + examples + "/taps.json", "--device", "sim:" + examples + "/holds.json"});
    // taps.json makes 6 gestures and holds.json 9: then both streams have ended.
    if (!client.waitUntil([&] { return client.signalsNamed("Gesture").size() == 6 + 9; },
                          std::chrono::seconds(60))) {
        state.SkipWithError("the daemon did not play both recordings");
        return;
    }
    std::this_thread::sleep_for(std::chrono::seconds(1));
    const pid_t pid = daemon.pid();
    for (auto _ : state) {
        const double before = cpuTicks(pid);
        const auto start = std::chrono::steady_clock::now();
        std::this_thread::sleep_for(std::chrono::seconds(kIdleSeconds));
        const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
        state.SetIterationTime(seconds);
        state.counters["cpu_percent"] = (cpuTicks(pid) - before) / static_cast<double>(::sysconf(_SC_CLK_TCK)) /
                                        seconds * 100.0;
    }
    state.counters["rss_kib"] = statusValue(pid, "VmRSS");
    state.counters["peak_rss_kib"] = statusValue(pid, "VmHWM");
    state.counters["threads"] = statusValue(pid, "Threads");
}

}  // namespace

BENCHMARK(DaemonIdleWithTwoDevices)->UseManualTime()->Iterations(1)->Unit(benchmark::kSecond);

BENCHMARK_MAIN();
