#include "ToolVersion.h"

#include "ToolRevision.h"

namespace VeltoTool {

std::string ToolVersion::text() { return std::string("veltotouch ") + VELTO_VERSION + " (" + VELTO_GIT_REVISION + ")"; }

}  // namespace VeltoTool
