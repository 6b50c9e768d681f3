// Any text as a --set argument. Splitting yields a key and a value text that
// put back together give the argument, or a ToolError; the value text yields a
// value or a ToolError, never anything else; the key only names the setting
// in messages and never changes the value.
#include "FuzzInput.h"
#include "StateArguments.h"
#include "ToolError.h"

#include <cstdio>
#include <cstring>
#include <exception>
#include <optional>
#include <string>
#include <utility>

namespace {

using VeltoHost::PropertyValue;
using VeltoTool::StateArguments;
using VeltoTool::ToolError;

bool hasLineBreak(const std::string& text) { return text.find_first_of("\r\n") != std::string::npos; }

// The value, or nothing for a ToolError; any other exception is a finding.
std::optional<PropertyValue> parseValue(const std::string& key, const std::string& text)
{
    try {
        PropertyValue value = StateArguments::parseValue(key, text);
        VELTO_FUZZ_CHECK(value.hasValue());
        return value;
    } catch (const ToolError& error) {
        const std::string message = error.what();
        VELTO_FUZZ_CHECK(message.find(key) != std::string::npos);
        // The tool prints the message as one line; only the user's own text
        // can bring a line break into it.
        if (!hasLineBreak(key) && !hasLineBreak(text)) VELTO_FUZZ_CHECK(!hasLineBreak(message));
        return std::nullopt;
    }
}

void checkSplit(const std::string& argument)
{
    std::pair<std::string, std::string> parts;
    try {
        parts = StateArguments::split(argument);
    } catch (const ToolError&) {
        // Refused exactly when there is no key before an '='.
        VELTO_FUZZ_CHECK(argument.empty() || argument.find('=') == std::string::npos || argument.front() == '=');
        return;
    }
    const auto& [key, text] = parts;
    VELTO_FUZZ_CHECK(!key.empty());
    VELTO_FUZZ_CHECK(key.find('=') == std::string::npos);
    VELTO_FUZZ_CHECK(key + "=" + text == argument);

    const std::optional<PropertyValue> value = parseValue(key, text);
    const std::optional<PropertyValue> other = parseValue("Algs.Other", text);
    VELTO_FUZZ_CHECK(value.has_value() == other.has_value());
    if (value) VELTO_FUZZ_CHECK(*value == *other);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    // Command-line arguments are C strings: nothing after a NUL can arrive.
    std::string argument(reinterpret_cast<const char*>(data), size);
    argument.resize(std::strlen(argument.c_str()));
    try {
        checkSplit(argument);
        // The whole text as a value, too: it need not contain an '='.
        parseValue("Algs.Key", argument);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "--set parsing threw something other than ToolError: %s\n", error.what());
        std::abort();
    }
    return 0;
}
