// Acting as another account: the kernel judges ACLs and modes for the effective uid, gid and
// supplementary groups, so a permission question is only the user's when asked under them.
#pragma once
#include <sys/types.h>

#include <memory>
#include <string>
#include <vector>

#include "quib_user.h"

namespace norvo::cli {

class UserIdentity {
public:
    // Takes user's groups (initgroups), effective gid and effective uid. Null with *error set
    // when that is not possible (only root may, unless user is already the effective one).
    [[nodiscard]] static std::unique_ptr<UserIdentity> Assume(const QUIBUSER &user, std::string *error);
    // Gives the saved identity back (the real uid stays root, so seteuid can return).
    ~UserIdentity();
    UserIdentity(const UserIdentity &) = delete;
    UserIdentity &operator=(const UserIdentity &) = delete;

private:
    UserIdentity() = default;
    bool switched_ = false;
    uid_t savedUid_ = 0;
    gid_t savedGid_ = 0;
    std::vector<gid_t> savedGroups_;
};

// The effective ids and groups at construction, given back when it goes (the real uid stays
// root, so seteuid can return): for code that takes the user's identity for good.
class SavedIdentity {
public:
    SavedIdentity();
    ~SavedIdentity();
    SavedIdentity(const SavedIdentity &) = delete;
    SavedIdentity &operator=(const SavedIdentity &) = delete;

private:
    uid_t uid_;
    gid_t gid_;
    std::vector<gid_t> groups_;
};

}  // namespace norvo::cli
