#pragma once

#include <sys/types.h>

#include <string>

namespace VeltoHost {

// Who may have a device's raw touch data (its recording, and the debug
// dictionary that holds it): root, the service's own user, and the members
// of one group. Membership is read from the user and group databases, as the
// bus reads it for the group rules of its policy, so that the daemon and
// its policy file always agree on who is in.
//
// Thread-safe: the lookups are the reentrant ones and nothing is cached, so
// a user added to the group is let in at once.
class RawDataAccess {
public:
    static constexpr const char* kDefaultGroup = "veltotouch";

    explicit RawDataAccess(std::string group = kDefaultGroup);

    bool allows(uid_t uid) const;
    const std::string& group() const noexcept { return _group; }

private:
    bool isMember(uid_t uid) const;

    std::string _group;
};

}  // namespace VeltoHost
