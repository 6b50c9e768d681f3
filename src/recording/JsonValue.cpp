#include "recording/JsonValue.h"

#include "pipeline/Util.h"
#include "platform/PropertyDictionary.h"

#include <nlohmann/json.hpp>

#include <charconv>
#include <cmath>
#include <cstdlib>
#include <utility>
#include <vector>

namespace VeltoTouch {

using VeltoHost::PropertyDictionary;

namespace {

// Builds a PropertyValue tree straight from nlohmann's SAX events, so that a
// container is parsed into one tree only (not an intermediate JSON tree that
// is then converted).
class PropertyValueBuilder {
public:
    explicit PropertyValueBuilder(JsonValue::TopLevel topLevel) : _topLevel(topLevel) {}

    PropertyValue takeResult() { return std::move(_result); }

    bool null() { return addScalar(PropertyValue::null()); }
    bool boolean(bool value) { return addScalar(PropertyValue::boolean(value)); }
    // The lexer reports only negative integers here (and "-0").
    bool number_integer(nlohmann::json::number_integer_t value)
    {
        return addScalar(value < 0 ? PropertyValue::int64(value)
                                   : PropertyValue::uint64(static_cast<std::uint64_t>(value)));
    }
    bool number_unsigned(nlohmann::json::number_unsigned_t value) { return addScalar(PropertyValue::uint64(value)); }
    bool number_float(nlohmann::json::number_float_t value, const std::string&)
    {
        return addScalar(PropertyValue::float64(value));
    }
    bool string(std::string& value) { return addScalar(PropertyValue::string(std::move(value))); }
    // Only binary formats produce these; JSON text never does.
    bool binary(nlohmann::json::binary_t&) { return false; }

    bool start_object(std::size_t) { return open(true); }
    bool key(std::string& key)
    {
        _levels.back().key = std::move(key);
        return true;
    }
    bool end_object()
    {
        Level level = std::move(_levels.back());
        _levels.pop_back();
        return add(PropertyValue::dictionary(std::move(level.entries)));
    }

    bool start_array(std::size_t) { return open(false); }
    bool end_array()
    {
        Level level = std::move(_levels.back());
        _levels.pop_back();
        return add(PropertyValue::array(std::move(level.items)));
    }

    bool parse_error(std::size_t, const std::string&, const nlohmann::detail::exception&) { return false; }

private:
    struct Level {
        bool isObject = false;
        PropertyValue::Array items;
        PropertyDictionary entries;
        std::string key;
    };

    bool open(bool isObject)
    {
        if (_levels.size() >= JsonValue::kMaxNestingDepth) return false;
        _levels.push_back(Level{isObject, {}, {}, {}});
        return true;
    }

    bool addScalar(PropertyValue value)
    {
        if (_levels.empty() && _topLevel == JsonValue::TopLevel::ObjectOrArray) return false;
        return add(std::move(value));
    }

    bool add(PropertyValue value)
    {
        if (_levels.empty()) {
            _result = std::move(value);
            return true;
        }
        Level& level = _levels.back();
        // A repeated key keeps its first position and takes the later value.
        if (level.isObject) {
            level.entries.set(std::move(level.key), std::move(value));
        } else {
            level.items.push_back(std::move(value));
        }
        return true;
    }

    JsonValue::TopLevel _topLevel;
    std::vector<Level> _levels;
    PropertyValue _result;
};

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
    PropertyValueBuilder builder(topLevel);
    if (!nlohmann::json::sax_parse(text.begin(), text.end(), &builder, nlohmann::json::input_format_t::json,
                                   /*strict=*/true, /*ignore_comments=*/false)) {
        return {};
    }
    return builder.takeResult();
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
