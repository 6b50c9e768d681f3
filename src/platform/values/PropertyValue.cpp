#include "platform/values/PropertyValue.h"

#include "platform/values/PropertyDictionary.h"

#include <charconv>
#include <cmath>
#include <cstdio>
#include <limits>
#include <variant>

namespace VeltoHost {

namespace {

struct NullTag {
    bool operator==(const NullTag&) const = default;
};

struct Number {
    PropertyValue::NumberType type;
    // Integers are kept in the member of their signedness, floats in `real`
    // (a 32-bit float is exactly representable as a double).
    std::int64_t signedValue = 0;
    std::uint64_t unsignedValue = 0;
    double real = 0;

    bool isInteger() const { return type != PropertyValue::NumberType::Float32 && type != PropertyValue::NumberType::Float64; }
    bool isUnsigned() const { return type == PropertyValue::NumberType::UInt32 || type == PropertyValue::NumberType::UInt64; }

    double asDouble() const
    {
        if (!isInteger()) return real;
        return isUnsigned() ? static_cast<double>(unsignedValue) : static_cast<double>(signedValue);
    }

    std::int64_t asInt64() const
    {
        if (isInteger()) return isUnsigned() ? static_cast<std::int64_t>(unsignedValue) : signedValue;
        if (std::isnan(real)) return 0;
        // Saturate instead of invoking undefined behaviour for huge values.
        if (real >= 9223372036854775807.0) return std::numeric_limits<std::int64_t>::max();
        if (real <= -9223372036854775808.0) return std::numeric_limits<std::int64_t>::min();
        return static_cast<std::int64_t>(real);
    }

    std::uint64_t asUInt64() const
    {
        if (isInteger()) return isUnsigned() ? unsignedValue : static_cast<std::uint64_t>(signedValue);
        if (real >= 0 && real < 18446744073709551616.0) return static_cast<std::uint64_t>(real);
        if (real >= 18446744073709551616.0) return std::numeric_limits<std::uint64_t>::max();
        return static_cast<std::uint64_t>(asInt64());
    }

