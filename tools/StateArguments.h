#pragma once

#include "pipeline/Pipeline.h"
#include "platform/values/PropertyValue.h"

#include <optional>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

namespace VeltoTool {

// Parsing of the tool's KEY=VALUE state arguments, where VALUE is JSON, and
// the check of what a setting became.
class StateArguments {
public:
    // "Algs.HoldTimeoutMilliseconds=600" -> key and the text after '='.
    // Throws ToolError without '=' or without a key.
    static std::pair<std::string, std::string> split(const std::string& argument);
    // The JSON value of a setting; throws ToolError naming the key when the
    // text is not JSON. A bare word that is not JSON is taken as a string, so
    // that --set Key=text works without shell-quoted quotes.
    static VeltoHost::PropertyValue parseValue(const std::string& key, const std::string& text);

    // One KEY=VALUE argument, its value parsed once.
    struct Setting {
        std::string key;
        std::string text;  // VALUE as written
        VeltoHost::PropertyValue value;
    };
    // split, then parseValue; throws their ToolError.
    static Setting parseSetting(const std::string& argument);

    // The pipeline converts a setting instead of refusing it: a string
    // written as the threshold is stored as 0, 1e40 as infinity, 2^32 + 500
    // as a timeout of 500. Given what was written and what the key reads
    // back, this is the text of a warning when the two differ in kind or in
    // value (at the precision the key keeps), and nothing when the setting
    // took as written. A number 0 or 1 written to a flag is the flag as
    // written. The text names the key and both values; the caller adds its
    // "warning:" prefix.
    static std::optional<std::string> readBackWarning(const std::string& key, const VeltoHost::PropertyValue& written,
                                                      const VeltoHost::PropertyValue& readBack);

    // Writes each KEY=JSON setting into the pipeline and reads it back at
    // once, so that one the pipeline converted (a string stored as 0) is
    // reported on `err` before it skews a whole replay.
    static void apply(VeltoTouch::Pipeline& pipeline, const std::vector<Setting>& settings, std::ostream& err);
};

}  // namespace VeltoTool
