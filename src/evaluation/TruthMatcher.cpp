#include "evaluation/TruthMatcher.h"

#include "records/TickConversion.h"

#include <algorithm>
#include <optional>

namespace VeltoTouch {

using Kind = TruthRecord::Kind;

namespace {

struct Recognised {
    TruthRecord gesture;        // kind, region, to; start = its first event
    std::uint64_t decided = 0;  // the deciding event
    std::optional<std::size_t> truth;
};

std::vector<Recognised> gesturesOf(const std::vector<RecordingReplay::TimedGesture>& events)
{
    std::vector<Recognised> out;
    std::optional<Recognised> hold;
    const auto closeHold = [&] {
        if (!hold) return;
        if (hold->gesture.to != hold->gesture.region) hold->gesture.kind = Kind::Slide;
        else hold->decided = hold->gesture.start;
        out.push_back(*hold);
        hold.reset();
    };
    for (const auto& [gesture, time] : events) {
        switch (gesture.kind) {
        case Gesture::Kind::Tap: out.push_back({{Kind::Tap, gesture.region, gesture.region, time, time}, time, {}}); break;
        case Gesture::Kind::DeviceReset:
            out.push_back({{Kind::Reset, Gesture::Region::None, Gesture::Region::None, time, time}, time, {}});
            break;
        case Gesture::Kind::HoldStart:
            closeHold();
            hold = Recognised{{Kind::Hold, gesture.region, gesture.region, time, time}, time, {}};
            break;
        case Gesture::Kind::HoldChange:
            if (hold) {
                hold->gesture.to = gesture.region;
                hold->decided = time;
                hold->gesture.end = time;
            }
            break;
        case Gesture::Kind::HoldEnd:
            if (hold) hold->gesture.end = time;
            closeHold();
            break;
        case Gesture::Kind::MayBegin:
        case Gesture::Kind::Cancel:
        case Gesture::Kind::Unknown: break;
        }
    }
    closeHold();
    // A hold is placed at its start, so the list is out of time order.
    std::stable_sort(out.begin(), out.end(),
                     [](const Recognised& a, const Recognised& b) { return a.gesture.start < b.gesture.start; });
    return out;
}

bool meets(const Recognised& g, const TruthRecord& truth)
{
    switch (truth.kind) {
    case Kind::Tap: return g.gesture.kind == Kind::Tap && g.gesture.region == truth.region;
    case Kind::Hold: return g.gesture.kind == Kind::Hold && g.gesture.region == truth.region;
    case Kind::Slide: return g.gesture.kind == Kind::Slide && g.gesture.to == truth.to;
    case Kind::Reset: return g.gesture.kind == Kind::Reset;
    case Kind::Palm:
    case Kind::Noise: return false;
    }
    return false;
}

}  // namespace

EvaluationResult TruthMatcher::match(const std::vector<TruthRecord>& truths, const RecordingReplay::Outcome& replay)
{
    const std::uint64_t late = Util::machTimeFromNanoseconds(kLateMs * 1'000'000);
    const auto inWindow = [&](const Recognised& g, const TruthRecord& truth) {
        // Resets are only ever taken by resets, gestures by touches.
        if ((g.gesture.kind == Kind::Reset) != (truth.kind == Kind::Reset)) return false;
        return g.gesture.start >= truth.start && g.gesture.start <= truth.end + late;
    };

    std::vector<Recognised> recognised = gesturesOf(replay.gestures);
    std::vector<std::optional<std::size_t>> takenBy(truths.size());

    for (std::size_t gi = 0; gi < recognised.size(); ++gi) {
        for (std::size_t ti = 0; ti < truths.size(); ++ti) {
            if (!takenBy[ti] && inWindow(recognised[gi], truths[ti]) && meets(recognised[gi], truths[ti]) &&
                (!recognised[gi].truth || truths[ti].start < truths[*recognised[gi].truth].start)) {
                recognised[gi].truth = ti;
            }
        }
        if (recognised[gi].truth) takenBy[*recognised[gi].truth] = gi;
    }
    for (std::size_t gi = 0; gi < recognised.size(); ++gi) {
        Recognised& g = recognised[gi];
        if (g.truth) continue;
        std::optional<std::size_t> best;
        bool bestInProgress = false;
        for (std::size_t ti = 0; ti < truths.size(); ++ti) {
            if (takenBy[ti] || !inWindow(g, truths[ti])) continue;
            const bool inProgress = g.gesture.start <= truths[ti].end;
            if (!best || (inProgress && !bestInProgress) ||
                (inProgress == bestInProgress && truths[ti].start < truths[*best].start)) {
                best = ti;
                bestInProgress = inProgress;
            }
        }
        if (best) {
            g.truth = best;
            takenBy[*best] = gi;
        }
    }

    EvaluationResult result;
    result.recordings = 1;
    result.durationNs = replay.durationNs;
    for (std::size_t ti = 0; ti < truths.size(); ++ti) {
        const TruthRecord& truth = truths[ti];
        auto& counts = result.counts(truth.kind);
        ++counts.truths;
        const bool rejecting = truth.kind == Kind::Palm || truth.kind == Kind::Noise;
        if (!takenBy[ti]) {
            if (rejecting) ++counts.met;
            result.confusion[{truth.label(), rejecting ? EvaluationResult::kNone : EvaluationResult::kMissed}] += 1;
            continue;
        }
        const Recognised& g = recognised[*takenBy[ti]];
        result.confusion[{truth.label(), g.gesture.label()}] += 1;
        if (rejecting) ++result.unwanted;
        if (meets(g, truth)) {
            ++counts.met;
            const std::uint64_t ticks = g.decided >= truth.start ? g.decided - truth.start : 0;
            counts.latenciesMs.push_back(static_cast<double>(Util::nanosecondsFromMachTime(ticks)) / 1e6);
        }
    }
    for (const Recognised& g : recognised) {
        auto& counts = result.counts(g.gesture.kind);
        ++counts.recognised;
        if (!g.truth) {
            ++result.spurious;
            result.confusion[{EvaluationResult::kSpurious, g.gesture.label()}] += 1;
        } else if (meets(g, truths[*g.truth])) {
            ++counts.correct;
        }
    }
    for (auto& counts : result.classes) std::sort(counts.latenciesMs.begin(), counts.latenciesMs.end());
    return result;
}

}  // namespace VeltoTouch
