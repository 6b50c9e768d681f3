#include "recording/JsonValue.h"

#include "recording/PropertyValueBuilder.h"

#include "platform/values/PropertyDictionary.h"
#include "records/HexText.h"

#include <nlohmann/json.hpp>

#include <charconv>
#include <cmath>
#include <cstdlib>
#include <utility>
#include <vector>

namespace VeltoTouch {

using VeltoHost::PropertyDictionary;

namespace {

nlohmann::ordered_json numberToJson(const PropertyValue& value)
{
    using NumberType = PropertyValue::NumberType;
    switch (value.numberType()) {
    case NumberType::Int32:
    case NumberType::Int64:
        return value.toInt64();
    case NumberType::UInt32:
    case NumberType::UInt64:
        return value.toUInt64();
    case NumberType::Float32: {
        const float number = value.toFloat();
        if (!std::isfinite(number)) return nullptr;
        // The shortest text that reads back as this float, taken as a double,
        // prints as that same short text.
        char text[64];
        auto result = std::to_chars(text, text + sizeof text - 1, number);
        *result.ptr = '\0';
        return std::strtod(text, nullptr);
    }
    case NumberType::Float64: {
        const double number = value.toDouble();
        if (!std::isfinite(number)) return nullptr;
        return number;
    }
    }
    return nullptr;
}

}  // namespace

PropertyValue JsonValue::parse(std::string_view text, TopLevel topLevel)
{
    Problem ignored = Problem::None;
    return parse(text, topLevel, ignored);
}

PropertyValue JsonValue::parse(std::string_view text, TopLevel topLevel, Problem& problem)
{
    PropertyValueBuilder builder(topLevel == TopLevel::AnyValue);
    if (!nlohmann::json::sax_parse(text.begin(), text.end(), &builder, nlohmann::json::input_format_t::json,
                                   /*strict=*/true, /*ignore_comments=*/false)) {
        problem = builder.problem() == Problem::None ? Problem::NotJson : builder.problem();
        return {};
    }
    problem = Problem::None;
    return builder.takeResult();
}

std::string JsonValue::describe(Problem problem)
{
    switch (problem) {
    case Problem::None: return "valid JSON";
    case Problem::NotJson: return "not JSON";
    case Problem::NumberOutOfRange: return "JSON with a number out of range (beyond a 64-bit float)";
    case Problem::TooDeep:
        return "JSON nested deeper than " + std::to_string(kMaxNestingDepth) + " levels";
    case Problem::ScalarAtTopLevel: return "JSON, but not an object or array at the top level";
    }
    return "not JSON";
}

nlohmann::ordered_json JsonValue::toJson(const PropertyValue& value)
{
    if (!value.hasValue()) return nullptr;
    switch (value.kind()) {
    case PropertyValue::Kind::Null:
        return nullptr;
    case PropertyValue::Kind::Boolean:
        return value.asBoolean();
    case PropertyValue::Kind::Number:
        return numberToJson(value);
    case PropertyValue::Kind::String:
        return value.asString();
    case PropertyValue::Kind::Bytes:
        return Util::hexStringFromBytes(value.asBytes());
    case PropertyValue::Kind::Array: {
        nlohmann::ordered_json array = nlohmann::ordered_json::array();
        for (const PropertyValue& element : value.asArray()) array.push_back(toJson(element));
        return array;
    }
    case PropertyValue::Kind::Dictionary: {
        nlohmann::ordered_json object = nlohmann::ordered_json::object();
        for (const auto& [key, element] : value.asDictionary()) object[key] = toJson(element);
        return object;
    }
    }
    return nullptr;
}

std::string JsonValue::dump(const nlohmann::ordered_json& json, bool indented)
{
    return json.dump(indented ? 2 : -1, ' ', /*ensure_ascii=*/false, nlohmann::ordered_json::error_handler_t::replace);
}

std::string JsonValue::write(const PropertyValue& value, bool indented) { return dump(toJson(value), indented); }

}  // namespace VeltoTouch
