// The system calls that take a resource (a descriptor, a directory handle, the working
// directory, a new file or directory) or make a settings write durable, and the NSS lookups:
// the calls of libnorvo, libnorvoplatform and what they drive (SQLite) that can fail for
// reasons outside the caller. Calls that only look (stat, access, realpath) are left alone: the
// sandbox's dead network mount fails those for real.
#undef _FORTIFY_SOURCE  // the fortified inline open() would clash with the definition below
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <grp.h>
#include <mntent.h>
#include <pwd.h>
#include <shadow.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include "seam.h"

using norvo::faults::seam::ShouldFail;

namespace {

mode_t ModeArgument(int flags, va_list args) {
    return (flags & (O_CREAT | O_TMPFILE)) != 0 ? static_cast<mode_t>(va_arg(args, unsigned)) : 0;
}

template <typename Entry>
int NssFailure(Entry **result) {
    *result = nullptr;
    return norvo::faults::seam::Error();
}

}  // namespace

// Each wrapper fails as the call itself does: -1 or null with errno, or the error number for
// the *_r lookups. open and open64 (likewise the others) are one call under two names.
#define SEAM_OPEN(fn)                                          \
    int fn(const char *path, int flags, ...) {                 \
        SEAM_REAL(fn);                                         \
        va_list args;                                          \
        va_start(args, flags);                                 \
        const mode_t mode = ModeArgument(flags, args);         \
        va_end(args);                                          \
        return ShouldFail(#fn) ? -1 : real(path, flags, mode); \
    }
SEAM_OPEN(open)
SEAM_OPEN(open64)

#define SEAM_OPENAT(fn)                                             \
    int fn(int dir, const char *path, int flags, ...) {             \
        SEAM_REAL(fn);                                              \
        va_list args;                                               \
        va_start(args, flags);                                      \
        const mode_t mode = ModeArgument(flags, args);              \
        va_end(args);                                               \
        return ShouldFail(#fn) ? -1 : real(dir, path, flags, mode); \
    }
SEAM_OPENAT(openat)
SEAM_OPENAT(openat64)

// One wrapper: name(parameters) forwards args, failing with the value given.
#define SEAM_CALL(type, fn, failure, params, args)      \
    type fn params {                                    \
        SEAM_REAL(fn);                                  \
        return ShouldFail(#fn) ? (failure) : real args; \
    }

SEAM_CALL(FILE *, fopen, nullptr, (const char *path, const char *mode), (path, mode))
SEAM_CALL(FILE *, fopen64, nullptr, (const char *path, const char *mode), (path, mode))
SEAM_CALL(FILE *, setmntent, nullptr, (const char *path, const char *mode), (path, mode))
SEAM_CALL(DIR *, opendir, nullptr, (const char *path), (path))
SEAM_CALL(DIR *, fdopendir, nullptr, (int fd), (fd))
SEAM_CALL(int, statx, -1, (int dir, const char *path, int flags, unsigned mask, struct statx *out),
          (dir, path, flags, mask, out))
SEAM_CALL(int, chdir, -1, (const char *path), (path))
SEAM_CALL(int, fchdir, -1, (int fd), (fd))
SEAM_CALL(int, mkdir, -1, (const char *path, mode_t mode), (path, mode))
SEAM_CALL(int, mkdirat, -1, (int dir, const char *path, mode_t mode), (dir, path, mode))
SEAM_CALL(int, mkostemp, -1, (char *pattern, int flags), (pattern, flags))
SEAM_CALL(int, mkostemp64, -1, (char *pattern, int flags), (pattern, flags))
SEAM_CALL(ssize_t, write, -1, (int fd, const void *data, size_t size), (fd, data, size))
SEAM_CALL(ssize_t, pwrite, -1, (int fd, const void *data, size_t size, off_t at), (fd, data, size, at))
SEAM_CALL(ssize_t, pwrite64, -1, (int fd, const void *data, size_t size, off64_t at), (fd, data, size, at))
SEAM_CALL(int, fsync, -1, (int fd), (fd))
SEAM_CALL(int, fchown, -1, (int fd, uid_t uid, gid_t gid), (fd, uid, gid))
SEAM_CALL(int, fchmod, -1, (int fd, mode_t mode), (fd, mode))
SEAM_CALL(int, flock, -1, (int fd, int operation), (fd, operation))
SEAM_CALL(int, rename, -1, (const char *from, const char *to), (from, to))
SEAM_CALL(int, renameat, -1, (int fromDir, const char *from, int toDir, const char *to),
          (fromDir, from, toDir, to))
SEAM_CALL(int, renameat2, -1, (int fromDir, const char *from, int toDir, const char *to, unsigned flags),
          (fromDir, from, toDir, to, flags))
SEAM_CALL(ssize_t, copy_file_range, -1,
          (int in, off64_t *inAt, int out, off64_t *outAt, size_t size, unsigned flags),
          (in, inAt, out, outAt, size, flags))
SEAM_CALL(int, futimens, -1, (int fd, const struct timespec times[2]), (fd, times))
SEAM_CALL(int, socket, -1, (int domain, int type, int protocol), (domain, type, protocol))
SEAM_CALL(int, connect, -1, (int fd, const struct sockaddr *address, socklen_t size), (fd, address, size))
SEAM_CALL(int, getpwnam_r, NssFailure(result),
          (const char *name, struct passwd *entry, char *buf, size_t size, struct passwd **result),
          (name, entry, buf, size, result))
SEAM_CALL(int, getpwuid_r, NssFailure(result),
          (uid_t uid, struct passwd *entry, char *buf, size_t size, struct passwd **result),
          (uid, entry, buf, size, result))
SEAM_CALL(int, getgrnam_r, NssFailure(result),
          (const char *name, struct group *entry, char *buf, size_t size, struct group **result),
          (name, entry, buf, size, result))
SEAM_CALL(int, getgrgid_r, NssFailure(result),
          (gid_t gid, struct group *entry, char *buf, size_t size, struct group **result),
          (gid, entry, buf, size, result))
SEAM_CALL(int, getspnam_r, NssFailure(result),
          (const char *name, struct spwd *entry, char *buf, size_t size, struct spwd **result),
          (name, entry, buf, size, result))
