#pragma once

#include "evaluation/EvaluationResult.h"
#include "evaluation/PipelineSetting.h"
#include "evaluation/TruthRecord.h"
#include "recording/PipelineRecording.h"

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

namespace VeltoTouch {

// Evaluates a corpus of recordings once per setting on a pool of worker
// threads. The work is one task per recording and setting; each recording is
// loaded by the first task that needs it and dropped when its last setting is
// done, and the tasks run a group of recordings (one per worker) at a time,
// so memory holds about as many recordings as there are workers, not the
// corpus. Each task replays through a fresh pipeline of its own. The results
// are added up in recording order, so they do not depend on the number of
// workers or on how the threads were scheduled.
class CorpusEvaluator {
public:
    struct Item {
        std::string recording;
        std::vector<TruthRecord> truth;
    };

    using Loader = std::function<PipelineRecording(const std::string& path)>;
    // Called after each task, from the worker that did it, never twice at once.
    using Progress = std::function<void(std::size_t done, std::size_t total)>;

    // One result per entry of `settings`. A failure (a recording that cannot
    // be read) stops the other workers; the failure of the first task in
    // order among those that failed is rethrown.
    static std::vector<EvaluationResult> run(const std::vector<Item>& corpus, const std::vector<PipelineSettings>& settings,
                                             unsigned workers, const Loader& load, const Progress& progress = {});

    // All cores, at least one.
    static unsigned defaultWorkers() noexcept;
};

}  // namespace VeltoTouch
