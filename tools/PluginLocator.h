#pragma once

#include <string>
#include <vector>

namespace VeltoTool {

// Finds the plug-in module a host program loads when it is not told a path.
//
// Looked for, in this order: the file named by VELTOTOUCH_PLUGIN; the
// installed module relative to the running program (PREFIX/bin/veltotouch ->
// PREFIX/LIBDIR/veltotouch/), so that an installed tree can be moved; the
// module in the build tree the program was built in; the module in the
// install location the build was configured for. A copied or installed
// program thus finds its module without being told, and says where it looked
// when it cannot.
class PluginLocator {
public:
    struct Result {
        std::string path;                  // empty when nothing was found
        std::vector<std::string> tried;    // every place looked at, in order
    };

    static Result find();
    // The same with the places given, for tests: the environment's value
    // (empty: not set), the running program's path, the build tree's module
    // and the configured install location's module.
    static Result find(const std::string& environment, const std::string& program, const std::string& buildTree,
                       const std::string& installed);

    // One line naming every place looked at, for the error when none had it.
    static std::string notFoundMessage(const Result& result);

    // `chosen` when given (--plugin), else what find() finds; raises
    // std::runtime_error with notFoundMessage when nothing is there.
    static std::string chosenOrFound(const std::string& chosen);
};

}  // namespace VeltoTool
