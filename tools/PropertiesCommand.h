#pragma once

#include <ostream>
#include <string>
#include <vector>

namespace CLI {
class App;
}

namespace VeltoTool {

// `veltotouch properties [--markdown]`: every property of the plug-in, the
// service's own, the pipeline's and the recogniser's (under
// "Pipeline.Algs."), with type, access, default and meaning. Everything comes
// from the tables the code reads (the recogniser's state keys, the service's
// keys); the defaults are read from a fresh pipeline.
class PropertiesCommand {
public:
    struct Options {
        bool markdown = false;
    };

    struct Property {
        std::string key;
        std::string type;
        std::string access;  // "read", "read/write" or "write"
        std::string defaultValue;  // JSON, or empty when it depends on the device
        std::string meaning;
    };
    static std::vector<Property> properties();

    static void run(const Options& options, std::ostream& out);

    // `properties` on the command line (see CommandLine): its options, and its run.
    static void addTo(CLI::App& app, int& status, std::ostream& out, std::ostream& err);
};

}  // namespace VeltoTool
