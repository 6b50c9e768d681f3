#include "platform/values/PropertyDictionary.h"
#include "recording/JsonValue.h"

#include <gtest/gtest.h>

#include <limits>
#include <string>

namespace {

using VeltoHost::PropertyDictionary;
using VeltoTouch::JsonValue;
using VeltoTouch::PropertyValue;

PropertyValue parseScalar(const std::string& text) { return JsonValue::parse(text, JsonValue::TopLevel::AnyValue); }

TEST(JsonValue, NumbersKeepTheirSignednessAndSixtyFourBitsExactly)
{
    EXPECT_EQ(parseScalar("18446744073709551615"), PropertyValue::uint64(std::numeric_limits<std::uint64_t>::max()));
    EXPECT_EQ(parseScalar("0"), PropertyValue::uint64(0));
    EXPECT_EQ(parseScalar("-9223372036854775808"), PropertyValue::int64(std::numeric_limits<std::int64_t>::min()));
    EXPECT_EQ(parseScalar("-1"), PropertyValue::int64(-1));
    EXPECT_EQ(parseScalar("1.0"), PropertyValue::float64(1.0));
    EXPECT_EQ(parseScalar("2e3"), PropertyValue::float64(2000.0));
    EXPECT_EQ(parseScalar("18446744073709551616"), PropertyValue::float64(18446744073709551616.0));
    EXPECT_FALSE(parseScalar("1e400").hasValue()) << "a number beyond double is malformed";
    EXPECT_EQ(parseScalar("true"), PropertyValue::boolean(true));
    EXPECT_EQ(parseScalar("null"), PropertyValue::null());
    EXPECT_EQ(parseScalar("\"\\u00e9\""), PropertyValue::string("\xc3\xa9"));
}

TEST(JsonValue, ContainersNeedAnObjectOrArrayAtTheTopAndBoundedNesting)
{
    EXPECT_FALSE(JsonValue::parse("1").hasValue());
    EXPECT_FALSE(JsonValue::parse("null").hasValue()) << "no value, not a null value";
    EXPECT_TRUE(JsonValue::parse("[]").isArray());
    EXPECT_TRUE(JsonValue::parse(" {} ").isDictionary());
    EXPECT_FALSE(JsonValue::parse("{} {}").hasValue());
    EXPECT_FALSE(JsonValue::parse("[1, ]").hasValue());

    const std::size_t limit = JsonValue::kMaxNestingDepth;
    EXPECT_TRUE(JsonValue::parse(std::string(limit, '[') + std::string(limit, ']')).isArray());
    EXPECT_FALSE(JsonValue::parse(std::string(limit + 1, '[') + std::string(limit + 1, ']')).hasValue());
}

TEST(JsonValue, ObjectsKeepEntryOrderAndTheLastOfRepeatedKeys)
{
    const PropertyValue value = JsonValue::parse(R"({"b": 1, "a": [true, null, "x"], "b": 2})");
    ASSERT_TRUE(value.isDictionary());
    PropertyDictionary expected;
    expected.set("b", PropertyValue::uint64(2));
    expected.set("a", PropertyValue::array({PropertyValue::boolean(true), PropertyValue::null(),
                                            PropertyValue::string("x")}));
    EXPECT_EQ(value, PropertyValue::dictionary(expected));
    EXPECT_EQ(JsonValue::write(value, false), R"({"b":2,"a":[true,null,"x"]})");
}

TEST(JsonValue, WritingMapsEveryKindAndNeverFails)
{
    PropertyDictionary all;
    all.set("i32", PropertyValue::int32(-5));
    all.set("u32", PropertyValue::uint32(7));
    all.set("f32", PropertyValue::float32(0.3f));
    all.set("f64", PropertyValue::float64(2.0));
    all.set("nan", PropertyValue::float32(std::numeric_limits<float>::quiet_NaN()));
    all.set("bytes", PropertyValue::bytes({0x1F, 0x00}));
    all.set("empty", PropertyValue());
    all.set("bad\xff", PropertyValue::string("\xc3"));  // text that is not UTF-8
    EXPECT_EQ(JsonValue::write(PropertyValue::dictionary(all), false),
              R"({"i32":-5,"u32":7,"f32":0.3,"f64":2.0,"nan":null,"bytes":"1f 00 ","empty":null,)"
              "\"bad\xef\xbf\xbd\":\"\xef\xbf\xbd\"}");
    EXPECT_EQ(JsonValue::write(PropertyValue::array({PropertyValue::uint64(1)}), true), "[\n  1\n]");
}

}  // namespace
