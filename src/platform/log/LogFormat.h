#pragma once

#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <string>
#include <string_view>
#include <type_traits>

namespace VeltoHost {

// One argument of a log format. Integers keep their signedness, floating
// point becomes double, and anything with a description() (values, events)
// is described once, for "%@".
class LogFormatArg {
public:
    enum class Type { Signed, Unsigned, Real, Text };

    template <typename T>
        requires(std::is_integral_v<T> && std::is_signed_v<T>)
    LogFormatArg(T value) : _type(Type::Signed), _signed(value) {}

    template <typename T>
        requires(std::is_integral_v<T> && std::is_unsigned_v<T> && !std::is_same_v<T, bool>)
    LogFormatArg(T value) : _type(Type::Unsigned), _unsigned(value) {}

    LogFormatArg(bool value) : _type(Type::Signed), _signed(value ? 1 : 0) {}

    template <typename T>
        requires std::is_enum_v<T>
    LogFormatArg(T value) : LogFormatArg(static_cast<std::underlying_type_t<T>>(value)) {}

    template <typename T>
        requires std::is_floating_point_v<T>
    LogFormatArg(T value) : _type(Type::Real), _real(static_cast<double>(value)) {}

    LogFormatArg(const char* text) : _type(Type::Text), _text(text ? text : "(null)") {}
    LogFormatArg(std::string text) : _type(Type::Text), _text(std::move(text)) {}
    LogFormatArg(std::string_view text) : _type(Type::Text), _text(text) {}

    template <typename T>
        requires requires(const T& object) {
            { object.description() } -> std::convertible_to<std::string>;
        }
    LogFormatArg(const T& object) : _type(Type::Text), _text(object.description()) {}

    template <typename T>
        requires requires(const T& object) {
            { object.description() } -> std::convertible_to<std::string>;
        }
    LogFormatArg(const std::shared_ptr<T>& object)
        : _type(Type::Text), _text(object ? object->description() : std::string("(null)"))
    {
    }

    Type type() const noexcept { return _type; }
    std::int64_t asSigned() const noexcept;
    std::uint64_t asUnsigned() const noexcept;
    double asReal() const noexcept;
    std::string asText() const;

private:
    Type _type;
    std::int64_t _signed = 0;
    std::uint64_t _unsigned = 0;
    double _real = 0;
    std::string _text;
};

// printf-style formatting with the conversions of the C library, plus "%@"
// for an object's description. Length modifiers choose 32- or 64-bit integer
// handling as in C ("%d" prints the low 32 bits as signed, "%jx" all 64 bits),
// whatever the C++ type of the argument; '*' widths and precisions take an
// argument. An argument that is missing prints as "(missing)".
std::string formatLogMessage(const char* format, std::initializer_list<LogFormatArg> args);

template <typename... Args>
std::string formatLog(const char* format, const Args&... args)
{
    return formatLogMessage(format, {LogFormatArg(args)...});
}

}  // namespace VeltoHost
