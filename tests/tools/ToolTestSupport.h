#pragma once

// What the tool's tests share: running the tool in-process with captured
// streams, temporary files, and the event lines of its --jsonl output.
#include "Cli.h"

#include <nlohmann/json.hpp>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

namespace VeltoTool::Testing {

namespace fs = std::filesystem;
using nlohmann::json;

#ifdef VELTO_EXAMPLES_DIR
inline const std::string kExamples = VELTO_EXAMPLES_DIR;

// The sample recordings by NAME, in order: containers (examples/NAME.json)
// and hid-recorder captures (examples/NAME.hid).
inline std::vector<std::string> exampleNames()
{
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator(kExamples)) {
        const auto extension = entry.path().extension();
        if (extension == ".json" || extension == ".hid") names.push_back(entry.path().stem().string());
    }
    std::sort(names.begin(), names.end());
    return names;
}

inline std::string examplePath(const std::string& name)
{
    const std::string container = kExamples + "/" + name + ".json";
    return fs::exists(container) ? container : kExamples + "/" + name + ".hid";
}
#endif

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

// Every line of the text, parsed as JSON (throws on a line that is not).
inline std::vector<json> jsonLinesOf(const std::string& text)
{
    std::vector<json> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) lines.push_back(json::parse(line));
    return lines;
}

// Gesture, region and frame of each event line of --jsonl output; time stamps
// differ between runs and are left out.
inline std::vector<std::string> eventsOf(const std::string& jsonLines)
{
    std::vector<std::string> out;
    for (const json& line : jsonLinesOf(jsonLines)) {
        if (!line.contains("gesture")) continue;
        out.push_back(line["gesture"].get<std::string>() + " " + line.value("region", "") + " " +
                      std::to_string(line.value("frame", 0)));
    }
    return out;
}

}  // namespace VeltoTool::Testing
