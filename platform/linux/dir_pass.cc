// QUIBDirPassBegin/End, and the shared per-entry state the file calls read inside a pass.
#include "dir_pass.h"

#include <errno.h>
#include <stdint.h>
#include <string.h>
#include <sys/syscall.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <atomic>
#include <memory>

#include "api_guard.h"
#include "fs_path.h"

#ifndef SYS_getxattrat
#define SYS_getxattrat 464  // Linux 6.13, the same number on every architecture
#endif

namespace norvo::platform {
namespace {

thread_local QUIBDirPass *t_current = nullptr;

// Every field that VLIBCFileLStat, QUIBACLPermGet or QUIBACLIsSupport asks for.
unsigned EntryFields() {
    return STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID | STATX_SIZE | STATX_ATIME | STATX_MTIME |
           STATX_CTIME | STATX_BTIME | acl::MountIdMask();
}

// getxattrat's argument block (include/uapi/linux/xattr.h).
struct XattrArgs {
    uint64_t value;
    uint32_t size;
    uint32_t flags;
};

std::atomic<bool> g_noGetxattrat{false};

}  // namespace

// Makes dir the thread's current pass over dirPath. Throws std::bad_alloc.
static QUIBDirPass *Begin(FileDescriptor dir, const char *dirPath) {
    auto pass = std::make_unique<QUIBDirPass>();
    pass->dirPath = dirPath;
    pass->dir = std::move(dir);
    pass->outer = t_current;
    t_current = pass.get();
    return pass.release();
}

QUIBDirPass *PassOf(const char *path, const char **name) {
    QUIBDirPass *pass = t_current;
    if (pass == nullptr || path == nullptr) {
        return nullptr;
    }
    const size_t length = pass->dirPath.size();
    if (strncmp(path, pass->dirPath.c_str(), length) != 0 || path[length] != '/') {
        return nullptr;
    }
    const char *rest = path + length + 1;
    if (rest[0] == '\0' || strchr(rest, '/') != nullptr) {
        return nullptr;
    }
    *name = rest;
    return pass;
}

int PassEntryStat(QUIBDirPass *pass, const char *name, struct statx *info) {
    if (!pass->entryKnown || pass->entryName != name) {
        pass->entryKnown = false;
        pass->entryName = name;
        pass->entryError = statx(pass->dir.Get(), name, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, EntryFields(),
                                 &pass->entry) == 0
                               ? 0
                               : errno;
        pass->entryKnown = true;
    }
    if (pass->entryError == 0) {
        *info = pass->entry;
    }
    return pass->entryError;
}

int PassDirStat(QUIBDirPass *pass, struct statx *info) {
    if (!pass->dirKnown) {
        pass->dirError =
            statx(pass->dir.Get(), "", AT_EMPTY_PATH,
                  STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID | acl::MountIdMask(), &pass->dirInfo) == 0
                ? 0
                : errno;
        pass->dirKnown = true;
    }
    if (pass->dirError == 0) {
        *info = pass->dirInfo;
    }
    return pass->dirError;
}

const acl::Identity *PassIdentity(QUIBDirPass *pass) {
    if (!pass->identityKnown) {
        if (!acl::ReadIdentity(&pass->identity)) {
            return nullptr;
        }
        pass->identityKnown = true;
    }
    return &pass->identity;
}

ssize_t PassGetXattr(QUIBDirPass *pass, const char *name, const char *path, const char *attribute,
                     void *value, size_t size) {
    if (!g_noGetxattrat.load(std::memory_order_relaxed) && size <= UINT32_MAX) {
        XattrArgs args{reinterpret_cast<uintptr_t>(value), static_cast<uint32_t>(size), 0};
        const long got = syscall(SYS_getxattrat, pass->dir.Get(), name, AT_SYMLINK_NOFOLLOW, attribute, &args,
                                 sizeof args);
        if (got >= 0 || errno != ENOSYS) {
            return got;
        }
        g_noGetxattrat.store(true, std::memory_order_relaxed);
    }
    return lgetxattr(path, attribute, value, size);
}

}  // namespace norvo::platform

using namespace norvo::platform;

extern "C" {

QUIBDirPass *QUIBDirPassBegin(const char *dirPath) {
    if (const int err = CheckPathArgument(dirPath)) {
        NORVO_FAIL_ERRNO(err);
        return nullptr;
    }
    return Guarded<QUIBDirPass *>(nullptr, [&]() -> QUIBDirPass * {
        FileDescriptor dir(open(dirPath, O_PATH | O_DIRECTORY | O_CLOEXEC));
        if (!dir.IsOpen()) {
            NORVO_FAIL_ERRNO(errno);
            return nullptr;
        }
        return Begin(std::move(dir), dirPath);
    });
}

QUIBDirPass *QUIBDirPassBeginAt(int dirFd, const char *dirPath) {
    if (const int err = CheckPathArgument(dirPath)) {
        NORVO_FAIL_ERRNO(err);
        return nullptr;
    }
    return Guarded<QUIBDirPass *>(nullptr, [&]() -> QUIBDirPass * {
        struct stat st;
        if (dirFd < 0 || fstat(dirFd, &st) != 0) {
            NORVO_FAIL_ERRNO(EBADF);
            return nullptr;
        }
        if (!S_ISDIR(st.st_mode)) {
            NORVO_FAIL_ERRNO(ENOTDIR);
            return nullptr;
        }
        FileDescriptor dir(fcntl(dirFd, F_DUPFD_CLOEXEC, 0));
        if (!dir.IsOpen()) {
            NORVO_FAIL_ERRNO(errno);
            return nullptr;
        }
        return Begin(std::move(dir), dirPath);
    });
}

void QUIBDirPassEnd(QUIBDirPass *pass) {
    if (pass == nullptr) {
        return;
    }
    // Out of order too: unlinked from wherever it sits in the thread's chain.
    for (QUIBDirPass **link = &t_current; *link != nullptr; link = &(*link)->outer) {
        if (*link == pass) {
            *link = pass->outer;
            break;
        }
    }
    delete pass;
}

}  // extern "C"
