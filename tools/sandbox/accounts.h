// The appliance's users and groups, kept as a model and written whole to the private
// /etc/passwd, /etc/group, /etc/shadow and /etc/gshadow after every change, so the files are
// always consistent (homes follow the homes root, group lines list every member).
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "appliance.h"

namespace norvo::testing::internal {

class Accounts {
public:
    // root, nobody; groups root, users (100), administrators (101), nogroup.
    Accounts();

    // Adds the user (primary group "users") and any missing supplementary group. Fails on a
    // duplicate name or uid, or a name that can't appear in /etc/passwd.
    void AddUser(const UserSpec &account);
    // Adds the group, or adds members to the existing one. Fails when an explicit gid differs
    // from the existing group's or is taken.
    void AddGroup(const GroupSpec &account);
    // The root under which users without an explicit home get <root>/<name>.
    void SetHomesRoot(const std::string &root);

    // false when unknown.
    [[nodiscard]] bool FindUser(const std::string &name, uid_t *uid, gid_t *gid) const;
    [[nodiscard]] bool FindGroup(const std::string &name, gid_t *gid) const;

    // Writes the four files under /etc.
    void Write() const;

private:
    struct User {
        std::string name;
        uid_t uid;
        gid_t gid;
        std::string hash;
        std::string home;
        std::string shell;
        long expireDay;
    };
    struct Group {
        std::string name;
        gid_t gid;
        std::vector<std::string> members;
    };
    Group *FindGroupEntry(const std::string &name);
    Group &EnsureGroup(const std::string &name, gid_t gid);
    uid_t NextUid() const;
    gid_t NextGid() const;
    std::string HomeOf(const User &user) const;

    std::vector<User> users_;
    std::vector<Group> groups_;
    std::string homesRoot_ = "/volume1/homes";
};

}  // namespace norvo::testing::internal
