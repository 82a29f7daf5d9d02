// Users, groups and shadow entries through NSS only (files, winbind, sssd alike), copied out
// of the reentrant calls. "Not found" and "the lookup failed" are kept apart.
#pragma once
#include <sys/types.h>

#include <string>
#include <vector>

namespace norvo::platform {

enum class NssStatus { kFound, kNotFound, kFailed };

struct NssUser {
    std::string name;  // as NSS spells it
    uid_t uid = 0;
    gid_t gid = 0;
    std::string gecos;
    std::string home;
    std::string shell;
};

struct NssGroup {
    std::string name;
    gid_t gid = 0;
    std::vector<std::string> members;
};

// kFailed leaves the errno of the lookup in *err (when err is not null).
[[nodiscard]] NssStatus FindUserByName(const std::string &name, NssUser *user, int *err = nullptr);
[[nodiscard]] NssStatus FindUserById(uid_t uid, NssUser *user, int *err = nullptr);
[[nodiscard]] NssStatus FindGroupByName(const std::string &name, NssGroup *group, int *err = nullptr);
[[nodiscard]] NssStatus FindGroupById(gid_t gid, NssGroup *group, int *err = nullptr);
// The shadow expiry day of name (days since 1970, -1 for none).
[[nodiscard]] NssStatus FindShadowExpiry(const std::string &name, long *expireDay, int *err = nullptr);

// Every group id of user, its primary group included (getgrouplist). false when NSS fails.
[[nodiscard]] bool GroupIdsOf(const NssUser &user, std::vector<gid_t> *gids);

// The platform code of a failed NSS lookup: 0x0300 when it was refused (shadow read by a
// non-root caller), 0x8100 otherwise.
[[nodiscard]] int NssFailureCode(int err);

}  // namespace norvo::platform
