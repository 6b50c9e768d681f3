#include "StateArguments.h"
#include "pipeline/Pipeline.h"

#include <gtest/gtest.h>

#include <optional>
#include <string>

using VeltoHost::PropertyValue;
using VeltoTool::StateArguments;

namespace {

// The warning for KEY=TEXT written to a fresh pipeline and read back, as
// the tool does it.
std::optional<std::string> warningFor(const std::string& key, const std::string& text)
{
    VeltoTouch::Pipeline pipeline;
    const PropertyValue value = StateArguments::parseValue(key, text);
    pipeline.setState(key, value);
    return StateArguments::readBackWarning(key, value, pipeline.getState(key));
}

TEST(StateArguments, SettingsThePipelineConvertedAreNamedWithBothValues)
{
    struct Case {
        const char* key;
        const char* value;
        std::optional<std::string> warning;  // none: taken as written
    };
    const std::string unknown = " but reads back null: the pipeline keeps no setting of that name (an unknown key, or "
                                "one that is only acted on)";
    const Case cases[] = {
        {"Algs.ActivationThreshold", "300", {}},      // an integer for a float setting
        {"Algs.ActivationThreshold", "0.1", {}},      // kept in single precision: still 0.1
        {"Algs.ActivationThreshold", "-2.5", {}},     // not range-checked, and kept as written
        {"Algs.HoldTimeoutMilliseconds", "600", {}},
        {"Algs.EnableTapSuppression", "false", {}},
        {"Algs.EnableTapSuppression", "0", {}},       // a flag written as a number
        {"Algs.VirtualNormalizationFactors.7", "0.5", {}},
        {"Algs.ActivationThreshold", "abc",
         "Algs.ActivationThreshold was set to a string (\"abc\") but reads back a number (0)"},
        {"Algs.ActivationThreshold", "[1]", "Algs.ActivationThreshold was set to an array ([1]) but reads back a number (0)"},
        {"Algs.ActivationThreshold", "true",
         "Algs.ActivationThreshold was set to a boolean (true) but reads back a number (1)"},
        {"Algs.ActivationThreshold", "1e40", "Algs.ActivationThreshold was set to 1e+40 but reads back inf"},
        {"Algs.ActivationThreshold", "16777217", "Algs.ActivationThreshold was set to 16777217 but reads back 16777216"},
        {"Algs.HoldTimeoutMilliseconds", "4294967796", "Algs.HoldTimeoutMilliseconds was set to 4294967796 but reads back 500"},
        {"Algs.HoldTimeoutMilliseconds", "-1", "Algs.HoldTimeoutMilliseconds was set to -1 but reads back 4294967295"},
        {"Algs.EnableTapSuppression", "2",
         "Algs.EnableTapSuppression was set to a number (2) but reads back a boolean (true)"},
        {"Algs.EnableTapSuppression", "yes",
         "Algs.EnableTapSuppression was set to a string (\"yes\") but reads back a boolean (false)"},
        // Keys are exact.
        {"Algs.ActivationThreshhold", "300", "Algs.ActivationThreshhold was set to 300" + unknown},
        {"Algs.VirtualNormalizationFactors.99", "0.5", "Algs.VirtualNormalizationFactors.99 was set to 0.5" + unknown},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(warningFor(c.key, c.value), c.warning) << c.key << "=" << c.value;
    }
}

}  // namespace
