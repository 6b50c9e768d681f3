// State keys and gesture counters, read and written through the pipeline's "Algs" domain.
#include "pipeline/Pipeline.h"

#include <gtest/gtest.h>

#include <cctype>
#include <map>
#include <string>

namespace VeltoTouch::Test {
namespace {

using VeltoHost::PropertyValue;

PropertyValue get(Pipeline& pipeline, const std::string& key) { return pipeline.getState("Algs." + key); }
void set(Pipeline& pipeline, const std::string& key, PropertyValue value) { pipeline.setState("Algs." + key, value); }

// Factor N of the group table reads and writes by its index; there is none
// past the last group, nor without an index.
TEST(AlgsState, NormalizationFactorsReadAndWriteByIndex)
{
    Pipeline pipeline;
    const std::string domain = "VirtualNormalizationFactors";
    EXPECT_EQ(get(pipeline, domain + ".7"), PropertyValue::float32(0.4651f));
    EXPECT_EQ(get(pipeline, domain + ".22"), PropertyValue::float32(0.6667f));
    EXPECT_TRUE(get(pipeline, domain + ".23").isNull());
    EXPECT_TRUE(get(pipeline, domain).isNull());

    // Written and read back, and one past the table unknown: StateArgumentsTest.
    set(pipeline, domain + ".7", PropertyValue::float64(0.5));
    EXPECT_EQ(get(pipeline, domain + ".8"), PropertyValue::float32(0.6667f)) << "only factor 7 moved";
    // The table changes; the group's virtual pixel keeps the gain it was built with.
    EXPECT_EQ(pipeline.algs().virtualPixels[7].gain, 0.4651f);
    // Writes past the table or without an index change nothing.
    set(pipeline, domain + ".99", PropertyValue::float64(0.5));
    set(pipeline, domain, PropertyValue::float64(0.5));
    EXPECT_EQ(get(pipeline, domain + ".0"), PropertyValue::float32(0.6667f));
}

// Every key of the table is reached by its name only (an indexed one with
// its index), reads as its entry says, and a write reaches exactly the value
// that reads back; a value that is not a number is written as 0.
TEST(AlgsState, EveryKeyOfTheTableReadsAndWritesItsOwnValue)
{
    for (const Algs::StateKey& key : Algs::stateKeys()) {
        SCOPED_TRACE(key.name);
        std::string name = key.name;
        if (key.indexed) name.replace(name.rfind(".N"), 2, ".7");
        Pipeline pipeline;
        std::map<std::string, PropertyValue> before;
        for (const Algs::StateKey& other : Algs::stateKeys()) before[other.name] = get(pipeline, other.name);

        EXPECT_EQ(get(pipeline, name).isNull(), key.get == nullptr);
        std::string lower = name;
        for (char& c : lower) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        EXPECT_TRUE(get(pipeline, lower).isNull());

        set(pipeline, name, PropertyValue::string("300"));
        const PropertyValue written = get(pipeline, name);
        if (key.set && key.get) {
            EXPECT_EQ(written.toFloat(), 0.0f) << "a string counts as 0";
            set(pipeline, name, PropertyValue::float64(7.0));
            EXPECT_EQ(get(pipeline, name).toFloat(), std::string(key.type) == "boolean" ? 1.0f : 7.0f);
        } else if (key.get) {
            EXPECT_EQ(written, before[key.name]) << "read-only";
        }
        for (const Algs::StateKey& other : Algs::stateKeys()) {
            if (&other != &key && !other.indexed && std::string(other.type) != "dictionary") {
                EXPECT_EQ(get(pipeline, other.name), before[other.name]) << "moved by " << name << ": " << other.name;
            }
        }
    }
}

}  // namespace
}  // namespace VeltoTouch::Test
