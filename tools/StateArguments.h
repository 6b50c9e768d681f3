#pragma once

#include "platform/PropertyValue.h"

#include <string>
#include <utility>

namespace VeltoTool {

// Parsing of the tool's KEY=VALUE state arguments, where VALUE is JSON.
class StateArguments {
public:
    // "Algs.HoldTimeoutMilliseconds=600" -> key and the text after '='.
    static std::pair<std::string, std::string> split(const std::string& argument);
    // The JSON value of a setting; throws ToolError naming the key when the
    // text is not JSON. A bare word that is not JSON is taken as a string, so
    // that --set Key=text works without shell-quoted quotes.
    static VeltoHost::PropertyValue parseValue(const std::string& key, const std::string& text);
};

}  // namespace VeltoTool
