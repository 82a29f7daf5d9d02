// Moving or copying a file into place: the upload's last step.
#pragma once
#include <sys/types.h>

#include "platform_export.h"

// Codes of QUIBFileCopy beyond the errno translation (vlibc_err.h).
enum {
    QUIB_ERR_FILE_EXISTS = 0x0800,     // the target exists and overwriting was not asked
    QUIB_ERR_TARGET_IS_DIR = 0xA200,   // the target is a directory (or not a regular file)
    QUIB_ERR_COPY_CANCELLED = 0xA300,  // the progress callback asked to stop
    QUIB_ERR_FILE_TOO_BIG = 0xA400,    // too big for the target's file system (EFBIG; 4 GiB on FAT)
};

// Options of QUIBFileCopy; fill from zero. The flags are ints, 0 or 1.
typedef struct _tag_QUIB_FILECOPY_OPT_ {
    int blOverwrite;     // replace an existing regular file at the target
    int blRemoveSource;  // a move: the source is gone afterwards (renamed, or copied and removed)
    int blSetOwner;      // give the target uid:gid (a failure fails the call)
    int blKeepTime;      // give the target the source's access and modification times
    int reserved;        // 0
    int blSync;          // the target's data is on disk before it takes its name
    // Called after each chunk copied (at most 64 MiB apart) and once before a rename; a
    // non-zero result stops the copy (QUIB_ERR_COPY_CANCELLED) and nothing is left at the
    // target. May be null.
    int (*pfnProgress)(void);
    uid_t uid;    // with blSetOwner
    gid_t gid;    // with blSetOwner
    mode_t mode;  // permission bits of the target; 0: 0666 less the process's umask
} QUIB_FILECOPY_OPT, *PQUIB_FILECOPY_OPT;

QUIB_BEGIN_C

// Puts the regular file src at dst. The folder of dst is opened once, without following a
// link on any component, and everything after happens relative to it; dst's last component
// must not be a link either. On the same file system the source itself is renamed (when
// blRemoveSource; else copied). Across file systems the data goes into an exclusive temporary
// ".<name>.XXXXXX" beside dst, which takes owner, mode and times through its descriptor, is
// synced (blSync) and renamed over dst; a failure or a cancel removes it, so dst is the old
// file or the new one whole. Without blOverwrite an existing dst is refused (0x0800) and never
// replaced, even by a racing creator. 0 on success; -1 with the error slot and errno set:
// 0x0D00 bad argument (src not a regular file or a link), 0x0300 refused, 0x0600/0x0700
// missing, 0x0800 exists, 0xA200 dst is a directory, 0xA300 cancelled, 0xA400 too big,
// 0x2900 full, 0x2400 quota, 0x8400 read-only, 0xC300 too long, 0x8100 other.
QUIB_API int QUIBFileCopy(const char *src, const char *dst, const QUIB_FILECOPY_OPT *options);

QUIB_END_C
