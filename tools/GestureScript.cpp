#include "GestureScript.h"

#include "ToolError.h"

#include <charconv>
#include <cmath>
#include <optional>
#include <sstream>

namespace VeltoTool {

using VeltoTouch::PixelRegion;

namespace {

constexpr std::uint32_t kDefaultTapMs = 120;

[[noreturn]] void fail(int line, const std::string& message)
{
    throw ToolError("script line " + std::to_string(line) + ": " + message);
}

// A touch is always somewhere: "none" names no place to touch.
PixelRegion parseRegion(const std::string& word, int line)
{
    const std::optional<PixelRegion> region = VeltoTouch::Gesture::regionFromName(word);
    if (!region || *region == PixelRegion::None) fail(line, "unknown region \"" + word + "\" (top, middle or bottom)");
    return *region;
}

std::vector<std::string> words(const std::string& statement)
{
    std::istringstream in(statement);
    std::vector<std::string> out;
    for (std::string word; in >> word;) out.push_back(word);
    return out;
}

void expectCount(const std::vector<std::string>& w, std::size_t min, std::size_t max, int line, const char* usage)
{
    if (w.size() < min || w.size() > max) fail(line, std::string("expected \"") + usage + "\"");
}

GestureScript::Step parseStatement(const std::vector<std::string>& w, int line)
{
    using Action = GestureScript::Action;
    GestureScript::Step step;
    step.action = Action::Idle;
    step.line = line;
    auto duration = [&](const std::string& text) {
        try {
            return GestureScript::parseDuration(text);
        } catch (const ToolError& error) {
            fail(line, error.what());
        }
    };
    const std::string& verb = w[0];
    if (verb == "tap") {
        expectCount(w, 2, 3, line, "tap REGION [DURATION]");
        step.action = Action::Tap;
        step.from = step.to = parseRegion(w[1], line);
        step.durationMs = w.size() == 3 ? duration(w[2]) : kDefaultTapMs;
    } else if (verb == "hold") {
        expectCount(w, 3, 4, line, "hold REGION DURATION [reset@TIME]");
        step.action = Action::Hold;
        step.from = step.to = parseRegion(w[1], line);
        step.durationMs = duration(w[2]);
        if (w.size() == 4) {
            if (w[3].rfind("reset@", 0) != 0) fail(line, "expected \"reset@TIME\" after the duration, got \"" + w[3] + "\"");
            step.resetAtMs = duration(w[3].substr(6));
            if (*step.resetAtMs >= step.durationMs) fail(line, "reset@ must fall within the hold");
        }
    } else if (verb == "slide") {
        expectCount(w, 4, 4, line, "slide FROM TO DURATION");
        step.action = Action::Slide;
        step.from = parseRegion(w[1], line);
        step.to = parseRegion(w[2], line);
        step.durationMs = duration(w[3]);
    } else if (verb == "palm" || verb == "idle" || verb == "noise") {
        expectCount(w, 2, 2, line, (verb + " DURATION").c_str());
        step.action = verb == "palm" ? Action::Palm : verb == "idle" ? Action::Idle : Action::Noise;
        step.durationMs = duration(w[1]);
    } else if (verb == "reset") {
        expectCount(w, 1, 1, line, "reset");
        step.action = Action::Reset;
    } else {
        fail(line, "unknown gesture \"" + verb + "\" (tap, hold, slide, palm, idle, noise, reset)");
    }
    return step;
}

}  // namespace

std::uint32_t GestureScript::parseDuration(const std::string& text)
{
    double scale = 0;
    std::string number;
    if (text.size() > 2 && text.compare(text.size() - 2, 2, "ms") == 0) {
        scale = 1;
        number = text.substr(0, text.size() - 2);
    } else if (text.size() > 1 && text.back() == 's') {
        scale = 1000;
        number = text.substr(0, text.size() - 1);
    } else {
        throw ToolError("invalid duration \"" + text + "\" (for example 600ms or 1.2s)");
    }
    double value = 0;
    auto [end, error] = std::from_chars(number.data(), number.data() + number.size(), value);
    if (error != std::errc() || end != number.data() + number.size() || !(value >= 0) || value * scale > 3.6e6) {
        throw ToolError("invalid duration \"" + text + "\" (for example 600ms or 1.2s, at most an hour)");
    }
    return static_cast<std::uint32_t>(std::lround(value * scale));
}

std::vector<GestureScript::Step> GestureScript::parse(const std::string& text)
{
    std::vector<Step> steps;
    int line = 1;
    std::string statement;
    auto flush = [&] {
        std::vector<std::string> w = words(statement);
        if (!w.empty()) steps.push_back(parseStatement(w, line));
        statement.clear();
    };
    bool comment = false;
    for (char c : text) {
        if (c == '\n') {
            flush();
            comment = false;
            ++line;
        } else if (comment) {
            continue;
        } else if (c == '#') {
            comment = true;
        } else if (c == ';') {
            flush();
        } else {
            statement += c;
        }
    }
    flush();
    return steps;
}

}  // namespace VeltoTool
