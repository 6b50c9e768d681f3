#include "ToolFiles.h"

#include "ToolError.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <sstream>

namespace VeltoTool {

std::string ToolFiles::read(const std::string& path)
{
    std::ifstream in(path, std::ios::binary);
    if (!in) throw ToolError(path + ": " + std::strerror(errno));
    std::ostringstream text;
    text << in.rdbuf();
    if (in.bad()) throw ToolError(path + ": read failed");
    return text.str();
}

void ToolFiles::write(const std::string& path, const std::string& text)
{
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    if (!out) throw ToolError(path + ": " + std::strerror(errno));
    out << text;
    out.close();
    if (!out) throw ToolError(path + ": write failed");
}

}  // namespace VeltoTool
