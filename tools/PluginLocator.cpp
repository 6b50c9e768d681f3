#include "PluginLocator.h"

#include <cstdlib>
#include <filesystem>
#include <stdexcept>
#include <system_error>

namespace VeltoTool {

namespace {

namespace fs = std::filesystem;

constexpr const char* kEnvironmentVariable = "VELTOTOUCH_PLUGIN";

#ifndef VELTO_PLUGIN_FILE_NAME
#define VELTO_PLUGIN_FILE_NAME "libVeltoTouchHIDService.so"
#endif
#ifndef VELTO_PLUGIN_BUILD_PATH
#define VELTO_PLUGIN_BUILD_PATH ""
#endif
#ifndef VELTO_PLUGIN_INSTALL_PATH
#define VELTO_PLUGIN_INSTALL_PATH ""
#endif
#ifndef VELTO_INSTALL_LIBDIR
#define VELTO_INSTALL_LIBDIR "lib"
#endif

bool isFile(const std::string& path)
{
    std::error_code error;
    return !path.empty() && fs::is_regular_file(path, error);
}

std::string runningProgram()
{
    std::error_code error;
    fs::path self = fs::read_symlink("/proc/self/exe", error);
    return error ? std::string() : self.string();
}

}  // namespace

PluginLocator::Result PluginLocator::find()
{
    const char* environment = std::getenv(kEnvironmentVariable);
    return find(environment ? environment : "", runningProgram(), VELTO_PLUGIN_BUILD_PATH,
                VELTO_PLUGIN_INSTALL_PATH);
}

PluginLocator::Result PluginLocator::find(const std::string& environment, const std::string& program,
                                          const std::string& buildTree, const std::string& installed)
{
    Result result;
    std::vector<std::string> candidates;
    if (!environment.empty()) {
        // An explicit choice is not second-guessed: if it is wrong, say so.
        result.tried.push_back(environment + " (" + kEnvironmentVariable + ")");
        if (isFile(environment)) result.path = environment;
        return result;
    }
    if (!program.empty()) {
        const fs::path prefix = fs::path(program).parent_path().parent_path();
        candidates.push_back((prefix / VELTO_INSTALL_LIBDIR / "veltotouch" / VELTO_PLUGIN_FILE_NAME).string());
    }
    candidates.push_back(buildTree);
    candidates.push_back(installed);
    for (const std::string& candidate : candidates) {
        if (candidate.empty()) continue;
        bool seen = false;
        for (const std::string& tried : result.tried) seen = seen || tried == candidate;
        if (seen) continue;
        result.tried.push_back(candidate);
        if (isFile(candidate)) {
            result.path = candidate;
            return result;
        }
    }
    return result;
}

std::string PluginLocator::notFoundMessage(const Result& result)
{
    std::string text = "plug-in module not found; looked in ";
    for (std::size_t i = 0; i < result.tried.size(); ++i) text += (i ? ", " : "") + result.tried[i];
    text += std::string(" (give --plugin PATH or set ") + kEnvironmentVariable + ")";
    return text;
}

std::string PluginLocator::chosenOrFound(const std::string& chosen)
{
    if (!chosen.empty()) return chosen;
    const Result found = find();
    if (found.path.empty()) throw std::runtime_error(notFoundMessage(found));
    return found.path;
}

}  // namespace VeltoTool
