#include "daemon/JournalLogSink.h"

#include <sys/stat.h>
#include <syslog.h>
#include <systemd/sd-journal.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

namespace VeltoHost {

namespace {

int priorityOf(LogLevel level)
{
    switch (level) {
    case LogLevel::Debug: return LOG_DEBUG;
    case LogLevel::Default: return LOG_NOTICE;
    case LogLevel::Error: return LOG_ERR;
    }
    return LOG_NOTICE;
}

}  // namespace

void JournalLogSink::write(const LogRecord& record)
{
    // Each argument is one whole "FIELD=value"; the message goes through %s
    // so that a '%' in it stays text.
    sd_journal_send("MESSAGE=%s", record.message.c_str(), "PRIORITY=%d", priorityOf(record.level),
                    "VELTOTOUCH_SUBSYSTEM=%s", record.subsystem.c_str(), "VELTOTOUCH_CATEGORY=%s",
                    record.category.c_str(), nullptr);
}

bool JournalLogSink::stderrIsJournal() { return isJournalStream(STDERR_FILENO, std::getenv("JOURNAL_STREAM")); }

bool JournalLogSink::isJournalStream(int fd, const char* journalStream)
{
    if (!journalStream) return false;
    unsigned long long device = 0;
    unsigned long long inode = 0;
    char rest = 0;
    if (std::sscanf(journalStream, "%llu:%llu%c", &device, &inode, &rest) != 2) return false;
    struct stat status {};
    if (::fstat(fd, &status) != 0) return false;
    return status.st_dev == device && status.st_ino == inode;
}

}  // namespace VeltoHost
