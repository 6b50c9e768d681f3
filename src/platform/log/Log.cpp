#include "platform/log/Log.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>
#include <string_view>

namespace VeltoHost {

namespace {

const char* levelName(LogLevel level)
{
    switch (level) {
    case LogLevel::Debug: return "debug";
    case LogLevel::Default: return "default";
    case LogLevel::Error: return "error";
    }
    return "?";
}

int thresholdFromEnvironment()
{
    const char* setting = std::getenv("VELTOTOUCH_LOG_LEVEL");
    if (!setting) return static_cast<int>(LogLevel::Error);
    if (std::strcmp(setting, "debug") == 0) return static_cast<int>(LogLevel::Debug);
    if (std::strcmp(setting, "default") == 0) return static_cast<int>(LogLevel::Default);
    if (std::strcmp(setting, "off") == 0) return Log::kOff;
    return static_cast<int>(LogLevel::Error);
}

class StderrSink : public LogSink {
public:
    void write(const LogRecord& record) override
    {
        // A message may end in line breaks of its own (some documented texts
        // do); they are folded into the one that ends the line, so that every
        // message is one line to whatever reads the log line by line.
        std::string_view message = record.message;
        while (!message.empty() && message.back() == '\n') message.remove_suffix(1);
        std::string line = "[" + record.subsystem + ":" + record.category + "] " + levelName(record.level) + ": ";
        line.append(message);
        line += '\n';
        // One write per line keeps lines whole when others share the stream.
        std::fwrite(line.data(), 1, line.size(), stderr);
    }
};

std::atomic<int>& thresholdSetting()
{
    static std::atomic<int> setting{thresholdFromEnvironment()};
    return setting;
}

struct SinkSlot {
    std::mutex lock;
    std::shared_ptr<LogSink> sink = std::make_shared<StderrSink>();
};

SinkSlot& sinkSlot()
{
    static SinkSlot slot;
    return slot;
}

}  // namespace

Log::Log(std::string category, std::string subsystem) : _subsystem(std::move(subsystem)), _category(std::move(category))
{
}

bool Log::isEnabled(LogLevel level) const noexcept
{
    return static_cast<int>(level) >= thresholdSetting().load(std::memory_order_relaxed);
}

void Log::write(LogLevel level, std::string message) const
{
    LogRecord record{_subsystem, _category, level, std::move(message)};
    SinkSlot& slot = sinkSlot();
    std::lock_guard guard(slot.lock);
    slot.sink->write(record);
}

void Log::setThreshold(int level) noexcept { thresholdSetting().store(level, std::memory_order_relaxed); }

int Log::threshold() noexcept { return thresholdSetting().load(std::memory_order_relaxed); }

std::shared_ptr<LogSink> Log::setSink(std::shared_ptr<LogSink> sink)
{
    if (!sink) sink = std::make_shared<StderrSink>();
    SinkSlot& slot = sinkSlot();
    std::lock_guard guard(slot.lock);
    slot.sink.swap(sink);
    return sink;
}

}  // namespace VeltoHost
