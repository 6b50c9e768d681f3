#include "platform/log/CaptureLogSink.h"

namespace VeltoHost {

void CaptureLogSink::write(const LogRecord& record)
{
    std::lock_guard guard(_lock);
    _records.push_back(record);
}

std::vector<LogRecord> CaptureLogSink::records() const
{
    std::lock_guard guard(_lock);
    return _records;
}

std::vector<std::string> CaptureLogSink::messages(const std::string& category) const
{
    std::lock_guard guard(_lock);
    std::vector<std::string> out;
    for (const LogRecord& record : _records) {
        if (category.empty() || record.category == category) out.push_back(record.message);
    }
    return out;
}

void CaptureLogSink::clear()
{
    std::lock_guard guard(_lock);
    _records.clear();
}

CaptureLogSink::Scope::Scope(LogLevel threshold)
    : _sink(std::make_shared<CaptureLogSink>()), _previousSink(Log::setSink(_sink)), _previousThreshold(Log::threshold())
{
    Log::setThreshold(threshold);
}

CaptureLogSink::Scope::~Scope()
{
    Log::setThreshold(_previousThreshold);
    Log::setSink(_previousSink);
}

}  // namespace VeltoHost
