#include "StateArguments.h"

#include "ToolError.h"
#include "recording/JsonValue.h"

namespace VeltoTool {

std::pair<std::string, std::string> StateArguments::split(const std::string& argument)
{
    const auto equals = argument.find('=');
    if (equals == std::string::npos || equals == 0) {
        throw ToolError("expected KEY=VALUE, got \"" + argument + "\"");
    }
    return {argument.substr(0, equals), argument.substr(equals + 1)};
}

VeltoHost::PropertyValue StateArguments::parseValue(const std::string& key, const std::string& text)
{
    using VeltoTouch::JsonValue;
    VeltoHost::PropertyValue value = JsonValue::parse(text, JsonValue::TopLevel::AnyValue);
    if (value.hasValue()) return value;
    const bool looksLikeJson = !text.empty() && std::string("{[\"-0123456789").find(text.front()) != std::string::npos;
    if (looksLikeJson || text.empty()) throw ToolError("value of " + key + " is not valid JSON: " + text);
    return VeltoHost::PropertyValue::string(text);
}

}  // namespace VeltoTool
