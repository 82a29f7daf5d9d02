// The shares a domain or directory-service account may see. The share lists are read exactly
// as for a local account (NvoLibValidShareGen's rule); the accounts come through NSS (winbind,
// sssd), so no domain controller or directory server is asked.
#include <memory>

#include "account_service.h"
#include "api_guard.h"
#include "quib_paths.h"
#include "quib_share.h"
#include "quib_share_list.h"
#include "quib_user.h"
#include "text_util.h"
#include "vlibc_file.h"
#include "vlibc_szlist.h"

namespace norvo::platform {
namespace {

struct SzListFree {
    void operator()(PSZLIST list) const { VLIBCSzListFree(list); }
};
struct ShareDBClose {
    void operator()(PQUIBSHARE_DB db) const { QUIBShareDBClose(db); }
};

bool Visible(const char *user, const QUIBSHARE &share, bool writableOnly) {
    if ((share.fStatus & SHARE_STATUS_HIDDEN) != 0 || BlSDKUserIsInList(user, share.szNoAccessList) != 0) {
        return false;
    }
    return BlSDKUserIsInList(user, share.szRWList) == 1 ||
           (!writableOnly && BlSDKUserIsInList(user, share.szROList) == 1);
}

PSZLIST ValidShares(const AccountService &service, const char *user, int sort, int writableOnly) {
    if (!IsConfigured(service)) {
        QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
        return nullptr;
    }
    if (!IsAcceptableName(user) || QUIBUserAuthTypeOf(user) != service.kind) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return nullptr;
    }
    std::unique_ptr<SZLIST, SzListFree> names(VLIBCSzListAlloc(16));
    std::unique_ptr<QUIBSHARE_DB, ShareDBClose> db(QUIBShareDBOpen());
    if (!names || !db) {
        return nullptr;  // the slot holds the reason
    }
    PQUIBSHARE cursor = nullptr;
    ScopeExit freeLast([&cursor] { QUIBShareFree(cursor); });
    int step = 0;
    while ((step = QUIBShareDBCursorGet(db.get(), &cursor)) == 0) {
        if (!Visible(user, *cursor, writableOnly != 0)) {
            continue;
        }
        PSZLIST raw = names.release();
        const int pushed = VLIBCSzListPush(&raw, cursor->szName);
        names.reset(raw);
        if (pushed < 0) {
            return nullptr;
        }
    }
    // A configuration that breaks off part-way must not pass for a shorter list.
    if (step < 0) {
        return nullptr;
    }
    if (sort != 0 && VLIBCSzListSortItems(names.get(), SZLIST_SORT_CASE_INSENSITIVE) < 0) {
        return nullptr;
    }
    return names.release();
}

}  // namespace
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

PSZLIST QuibCgiDomValidShareGen(const char * /*context*/, const char *user, int sort, int writableOnly) {
    return np::Guarded<PSZLIST>(
        nullptr, [&] { return np::ValidShares(np::kDomainService, user, sort, writableOnly); });
}

PSZLIST QuibCgiLDAPValidShareGen(const char * /*context*/, const char *user, int sort, int writableOnly) {
    return np::Guarded<PSZLIST>(
        nullptr, [&] { return np::ValidShares(np::kDirectoryService, user, sort, writableOnly); });
}

}  // extern "C"
