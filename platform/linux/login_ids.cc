// The ids of the account logged in under a sid, for switching identity to it.
#include <sys/types.h>

#include <string>

#include "api_guard.h"
#include "login_session.h"
#include "quib_login.h"
#include "quib_user.h"
#include "text_util.h"

namespace norvo::platform {
namespace {

// 0 and the ids of user when sid is its live login; else -1 with the slot set.
int IdsOfLogin(const char *sid, const char *user, uid_t *uid, gid_t *gid) {
    if (!IsAcceptableName(user)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    std::string loggedIn;
    if (!IsLoginOf(sid, user, &loggedIn)) {
        return -1;
    }
    return QUIBUserGetUGID(loggedIn.c_str(), uid, gid);
}

}  // namespace
}  // namespace norvo::platform

using norvo::platform::Guarded;
using norvo::platform::IdsOfLogin;

extern "C" {

uid_t QuibCgiUIDGet(const char *sid, const char *user) {
    return Guarded(static_cast<uid_t>(-1), [&] {
        uid_t uid = 0;
        gid_t gid = 0;
        return IdsOfLogin(sid, user, &uid, &gid) == 0 ? uid : static_cast<uid_t>(-1);
    });
}

gid_t QuibCgiGIDGet(const char *sid, const char *user) {
    return Guarded(static_cast<gid_t>(-1), [&] {
        uid_t uid = 0;
        gid_t gid = 0;
        return IdsOfLogin(sid, user, &uid, &gid) == 0 ? gid : static_cast<gid_t>(-1);
    });
}

}  // extern "C"
