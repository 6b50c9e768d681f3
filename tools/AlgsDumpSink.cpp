#include "AlgsDumpSink.h"

#include "recording/JsonValue.h"

#include <nlohmann/json.hpp>

namespace VeltoTool {

void AlgsDumpSink::write(const VeltoHost::LogRecord& record)
{
    if (record.category == "Algs") {
        if (_format == Format::JsonLines) {
            nlohmann::ordered_json line = nlohmann::ordered_json::object();
            line["dump"] = record.message;
            _out << VeltoTouch::JsonValue::dump(line, false) << '\n';
        } else {
            _out << record.message << '\n';
        }
        return;
    }
    // Only the recogniser's debug output was asked for.
    if (record.level == VeltoHost::LogLevel::Debug) return;
    std::lock_guard guard(_othersLock);
    if (_others) _others->write(record);
}

void AlgsDumpSink::setOthers(std::shared_ptr<VeltoHost::LogSink> others)
{
    std::lock_guard guard(_othersLock);
    _others = std::move(others);
}

AlgsDumpSink::Scope::Scope(std::ostream& out, Format format) : _previousThreshold(VeltoHost::Log::threshold())
{
    // The previous sink keeps receiving the other categories' lines.
    auto sink = std::make_shared<AlgsDumpSink>(out, format);
    _previousSink = VeltoHost::Log::setSink(sink);
    sink->setOthers(_previousSink);
    VeltoHost::Log::setThreshold(VeltoHost::LogLevel::Debug);
}

AlgsDumpSink::Scope::~Scope()
{
    VeltoHost::Log::setThreshold(_previousThreshold);
    VeltoHost::Log::setSink(_previousSink);
}

}  // namespace VeltoTool
