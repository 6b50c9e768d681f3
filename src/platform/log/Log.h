#pragma once

#include "platform/log/LogFormat.h"

#include <memory>
#include <string>

namespace VeltoHost {

// Levels in increasing importance. A level is enabled when it is at or above
// the process-wide threshold.
enum class LogLevel { Debug = 0, Default = 1, Error = 2 };

struct LogRecord {
    std::string subsystem;
    std::string category;
    LogLevel level;
    std::string message;
};

class LogSink {
public:
    virtual ~LogSink() = default;
    // Called with the sink lock held: one record at a time, in order.
    virtual void write(const LogRecord& record) = 0;
};

// A structured log handle: subsystem and category, cheap to copy. Messages
// are built only when their level is enabled; callers that pass arguments
// that are themselves costly to compute (dumps) test isEnabled() first.
//
// The threshold starts from the environment variable VELTOTOUCH_LOG_LEVEL
// ("debug", "default", "error" or "off"; "error" when unset) and the default
// sink writes to standard error.
class Log {
public:
    static constexpr const char* kSubsystem = "org.veltotouch.hid.VeltoTouch";

    explicit Log(std::string category, std::string subsystem = kSubsystem);

    const std::string& subsystem() const noexcept { return _subsystem; }
    const std::string& category() const noexcept { return _category; }

    bool isEnabled(LogLevel level) const noexcept;
    void write(LogLevel level, std::string message) const;

    template <typename... Args>
    void debug(const char* format, const Args&... args) const
    {
        if (isEnabled(LogLevel::Debug)) write(LogLevel::Debug, formatLog(format, args...));
    }
    template <typename... Args>
    void log(const char* format, const Args&... args) const
    {
        if (isEnabled(LogLevel::Default)) write(LogLevel::Default, formatLog(format, args...));
    }
    template <typename... Args>
    void error(const char* format, const Args&... args) const
    {
        if (isEnabled(LogLevel::Error)) write(LogLevel::Error, formatLog(format, args...));
    }

    // Process-wide configuration. Threshold kOff disables every level.
    static constexpr int kOff = 3;
    static void setThreshold(int level) noexcept;
    static void setThreshold(LogLevel level) noexcept { setThreshold(static_cast<int>(level)); }
    static int threshold() noexcept;
    // Replaces the sink; nullptr restores the standard-error sink. Returns the previous one.
    static std::shared_ptr<LogSink> setSink(std::shared_ptr<LogSink> sink);

private:
    std::string _subsystem;
    std::string _category;
};

}  // namespace VeltoHost
