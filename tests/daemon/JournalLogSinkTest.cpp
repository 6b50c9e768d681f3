#include "daemon/JournalLogSink.h"

#include <gtest/gtest.h>

#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <string>

using VeltoHost::JournalLogSink;

TEST(JournalLogSinkTest, OnlyTheStreamSystemdNamedIsTheJournal)
{
    std::FILE* file = std::tmpfile();
    ASSERT_NE(file, nullptr);
    const int fd = ::fileno(file);
    struct stat status {};
    ASSERT_EQ(::fstat(fd, &status), 0);
    const std::string device = std::to_string(status.st_dev);
    const std::string inode = std::to_string(status.st_ino);

    struct Case {
        const char* journalStream;
        bool journal;
    };
    const std::string same = device + ":" + inode;
    const std::string otherInode = device + ":" + std::to_string(status.st_ino + 1);
    const std::string trailing = same + "x";
    const Case cases[] = {
        {same.c_str(), true},
        {otherInode.c_str(), false},  // inherited by a child whose stderr went elsewhere
        {nullptr, false},             // not started by systemd
        {"", false},
        {trailing.c_str(), false},
        {"12", false},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(JournalLogSink::isJournalStream(fd, c.journalStream), c.journal)
            << (c.journalStream ? c.journalStream : "(unset)");
    }
    std::fclose(file);
}
