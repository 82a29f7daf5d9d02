#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "common/path_names.h"
#include "common/text.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "quib_login.h"

using norvo::kNorvoDir;

namespace {

enum { kNoAccess = 0, kReadOnly = 1, kReadWrite = 2 };

// A no-access list that can't be checked (the account service failed) keeps the user out.
bool NoAccessListed(const char *user, const QUIBSHARE &share) {
    return BlSDKUserIsInList(user, share.szNoAccessList) != 0;
}

// The share's own lists, in precedence order: no access wins over both others, read-write over
// read-only.
int ListPrivilege(const char *user, const QUIBSHARE &share) {
    if (NoAccessListed(user, share)) {
        return kNoAccess;
    }
    if (BlSDKUserIsInList(user, share.szRWList) == 1) {
        return kReadWrite;
    }
    if (BlSDKUserIsInList(user, share.szROList) == 1) {
        return kReadOnly;
    }
    return kNoAccess;
}

}  // namespace

int NvoLibGetPrivilege(const char *path, const char *user, const char *sid, int *priv, unsigned int *flags) {
    return norvo::Guarded<int>(-1, [&]() -> int {
        const int admin = QUIBGroupIsAdminGroupMem(user);
        if (admin == -1) {
            NvoLibSetErr(NVO_ERR_SYSTEM);
            NVO_LOG(kNorvoDir, "%s:%d QUIBGroupIsAdminGroupMem(%s) failed. [0x%04X %s:%d]",
                    norvo::OrNull(user), VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return -1;
        }
        // The privilege of a share is only ever judged on a path that resolves into that share.
        if (!norvo::IsWellFormedUserPath(path) || user == nullptr || priv == nullptr) {
            NvoLibSetErr(NVO_ERR_SYSTEM);
            NVO_LOG(kNorvoDir, "%s(%d): bad parameter!");
            return -1;
        }
        norvo::CString shareName(NvoLibGetTokOfPath(path, 1));
        if (!shareName) {
            NvoLibSetErr(NVO_ERR_SYSTEM);
            NVO_LOG(kNorvoDir, "%s(%d): NvoLibGetTokOfPath %s fail", path);
            return -1;
        }
        norvo::ShareRecord share = norvo::GetShare(shareName.get());
        if (!share) {
            NvoLibSetErr(NVO_ERR_NO_PATH);
            NVO_LOG(kNorvoDir, "%s(%d): QUIBShareGet %s fail", shareName.get());
            return -1;
        }

        const bool domain = sid != nullptr && norvo::IsDomainUser(user);
        const bool directory = sid != nullptr && norvo::IsDirectoryUser(user);
        if (domain || directory) {
            int granted = kNoAccess;
            const int answer = domain ? QuibCgiDomGetPrivilege(shareName.get(), user, sid, &granted)
                                      : QuibCgiLDAPGetPrivilege(shareName.get(), user, sid, &granted);
            if (answer < 0) {
                NvoLibSetErr(answer == -2 ? NVO_ERR_TESTJOIN : NVO_ERR_ACCESS);
                return -1;
            }
            *priv = granted == kReadOnly || granted == kReadWrite ? granted : kNoAccess;
        } else {
            *priv = ListPrivilege(user, *share);
        }
        if (flags != nullptr) {
            *flags = admin == 1 ? 0 : share->fRestrict;
        }
        return 0;
    });
}

int NvoLibHasPrivilege(const char *path, const char *user, const char *sid, int expected) {
    return norvo::Guarded<int>(-1, [&]() -> int {
        NvoLibSetErr(NVO_ERR_NONE);
        if (path == nullptr || user == nullptr) {
            NvoLibSetErr(NVO_ERR_SYSTEM);
            NVO_LOG(kNorvoDir, "%s(%d): bad parameter! username=%s, path=%s", norvo::OrNull(user),
                    norvo::OrNull(path));
            return -1;
        }
        int priv = kNoAccess;
        unsigned int flags = 0;
        if (NvoLibGetPrivilege(path, user, sid, &priv, &flags) < 0) {
            NVO_LOG(kNorvoDir, "%s(%d): failed to get privilege of %s at %s", user, path);
            return -1;
        }
        // Exact: read-write does not satisfy an expected read-only.
        return priv == expected ? 1 : 0;
    });
}

PSZLIST NvoLibValidShareGen(const char *user, int sort, int writableOnly) {
    return norvo::Guarded<PSZLIST>(nullptr, [&]() -> PSZLIST {
        if (user == nullptr) {
            NVO_LOG(kNorvoDir, "%s(%d) bad parameter");
            NvoLibSetErr(NVO_ERR_SYSTEM);
            return nullptr;
        }
        norvo::SzList names(VLIBCSzListAlloc(1024));
        if (!names) {
            NVO_LOG(kNorvoDir, "%s(%d) malloc fail");
            NvoLibSetErr(NVO_ERR_SYSTEM);
            return nullptr;
        }
        norvo::ShareDB db(QUIBShareDBOpen());
        if (!db) {
            NVO_LOG(kNorvoDir, "%s:%d QUIBShareDBOpenFile Error[%X]\n", VLIBCErrGet());
            NvoLibSetErr(NVO_ERR_SYSTEM);
            return nullptr;
        }

        PQUIBSHARE cursor = nullptr;
        int step = 0;
        while ((step = QUIBShareDBCursorGet(db.get(), &cursor)) == 0) {
            const QUIBSHARE &share = *cursor;
            if ((share.fStatus & SHARE_STATUS_HIDDEN) != 0 || NoAccessListed(user, share)) {
                continue;
            }
            const bool granted = BlSDKUserIsInList(user, share.szRWList) == 1 ||
                                 (!writableOnly && BlSDKUserIsInList(user, share.szROList) == 1);
            if (granted) {
                PSZLIST raw = names.release();
                const int pushed = VLIBCSzListPush(&raw, share.szName);
                names.reset(raw);
                if (pushed < 0) {
                    step = -1;
                    break;
                }
            }
        }
        norvo::ShareRecord last(cursor);
        // A share database that breaks off part-way must not pass for a shorter list.
        if (step < 0) {
            NVO_LOG(kNorvoDir, "%s:%d QUIBShareDBCursorGet Error[%X]", VLIBCErrGet());
            NvoLibSetErr(NVO_ERR_SYSTEM);
            return nullptr;
        }
        if (sort) {
            VLIBCSzListSortItems(names.get(), SZLIST_SORT_CASE_INSENSITIVE);
        }
        NvoLibSetErr(NVO_ERR_NONE);
        return names.release();
    });
}
