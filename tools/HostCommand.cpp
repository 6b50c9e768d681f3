#include "HostCommand.h"

#include "ToolError.h"

#include <filesystem>

namespace VeltoTool {

std::string HostCommand::defaultPluginPath()
{
#ifdef VELTO_PLUGIN_FILE_NAME
    std::error_code error;
    const auto self = std::filesystem::read_symlink("/proc/self/exe", error);
    if (!error) return (self.parent_path() / VELTO_PLUGIN_RELATIVE_DIR / VELTO_PLUGIN_FILE_NAME).lexically_normal();
    return VELTO_PLUGIN_FILE_NAME;
#else
    return "VeltoTouchHIDService.so";
#endif
}

int HostCommand::run(const Options&, std::ostream&, std::ostream&) { throw ToolError("host: not built yet"); }

}  // namespace VeltoTool
