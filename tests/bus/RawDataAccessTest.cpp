#include "bus/RawDataAccess.h"

#include <gtest/gtest.h>

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <string>

using VeltoHost::RawDataAccess;

TEST(RawDataAccessTest, RootTheServiceItselfAndTheGroupsMembersAreLetIn)
{
    const passwd* nobody = ::getpwnam("nobody");
    if (!nobody) GTEST_SKIP() << "no user 'nobody' here";
    const group* primary = ::getgrgid(nobody->pw_gid);
    if (!primary) GTEST_SKIP() << "the primary group of 'nobody' has no entry";
    const std::string primaryGroup = primary->gr_name;
    const uid_t service = ::geteuid();

    struct Case {
        std::string group;
        uid_t uid;
        bool allowed;
    };
    const Case cases[] = {
        {RawDataAccess::kDefaultGroup, 0, true},
        {RawDataAccess::kDefaultGroup, service, true},
        // A user's primary group counts, as it does for the bus's group rules.
        {primaryGroup, nobody->pw_uid, true},
        {"root", nobody->pw_uid, service == nobody->pw_uid},
        {"no-such-group-here", nobody->pw_uid, service == nobody->pw_uid},
        // A user id with no entry belongs to no group.
        {primaryGroup, 4'000'000'000u, service == 4'000'000'000u},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(RawDataAccess(c.group).allows(c.uid), c.allowed) << c.group << " / uid " << c.uid;
    }
}
