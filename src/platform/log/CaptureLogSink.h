#pragma once

#include "platform/log/Log.h"

#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace VeltoHost {

// Keeps every record in memory, for tests and tools that inspect what was
// logged. Install it with CaptureLogSink::Scope, which also sets the threshold
// and puts the previous sink and threshold back when it ends.
class CaptureLogSink : public LogSink {
public:
    void write(const LogRecord& record) override;

    std::vector<LogRecord> records() const;
    // Messages of one category, in order ("" for every category).
    std::vector<std::string> messages(const std::string& category = "") const;
    void clear();

    class Scope {
    public:
        explicit Scope(LogLevel threshold = LogLevel::Debug);
        ~Scope();
        Scope(const Scope&) = delete;
        Scope& operator=(const Scope&) = delete;
        CaptureLogSink& sink() { return *_sink; }

    private:
        std::shared_ptr<CaptureLogSink> _sink;
        std::shared_ptr<LogSink> _previousSink;
        int _previousThreshold;
    };

private:
    mutable std::mutex _lock;
    std::vector<LogRecord> _records;
};

}  // namespace VeltoHost
