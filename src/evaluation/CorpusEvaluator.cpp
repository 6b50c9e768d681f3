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

unsigned CorpusEvaluator::defaultWorkers() noexcept { return std::max(1u, std::thread::hardware_concurrency()); }

std::vector<EvaluationResult> CorpusEvaluator::run(const std::vector<Item>& corpus,
                                                   const std::vector<PipelineSettings>& settings, unsigned workers,
                                                   const FrameReader& read, const Progress& progress)
{
    const std::size_t perRecording = settings.size();
    const std::size_t total = corpus.size() * perRecording;
    const std::size_t threads = std::clamp<std::size_t>(workers, 1, std::max<std::size_t>(total, 1));
    // Shares of the settings: each costs one more read of the recording, so
    // only as many as it takes to give every worker about two tasks.
    const std::size_t shares =
        threads == 1 || corpus.empty()
            ? 1
            : std::clamp<std::size_t>((2 * threads + corpus.size() - 1) / corpus.size(), 1, std::max<std::size_t>(perRecording, 1));
    const std::size_t tasks = corpus.size() * shares;

    // Indexed by recording and setting.
    std::vector<EvaluationResult> results(total);
    std::vector<std::exception_ptr> failures(total);
    std::atomic<std::size_t> next{0};
    std::atomic<bool> failed{false};
    std::mutex progressMutex;
    std::size_t done = 0;

    const auto work = [&] {
        for (std::size_t task = next++; task < tasks && !failed; task = next++) {
            const std::size_t r = task / shares;
            const std::size_t share = task % shares;
            const std::size_t first = share * perRecording / shares;
            const std::size_t end = (share + 1) * perRecording / shares;
            try {
                std::vector<std::unique_ptr<RecordingReplay>> replays;
                for (std::size_t s = first; s < end; ++s) replays.push_back(std::make_unique<RecordingReplay>(settings[s]));
                read(corpus[r].recording, [&](PipelineRecording::Frame&& frame) {
                    for (const auto& replay : replays) replay->play(frame);
                });
                for (std::size_t s = first; s < end; ++s) {
                    results[r * perRecording + s] = TruthMatcher::match(corpus[r].truth, replays[s - first]->outcome());
                }
            } catch (...) {
                failures[r * perRecording + first] = std::current_exception();
                failed = true;
            }
            if (progress) {
                std::lock_guard lock(progressMutex);
                for (std::size_t s = first; s < end; ++s) progress(++done, total);
            }
        }
    };

    if (threads == 1) {
        work();
    } else {
        std::vector<std::jthread> pool;
        for (std::size_t i = 0; i < threads; ++i) pool.emplace_back(work);
    }

    // In recording order, so that the failure reported does not depend on scheduling.
    for (const std::exception_ptr& failure : failures) {
        if (failure) std::rethrow_exception(failure);
    }
    std::vector<EvaluationResult> perSetting(perRecording);
    for (std::size_t i = 0; i < total; ++i) perSetting[i % perRecording].add(results[i]);
    return perSetting;
}

}  // namespace VeltoTouch
