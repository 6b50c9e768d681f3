#pragma once

#include "platform/log/Log.h"

namespace VeltoHost {

// Log records as journal entries: the message with its priority, and the
// subsystem and category as fields of their own, so that
// `journalctl VELTOTOUCH_CATEGORY=Daemon` picks out one part of the service.
//
// Under systemd, standard error already reaches the journal, but one line at
// a time and without priorities or fields; a service started by systemd
// therefore writes here instead (see stderrIsJournal).
class JournalLogSink : public LogSink {
public:
    void write(const LogRecord& record) override;

    // Whether standard error is the journal's stream: systemd says so by
    // setting JOURNAL_STREAM to the device and inode of that stream, which
    // also tells a child that merely inherited the variable (its stderr was
    // redirected elsewhere) that it is not connected to the journal.
    static bool stderrIsJournal();
    // The same test for any descriptor and value of JOURNAL_STREAM.
    static bool isJournalStream(int fd, const char* journalStream);
};

}  // namespace VeltoHost
