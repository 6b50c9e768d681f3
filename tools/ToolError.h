#pragma once

#include <stdexcept>
#include <string>

namespace VeltoTool {

// An error the user made (a missing file, a malformed option value): printed
// as one line, exit status 1. Usage errors of the command line itself are
// CLI11's and exit with 2.
class ToolError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

}  // namespace VeltoTool
