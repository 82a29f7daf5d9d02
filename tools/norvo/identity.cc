#include "identity.h"

#include <errno.h>
#include <grp.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <iostream>

namespace norvo::cli {
namespace {

std::string Because(const char *what, const char *name) {
    return std::string("cannot act as ") + name + ": " + what + ": " + strerror(errno);
}

}  // namespace

std::unique_ptr<UserIdentity> UserIdentity::Assume(const QUIBUSER &user, std::string *error) {
    std::unique_ptr<UserIdentity> identity(new UserIdentity());
    const char *name = user.szName != nullptr ? user.szName : "(unnamed)";
    if (geteuid() == user.nUID && getegid() == user.nGID) {
        return identity;
    }
    if (geteuid() != 0) {
        errno = EPERM;
        *error = Because("only root can take another identity", name);
        return nullptr;
    }
    identity->savedUid_ = geteuid();
    identity->savedGid_ = getegid();
    const int count = getgroups(0, nullptr);
    if (count < 0) {
        *error = Because("getgroups", name);
        return nullptr;
    }
    identity->savedGroups_.resize(static_cast<size_t>(count));
    if (getgroups(count, identity->savedGroups_.data()) < 0) {
        *error = Because("getgroups", name);
        return nullptr;
    }
    if (initgroups(name, user.nGID) != 0) {
        *error = Because("initgroups", name);
        return nullptr;
    }
    identity->switched_ = true;  // from here on the destructor has something to give back
    if (setegid(user.nGID) != 0) {
        *error = Because("setegid", name);
        return nullptr;
    }
    if (seteuid(user.nUID) != 0) {
        *error = Because("seteuid", name);
        return nullptr;
    }
    return identity;
}

UserIdentity::~UserIdentity() {
    if (!switched_) {
        return;
    }
    // uid first: only root may change the gid and the groups back.
    if (seteuid(savedUid_) != 0 || setegid(savedGid_) != 0 ||
        setgroups(savedGroups_.size(), savedGroups_.data()) != 0) {
        std::cerr << "norvo: cannot take the own identity back: " << strerror(errno) << '\n';
    }
}

SavedIdentity::SavedIdentity()
    : uid_(geteuid()), gid_(getegid()), groups_(static_cast<size_t>(std::max(getgroups(0, nullptr), 0))) {
    const int n = getgroups(static_cast<int>(groups_.size()), groups_.data());
    groups_.resize(n > 0 ? static_cast<size_t>(n) : 0);
}

SavedIdentity::~SavedIdentity() {
    if (seteuid(uid_) == 0) {
        (void)setgroups(groups_.size(), groups_.data());
        (void)setegid(gid_);
    }
}

}  // namespace norvo::cli
