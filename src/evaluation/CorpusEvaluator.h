#pragma once

#include "evaluation/EvaluationResult.h"
#include "evaluation/PipelineSetting.h"
#include "evaluation/TruthRecord.h"
#include "recording/ContainerStream.h"

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

namespace VeltoTouch {

// Evaluates a corpus of recordings once per setting on a pool of worker
// threads. A task reads one recording as it arrives and plays each frame into
// one replay per setting of its share, so memory holds a frame per worker,
// whatever the recordings' length, and a file is read once for all the
// settings of a task. The settings are split into as many shares as it takes
// to give every worker about two tasks, so that a corpus of fewer recordings
// than workers still keeps them busy. The results are added up in recording
// order, so they do not depend on the number of workers or on how the
// threads were scheduled.
class CorpusEvaluator {
public:
    struct Item {
        std::string recording;
        std::vector<TruthRecord> truth;
    };

    // Reads the recording at `path`, handing over its frames in order (a
    // failure is thrown, after the frames before it).
    using FrameReader = std::function<void(const std::string& path, const ContainerStream::FrameHandler& onFrame)>;
    // Called once per recording and setting done, from the worker that did
    // it, never twice at once.
    using Progress = std::function<void(std::size_t done, std::size_t total)>;

    // One result per entry of `settings`. A failure (a recording that cannot
    // be read) stops the other workers; the failure of the first task in
    // order among those that failed is rethrown.
    static std::vector<EvaluationResult> run(const std::vector<Item>& corpus, const std::vector<PipelineSettings>& settings,
                                             unsigned workers, const FrameReader& read, const Progress& progress = {});

    // All cores, at least one.
    static unsigned defaultWorkers() noexcept;
};

}  // namespace VeltoTouch
