#include "daemon/DaemonConfig.h"

#include "platform/log/Log.h"

#include <toml++/toml.h>

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <sstream>
#include <utility>

namespace VeltoHost {

namespace {

constexpr std::int64_t kLargestId = 0xFFFF;
// The binding that holds its key down rather than pressing it once.
constexpr std::string_view kHoldBinding = "hold";
constexpr std::string_view kClickGestures = "may-begin, tap, hold-start, hold-change, hold-end or hold";

constexpr std::array<std::pair<std::string_view, int>, 4> kLogLevels{{
    {"debug", static_cast<int>(LogLevel::Debug)},
    {"default", static_cast<int>(LogLevel::Default)},
    {"error", static_cast<int>(LogLevel::Error)},
    {"off", Log::kOff},
}};

std::string hexId(std::uint16_t id)
{
    char text[sizeof "0xFFFF"];
    std::snprintf(text, sizeof text, "0x%04X", static_cast<unsigned int>(id));
    return text;
}

std::string quoted(std::string_view text) { return "\"" + std::string(text) + "\""; }

// A number as the file wrote it, so that the message quotes what the user sees.
std::string asWritten(const toml::value<std::int64_t>& number)
{
    const std::int64_t value = number.get();
    if (value < 0 || !(number.flags() & toml::value_flags::format_as_hexadecimal)) return std::to_string(value);
    std::ostringstream text;
    text << "0x" << std::hex << std::uppercase << value;
    return text.str();
}

// Reads one parsed document; every complaint goes through fail() so that it
// names the place it is about.
class Reader {
public:
    explicit Reader(std::string sourceName) : _sourceName(std::move(sourceName)) {}

    [[noreturn]] void fail(const toml::source_region& where, const std::string& what) const
    {
        throw DaemonConfig::Error(place(where) + ": " + what);
    }

    void readDocument(const toml::table& document, DaemonConfig& config) const
    {
        for (const auto& [key, node] : document) {
            if (key.str() == "log_level") config.logThreshold = readLogLevel(node);
            else if (key.str() == "match") readMatches(key, node, config);
            else if (key.str() == "keys") readKeys(key, node, config.keys);
            else fail(key.source(), "unknown setting " + quoted(key.str()) + " (expected log_level, [[match]] or [keys])");
        }
    }

private:
    // "FILE:LINE:COLUMN", the start of every message about the file.
    std::string place(const toml::source_region& where) const
    {
        return _sourceName + ":" + std::to_string(where.begin.line) + ":" + std::to_string(where.begin.column);
    }

    int readLogLevel(const toml::node& node) const
    {
        const auto* name = node.as_string();
        if (name) {
            for (const auto& [each, threshold] : kLogLevels) {
                if (each == name->get()) return threshold;
            }
        }
        fail(node.source(), "log_level must be \"debug\", \"default\", \"error\" or \"off\"");
    }

    void readMatches(const toml::key& key, const toml::node& node, DaemonConfig& config) const
    {
        const auto* tables = node.as_array();
        if (!tables || !tables->is_array_of_tables()) {
            fail(key.source(), "match must be a list of tables: write each one as [[match]]");
        }
        // Where each match was first written, so that a repeat can point back at it.
        std::vector<std::uint32_t> firstLines;
        for (const toml::node& each : *tables) {
            const toml::table& table = *each.as_table();
            const DaemonConfig::DeviceMatch match = readMatch(table);
            const auto earlier = std::find(config.matches.begin(), config.matches.end(), match);
            if (earlier == config.matches.end()) {
                config.matches.push_back(match);
                firstLines.push_back(table.source().begin.line);
                continue;
            }
            // Harmless to the daemon, but likely a slip (a copied table whose ids
            // were meant to change): said, and taken once.
            const auto firstLine = firstLines[static_cast<std::size_t>(earlier - config.matches.begin())];
            config.warnings.push_back(place(table.source()) + ": [[match]] vendor " + hexId(match.vendor) +
                                      " product " + hexId(match.product) + " repeats the one at line " +
                                      std::to_string(firstLine) + "; taken once");
        }
    }

    DaemonConfig::DeviceMatch readMatch(const toml::table& table) const
    {
        std::optional<std::uint16_t> vendor;
        std::optional<std::uint16_t> product;
        for (const auto& [key, node] : table) {
            if (key.str() == "vendor") vendor = readId(key, node);
            else if (key.str() == "product") product = readId(key, node);
            else fail(key.source(), "unknown key " + quoted(key.str()) + " in [[match]] (expected vendor and product)");
        }
        if (!vendor || !product) fail(table.source(), "[[match]] needs both vendor and product");
        return {*vendor, *product};
    }

