#include "evaluation/CorpusEvaluator.h"

#include "evaluation/RecordingReplay.h"
#include "evaluation/TruthMatcher.h"

#include <algorithm>
#include <atomic>
#include <exception>
#include <memory>
#include <mutex>
#include <thread>

namespace VeltoTouch {

namespace {

// A recording loaded by the first task that needs it and released by the last.
struct LoadedRecording {
    std::mutex mutex;
    std::shared_ptr<const PipelineRecording> recording;
    std::size_t tasksLeft = 0;
};

}  // namespace

unsigned CorpusEvaluator::defaultWorkers() noexcept { return std::max(1u, std::thread::hardware_concurrency()); }

std::vector<EvaluationResult> CorpusEvaluator::run(const std::vector<Item>& corpus,
                                                   const std::vector<PipelineSettings>& settings, unsigned workers,
                                                   const Loader& load, const Progress& progress)
{
    const std::size_t perRecording = settings.size();
    const std::size_t total = corpus.size() * perRecording;
    std::vector<LoadedRecording> loaded(corpus.size());
    for (LoadedRecording& slot : loaded) slot.tasksLeft = perRecording;
    std::vector<EvaluationResult> taskResults(total);
    std::vector<std::exception_ptr> failures(total);
    std::atomic<std::size_t> next{0};
    std::atomic<bool> failed{false};
    std::mutex progressMutex;
    std::size_t done = 0;

    const std::size_t threads = std::clamp<std::size_t>(workers, 1, std::max<std::size_t>(total, 1));
    // Tasks run in groups of as many recordings as there are workers, setting
    // by setting within a group: the workers start on different recordings
    // and load them side by side, where taking one recording's settings in a
    // row would leave all but one worker waiting for its load.
    const auto taskAt = [&](std::size_t position) {
        const std::size_t group = position / (threads * perRecording);
        const std::size_t first = group * threads;
        const std::size_t size = std::min(threads, corpus.size() - first);
        const std::size_t offset = position - first * perRecording;
        return std::make_pair(first + offset % size, offset / size);
    };

    const auto work = [&] {
        for (std::size_t position = next++; position < total && !failed; position = next++) {
            const auto [r, setting] = taskAt(position);
            const std::size_t task = r * perRecording + setting;
            LoadedRecording& slot = loaded[r];
            try {
                std::shared_ptr<const PipelineRecording> recording;
                {
                    std::lock_guard lock(slot.mutex);
                    if (!slot.recording) slot.recording = std::make_shared<const PipelineRecording>(load(corpus[r].recording));
                    recording = slot.recording;
                }
                const auto replay = RecordingReplay::run(recording->frames(), settings[setting]);
                taskResults[task] = TruthMatcher::match(corpus[r].truth, replay);
            } catch (...) {
                failures[task] = std::current_exception();
                failed = true;
            }
            {
                std::lock_guard lock(slot.mutex);
                if (--slot.tasksLeft == 0) slot.recording.reset();
            }
            if (progress) {
                std::lock_guard lock(progressMutex);
                progress(++done, total);
            }
        }
    };

    if (threads == 1) {
        work();
    } else {
        std::vector<std::jthread> pool;
        for (std::size_t i = 0; i < threads; ++i) pool.emplace_back(work);
    }

    // In task order, so that the failure reported does not depend on scheduling.
    for (const std::exception_ptr& failure : failures) {
        if (failure) std::rethrow_exception(failure);
    }
    std::vector<EvaluationResult> results(perRecording);
    for (std::size_t task = 0; task < total; ++task) results[task % perRecording].add(taskResults[task]);
    return results;
}

}  // namespace VeltoTouch
