#pragma once

// What the tool's tests share: running the tool in-process with captured
// streams, temporary files, and the event lines of its --jsonl output.
#include "Cli.h"

#include <nlohmann/json.hpp>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

namespace VeltoTool::Testing {

namespace fs = std::filesystem;

struct ToolRun {
    int status;
    std::string out;
    std::string err;
};

inline ToolRun runTool(std::vector<std::string> arguments)
{
    arguments.insert(arguments.begin(), "veltotouch");
    std::vector<const char*> argv;
    for (const std::string& argument : arguments) argv.push_back(argument.c_str());
    std::ostringstream out, err;
    int status = Cli::run(static_cast<int>(argv.size()), argv.data(), out, err);
    return {status, out.str(), err.str()};
}

inline std::string readFile(const fs::path& path)
{
    std::ifstream in(path);
    std::ostringstream text;
    text << in.rdbuf();
    return text.str();
}

class TempDir {
public:
    TempDir()
        : _path(fs::temp_directory_path() /
                ("veltotouch-test-" + std::to_string(::getpid()) + "-" + std::to_string(nextNumber())))
    {
        fs::create_directories(_path);
    }
    ~TempDir() { fs::remove_all(_path); }
    fs::path file(const std::string& name, const std::string& text = {}) const
    {
        fs::path path = _path / name;
        if (!text.empty()) std::ofstream(path) << text;
        return path;
    }

    const fs::path& path() const { return _path; }

private:
    static int nextNumber()
    {
        static int number = 0;
        return ++number;
    }
    fs::path _path;
};

// Gesture, region and frame of each event line of --jsonl output; time stamps
// differ between runs and are left out.
inline std::vector<std::string> eventsOf(const std::string& jsonLines)
{
    std::vector<std::string> out;
    std::istringstream text(jsonLines);
    for (std::string line; std::getline(text, line);) {
        auto json = nlohmann::json::parse(line);
        if (!json.contains("gesture")) continue;
        out.push_back(json["gesture"].get<std::string>() + " " + json.value("region", "") + " " +
                      std::to_string(json.value("frame", 0)));
    }
    return out;
}

}  // namespace VeltoTool::Testing
