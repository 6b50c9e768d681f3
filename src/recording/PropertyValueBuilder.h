#pragma once

#include "platform/values/PropertyDictionary.h"
#include "platform/values/PropertyValue.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace VeltoTouch {

using VeltoHost::PropertyValue;

// Builds one PropertyValue tree from a parser's events (SAX), so that a
// document is parsed into one tree only, not an intermediate JSON tree that
// is then converted. Both JSON readers use it, the whole-text one and the
// one that streams a recording, so that a value reads the same through
// either: non-negative integers as uint64, negative ones as int64, the rest
// as float64; a repeated key keeps its first position and takes the later
// value; more than kMaxNestingDepth levels are refused.
//
// The member names are those of nlohmann's SAX interface, which takes the
// builder directly. Each returns false to stop the parse.
class PropertyValueBuilder {
public:
    static constexpr std::size_t kMaxNestingDepth = 512;

    // Why a parse stopped, for messages that tell valid JSON the reader
    // cannot hold apart from text that is not JSON at all.
    enum class Problem { None, NotJson, NumberOutOfRange, TooDeep, ScalarAtTopLevel };

    // Whether a scalar alone is a complete document.
    explicit PropertyValueBuilder(bool scalarTopLevelAllowed) : _scalarTopLevelAllowed(scalarTopLevelAllowed) {}

    PropertyValue takeResult() { return std::move(_result); }
    Problem problem() const noexcept { return _problem; }

    bool null() { return scalar(PropertyValue::null()); }
    bool boolean(bool value) { return scalar(PropertyValue::boolean(value)); }
    // Negative integers (and "-0").
    bool number_integer(std::int64_t value)
    {
        return scalar(value < 0 ? PropertyValue::int64(value) : PropertyValue::uint64(static_cast<std::uint64_t>(value)));
    }
    bool number_unsigned(std::uint64_t value) { return scalar(PropertyValue::uint64(value)); }
    bool number_float(double value, const std::string&) { return scalar(PropertyValue::float64(value)); }
    bool string(std::string& value) { return scalar(PropertyValue::string(std::move(value))); }
    // Only binary formats produce these; JSON text never does.
    template <typename Binary>
    bool binary(Binary&)
    {
        return false;
    }

    // A scalar the caller has already made a value (a reader that keeps
    // scalars of its own, numbers mapped as above).
    bool scalar(PropertyValue value);

    bool start_object(std::size_t = 0) { return open(true); }
    bool key(std::string& key);
    bool end_object();
    bool start_array(std::size_t = 0) { return open(false); }
    bool end_array();

    template <typename Exception>
    bool parse_error(std::size_t, const std::string&, const Exception& error)
    {
        // The parser's out-of-range error (406) is a number beyond a double.
        _problem = error.id == kNumberOverflowError ? Problem::NumberOutOfRange : Problem::NotJson;
        return false;
    }

private:
    struct Level {
        bool isObject = false;
        PropertyValue::Array items;
        VeltoHost::PropertyDictionary entries;
        std::string key;
    };

    bool open(bool isObject);
    bool add(PropertyValue value);

    static constexpr int kNumberOverflowError = 406;

    bool _scalarTopLevelAllowed;
    Problem _problem = Problem::None;
    std::vector<Level> _levels;
    PropertyValue _result;
};

}  // namespace VeltoTouch
