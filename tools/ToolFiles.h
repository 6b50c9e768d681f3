#pragma once


#include <string>

namespace VeltoTool {

// Whole-file reads and writes with errors that name the file.
class ToolFiles {
public:
    static std::string read(const std::string& path);
    static void write(const std::string& path, const std::string& text);
};

}  // namespace VeltoTool
