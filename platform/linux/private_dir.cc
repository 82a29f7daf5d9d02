#include "private_dir.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "vlibc_err.h"

namespace norvo::platform {
namespace {

// A file with a second name may be someone else's file linked in (without protected_hardlinks):
// refused, as SQLite would write through it.
bool IsOwnedOnly(const struct stat &st, mode_t type, uid_t uid, mode_t othersMay) {
    return (st.st_mode & S_IFMT) == type && st.st_uid == uid && (st.st_mode & othersMay) == 0 &&
           (type != S_IFREG || st.st_nlink == 1);
}

// A link or a non-directory where a directory must be is a refusal, not a system failure.
int CodeOfOpen(int err) {
    return err == ELOOP || err == ENOTDIR || err == EISDIR || err == ENXIO ? QUIB_ERR_ACCESS_DENIED
                                                                           : VLIBCErrFromErrno(err);
}

// Others may only pass through a passage directory (x without r): they hold it by O_PATH,
// enough for fstat and openat. Root opens for real, to set the mode of what it makes.
int DirFlags() {
    return (geteuid() == 0 ? O_RDONLY : O_PATH) | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
}

// Opens name in parent, making it with mode when mayCreate and it is missing. The mode is set
// with fchmod on what this call made: mkdir's is cut by the umask. *made says whether it did.
int OpenOrMake(int parent, const std::string &name, bool mayCreate, mode_t mode, FileDescriptor *out,
               bool *made) {
    *made = false;
    FileDescriptor fd(openat(parent, name.c_str(), DirFlags()));
    if (!fd.IsOpen() && errno == ENOENT && mayCreate) {
        if (mkdirat(parent, name.c_str(), mode) != 0) {
            if (errno != EEXIST) {
                return VLIBCErrFromErrno(errno);
            }
        } else {
            *made = true;
        }
        fd.Reset(openat(parent, name.c_str(), DirFlags()));
    }
    if (!fd.IsOpen()) {
        const int err = errno;
        if (*made) {
            unlinkat(parent, name.c_str(), AT_REMOVEDIR);  // never left behind half made
        }
        return CodeOfOpen(err);
    }
    *out = std::move(fd);
    return QUIB_ERR_NONE;
}

int CheckOwned(int fd, mode_t type, uid_t uid, mode_t othersMay) {
    struct stat st;
    if (fstat(fd, &st) != 0) {
        return VLIBCErrFromErrno(errno);
    }
    return IsOwnedOnly(st, type, uid, othersMay) ? QUIB_ERR_NONE : QUIB_ERR_ACCESS_DENIED;
}

int OpenComponent(int parent, const std::string &name, bool mayCreate, mode_t mode, FileDescriptor *out) {
    FileDescriptor fd;
    bool made = false;
    if (const int code = OpenOrMake(parent, name, mayCreate, mode, &fd, &made)) {
        return code;
    }
    if (made && mode != 0700 && fchmod(fd.Get(), mode) != 0) {
        return VLIBCErrFromErrno(errno);
    }
    if (const int code = CheckOwned(fd.Get(), S_IFDIR, 0, S_IWGRP | S_IWOTH)) {
        return code;
    }
    *out = std::move(fd);
    return QUIB_ERR_NONE;
}

int OpenRootDir(const std::string &path, bool create, mode_t mode, FileDescriptor *dir) {
    if (path.empty() || path.front() != '/') {
        return QUIB_ERR_BAD_PARAMETER;
    }
    FileDescriptor current;
    if (const int code = OpenComponent(AT_FDCWD, "/", false, mode, &current)) {
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
        if (const int code = OpenComponent(current.Get(), name, create && last, mode, &next)) {
            return code;
        }
        current = std::move(next);
        pos = end;
    }
    *dir = std::move(current);
    return QUIB_ERR_NONE;
}

int CheckDatabase(int dir, const std::string &name, uid_t uid, gid_t gid, bool create) {
    const int flags = O_RDWR | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC | (create ? O_CREAT : 0);
    FileDescriptor fd(openat(dir, name.c_str(), flags, 0600));
    if (!fd.IsOpen()) {
        return errno == ENOENT ? QUIB_ERR_NO_SUCH_FILE : CodeOfOpen(errno);
    }
    struct stat st;
    if (fstat(fd.Get(), &st) != 0) {
        return VLIBCErrFromErrno(errno);
    }
    // Root made it just now for another owner: hand it over before anything is written.
    if (uid != 0 && st.st_uid == 0 && st.st_size == 0 && geteuid() == 0 && create) {
        if (fchown(fd.Get(), uid, gid) != 0) {
            return VLIBCErrFromErrno(errno);
        }
        st.st_uid = uid;
    }
    if (!IsOwnedOnly(st, S_IFREG, uid, 077)) {
        return QUIB_ERR_ACCESS_DENIED;
    }
    for (const char *suffix : {"-journal", "-wal"}) {
        if (fstatat(dir, (name + suffix).c_str(), &st, AT_SYMLINK_NOFOLLOW) != 0) {
            if (errno == ENOENT) {
                continue;
            }
            return VLIBCErrFromErrno(errno);
        }
        if (!IsOwnedOnly(st, S_IFREG, uid, 077)) {
            return QUIB_ERR_ACCESS_DENIED;
        }
    }
    return QUIB_ERR_NONE;
}

}  // namespace

int OpenPrivateDir(const std::string &path, bool create, FileDescriptor *dir) {
    if (geteuid() != 0) {
        return QUIB_ERR_ACCESS_DENIED;
    }
    return OpenRootDir(path, create, 0700, dir);
}

int OpenPassageDir(const std::string &path, bool create, FileDescriptor *dir) {
    return OpenRootDir(path, create && geteuid() == 0, 0711, dir);
}

int CheckPrivateDatabase(int dir, const std::string &name, bool create) {
    return CheckDatabase(dir, name, 0, 0, create);
}

int OpenOwnerDir(int parent, const std::string &name, uid_t uid, gid_t gid, bool create,
                 FileDescriptor *dir) {
    if (name.empty() || name == "." || name == ".." || name.find('/') != std::string::npos ||
        name.find('\0') != std::string::npos) {
        return QUIB_ERR_BAD_PARAMETER;
    }
    const uid_t self = geteuid();
    if (self != 0 && self != uid) {
        return QUIB_ERR_ACCESS_DENIED;
    }
    FileDescriptor fd;
    bool made = false;
    if (const int code = OpenOrMake(parent, name, create && self == 0, 0700, &fd, &made)) {
        return code;
    }
    if (made && (fchown(fd.Get(), uid, gid) != 0 || fchmod(fd.Get(), 0700) != 0)) {
        const int err = errno;
        unlinkat(parent, name.c_str(), AT_REMOVEDIR);  // never left behind as root's
        return VLIBCErrFromErrno(err);
    }
    if (const int code = CheckOwned(fd.Get(), S_IFDIR, uid, 077)) {
        return code;
    }
    *dir = std::move(fd);
    return QUIB_ERR_NONE;
}

int CheckOwnerDatabase(int dir, const std::string &name, uid_t uid, gid_t gid, bool create) {
    return CheckDatabase(dir, name, uid, gid, create);
}

}  // namespace norvo::platform
