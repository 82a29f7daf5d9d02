#include <unistd.h>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "norvo/pathinfo.h"
#include "quib_share.h"

using norvo::kNorvoMisc;

namespace {

constexpr int kReadWrite = 2;
constexpr int kRestrictedUploadType = 2;

// Home folders are the user's own: no share lookup.
bool IsHomePath(const char *path) {
    return IsDirUserHome(path, nullptr) == 1;
}

// The share privilege and restriction flags of a share path; false (logged) on failure.
bool SharePrivilege(const char *user, const char *sid, const char *path, int &priv, unsigned int &flags) {
    if (NvoLibGetPrivilege(path, user, sid, &priv, &flags) < 0) {
        NVO_LOG(kNorvoMisc, "%s:%d Gailed to check privilege of path %s, reason=[%d] ", path, NvoLibGetErr());
        return false;
    }
    return true;
}

enum Verdict { kAllowed, kRefused, kLookupFailed };

// Home folders pass; a share passes when the user holds any privilege there and none of the
// blocking restriction flags is set. A refusal is logged here.
Verdict ShareAllows(const char *user, const char *sid, const char *path, unsigned int blocking) {
    if (IsHomePath(path)) {
        return kAllowed;
    }
    int priv = 0;
    unsigned int flags = 0;
    if (!SharePrivilege(user, sid, path, priv, flags)) {
        return kLookupFailed;
    }
    if (priv != 0 && (flags & blocking) == 0) {
        return kAllowed;
    }
    NVO_LOG(kNorvoMisc, "%s:%d No privilege in path %s", path);
    return kRefused;
}

}  // namespace

int CheckShareListPrivilege(const char *user, const char *sid, const char *path) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (path == nullptr) {
            return 0;
        }
        return ShareAllows(user, sid, path, SHARE_RESTRICT_NO_BROWSE) == kAllowed ? 1 : 0;
    });
}

int CheckShareDownloadPrivilege(const char *user, const char *sid, const char *path) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (path == nullptr) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            return 0;
        }
        // Only a refusal by the share sets the code; a failed lookup keeps its own.
        const Verdict verdict =
            ShareAllows(user, sid, path, SHARE_RESTRICT_NO_DOWNLOAD | SHARE_RESTRICT_NO_BROWSE);
        if (verdict == kRefused) {
            NvoLibSetErr(NVO_ERR_PRIVILEGE);
        }
        return verdict == kAllowed ? 1 : 0;
    });
}

int CheckShareUploadPrivilege(const char *user, const char *sid, const char *path, int *type) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (path == nullptr) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            return 0;
        }
        int uploadType = type != nullptr ? *type : 0;
        if (!IsHomePath(path)) {
            int priv = 0;
            unsigned int flags = 0;
            if (NvoLibGetPrivilege(path, user, sid, &priv, &flags) < 0) {
                NVO_LOG(kNorvoMisc, "%s:%d Failed to get privilege, path= %s, reason=[%d] ", path,
                        NvoLibGetErr());
                return 0;
            }
            if (priv != kReadWrite) {
                NvoLibSetErr(NVO_ERR_PRIVILEGE);
                NVO_LOG(kNorvoMisc, "%s:%d Share no upload privilege, path=%s", path);
                return 0;
            }
            if ((flags & (SHARE_RESTRICT_NO_MODIFY | SHARE_RESTRICT_NO_BROWSE)) != 0) {
                if (type != nullptr) {
                    *type = kRestrictedUploadType;
                }
                return 1;
            }
        }
        if (uploadType != 0) {
            return 1;
        }
        // A plain upload must not replace what is there.
        PathInfo info;
        if (!PathInfoFactory::create(user, path, info)) {
            NVO_LOG(kNorvoMisc, "%s:%d Failed to get path info:%s, reason=[%X]", path, VLIBCErrGet());
            return 0;
        }
        if (access(info.fullPath.c_str(), F_OK) == 0) {
            NvoLibSetErr(NVO_ERR_EXIST);
            NVO_LOG(kNorvoMisc, "%s:%d Share no modify privilege, path=%s", path);
            return 0;
        }
        return 1;
    });
}
