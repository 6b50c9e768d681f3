#pragma once

#include <iosfwd>

namespace VeltoTool {

// The veltotouch command line: the commands (each declares its own options,
// see CommandLine), help, and the mapping of failures to exit codes (2 for
// usage errors, 1 for everything else).
class Cli {
public:
    static int main(int argc, char** argv);
    // The same with chosen streams, for tests.
    static int run(int argc, const char* const* argv, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
