#include <errno.h>
#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <string>

#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "common/path_names.h"
#include "common/text.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "quib_fs.h"

using norvo::kNorvoDir;

namespace {

// The text after the share name; the path has been checked to begin with "/" and the share.
const char *TailAfterShare(const char *path, const char *share) {
    return path + strlen(share) + 1;
}

}  // namespace

int NvoLibTransFullPath(const char *path, char *out, int size) {
    return norvo::Guarded<int>(-1, [&]() -> int {
        if (!norvo::IsWellFormedUserPath(path) || out == nullptr || size <= 0) {
            if (out != nullptr && size > 0) {
                out[0] = '\0';  // the log prints it
            }
            NVO_SET_QUIB_ERR(kNorvoDir, QUIB_ERR_BAD_PARAMETER);
            NVO_LOG(kNorvoDir, "%s(%d) bad parameter, oldpath=%s, new path=%s", norvo::OrNull(path),
                    norvo::OrNull(out));
            return -1;
        }
        norvo::CString share(NvoLibGetTokOfPath(path, 1));
        if (!share) {
            NVO_SET_QUIB_ERR(kNorvoDir, QUIB_ERR_FAILED);
            NVO_LOG(kNorvoDir, "%s(%d) NvoLibGetTokOfPath fail");
            return -1;
        }
        norvo::ShareRecord record = norvo::GetShare(share.get());
        if (!record) {
            NVO_SET_QUIB_ERR(kNorvoDir, QUIB_ERR_NO_SUCH_SHARE);
            return -1;
        }
        snprintf(out, static_cast<size_t>(size), "%s%s", record->szPath, TailAfterShare(path, share.get()));
        return 0;
    });
}

int NvoFullPathGet(const char *path, std::string &fullPath, std::string &shareName, std::string &volumePath,
                   std::string &sharePath, const std::string &user) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (norvo::IsEmpty(path) || user.empty() || !norvo::IsWellFormedUserPath(path)) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            return 0;
        }
        norvo::CString share(NvoLibGetTokOfPath(path, 1));
        if (!share) {
            NVO_LOG(kNorvoDir, "%s:%d NvoLibGetTokOfPath fail");
            NvoLibSetErr(NVO_ERR_SYSTEM);
            return 0;
        }
        shareName = share.get();

        if (IsDirUserHome(shareName, nullptr)) {
            if (!NvoUserHomeFullPathGet(sharePath, user)) {
                NVO_LOG(kNorvoDir, "%s:%d NvoUserHomeFullPathGet fail");
                return 0;
            }
        } else {
            norvo::ShareRecord record = norvo::GetShare(shareName.c_str());
            if (!record) {
                NVO_LOG(kNorvoDir, "%s:%d QUIBShareGet fail");
                NvoLibSetErr(VLIBCErrGet() == QUIB_ERR_NO_SUCH_SHARE ? NVO_ERR_NO_PATH : NVO_ERR_SYSTEM);
                return 0;
            }
            sharePath = norvo::OrNull(record->szPath);
        }

        fullPath = sharePath + TailAfterShare(path, share.get());
        const size_t slash = sharePath.find('/', 1);
        volumePath = slash == std::string::npos ? sharePath : sharePath.substr(0, slash);
        return 1;
    });
}

int NvoUserHomeFullPathGet(std::string &homePath, const std::string &user) {
    return norvo::Guarded<int>(0, [&]() -> int {
        // A name that is not one path component never becomes one: the account "a/b" would
        // otherwise create, and own, a folder inside a's home.
        norvo::UserRecord record = norvo::IsPathComponent(user) ? norvo::GetUser(user.c_str()) : nullptr;
        if (!record) {
            NVO_LOG(kNorvoDir, "%s:%d Failed to get user (%s)", user.c_str());
            NvoLibSetErr(NVO_ERR_NO_USER);
            return 0;
        }
        if (!QUIBServiceUserHomeIsEnabled(record.get())) {
            NVO_LOG(kNorvoDir, "%s:%d %d, User home isn't enalbed", static_cast<int>(record->nUID));
            NvoLibSetErr(NVO_ERR_NO_PATH);
            return 0;
        }
        const char *home = norvo::OrNull(record->szHome);
        char stopAt[4096] = {0};
        if (QUIBFSMkdirP(home, stopAt, sizeof(stopAt), 1, record->nUID, record->nGID, 0755) < 0) {
            NVO_LOG(kNorvoDir, "%s:%d Fail to mkdir for home [%s]. (stop at %s): %m", home, stopAt);
            NvoLibSetErr(NVO_ERR_NO_PATH);
            return 0;
        }
        char resolved[4096] = {0};
        if (!NvoLibRealFullPathGet(home, resolved, 4095)) {
            NVO_LOG(kNorvoDir, "%s:%d Failed to get real path (%s)", home);
            return 0;
        }
        homePath = resolved;
        return 1;
    });
}

int NvoLibRealFullPathGet(const char *path, char *out, int size) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (path == nullptr || out == nullptr || size <= 0) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            return 0;
        }
        norvo::CString resolved(realpath(path, nullptr));
        if (!resolved) {
            const int err = errno;
            NvoLibSetErr(err == ENOENT   ? NVO_ERR_NO_PATH
                         : err == EACCES ? NVO_ERR_PRIVILEGE
                                         : NVO_ERR_SYSTEM);
            errno = err;
            NVO_LOG(kNorvoDir, "%s:%d readpath(%s) fail (%m)", path);
            return 0;
        }
        snprintf(out, static_cast<size_t>(size), "%s", resolved.get());
        return 1;
    });
}
