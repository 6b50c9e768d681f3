// bench-libs: veltotouch_evaluation
//
// `eval --sweep` on a pool of workers: 8 settings over a corpus of 8
// synthesised recordings of 30 random touches each, on 1 and on 2 workers.
// The work should divide among the cores: on 2 workers the time should be at
// most 0.6 of the time on 1.
//
// On a machine that other jobs keep busy, the wall time of 2 workers says
// more about the neighbours than about the pool, so the benchmark also
// reports critical_cpu_ms: the CPU time of the busiest worker, which is what
// the run would take with a free core per worker.
#include "evaluation/CorpusEvaluator.h"
#include "evaluation/SweepGrid.h"

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <ctime>
#include <map>
#include <thread>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string>

namespace {

using namespace VeltoTouch;

std::string readFile(const std::string& path)
{
    std::ifstream in(path);
    std::ostringstream text;
    text << in.rdbuf();
    return text.str();
}

// Made once with the built tool, removed at exit.
const std::vector<CorpusEvaluator::Item>& corpus()
{
    static const std::filesystem::path dir =
        std::filesystem::temp_directory_path() / ("veltotouch-bench-eval-" + std::to_string(::getpid()));
    static const std::vector<CorpusEvaluator::Item> items = [] {
        std::filesystem::create_directories(dir);
        std::atexit([] { std::filesystem::remove_all(dir); });
        std::vector<CorpusEvaluator::Item> out;
        for (int seed = 1; seed <= 8; ++seed) {
            const std::string recording = (dir / ("random" + std::to_string(seed) + ".json")).string();
            const std::string command = std::string(VELTO_TOOL_PATH) + " synth --random 30 --seed " +
                                        std::to_string(seed) + " -o " + recording + " --truth auto";
            if (std::system(command.c_str()) != 0) throw std::runtime_error("synth failed: " + command);
            out.push_back({recording, TruthRecord::parseLines(readFile(TruthRecord::pathBeside(recording)))});
        }
        return out;
    }();
    return items;
}

double threadCpuMs()
{
    timespec now{};
    ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) * 1e3 + static_cast<double>(now.tv_nsec) / 1e6;
}

void BM_EvalSweep(benchmark::State& state)
{
    const auto& items = corpus();
    const auto grid = SweepGrid::combinations({SweepGrid::parseAxis("Algs.HoldTimeoutMilliseconds=300:1000:100")});
    // As the tool reads them: streamed from the file.
    const auto load = [](const std::string& path, const ContainerStream::FrameHandler& onFrame) {
        const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
        if (fd < 0) throw std::runtime_error("cannot open " + path);
        try {
            ContainerStream::read(fd, onFrame);
        } catch (...) {
            ::close(fd);
            throw;
        }
        ::close(fd);
    };
    double criticalCpuMs = 0;
    for (auto _ : state) {
        // The CPU time of each thread after its latest task; the progress
        // calls come from the worker that did the task, one at a time. A
        // single worker is the calling thread itself, counted from here.
        const std::thread::id caller = std::this_thread::get_id();
        const double callerStart = threadCpuMs();
        std::map<std::thread::id, double> cpuMs;
        auto results = CorpusEvaluator::run(items, grid, static_cast<unsigned>(state.range(0)), load,
                                            [&](std::size_t, std::size_t) {
                                                const auto self = std::this_thread::get_id();
                                                cpuMs[self] = threadCpuMs() - (self == caller ? callerStart : 0.0);
                                            });
        benchmark::DoNotOptimize(results);
        double busiest = 0;
        for (const auto& [thread, ms] : cpuMs) busiest = std::max(busiest, ms);
        criticalCpuMs += busiest;
    }
    state.counters["settings"] = static_cast<double>(grid.size());
    state.counters["critical_cpu_ms"] = benchmark::Counter(criticalCpuMs, benchmark::Counter::kAvgIterations);
}
BENCHMARK(BM_EvalSweep)->ArgName("workers")->Arg(1)->Arg(2)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
