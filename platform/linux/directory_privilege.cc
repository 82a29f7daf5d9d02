// Share privileges of domain and directory-service accounts, valid only for a live login.
// The share lists are read exactly as for a local account; the account service itself is
// not asked (this Linux build has no domain controller or directory server to ask).
#include <strings.h>

#include <memory>
#include <string>

#include "account_service.h"
#include "api_guard.h"
#include "login_session.h"
#include "quib_login.h"
#include "quib_paths.h"
#include "quib_share.h"
#include "quib_user.h"
#include "text_util.h"
#include "vlibc_file.h"

namespace norvo::platform {
namespace {

struct ShareFree {
    void operator()(PQUIBSHARE share) const { QUIBShareFree(share); }
};

bool InList(const char *user, const char *list) {
    return list != nullptr && BlSDKUserIsInList(user, list) == 1;
}

int GetPrivilege(const AccountService &service, const char *share, const char *user, const char *sid,
                 int *priv) {
    if (!IsConfigured(service)) {
        QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
        return -2;
    }
    if (share == nullptr || !IsAcceptableName(user) || sid == nullptr || priv == nullptr ||
        QUIBUserAuthTypeOf(user) != service.kind) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    std::string loggedIn;
    if (!IsLoginOf(sid, user, &loggedIn)) {
        return -1;
    }
    PQUIBSHARE raw = nullptr;
    if (QUIBShareGet(share, &raw) != 0) {
        return -1;  // the slot holds the reason: 0x1400 for an unknown share
    }
    const std::unique_ptr<QUIBSHARE, ShareFree> record(raw);
    if (InList(user, record->szNoAccessList)) {
        *priv = 0;
    } else if (InList(user, record->szRWList)) {
        *priv = 2;
    } else if (InList(user, record->szROList)) {
        *priv = 1;
    } else {
        *priv = 0;
    }
    return 0;
}

}  // namespace
}  // namespace norvo::platform

using namespace norvo::platform;

extern "C" {

int QuibCgiDomGetPrivilege(const char *share, const char *user, const char *sid, int *priv) {
    return Guarded(-1, [&] { return GetPrivilege(kDomainService, share, user, sid, priv); });
}

int QuibCgiLDAPGetPrivilege(const char *share, const char *user, const char *sid, int *priv) {
    return Guarded(-1, [&] { return GetPrivilege(kDirectoryService, share, user, sid, priv); });
}

}  // extern "C"
