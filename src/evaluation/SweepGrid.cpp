#include "evaluation/SweepGrid.h"

#include <charconv>
#include <cmath>
#include <stdexcept>

namespace VeltoTouch {

namespace {

double number(const std::string& text, const std::string& whole)
{
    double value = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (text.empty() || error != std::errc() || end != text.data() + text.size() || !std::isfinite(value)) {
        throw std::invalid_argument("--sweep " + whole + ": \"" + text + "\" is not a number (KEY=FROM:TO:STEP)");
    }
    return value;
}

// Whole numbers stay integers, so that an integer setting reads them as given.
nlohmann::json jsonNumber(double value)
{
    if (value == std::floor(value) && std::fabs(value) < 9e15) {
        if (value >= 0) return static_cast<std::uint64_t>(value);
        return static_cast<std::int64_t>(value);
    }
    return value;
}

}  // namespace

SweepGrid::Axis SweepGrid::parseAxis(const std::string& text)
{
    const auto equals = text.find('=');
    if (equals == std::string::npos || equals == 0) {
        throw std::invalid_argument("--sweep \"" + text + "\": expected KEY=FROM:TO:STEP");
    }
    const std::string range = text.substr(equals + 1);
    const auto first = range.find(':');
    const auto second = first == std::string::npos ? first : range.find(':', first + 1);
    if (second == std::string::npos || range.find(':', second + 1) != std::string::npos) {
        throw std::invalid_argument("--sweep \"" + text + "\": expected KEY=FROM:TO:STEP");
    }
    const double from = number(range.substr(0, first), text);
    const double to = number(range.substr(first + 1, second - first - 1), text);
    const double step = number(range.substr(second + 1), text);
    if (step <= 0) throw std::invalid_argument("--sweep " + text + ": STEP must be greater than 0");
    if (to < from) throw std::invalid_argument("--sweep " + text + ": TO must not be less than FROM");
    const double steps = std::floor((to - from) / step + 1e-9);
    if (steps + 1 > static_cast<double>(kMaxSettings)) {
        throw std::invalid_argument("--sweep " + text + ": more than " + std::to_string(kMaxSettings) + " values");
    }
    Axis axis{text.substr(0, equals), {}};
    // Each value from its index, so that steps like 0.1 do not accumulate error.
    for (std::size_t i = 0; i <= static_cast<std::size_t>(steps); ++i) {
        axis.values.push_back(from + static_cast<double>(i) * step);
    }
    return axis;
}

std::vector<PipelineSettings> SweepGrid::combinations(const std::vector<Axis>& axes)
{
    std::vector<PipelineSettings> grid{PipelineSettings{}};
    for (const Axis& axis : axes) {
        if (grid.size() * axis.values.size() > kMaxSettings) {
            throw std::invalid_argument("--sweep: the grid has more than " + std::to_string(kMaxSettings) + " settings");
        }
        std::vector<PipelineSettings> next;
        for (const PipelineSettings& settings : grid) {
            for (double value : axis.values) {
                PipelineSettings combined = settings;
                combined.push_back({axis.key, jsonNumber(value)});
                next.push_back(std::move(combined));
            }
        }
        grid = std::move(next);
    }
    return grid;
}

}  // namespace VeltoTouch
