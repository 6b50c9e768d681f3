#pragma once

#include <stdexcept>
#include <string>

namespace VeltoTool {

// A failure of a command (a missing or malformed file, a faulty gesture
// script, an output that cannot be written): printed as one line, exit
// status 1. Usage errors (an unknown option, a value an option does not
// take) are refused while the command line is parsed and exit with 2; the
// parsers of option values throw this error, and the command line turns it
// into a usage error there.
class ToolError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

}  // namespace VeltoTool