    std::uint16_t readId(const toml::key& key, const toml::node& node) const
    {
        const auto* number = node.as_integer();
        if (!number) fail(node.source(), std::string(key.str()) + " must be an integer such as 0x1234");
        const std::int64_t value = number->get();
        if (value < 0 || value > kLargestId) {
            fail(node.source(), std::string(key.str()) + " " + asWritten(*number) + " is out of range (0 to 0xFFFF)");
        }
        return static_cast<std::uint16_t>(value);
    }

    void readKeys(const toml::key& key, const toml::node& node, KeyMap::Bindings& bindings) const
    {
        const auto* gestures = node.as_table();
        if (!gestures) fail(key.source(), "keys must be a table: [keys] with lines such as tap.top = \"KEY_VOLUMEUP\"");
        for (const auto& [gestureKey, regions] : *gestures) {
            const bool hold = gestureKey.str() == kHoldBinding;
            const std::optional<Gesture::Kind> kind = Gesture::kindFromName(gestureKey.str());
            if (!hold && !(kind && KeyMap::isClickable(*kind))) {
                fail(gestureKey.source(), "unknown gesture " + quoted(gestureKey.str()) + " in [keys] (expected " +
                                              std::string(kClickGestures) + ")");
            }
            const auto* table = regions.as_table();
            if (!table) {
                const std::string gesture(gestureKey.str());
                fail(regions.source(), "keys." + gesture + " must name a region: " + gesture + ".top = \"KEY_...\"");
            }
            for (const auto& [regionKey, value] : *table) {
                const std::optional<Gesture::Region> region = Gesture::regionFromName(regionKey.str());
                if (!region) {
                    fail(regionKey.source(), "unknown region " + quoted(regionKey.str()) +
                                                 " in [keys] (expected top, middle, bottom or none)");
                }
                const std::optional<unsigned int> code = readKeyName(value);
                if (hold) assign(bindings.holds, *region, code);
                else assign(bindings.clicks, std::pair{*kind, *region}, code);
            }
        }
    }

    // Empty for "", which removes a binding.
    std::optional<unsigned int> readKeyName(const toml::node& node) const
    {
        const auto* name = node.as_string();
        if (!name) fail(node.source(), "a key binding must be a key name such as \"KEY_VOLUMEUP\", or \"\" for none");
        if (name->get().empty()) return std::nullopt;
        const std::optional<unsigned int> code = KeyMap::keyCodeFromName(name->get());
        if (!code) fail(node.source(), "unknown key name " + quoted(name->get()) + " (Linux names such as \"KEY_MUTE\")");
        return code;
    }

    template <typename Map, typename Key>
    static void assign(Map& map, const Key& key, std::optional<unsigned int> code)
    {
        if (code) map[key] = *code;
        else map.erase(key);
    }

    std::string _sourceName;
};

}  // namespace

DaemonConfig DaemonConfig::load(const std::string& path)
{
    // Read with the system calls themselves: a stream opens a directory
    // without complaint and then reads it as an empty file, which would start
    // the daemon on defaults instead of saying that the path is wrong.
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) throw Error(path + ": cannot read: " + std::strerror(errno));
    std::string text;
    char buffer[4096];
    for (;;) {
        const ssize_t count = ::read(fd, buffer, sizeof buffer);
        if (count == 0) break;
        if (count < 0 && errno == EINTR) continue;
        if (count < 0) {
            const int error = errno;
            ::close(fd);
            throw Error(path + ": cannot read: " + std::strerror(error));
        }
        text.append(buffer, static_cast<std::size_t>(count));
    }
    ::close(fd);
    return parse(text, path);
}

DaemonConfig DaemonConfig::parse(std::string_view text, const std::string& sourceName)
{
    const Reader reader(sourceName);
    toml::table document;
    try {
        document = toml::parse(text, sourceName);
    } catch (const toml::parse_error& error) {
        reader.fail(error.source(), std::string(error.description()));
    }
    DaemonConfig config;
    reader.readDocument(document, config);
    return config;
}

bool DaemonConfig::takes(std::uint16_t vendor, std::uint16_t product) const noexcept
{
    for (const DeviceMatch& match : matches) {
        if (match.vendor == vendor && match.product == product) return true;
    }
    return false;
}

}  // namespace VeltoHost
