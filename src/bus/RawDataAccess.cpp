#include "bus/RawDataAccess.h"

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <utility>
#include <vector>

namespace VeltoHost {

namespace {

// Large enough for any ordinary entry; a longer one (ERANGE) is retried with
// a buffer twice the size.
constexpr std::size_t kLookupBuffer = 4096;
constexpr std::size_t kLargestLookupBuffer = 1 << 20;

template <typename Entry, typename Lookup>
bool lookUp(Entry& entry, std::vector<char>& buffer, Lookup lookup)
{
    for (buffer.resize(kLookupBuffer); buffer.size() <= kLargestLookupBuffer; buffer.resize(buffer.size() * 2)) {
        Entry* found = nullptr;
        const int error = lookup(&entry, buffer.data(), buffer.size(), &found);
        if (error == ERANGE) continue;
        return error == 0 && found != nullptr;
    }
    return false;
}

}  // namespace

RawDataAccess::RawDataAccess(std::string group) : _group(std::move(group)) {}

bool RawDataAccess::allows(uid_t uid) const
{
    return uid == 0 || uid == ::geteuid() || isMember(uid);
}

bool RawDataAccess::isMember(uid_t uid) const
{
    struct group groupEntry {};
    std::vector<char> groupBuffer;
    if (!lookUp(groupEntry, groupBuffer, [&](struct group* entry, char* buffer, std::size_t size, struct group** found) {
            return ::getgrnam_r(_group.c_str(), entry, buffer, size, found);
        })) {
        return false;
    }
    passwd user{};
    std::vector<char> userBuffer;
    if (!lookUp(user, userBuffer, [&](passwd* entry, char* buffer, std::size_t size, passwd** found) {
            return ::getpwuid_r(uid, entry, buffer, size, found);
        })) {
        return false;
    }
    // The user's primary group and every group that lists it.
    int count = 32;
    std::vector<gid_t> groups(static_cast<std::size_t>(count));
    while (::getgrouplist(user.pw_name, user.pw_gid, groups.data(), &count) < 0) {
        groups.resize(static_cast<std::size_t>(count));
    }
    groups.resize(static_cast<std::size_t>(count));
    return std::find(groups.begin(), groups.end(), groupEntry.gr_gid) != groups.end();
}

}  // namespace VeltoHost
