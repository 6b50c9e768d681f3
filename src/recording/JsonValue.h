#pragma once

#include "platform/values/PropertyValue.h"
#include "recording/PropertyValueBuilder.h"

#include <nlohmann/json_fwd.hpp>

#include <cstddef>
#include <string>
#include <string_view>

namespace VeltoTouch {

using VeltoHost::PropertyValue;

// JSON text <-> PropertyValue, one to one: object <-> dictionary (entry order
// kept), array <-> array, string <-> string, true/false <-> boolean,
// null <-> null. Shared by the recording container and by tools that take or
// print values as JSON.
//
// Numbers read as: non-negative integers -> uint64 (so 64-bit time stamps stay
// exact), negative integers -> int64, anything with a fraction or exponent ->
// float64. Integers too large for 64 bits read as float64.
class JsonValue {
public:
    enum class TopLevel {
        // A container document: the top level must be an object or an array.
        ObjectOrArray,
        // A single value of any kind, scalars included (command-line values).
        AnyValue,
    };

    // Values nested deeper than this are refused as malformed: a hostile
    // document of a few hundred kilobytes of '[' would otherwise build a tree
    // whose recursive destruction overflows the stack.
    static constexpr std::size_t kMaxNestingDepth = PropertyValueBuilder::kMaxNestingDepth;

    // Strict parse of UTF-8 JSON text (no comments, no trailing text). Returns
    // an empty reference when the text is malformed, nested too deeply, or is
    // a scalar while `topLevel` asks for an object or array. Never throws
    // anything but std::bad_alloc.
    static PropertyValue parse(std::string_view text, TopLevel topLevel = TopLevel::ObjectOrArray);
    // The same, saying why when the result is empty.
    using Problem = PropertyValueBuilder::Problem;
    static PropertyValue parse(std::string_view text, TopLevel topLevel, Problem& problem);
    // What a problem is, in words for a message: "not JSON", "a number out
    // of range", ...
    static std::string describe(Problem problem);

    // The JSON form of a value. Never fails; for what JSON cannot hold:
    // - byte data is written as its hex text ("00 0a ff "), as report bytes are;
    // - numbers that are not finite (NaN, infinities) are written as null;
    // - an empty reference is written as null;
    // - float32 numbers are written with their shortest decimal form ("0.1",
    //   not 0.100000001490116), so recorded settings stay readable.
    static nlohmann::ordered_json toJson(const PropertyValue& value);

    // Text of a JSON document. Invalid UTF-8 inside strings and keys is
    // replaced by U+FFFD rather than failing the write. Indented output uses
    // two blanks per level; compact output is one line (for JSON Lines).
    static std::string dump(const nlohmann::ordered_json& json, bool indented);
    static std::string write(const PropertyValue& value, bool indented = true);
};

}  // namespace VeltoTouch
