#include "FiniteNumberCheck.h"

#include <charconv>
#include <cmath>
#include <string>

namespace VeltoTool {

namespace {

std::string shortest(double number)
{
    char text[32];
    return std::string(text, std::to_chars(text, text + sizeof text, number).ptr);
}

}  // namespace

FiniteNumberCheck::FiniteNumberCheck(double minimum, bool zeroAllowed)
{
    const std::string bound = zeroAllowed ? "0 or at least " + shortest(minimum) : "at least " + shortest(minimum);
    // The option's own help says what the number means and its range.
    description("");
    func_ = [minimum, zeroAllowed, bound](std::string& text) -> std::string {
        double value = 0;
        const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
        if (text.empty() || error == std::errc::invalid_argument || end != text.data() + text.size()) {
            return "expected a number, got \"" + text + "\"";
        }
        if (error == std::errc::result_out_of_range) return "number out of range: " + text;
        if (!std::isfinite(value)) return "expected a finite number, got " + text;
        if ((zeroAllowed && value == 0) || value >= minimum) return {};
        return "must be " + bound + ", got " + text;
    };
}

}  // namespace VeltoTool
