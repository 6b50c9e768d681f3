#pragma once

#include "platform/Log.h"

#include <memory>
#include <mutex>
#include <ostream>

namespace VeltoTool {

// Shows the recogniser's per-frame dumps: while a Scope lives, the debug log
// is on and lines of the "Algs" category go to the given stream, one block
// per message; other categories keep going to standard error.
class AlgsDumpSink : public VeltoHost::LogSink {
public:
    explicit AlgsDumpSink(std::ostream& out) : _out(out) {}
    // Where lines of the other categories go.
    void setOthers(std::shared_ptr<VeltoHost::LogSink> others);
    void write(const VeltoHost::LogRecord& record) override;

    class Scope {
    public:
        explicit Scope(std::ostream& out);
        ~Scope();
        Scope(const Scope&) = delete;
        Scope& operator=(const Scope&) = delete;

    private:
        std::shared_ptr<VeltoHost::LogSink> _previousSink;
        int _previousThreshold;
    };

private:
    std::ostream& _out;
    std::mutex _othersLock;
    std::shared_ptr<VeltoHost::LogSink> _others;
};

}  // namespace VeltoTool
