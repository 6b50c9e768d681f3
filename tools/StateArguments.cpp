#include "StateArguments.h"

#include "ToolError.h"
#include "recording/JsonValue.h"

#include <charconv>
#include <cmath>

namespace VeltoTool {

using VeltoHost::PropertyValue;

namespace {

// The number a value stands for as its shortest text reads: a 32-bit float
// that holds 0.1 is taken as 0.1, not as 0.100000001490116, so that a setting
// kept in single precision does not differ from the decimal written to it.
double decimalValue(const PropertyValue& value)
{
    if (value.numberType() != PropertyValue::NumberType::Float32) return value.toDouble();
    char text[32];
    const auto end = std::to_chars(text, text + sizeof text, value.toFloat()).ptr;
    double decimal = 0;
    std::from_chars(text, end, decimal);
    return decimal;
}

bool sameNumber(const PropertyValue& written, const PropertyValue& readBack)
{
    const double a = decimalValue(written);
    const double b = decimalValue(readBack);
    return a == b || (std::isnan(a) && std::isnan(b));
}

// A flag written as the number 0 or 1 is the flag as meant.
bool isFlagAsNumber(const PropertyValue& written, const PropertyValue& readBack)
{
    return written.isNumber() && readBack.isBoolean() && written.toDouble() == (readBack.asBoolean() ? 1.0 : 0.0);
}

bool sameSetting(const PropertyValue& written, const PropertyValue& readBack)
{
    if (isFlagAsNumber(written, readBack)) return true;
    if (written.kind() != readBack.kind() || written.hasValue() != readBack.hasValue()) return false;
    if (written.isNumber()) return sameNumber(written, readBack);
    return written == readBack;
}

}  // namespace

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
    JsonValue::Problem problem = JsonValue::Problem::None;
    VeltoHost::PropertyValue value = JsonValue::parse(text, JsonValue::TopLevel::AnyValue, problem);
    if (value.hasValue()) return value;
    if (problem == JsonValue::Problem::NumberOutOfRange || problem == JsonValue::Problem::TooDeep) {
        throw ToolError("value of " + key + " is " + JsonValue::describe(problem));
    }
    const bool looksLikeJson = !text.empty() && std::string("{[\"-0123456789").find(text.front()) != std::string::npos;
    if (looksLikeJson || text.empty()) throw ToolError("value of " + key + " is not valid JSON: " + text);
    return VeltoHost::PropertyValue::string(text);
}

StateArguments::Setting StateArguments::parseSetting(const std::string& argument)
{
    auto [key, text] = split(argument);
    VeltoHost::PropertyValue value = parseValue(key, text);
    return {std::move(key), std::move(text), std::move(value)};
}

std::optional<std::string> StateArguments::readBackWarning(const std::string& key, const PropertyValue& written,
                                                           const PropertyValue& readBack)
{
    if (sameSetting(written, readBack)) return std::nullopt;
    if (!readBack.hasValue() || readBack.isNull()) {
        return key + " was set to " + written.description() +
               " but reads back null: the pipeline keeps no setting of that name (an unknown key, or one that is "
               "only acted on)";
    }
    if (written.kind() != readBack.kind()) {
        return key + " was set to " + written.kindDescription() + " (" + written.description() + ") but reads back " +
               readBack.kindDescription() + " (" + readBack.description() + ")";
    }
    return key + " was set to " + written.description() + " but reads back " + readBack.description();
}

void StateArguments::apply(VeltoTouch::Pipeline& pipeline, const std::vector<Setting>& settings, std::ostream& err)
{
    for (const auto& [key, text, value] : settings) {
        pipeline.setState(key, value);
        if (auto warning = readBackWarning(key, value, pipeline.getState(key))) {
            err << "veltotouch: warning: " << *warning << '\n';
        }
    }
}

}  // namespace VeltoTool
