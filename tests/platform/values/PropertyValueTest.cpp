#include "platform/values/PropertyDictionary.h"
#include "platform/values/PropertyValue.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

using VeltoHost::PropertyDictionary;
using VeltoHost::PropertyValue;

TEST(PropertyValue, EmptyReferenceIsDistinctFromNull)
{
    PropertyValue empty;
    PropertyValue null = PropertyValue::null();
    EXPECT_FALSE(empty.hasValue());
    EXPECT_TRUE(null.hasValue());
    EXPECT_TRUE(null.isNull());
    EXPECT_FALSE(empty.isNull());
    EXPECT_FALSE(empty == null);
}

// Settings written as a string, a boolean, a negative or a larger number and
// read back through a pipeline: StateArgumentsTest and AlgsStateTest.
TEST(PropertyValue, NumbersConvertAsSettingsExpect)
{
    EXPECT_EQ(PropertyValue::uint32(4294967295u).description(), "4294967295");
    EXPECT_EQ(PropertyValue::float64(2.75).toInt64(), 2);
    EXPECT_EQ(PropertyValue::float64(-2.75).toInt64(), -2);
    EXPECT_EQ(PropertyValue::float64(-1.0).toUInt64(), std::numeric_limits<std::uint64_t>::max());
    EXPECT_EQ(PropertyValue::float64(std::nan("")).toInt64(), 0);
    EXPECT_EQ(PropertyValue::float64(1e300).toInt64(), std::numeric_limits<std::int64_t>::max());

    // Booleans count as numbers; every other kind counts as 0.
    EXPECT_TRUE(PropertyValue::boolean(true).isNumberOrBoolean());
    EXPECT_EQ(PropertyValue().toDouble(), 0.0);
    EXPECT_EQ(PropertyValue::null().toUInt64(), 0u);

    EXPECT_TRUE(PropertyValue::float64(0.5).toBool());
    EXPECT_FALSE(PropertyValue::float64(0.0).toBool());
    EXPECT_FALSE(PropertyValue::uint32(0).toBool());
}

TEST(PropertyValue, DictionaryKeepsInsertionOrderAndDescribes)
{
    PropertyDictionary dictionary;
    dictionary.set("Zeta", PropertyValue::uint32(1));
    dictionary.set("Alpha", PropertyValue::array({PropertyValue::boolean(false), PropertyValue::float32(0.5f)}));
    dictionary.set("Bytes", PropertyValue::bytes({0x00, 0xAB}));
    dictionary.set("Zeta", PropertyValue::string("line\n\"quoted\""));
    PropertyValue value = PropertyValue::dictionary(dictionary);

    ASSERT_EQ(value.asDictionary().size(), 3u);
    EXPECT_EQ(value.asDictionary().begin()->first, "Zeta");
    EXPECT_FALSE(value.asDictionary().get("Missing").hasValue());
    EXPECT_EQ(value.description(), R"({"Zeta": "line\n\"quoted\"", "Alpha": [false, 0.5], "Bytes": <00ab>})");

    // Equality is deep, of the same kind, and ignores a dictionary's order.
    EXPECT_FALSE(PropertyValue::uint32(1) == PropertyValue::float64(1.0));
    EXPECT_FALSE(PropertyValue::string("a") == PropertyValue::bytes({'a'}));
    PropertyDictionary reordered;
    reordered.set("Bytes", PropertyValue::bytes({0x00, 0xAB}));
    reordered.set("Alpha", PropertyValue::array({PropertyValue::boolean(false), PropertyValue::float32(0.5f)}));
    reordered.set("Zeta", PropertyValue::string("line\n\"quoted\""));
    EXPECT_TRUE(value == PropertyValue::dictionary(reordered));

    // Accessors of the wrong kind give empty defaults instead of failing.
    EXPECT_TRUE(PropertyValue::uint32(3).asString().empty());
    EXPECT_TRUE(PropertyValue().asArray().empty());
}
