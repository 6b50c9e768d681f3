#pragma once

#include "platform/Log.h"

#include <memory>
#include <mutex>
#include <ostream>

namespace VeltoTool {

// Shows the recogniser's per-frame dumps: while a Scope lives, the debug log
// is on and lines of the "Algs" category go to the given stream, one block
// per message; other categories keep going to standard error. In JSON Lines
// output every line of the stream must be JSON, so each block is written as
// one object, {"dump":"..."}.
class AlgsDumpSink : public VeltoHost::LogSink {
public:
    enum class Format { Text, JsonLines };

    explicit AlgsDumpSink(std::ostream& out, Format format = Format::Text) : _out(out), _format(format) {}
    // Where lines of the other categories go.
    void setOthers(std::shared_ptr<VeltoHost::LogSink> others);
    void write(const VeltoHost::LogRecord& record) override;

    class Scope {
    public:
        explicit Scope(std::ostream& out, Format format = Format::Text);
        ~Scope();
        Scope(const Scope&) = delete;
        Scope& operator=(const Scope&) = delete;

    private:
        std::shared_ptr<VeltoHost::LogSink> _previousSink;
        int _previousThreshold;
    };

private:
    std::ostream& _out;
    Format _format;
    std::mutex _othersLock;
    std::shared_ptr<VeltoHost::LogSink> _others;
};

}  // namespace VeltoTool
