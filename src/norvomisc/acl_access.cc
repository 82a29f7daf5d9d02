#include <dirent.h>
#include <errno.h>
#include <string.h>
#include <unistd.h>

#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "common/text.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvomisc.h"
#include "quib_fs.h"

using norvo::kNorvoMisc;

namespace {

constexpr unsigned int kEverything = 8191;

// Request bit, and the permission bit it needs, in the order they are tested.
struct Requirement {
    int request;
    unsigned int permission;
};
constexpr Requirement kRequirements[] = {
    {0x1, ACL_PERM_READ},   {0x2, ACL_PERM_WRITE},   {0x4, ACL_PERM_EXECUTE},
    {0x8, ACL_PERM_DELETE}, {0x10, ACL_PERM_APPEND},
};

int DirectoryErrno(int err) {
    switch (err) {
        case ENOENT:
        case ENOTDIR:
            return NVO_ERR_NO_PATH;
        case EACCES:
        case EPERM:
            return NVO_ERR_PRIVILEGE;
        default:
            return NVO_ERR_ACCESS;
    }
}

}  // namespace

unsigned int GetACLPrivilege(const char *path) {
    return norvo::Guarded<unsigned int>(0, [&]() -> unsigned int {
        unsigned int mask = 0;
        if (QUIBACLPermGet(path, &mask) == 0) {
            return mask;
        }
        const int err = VLIBCErrGet();
        switch (err) {
            case QUIB_ERR_NO_SUCH_FILE:
            case QUIB_ERR_ACCESS_DENIED:
            case QUIB_ERR_NOT_MOUNTED:
            case QUIB_ERR_ACL_NOT_SUPPORTED:
                break;
            default:
                NVO_LOG(kNorvoMisc,
                        "%s:%d Failed to get the ACL Privilege: file = %s, euid = %u, reason=[%X]",
                        norvo::OrNull(path), static_cast<unsigned>(geteuid()), err);
                break;
        }
        return kEverything;
    });
}

int ACLAccess(const char *path, int request) {
    return norvo::Guarded<int>(-1, [&]() -> int {
        if (path == nullptr || request == 0) {
            return -1;
        }
        unsigned int mask = 0;
        if (QUIBACLPermGet(path, &mask) != 0) {
            const int err = VLIBCErrGet();
            switch (err) {
                case QUIB_ERR_READ_ONLY_FS:
                    NvoLibSetErr(NVO_ERR_READ_ONLY);
                    return -1;
                case QUIB_ERR_NOT_MOUNTED:
                case QUIB_ERR_NO_SUCH_FILE:
                case QUIB_ERR_NOT_DIRECTORY:
                    NvoLibSetErr(NVO_ERR_NO_PATH);
                    return -1;
                // Without a readable ACL the file system's own checks decide when the file is used.
                case QUIB_ERR_ACL_NOT_SUPPORTED:
                case QUIB_ERR_ACCESS_DENIED:
                    return 0;
                default:
                    NVO_LOG(kNorvoMisc, "%s:%d Failed to get the ACL Privilege: file = %s, reason=[%X]", path,
                            err);
                    return -1;
            }
        }
        for (const Requirement &need : kRequirements) {
            if ((request & need.request) != 0 && (mask & need.permission) == 0) {
                NvoLibSetErr(NVO_ERR_PRIVILEGE);
                NVO_SET_QUIB_ERR(kNorvoMisc, QUIB_ERR_ACCESS_DENIED);
                return -1;
            }
        }
        return 0;
    });
}

int CheckDirListPrivilege(const char *path) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (path == nullptr) {
            return 0;
        }
        NvoLibSetErr(NVO_ERR_NONE);
        // The working directory stays changed: the caller lists relative to it.
        if (chdir(path) != 0) {
            const int err = errno;
            NvoLibSetErr(DirectoryErrno(err));
            NVO_LOG(kNorvoMisc, "%s:%d Failed to chdir %s. [%s]", path, strerror(err));
            return 0;
        }
        norvo::DirHandle dir(opendir("."));
        if (!dir) {
            const int err = errno;
            NvoLibSetErr(DirectoryErrno(err));
            NVO_LOG(kNorvoMisc, "%s:%d Failed to opendir %s. [%s]", path, strerror(err));
            return 0;
        }
        return 1;
    });
}
