#pragma once

#include "algs/DecisionObserver.h"
#include "pipeline/Pipeline.h"
#include "report/ColumnEncoder.h"

#include <nlohmann/json.hpp>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace VeltoTouch {

// Gathers what a report page shows while a recording plays through a
// pipeline: one row of per-frame columns for each frame the recogniser runs
// (images and device resets alike) and the marks on the time axis: gestures,
// device resets, state writes and gaps in the frame numbers. It takes the
// pipeline's probes and its decision observer for as long as it lives.
class ReportCollector final : public DecisionObserver {
public:
    // Frame numbers outside [first, last] are played but left out of the
    // page, with their marks.
    struct FrameRange {
        std::optional<std::uint32_t> first;
        std::optional<std::uint32_t> last;
        bool contains(std::uint32_t frame) const noexcept
        {
            return (!first || frame >= *first) && (!last || frame <= *last);
        }
    };

    explicit ReportCollector(Pipeline& pipeline, FrameRange range = {});
    ~ReportCollector() override;
    ReportCollector(const ReportCollector&) = delete;
    ReportCollector& operator=(const ReportCollector&) = delete;

    void frameDecided(const DecisionRecord& record) override;

    std::size_t frameCount() const noexcept { return _frameCount; }
    // {"frameCount", "columns": {name: {"kind", "data"}}, "events", "states", "gaps", "ignoredReports"}
    nlohmann::ordered_json payload() const;

private:
    struct Column {
        std::string name;
        ColumnEncoder encoder;
    };
    enum class MarkList { States, Gaps };

    void setTime(std::uint64_t ticks);
    void addEvents(const VeltoHost::HidEventList& events);
    // Marks that come before the frame they belong to wait for it, so that
    // they are dropped with it when it is out of range.
    void holdForNextFrame(MarkList list, nlohmann::ordered_json mark);
    ColumnEncoder& column(std::size_t index) { return _columns[index].encoder; }

    Pipeline& _pipeline;
    FrameRange _range;
    std::optional<std::uint64_t> _originTicks;
    std::int64_t _nowUs = 0;
    std::vector<Column> _columns;
    std::size_t _frameCount = 0;
    bool _lastFrameIncluded = false;
    std::vector<std::pair<MarkList, nlohmann::ordered_json>> _pending;
    nlohmann::ordered_json _events = nlohmann::ordered_json::array();
    nlohmann::ordered_json _states = nlohmann::ordered_json::array();
    nlohmann::ordered_json _gaps = nlohmann::ordered_json::array();
    std::uint64_t _ignoredReports = 0;
};

}  // namespace VeltoTouch
