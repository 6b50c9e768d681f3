#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace VeltoHost {

class PropertyDictionary;

// A dynamically typed, immutable value shared by reference counting: what every
// state and property call passes around. Copying a PropertyValue copies the
// reference, never the value, so a value handed on is the same object.
//
// A default-constructed PropertyValue is an empty reference (no value at all),
// which is distinct from a value of kind Null; recordings keep the two apart.
// Because values never change after construction, a reference may be shared
// between threads without further locking.
class PropertyValue {
public:
    enum class Kind { Null, Boolean, Number, String, Bytes, Array, Dictionary };

    // How a number was made, so that it reads back with the same width and
    // signedness (an unsigned 32-bit counter stays one).
    enum class NumberType { Int32, Int64, UInt32, UInt64, Float32, Float64 };

    using Array = std::vector<PropertyValue>;
    using Bytes = std::vector<std::uint8_t>;

    PropertyValue() = default;

    static PropertyValue null();
    static PropertyValue boolean(bool value);
    static PropertyValue int32(std::int32_t value);
    static PropertyValue int64(std::int64_t value);
    static PropertyValue uint32(std::uint32_t value);
    static PropertyValue uint64(std::uint64_t value);
    static PropertyValue float32(float value);
    static PropertyValue float64(double value);
    static PropertyValue string(std::string value);
    static PropertyValue bytes(Bytes value);
    static PropertyValue array(Array value);
    static PropertyValue dictionary(PropertyDictionary value);

    // True when the reference holds a value (of any kind, Null included).
    bool hasValue() const noexcept { return _storage != nullptr; }

    // Kind of the value; an empty reference reports Null.
    Kind kind() const noexcept;
    // The kind in words for messages to people ("a number", "an object";
    // "nothing" for an empty reference).
    const char* kindDescription() const noexcept;
    bool isNull() const noexcept { return hasValue() && kind() == Kind::Null; }
    bool isBoolean() const noexcept { return hasValue() && kind() == Kind::Boolean; }
    bool isNumber() const noexcept { return hasValue() && kind() == Kind::Number; }
    bool isString() const noexcept { return hasValue() && kind() == Kind::String; }
    bool isBytes() const noexcept { return hasValue() && kind() == Kind::Bytes; }
    bool isArray() const noexcept { return hasValue() && kind() == Kind::Array; }
    bool isDictionary() const noexcept { return hasValue() && kind() == Kind::Dictionary; }

    // Numbers and booleans both count as numbers for the settings conversions:
    // true is 1 and false is 0.
    bool isNumberOrBoolean() const noexcept { return isNumber() || isBoolean(); }

    // Number type of a Number value (Int64 for anything else).
    NumberType numberType() const noexcept;

    // "A number, else 0": a Number or Boolean converted to the requested type;
    // every other kind, and an empty reference, gives 0. Floating-point values
    // convert to integers by truncation toward zero, saturating at the limits
    // of the 64-bit type (NaN gives 0); to unsigned through signed 64-bit, so
    // -1.0 becomes 2^64-1 as an integer -1 would.
    double toDouble() const noexcept;
    float toFloat() const noexcept;
    std::int64_t toInt64() const noexcept;
    std::uint64_t toUInt64() const noexcept;
    // The boolean meaning: a Number or Boolean is true when it is not zero;
    // anything else is false.
    bool toBool() const noexcept;

    // Accessors for a value already known to be of the kind; the wrong kind
    // gives the empty default of that kind.
    bool asBoolean() const noexcept;
    const std::string& asString() const noexcept;
    const Bytes& asBytes() const noexcept;
    const Array& asArray() const noexcept;
    const PropertyDictionary& asDictionary() const noexcept;

    // Text for log lines: JSON-like, with numbers printed in their own type,
    // bytes as <hex>, an empty reference as (empty).
    std::string description() const;

    // Deep equality; numbers compare by type and value (so uint32 1 differs
    // from float64 1.0), which is what round-trip checks want.
    friend bool operator==(const PropertyValue& a, const PropertyValue& b) noexcept;

    // Identity of the shared value (for checks that a value was not copied).
    const void* identity() const noexcept { return _storage.get(); }
    long useCount() const noexcept { return _storage.use_count(); }

    // Opaque storage; public only so that the implementation's helpers can name it.
    struct Storage;

private:
    explicit PropertyValue(std::shared_ptr<const Storage> storage) : _storage(std::move(storage)) {}
    void describeInto(std::string& out) const;

    std::shared_ptr<const Storage> _storage;
};

}  // namespace VeltoHost
