#include "platform/log/LogFormat.h"

#include <cstdio>
#include <cstring>
#include <vector>

namespace VeltoHost {

std::int64_t LogFormatArg::asSigned() const noexcept
{
    switch (_type) {
    case Type::Signed: return _signed;
    case Type::Unsigned: return static_cast<std::int64_t>(_unsigned);
    case Type::Real: return static_cast<std::int64_t>(_real);
    case Type::Text: return 0;
    }
    return 0;
}

std::uint64_t LogFormatArg::asUnsigned() const noexcept
{
    return _type == Type::Unsigned ? _unsigned : static_cast<std::uint64_t>(asSigned());
}

double LogFormatArg::asReal() const noexcept
{
    switch (_type) {
    case Type::Signed: return static_cast<double>(_signed);
    case Type::Unsigned: return static_cast<double>(_unsigned);
    case Type::Real: return _real;
    case Type::Text: return 0;
    }
    return 0;
}

std::string LogFormatArg::asText() const
{
    switch (_type) {
    case Type::Signed: return std::to_string(_signed);
    case Type::Unsigned: return std::to_string(_unsigned);
    case Type::Real: return std::to_string(_real);
    case Type::Text: return _text;
    }
    return {};
}

namespace {

// Appends snprintf output of any length.
template <typename... V>
void appendFormatted(std::string& out, const char* pattern, V... values)
{
    char buffer[128];
    int needed = std::snprintf(buffer, sizeof buffer, pattern, values...);
    if (needed < 0) return;
    if (static_cast<std::size_t>(needed) < sizeof buffer) {
        out.append(buffer, static_cast<std::size_t>(needed));
        return;
    }
    std::vector<char> large(static_cast<std::size_t>(needed) + 1);
    std::snprintf(large.data(), large.size(), pattern, values...);
    out.append(large.data(), static_cast<std::size_t>(needed));
}

class Formatter {
public:
    Formatter(const LogFormatArg* first, const LogFormatArg* last) : _next(first), _end(last) {}

    std::string run(const char* format)
    {
        std::string out;
        for (const char* p = format; *p;) {
            if (*p != '%') {
                out += *p++;
                continue;
            }
            p = directive(p, out);
        }
        return out;
    }

private:
    const LogFormatArg* take()
    {
        if (_next == _end) return nullptr;
        return _next++;
    }

    // Reads one "%..." directive starting at `p` and returns the position after it.
    const char* directive(const char* p, std::string& out)
    {
        const char* start = p++;
        if (*p == '%') {
            out += '%';
            return p + 1;
        }
        std::string pattern = "%";
        while (*p && std::strchr("-+ #0", *p)) pattern += *p++;
        p = number(p, pattern);
        if (*p == '.') {
            pattern += *p++;
            p = number(p, pattern);
        }
        bool wide = false;
        while (*p && std::strchr("hlLjztq", *p)) {
            if (std::strchr("lLjztq", *p)) wide = true;
            ++p;
        }
        if (!*p) {
            out.append(start);
            return p;
        }
        char conversion = *p++;
        convert(conversion, pattern, wide, out);
        return p;
    }

    // Copies a width or precision, resolving '*' from the argument list.
    const char* number(const char* p, std::string& pattern)
    {
        if (*p == '*') {
            const LogFormatArg* arg = take();
            pattern += std::to_string(arg ? static_cast<int>(arg->asSigned()) : 0);
            return p + 1;
        }
        while (*p >= '0' && *p <= '9') pattern += *p++;
        return p;
    }

    void convert(char conversion, std::string pattern, bool wide, std::string& out)
    {
        const LogFormatArg* arg = take();
        if (!arg) {
            out += "(missing)";
            return;
        }
        switch (conversion) {
        case 'd':
        case 'i':
            if (wide) {
                appendFormatted(out, (pattern + "lld").c_str(), static_cast<long long>(arg->asSigned()));
            } else {
                appendFormatted(out, (pattern + "d").c_str(), static_cast<int>(static_cast<std::uint32_t>(arg->asUnsigned())));
            }
            break;
        case 'u':
        case 'x':
        case 'X':
        case 'o':
            if (wide) {
                appendFormatted(out, (pattern + "ll" + conversion).c_str(), static_cast<unsigned long long>(arg->asUnsigned()));
            } else {
                appendFormatted(out, (pattern + conversion).c_str(), static_cast<unsigned>(arg->asUnsigned()));
            }
            break;
        case 'c':
            appendFormatted(out, (pattern + "c").c_str(), static_cast<int>(static_cast<unsigned char>(arg->asSigned())));
            break;
        case 'f':
        case 'F':
        case 'e':
        case 'E':
        case 'g':
        case 'G':
        case 'a':
        case 'A':
            appendFormatted(out, (pattern + conversion).c_str(), arg->asReal());
            break;
        case 's':
        case '@':
            appendFormatted(out, (pattern + "s").c_str(), arg->asText().c_str());
            break;
        default:
            out += pattern;
            out += conversion;
            break;
        }
    }

    const LogFormatArg* _next;
    const LogFormatArg* _end;
};

}  // namespace

std::string formatLogMessage(const char* format, std::initializer_list<LogFormatArg> args)
{
    return Formatter(args.begin(), args.end()).run(format ? format : "");
}

}  // namespace VeltoHost
