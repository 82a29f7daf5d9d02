#include "identity.h"

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <cerrno>

#include "fail.h"

namespace norvo::testing::internal {

void BecomeUser(const std::string &user) {
    errno = 0;
    const passwd *entry = getpwnam(user.c_str());
    if (entry == nullptr)
        Fail("no user %s in the appliance", user.c_str());
    const uid_t uid = entry->pw_uid;
    const gid_t gid = entry->pw_gid;
    if (initgroups(user.c_str(), gid) != 0)
        FailErrno("can't set the groups of %s", user.c_str());
    if (setresgid(gid, gid, gid) != 0)
        FailErrno("can't take the gid of %s", user.c_str());
    if (setresuid(uid, uid, uid) != 0)
        FailErrno("can't take the uid of %s", user.c_str());
}

}  // namespace norvo::testing::internal
