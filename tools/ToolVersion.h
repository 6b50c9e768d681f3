#pragma once

#include <string>

namespace VeltoTool {

// What `veltotouch --version` prints.
class ToolVersion {
public:
    // "veltotouch 0.1.0 (1a2b3c4d5e6f)": the project's version and the git
    // commit the tool was built from, looked up at build time ("-dirty" after
    // it when tracked files had changes, "unknown" without git).
    static std::string text();
};

}  // namespace VeltoTool
