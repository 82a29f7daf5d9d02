#include <errno.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "common/log.h"
#include "common/modules.h"
#include "common/remote_mount.h"
#include "common/text.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvomisc.h"
#include "norvo/nvoman.h"
#include "quib_fs.h"

using norvo::kNvoMan;

namespace {

constexpr int kNoAccessTest = 32;

int Fail(int code, int quibErr) {
    NvoLibSetErr(code);
    VLIBCErrSetEx(quibErr, kNvoMan, __LINE__);
    return -1;
}

// A missing or unreachable path on a network mount is the mount's failure, not the path's.
int MissingPathError(const char *probe) {
    if (norvo::OnRemoteMount(probe)) {
        return Fail(NVO_ERR_REMOTE_FS, QUIB_ERR_REMOTE_FS);
    }
    return Fail(NVO_ERR_NO_PATH, QUIB_ERR_NO_SUCH_FILE);
}

// Every component, existing or not, must be a name that may be created. Character rules are
// NvoCheckFileName's alone: a path is never held to the FAT character set here. Intended.
bool ComponentsAreAllowed(char *copy) {
    char *save = nullptr;
    for (char *name = strtok_r(copy + 1, "/", &save); name != nullptr; name = strtok_r(nullptr, "/", &save)) {
        if (!NvoCheckReservedName(name)) {
            return false;
        }
    }
    return true;
}

}  // namespace

int NvoCheckPath(const char *path, bool findExisting, int mode, std::string *existing) {
    return norvo::Guarded<int>(-1, [&]() -> int {
        if (norvo::IsEmpty(path)) {
            NvoLibSetErr(NVO_ERR_GENERAL);
            return -1;
        }
        if (path[0] != '/') {
            return Fail(NVO_ERR_GENERAL, QUIB_ERR_BAD_PARAMETER);
        }
        char probe[4096];
        char full[4096];
        snprintf(probe, sizeof(probe), "%s", path);
        snprintf(full, sizeof(full), "%s", path);

        if (findExisting) {
            while (probe[0] != '\0' && access(probe, F_OK) != 0) {
                char *slash = strrchr(probe, '/');
                if (slash == nullptr) {
                    const int err = errno;
                    Fail(NVO_ERR_GENERAL, QUIB_ERR_FAILED);
                    NVO_LOG(kNvoMan, "%s:%d Failed to strrchr '/' for %s, reason=%s", probe, strerror(err));
                    return -1;
                }
                *slash = '\0';
            }
        }
        if (strcmp(probe, "/") == 0) {
            return Fail(NVO_ERR_NO_PATH, QUIB_ERR_NO_SUCH_FILE);
        }

        struct stat st;
        if (lstat(probe, &st) != 0) {
            const int err = errno;
            if (err == EPERM || err == EACCES) {
                return Fail(NVO_ERR_PRIVILEGE, QUIB_ERR_ACCESS_DENIED);
            }
            if (norvo::IsUnreachableErrno(err)) {
                return MissingPathError(probe);
            }
            Fail(NVO_ERR_SYSTEM, QUIB_ERR_FAILED);
            NVO_LOG(kNvoMan, "%s:%d Failed to lstat %s, reason=%s", probe, strerror(err));
            return -1;
        }
        if (!S_ISREG(st.st_mode) && !S_ISDIR(st.st_mode)) {
            Fail(NVO_ERR_SYSTEM, QUIB_ERR_FAILED);
            NVO_LOG(kNvoMan, "%s:%d Path is not regular file and directory:%s", probe);
            return -1;
        }
        if (mode != kNoAccessTest && ACLAccess(probe, mode) < 0) {
            NVO_LOG(kNvoMan, "%s:%d Can't access %s, errno=%X ", probe, NvoLibGetErr());
            return -1;
        }
        if (existing != nullptr) {
            *existing = probe;
        }
        return ComponentsAreAllowed(full) ? 0 : -1;
    });
}
