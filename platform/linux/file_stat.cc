// VLIBCFileLStat: one statx system call per file. statx is the only call that reports a birth
// time, and asking it for exactly the fields wanted spares network file systems the rest. Inside
// a directory pass the entry's statx is the pass's, shared with the other calls about it.
#include <errno.h>
#include <fcntl.h>
#include <stdint.h>
#include <sys/stat.h>

#include <limits>

#include "dir_pass.h"
#include "fs_path.h"
#include "quib_stat.h"

namespace norvo::platform {
namespace {

constexpr int kKnownFlags = QUIB_STAT_BASIC | QUIB_STAT_CRTIME;
constexpr unsigned kBasicFields =
    STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID | STATX_SIZE | STATX_ATIME | STATX_MTIME | STATX_CTIME;

QUIBTIME ToQuibTime(const struct statx_timestamp &t) {
    constexpr int64_t kLow = std::numeric_limits<int32_t>::min();
    constexpr int64_t kHigh = std::numeric_limits<int32_t>::max();
    const int64_t seconds = t.tv_sec < kLow ? kLow : (t.tv_sec > kHigh ? kHigh : t.tv_sec);
    return QUIBTIME{static_cast<int32_t>(seconds), t.tv_nsec};
}

int Fill(const struct statx &info, bool wantCrtime, PQUIBSTAT st) {
    QUIBSTAT out{};
    out.st_mode = info.stx_mode;
    out.st_uid = info.stx_uid;
    out.st_gid = info.stx_gid;
    out.st_size = static_cast<int64_t>(info.stx_size);
    out.st_atim = ToQuibTime(info.stx_atime);
    out.st_mtim = ToQuibTime(info.stx_mtime);
    out.st_ctim = ToQuibTime(info.stx_ctime);
    // A file system that keeps no birth time (FAT through FUSE, some network ones) leaves the
    // bit out of the answer; zero then says "unknown" rather than passing off another time.
    if (wantCrtime && (info.stx_mask & STATX_BTIME) != 0) {
        out.st_crtim = ToQuibTime(info.stx_btime);
    }
    *st = out;
    return 0;
}

unsigned FieldsFor(bool wantCrtime) {
    return kBasicFields | (wantCrtime ? STATX_BTIME : 0u);
}

}  // namespace
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" int VLIBCFileLStat(const char *path, int flags, PQUIBSTAT st) {
    if (const int bad = np::CheckPathArgument(path); bad != 0) {
        return NORVO_FAIL_ERRNO(bad);
    }
    if (st == nullptr || (flags & ~np::kKnownFlags) != 0) {
        return NORVO_FAIL_ERRNO(EINVAL);
    }
    const bool wantCrtime = (flags & QUIB_STAT_CRTIME) != 0;
    struct statx info;
    const char *name = nullptr;
    if (QUIBDirPass *pass = np::PassOf(path, &name)) {
        if (const int err = np::PassEntryStat(pass, name, &info); err != 0) {
            return NORVO_FAIL_ERRNO(err);
        }
    } else if (statx(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, np::FieldsFor(wantCrtime),
                     &info) != 0) {
        return NORVO_FAIL_ERRNO(errno);
    }
    return np::Fill(info, wantCrtime, st);
}

extern "C" int VLIBCFileLStatAt(int dirFd, const char *name, int flags, PQUIBSTAT st) {
    if (name == nullptr || name[0] == '\0' || st == nullptr || (flags & ~np::kKnownFlags) != 0) {
        return NORVO_FAIL_ERRNO(EINVAL);
    }
    const bool wantCrtime = (flags & QUIB_STAT_CRTIME) != 0;
    struct statx info;
    if (statx(dirFd, name, AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT, np::FieldsFor(wantCrtime), &info) != 0) {
        return NORVO_FAIL_ERRNO(errno);
    }
    return np::Fill(info, wantCrtime, st);
}
