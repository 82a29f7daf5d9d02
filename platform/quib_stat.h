// The platform's extended stat record and the call that fills it without following a final
// symbolic link. Listings, walkers and search conditions read files through it.
#pragma once
#include <stdint.h>
#include <sys/stat.h>
#include <sys/types.h>
#include "platform_export.h"

// Flags of VLIBCFileLStat.
enum {
    QUIB_STAT_BASIC = 0x1,   // mode, owner, group, size and the three usual times
    QUIB_STAT_CRTIME = 0x8,  // also the creation (birth) time
};

// A time as the appliance's 32-bit processors keep it: signed 32-bit seconds since the epoch.
typedef struct _tag_QUIBTIME_ {
    int32_t tv_sec;
    uint32_t tv_nsec;
} QUIBTIME;

// The times are laid out as struct stat lays them out (st_mtim.tv_sec, ...), so
// <sys/stat.h>'s own macros make st.st_atime, st.st_mtime and st.st_ctime read the seconds
// here as they do there.
typedef struct _tag_QUIBSTAT_ {
    mode_t st_mode;  // type bits (0xF000) and permission bits
    uid_t st_uid;
    gid_t st_gid;
    int64_t st_size;
    QUIBTIME st_atim;
    QUIBTIME st_mtim;
    QUIBTIME st_ctim;
    QUIBTIME st_crtim;  // creation time; zero unless asked for and kept by the file system
} QUIBSTAT, *PQUIBSTAT;

QUIB_BEGIN_C

// Fills *st for path itself (a final symbolic link is described, not followed). flags: any
// combination of QUIB_STAT_BASIC (0 means the same) and QUIB_STAT_CRTIME. Times outside the
// 32-bit range (after January 2038, before December 1901) saturate at its ends, so they still
// order correctly against every time inside it. 0 on success; -1 on failure with errno set,
// the error slot set from it and *st untouched: EINVAL (0x0D00) for a null or empty path, a
// null st or an unknown flag, ENAMETOOLONG (0xC300) for a path of 4096 bytes or more, else the
// kernel's errno (ENOENT 0x0600, ENOTDIR 0x0700, EACCES 0x0300, EIO 0x8100, ...).
QUIB_API int VLIBCFileLStat(const char *path, int flags, PQUIBSTAT st);

// The same for name looked up in the directory open at dirFd, however long the directory's own
// path: what a walk asks about each entry of the directory it holds open. EINVAL (0x0D00) for a
// null or empty name, EBADF (0x8100) for a descriptor that is not open.
QUIB_API int VLIBCFileLStatAt(int dirFd, const char *name, int flags, PQUIBSTAT st);

QUIB_END_C
