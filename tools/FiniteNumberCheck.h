#pragma once

#include <CLI/CLI.hpp>

namespace VeltoTool {

// The check on every speed, frame period and time limit of the command line.
// The number conversion behind the options takes "nan", "inf" and negative
// numbers, none of which is a pace or a length of time, and a speed of 1e-9
// turns a 10 ms gap into four months of waiting; such values are refused
// here, as usage errors, before they are converted.
class FiniteNumberCheck : public CLI::Validator {
public:
    // Finite numbers not below `minimum`; with `zeroAllowed`, also 0, which
    // then has a meaning of its own (a speed of 0 plays without waiting).
    explicit FiniteNumberCheck(double minimum, bool zeroAllowed = false);
};

}  // namespace VeltoTool