    bool operator==(const Number& other) const
    {
        if (type != other.type) return false;
        if (!isInteger()) return real == other.real || (std::isnan(real) && std::isnan(other.real));
        return signedValue == other.signedValue && unsignedValue == other.unsignedValue;
    }
};

}  // namespace

struct PropertyValue::Storage {
    std::variant<NullTag, bool, Number, std::string, Bytes, Array, PropertyDictionary> data;
};

namespace {


template <typename T>
const T* get(const auto& storage)
{
    if (!storage) return nullptr;
    return std::get_if<T>(&storage->data);
}

PropertyValue::Storage makeNumber(PropertyValue::NumberType type, std::int64_t s, std::uint64_t u, double r)
{
    return PropertyValue::Storage{Number{type, s, u, r}};
}

}  // namespace

PropertyValue PropertyValue::null() { return PropertyValue(std::make_shared<const Storage>(Storage{NullTag{}})); }
PropertyValue PropertyValue::boolean(bool value) { return PropertyValue(std::make_shared<const Storage>(Storage{value})); }
PropertyValue PropertyValue::int32(std::int32_t value)
{
    return PropertyValue(std::make_shared<const Storage>(makeNumber(NumberType::Int32, value, 0, 0)));
}
PropertyValue PropertyValue::int64(std::int64_t value)
{
    return PropertyValue(std::make_shared<const Storage>(makeNumber(NumberType::Int64, value, 0, 0)));
}
PropertyValue PropertyValue::uint32(std::uint32_t value)
{
    return PropertyValue(std::make_shared<const Storage>(makeNumber(NumberType::UInt32, 0, value, 0)));
}
PropertyValue PropertyValue::uint64(std::uint64_t value)
{
    return PropertyValue(std::make_shared<const Storage>(makeNumber(NumberType::UInt64, 0, value, 0)));
}
PropertyValue PropertyValue::float32(float value)
{
    return PropertyValue(std::make_shared<const Storage>(makeNumber(NumberType::Float32, 0, 0, value)));
}
PropertyValue PropertyValue::float64(double value)
{
    return PropertyValue(std::make_shared<const Storage>(makeNumber(NumberType::Float64, 0, 0, value)));
}
PropertyValue PropertyValue::string(std::string value)
{
    return PropertyValue(std::make_shared<const Storage>(Storage{std::move(value)}));
}
PropertyValue PropertyValue::bytes(Bytes value) { return PropertyValue(std::make_shared<const Storage>(Storage{std::move(value)})); }
PropertyValue PropertyValue::array(Array value) { return PropertyValue(std::make_shared<const Storage>(Storage{std::move(value)})); }
PropertyValue PropertyValue::dictionary(PropertyDictionary value)
{
    return PropertyValue(std::make_shared<const Storage>(Storage{std::move(value)}));
}

const char* PropertyValue::kindDescription() const noexcept
{
    if (!hasValue()) return "nothing";
    switch (kind()) {
    case Kind::Null: return "null";
    case Kind::Boolean: return "a boolean";
    case Kind::Number: return "a number";
    case Kind::String: return "a string";
    case Kind::Bytes: return "byte data";
    case Kind::Array: return "an array";
    case Kind::Dictionary: return "an object";
    }
    return "a value";
}

PropertyValue::Kind PropertyValue::kind() const noexcept
{
    if (!_storage) return Kind::Null;
    return static_cast<Kind>(_storage->data.index());
}

PropertyValue::NumberType PropertyValue::numberType() const noexcept
{
    const Number* number = get<Number>(_storage);
    return number ? number->type : NumberType::Int64;
}

double PropertyValue::toDouble() const noexcept
{
    if (const Number* number = get<Number>(_storage)) return number->asDouble();
    if (const bool* flag = get<bool>(_storage)) return *flag ? 1.0 : 0.0;
    return 0.0;
}

float PropertyValue::toFloat() const noexcept { return static_cast<float>(toDouble()); }

std::int64_t PropertyValue::toInt64() const noexcept
{
    if (const Number* number = get<Number>(_storage)) return number->asInt64();
    if (const bool* flag = get<bool>(_storage)) return *flag ? 1 : 0;
    return 0;
}

std::uint64_t PropertyValue::toUInt64() const noexcept
{
    if (const Number* number = get<Number>(_storage)) return number->asUInt64();
    if (const bool* flag = get<bool>(_storage)) return *flag ? 1 : 0;
    return 0;
}

bool PropertyValue::toBool() const noexcept
{
    if (const Number* number = get<Number>(_storage)) {
        return number->isInteger() ? (number->signedValue != 0 || number->unsignedValue != 0) : number->real != 0.0;
    }
    if (const bool* flag = get<bool>(_storage)) return *flag;
    return false;
}

bool PropertyValue::asBoolean() const noexcept
{
    const bool* flag = get<bool>(_storage);
    return flag && *flag;
}

const std::string& PropertyValue::asString() const noexcept
{
    static const std::string kEmpty;
    const std::string* text = get<std::string>(_storage);
    return text ? *text : kEmpty;
}

const PropertyValue::Bytes& PropertyValue::asBytes() const noexcept
{
    static const Bytes kEmpty;
    const Bytes* bytes = get<Bytes>(_storage);
    return bytes ? *bytes : kEmpty;
}

const PropertyValue::Array& PropertyValue::asArray() const noexcept
{
    static const Array kEmpty;
    const Array* array = get<Array>(_storage);
    return array ? *array : kEmpty;
}

const PropertyDictionary& PropertyValue::asDictionary() const noexcept
{
    static const PropertyDictionary kEmpty;
    const PropertyDictionary* dictionary = get<PropertyDictionary>(_storage);
    return dictionary ? *dictionary : kEmpty;
}

namespace {

void appendQuoted(std::string& out, const std::string& text)
{
    out += '"';
    for (unsigned char c : text) {
        switch (c) {
        case '"': out += "\\\""; break;
        case '\\': out += "\\\\"; break;
        case '\n': out += "\\n"; break;
        case '\t': out += "\\t"; break;
        default:
            if (c < 0x20) {
                char escape[8];
                std::snprintf(escape, sizeof escape, "\\u%04x", c);
                out += escape;
            } else {
                out += static_cast<char>(c);
            }
        }
    }
    out += '"';
}

void appendNumber(std::string& out, const Number& number)
{
    char text[64];
    std::to_chars_result result{};
    switch (number.type) {
    case PropertyValue::NumberType::Int32:
    case PropertyValue::NumberType::Int64:
        result = std::to_chars(text, text + sizeof text, number.signedValue);
        break;
    case PropertyValue::NumberType::UInt32:
    case PropertyValue::NumberType::UInt64:
        result = std::to_chars(text, text + sizeof text, number.unsignedValue);
        break;
    case PropertyValue::NumberType::Float32:
        result = std::to_chars(text, text + sizeof text, static_cast<float>(number.real));
        break;
    case PropertyValue::NumberType::Float64:
        result = std::to_chars(text, text + sizeof text, number.real);
        break;
    }
    out.append(text, result.ptr);
}

}  // namespace

void PropertyValue::describeInto(std::string& out) const
{
    if (!_storage) {
        out += "(empty)";
        return;
    }
    std::visit(
        [&out](const auto& value) {
            using T = std::decay_t<decltype(value)>;
            if constexpr (std::is_same_v<T, NullTag>) {
                out += "null";
            } else if constexpr (std::is_same_v<T, bool>) {
                out += value ? "true" : "false";
            } else if constexpr (std::is_same_v<T, Number>) {
                appendNumber(out, value);
            } else if constexpr (std::is_same_v<T, std::string>) {
                appendQuoted(out, value);
            } else if constexpr (std::is_same_v<T, Bytes>) {
                static const char kDigits[] = "0123456789abcdef";
                out += '<';
                for (std::uint8_t byte : value) {
                    out += kDigits[byte >> 4];
                    out += kDigits[byte & 0xF];
                }
                out += '>';
            } else if constexpr (std::is_same_v<T, Array>) {
                out += '[';
                for (std::size_t i = 0; i < value.size(); ++i) {
                    if (i) out += ", ";
                    value[i].describeInto(out);
                }
                out += ']';
            } else {
                out += '{';
                bool first = true;
                for (const auto& [key, entry] : value) {
                    if (!first) out += ", ";
                    first = false;
                    appendQuoted(out, key);
                    out += ": ";
                    entry.describeInto(out);
                }
                out += '}';
            }
        },
        _storage->data);
}

std::string PropertyValue::description() const
{
    std::string out;
    describeInto(out);
    return out;
}

bool operator==(const PropertyValue& a, const PropertyValue& b) noexcept
{
    if (a._storage == b._storage) return true;
    if (!a._storage || !b._storage) return false;
    return a._storage->data == b._storage->data;
}

}  // namespace VeltoHost
