// QUIBFileCopy: an upload's file put into place without a window in which the target is
// half-written, and without a link anywhere on the target's way being followed.
#include <errno.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <stdio.h>
#include <string.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "api_guard.h"
#include "fs_path.h"
#include "locked_file.h"
#include "quib_file_copy.h"
#include "quib_fs.h"

namespace {

using norvo::platform::FileDescriptor;
using norvo::platform::Guarded;
using norvo::platform::ScopeExit;

constexpr size_t kChunk = 64u << 20;       // per progress call; large, so the kernel's copy runs long
constexpr off_t kFatLimit = 0xFFFFFFFFLL;  // FAT's largest file
constexpr size_t kTempStem = 200;          // of the target's name in the temporary's, so it fits NAME_MAX

// The failure's own code where the errno translation has none.
int CopyCode(int err) {
    switch (err) {
        case EEXIST:
        case ENOTEMPTY:
            return QUIB_ERR_FILE_EXISTS;
        case EISDIR:
            return QUIB_ERR_TARGET_IS_DIR;
        case ECANCELED:
            return QUIB_ERR_COPY_CANCELLED;
        case EFBIG:
            return QUIB_ERR_FILE_TOO_BIG;
        case ELOOP:  // a link on the way: refused, as reaching through it would be
        case EXDEV:  // openat2 saw the way leave through a magic link
            return QUIB_ERR_ACCESS_DENIED;
        default:
            return VLIBCErrFromErrno(err);
    }
}

int Fail(int err, int line) {
    VLIBCErrSetEx(CopyCode(err), QUIB_SOURCE_NAME, line);
    errno = err;
    return -1;
}
#define COPY_FAIL(err) Fail((err), __LINE__)

// The directory at path, every component opened without following a link. O_PATH: searching
// is all the caller needs, so a folder the user may write but not list still works.
int OpenDirNoFollow(const std::string &path) {
    open_how how{};
    how.flags = O_PATH | O_DIRECTORY | O_CLOEXEC;
    how.resolve = RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
    int fd;
    do {
        fd = static_cast<int>(syscall(SYS_openat2, AT_FDCWD, path.c_str(), &how, sizeof how));
    } while (fd < 0 && errno == EAGAIN);
    if (fd >= 0 || errno != ENOSYS) {
        return fd;
    }
    // Kernels before 5.6: one component at a time.
    FileDescriptor dir(open(path[0] == '/' ? "/" : ".", O_PATH | O_DIRECTORY | O_CLOEXEC));
    size_t at = 0;
    while (dir.IsOpen() && at < path.size()) {
        const size_t end = std::min(path.find('/', at), path.size());
        if (end > at) {
            const std::string name = path.substr(at, end - at);
            dir.Reset(openat(dir.Get(), name.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        }
        at = end + 1;
    }
    return dir.Release();
}

mode_t TargetMode(const QUIB_FILECOPY_OPT &options) {
    if (options.mode != 0) {
        return options.mode & 07777;
    }
    const mode_t mask = umask(022);  // read it: the CGI has one thread
    umask(mask);
    return 0666 & ~mask;
}

// Owner before mode: a chown drops set-id bits.
int SetOwnerAndMode(int fd, const QUIB_FILECOPY_OPT &options) {
    if (options.blSetOwner && fchown(fd, options.uid, options.gid) != 0) {
        return errno;
    }
    return fchmod(fd, TargetMode(options)) != 0 ? errno : 0;
}

bool Cancelled(const QUIB_FILECOPY_OPT &options) {
    return options.pfnProgress != nullptr && options.pfnProgress() != 0;
}

// Copies all of in to out from offset 0: the kernel's copy, or read and write where it can't.
int CopyData(int in, int out, const QUIB_FILECOPY_OPT &options) {
    bool kernel = true;
    std::vector<char> buffer;
    size_t sinceProgress = 0;
    for (off_t at = 0;;) {
        ssize_t n;
        if (kernel) {
            loff_t from = at, to = at;
            n = copy_file_range(in, &from, out, &to, kChunk, 0);
            if (n < 0 && at == 0 &&
                (errno == EXDEV || errno == EINVAL || errno == ENOSYS || errno == EOPNOTSUPP)) {
                kernel = false;
                buffer.resize(1u << 20);
                continue;
            }
        } else {
            n = pread(in, buffer.data(), buffer.size(), at);
            for (ssize_t done = 0; n > 0 && done < n;) {
                const ssize_t w = pwrite(out, buffer.data() + done, size_t(n - done), at + done);
                if (w < 0) {
                    n = -1;
                } else {
                    done += w;
                }
            }
        }
        if (n < 0) {
            if (errno == EINTR) {
                continue;
            }
            return errno;
        }
        if (n == 0) {
            return 0;
        }
        at += n;
        sinceProgress += size_t(n);
        if (sinceProgress >= kChunk || kernel) {
            sinceProgress = 0;
            if (Cancelled(options)) {
                return ECANCELED;
            }
        }
    }
}

// A fresh ".<name>.XXXXXX" beside name in dir, opened for writing; never an existing file.
int CreateTemporary(int dir, const std::string &name, std::string *tempName) {
    for (int attempt = 0; attempt < 100; ++attempt) {
        unsigned char random[6];
        if (getrandom(random, sizeof random, 0) != ssize_t(sizeof random)) {
            return -1;
        }
        static const char kDigits[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789";
        std::string suffix;
        for (const unsigned char byte : random) {
            suffix += kDigits[byte % 62];
        }
        *tempName = "." + name.substr(0, kTempStem) + "." + suffix;
        const int fd =
            openat(dir, tempName->c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
        if (fd >= 0 || errno != EEXIST) {
            return fd;
        }
    }
    errno = EEXIST;
    return -1;
}

// Renames without replacing; where the file system has no RENAME_NOREPLACE the check before the
// rename is the best there is (a racing creator may then lose its file).
int RenameInto(int fromDir, const char *from, int toDir, const char *to, bool overwrite) {
    if (overwrite) {
        return renameat(fromDir, from, toDir, to);
    }
    if (renameat2(fromDir, from, toDir, to, RENAME_NOREPLACE) == 0) {
        return 0;
    }
    if (errno != EINVAL) {
        return -1;
    }
    struct stat st;
    if (fstatat(toDir, to, &st, AT_SYMLINK_NOFOLLOW) == 0) {
        errno = EEXIST;
        return -1;
    }
    return renameat(fromDir, from, toDir, to);
}

// The target must be absent, or a regular file the caller asked to replace.
int CheckTarget(int dir, const char *name, bool overwrite) {
    struct stat st;
    if (fstatat(dir, name, &st, AT_SYMLINK_NOFOLLOW) != 0) {
        return errno == ENOENT ? 0 : errno;
    }
    if (!S_ISREG(st.st_mode)) {
        return EISDIR;  // a folder, a link, a device: never replaced by a file
    }
    return overwrite ? 0 : EEXIST;
}

bool IsFat(int dir) {
    const std::string where = "/proc/self/fd/" + std::to_string(dir);
    return QUIBGetFSType(where.c_str(), 0) == FSTYPE_FAT;
}

// Best effort: the rename has happened, and a folder the user may not read can't be synced.
void SyncDir(int dir) {
    FileDescriptor readable(openat(dir, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (readable.IsOpen()) {
        (void)fsync(readable.Get());
    }
}

int Move(const char *src, const char *dst, const QUIB_FILECOPY_OPT &options) {
    std::string dstDir, srcDir;
    std::string_view dstLast, srcLast;
    if (!norvo::platform::SplitLastComponent(dst, &dstDir, &dstLast) ||
        !norvo::platform::SplitLastComponent(src, &srcDir, &srcLast) || dstLast == "." || dstLast == ".." ||
        srcLast == "." || srcLast == "..") {
        return COPY_FAIL(EINVAL);
    }
    const std::string name(dstLast), srcName(srcLast);
    FileDescriptor dir(OpenDirNoFollow(dstDir));
    if (!dir.IsOpen()) {
        return COPY_FAIL(errno);
    }
    FileDescriptor from(open(src, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    if (!from.IsOpen()) {
        return COPY_FAIL(errno == ELOOP ? EINVAL : errno);
    }
    struct stat source, folder;
    if (fstat(from.Get(), &source) != 0 || fstat(dir.Get(), &folder) != 0) {
        return COPY_FAIL(errno);
    }
    if (!S_ISREG(source.st_mode)) {
        return COPY_FAIL(EINVAL);
    }
    if (const int err = CheckTarget(dir.Get(), name.c_str(), options.blOverwrite != 0)) {
        return COPY_FAIL(err);
    }
    FileDescriptor fromDir;
    if (options.blRemoveSource) {
        fromDir.Reset(open(srcDir.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
        struct stat named;
        if (!fromDir.IsOpen() || fstatat(fromDir.Get(), srcName.c_str(), &named, AT_SYMLINK_NOFOLLOW) != 0) {
            return COPY_FAIL(errno);
        }
        if (named.st_dev != source.st_dev || named.st_ino != source.st_ino) {
            return COPY_FAIL(ENOENT);  // the name was swapped after it was opened
        }
    }
    if (options.blRemoveSource && source.st_dev == folder.st_dev) {
        if (Cancelled(options)) {
            return COPY_FAIL(ECANCELED);
        }
        if (const int err = SetOwnerAndMode(from.Get(), options)) {
            return COPY_FAIL(err);
        }
        if (RenameInto(fromDir.Get(), srcName.c_str(), dir.Get(), name.c_str(), options.blOverwrite != 0) ==
            0) {
            if (options.blSync) {
                SyncDir(dir.Get());
            }
            return 0;
        }
        if (errno != EXDEV) {  // two mounts of one file system: copy after all
            return COPY_FAIL(errno);
        }
    }
    if (source.st_size > kFatLimit && IsFat(dir.Get())) {
        return COPY_FAIL(EFBIG);
    }
    std::string tempName;
    FileDescriptor to(CreateTemporary(dir.Get(), name, &tempName));
    if (!to.IsOpen()) {
        return COPY_FAIL(errno);
    }
    ScopeExit removeTemp([&] { unlinkat(dir.Get(), tempName.c_str(), 0); });
    int err = SetOwnerAndMode(to.Get(), options);
    if (err == 0) {
        err = CopyData(from.Get(), to.Get(), options);
    }
    if (err == 0 && options.blKeepTime) {
        const struct timespec times[2] = {source.st_atim, source.st_mtim};
        err = futimens(to.Get(), times) != 0 ? errno : 0;
    }
    if (err == 0 && options.blSync) {
        err = fsync(to.Get()) != 0 ? errno : 0;
    }
    if (err == 0) {
        err = RenameInto(dir.Get(), tempName.c_str(), dir.Get(), name.c_str(), options.blOverwrite != 0) != 0
                  ? errno
                  : 0;
    }
    if (err != 0) {
        return COPY_FAIL(err);
    }
    removeTemp.Dismiss();
    if (options.blSync) {
        SyncDir(dir.Get());
    }
    if (options.blRemoveSource) {
        // The target is whole and in place: a source that can't be removed stays, and the
        // move still counts as done.
        (void)unlinkat(fromDir.Get(), srcName.c_str(), 0);
    }
    return 0;
}

}  // namespace

extern "C" int QUIBFileCopy(const char *src, const char *dst, const QUIB_FILECOPY_OPT *options) {
    if (options == nullptr) {
        return NORVO_FAIL_ERRNO(EINVAL);
    }
    for (const char *path : {src, dst}) {
        if (const int err = norvo::platform::CheckPathArgument(path)) {
            return NORVO_FAIL_ERRNO(err);
        }
    }
    return Guarded(-1, [&] { return Move(src, dst, *options); });
}
