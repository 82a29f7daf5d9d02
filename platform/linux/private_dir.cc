#include "private_dir.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "vlibc_err.h"

namespace norvo::platform {
namespace {

bool IsRootOnly(const struct stat &st, mode_t type, mode_t othersMay) {
    return (st.st_mode & S_IFMT) == type && st.st_uid == 0 && (st.st_mode & othersMay) == 0;
}

// A link or a non-directory where a directory must be is a refusal, not a system failure.
int CodeOfOpen(int err) {
    return err == ELOOP || err == ENOTDIR || err == EISDIR || err == ENXIO ? QUIB_ERR_ACCESS_DENIED
                                                                           : VLIBCErrFromErrno(err);
}

int OpenComponent(int parent, const std::string &name, bool mayCreate, FileDescriptor *out) {
    constexpr int kFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
    FileDescriptor fd(openat(parent, name.c_str(), kFlags));
    if (!fd.IsOpen() && errno == ENOENT && mayCreate) {
        // mkdir's mode is cut by the umask, which can only take bits away from 0700.
        if (mkdirat(parent, name.c_str(), 0700) != 0 && errno != EEXIST) {
            return VLIBCErrFromErrno(errno);
        }
        fd.Reset(openat(parent, name.c_str(), kFlags));
    }
    if (!fd.IsOpen()) {
        return CodeOfOpen(errno);
    }
    struct stat st;
    if (fstat(fd.Get(), &st) != 0) {
        return VLIBCErrFromErrno(errno);
    }
    if (!IsRootOnly(st, S_IFDIR, S_IWGRP | S_IWOTH)) {
        return QUIB_ERR_ACCESS_DENIED;
    }
    *out = std::move(fd);
    return QUIB_ERR_NONE;
}

}  // namespace

int OpenPrivateDir(const std::string &path, bool create, FileDescriptor *dir) {
    if (path.empty() || path.front() != '/') {
        return QUIB_ERR_BAD_PARAMETER;
    }
    if (geteuid() != 0) {
        return QUIB_ERR_ACCESS_DENIED;
    }
    FileDescriptor current;
    if (const int code = OpenComponent(AT_FDCWD, "/", false, &current)) {
        return code;
    }
    size_t pos = 0;
    while (pos < path.size()) {
        const size_t start = path.find_first_not_of('/', pos);
        if (start == std::string::npos) {
            break;
        }
        size_t end = path.find('/', start);
        end = end == std::string::npos ? path.size() : end;
        const std::string name = path.substr(start, end - start);
        if (name == "." || name == "..") {
            return QUIB_ERR_BAD_PARAMETER;
        }
        const bool last = path.find_first_not_of('/', end) == std::string::npos;
        FileDescriptor next;
        if (const int code = OpenComponent(current.Get(), name, create && last, &next)) {
            return code;
        }
        current = std::move(next);
        pos = end;
    }
    *dir = std::move(current);
    return QUIB_ERR_NONE;
}

int CheckPrivateDatabase(int dir, const std::string &name, bool create) {
    const int flags = O_RDWR | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC | (create ? O_CREAT : 0);
    FileDescriptor fd(openat(dir, name.c_str(), flags, 0600));
    if (!fd.IsOpen()) {
        return errno == ENOENT ? QUIB_ERR_NO_SUCH_FILE : CodeOfOpen(errno);
    }
    struct stat st;
    if (fstat(fd.Get(), &st) != 0) {
        return VLIBCErrFromErrno(errno);
    }
    if (!IsRootOnly(st, S_IFREG, 077)) {
        return QUIB_ERR_ACCESS_DENIED;
    }
    for (const char *suffix : {"-journal", "-wal"}) {
        if (fstatat(dir, (name + suffix).c_str(), &st, AT_SYMLINK_NOFOLLOW) != 0) {
            if (errno == ENOENT) {
                continue;
            }
            return VLIBCErrFromErrno(errno);
        }
        if (!IsRootOnly(st, S_IFREG, 077)) {
            return QUIB_ERR_ACCESS_DENIED;
        }
    }
    return QUIB_ERR_NONE;
}

}  // namespace norvo::platform
