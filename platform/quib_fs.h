// File systems: type of the file system holding a path, the mount table, volumes, the
// platform's hidden names, directory creation and ACL permission masks.
#pragma once
#include <sys/types.h>
#include "platform_export.h"

// Indexes into rgszFsType, and the two values outside the table.
enum {
    FSTYPE_EXT4 = 0,
    FSTYPE_FAT = 1,
    FSTYPE_EXT3 = 2,
    FSTYPE_BTRFS = 3,
    FSTYPE_TMPFS = 4,
    FSTYPE_XFS = 5,
    FSTYPE_EXFAT = 6,
    FSTYPE_ISO = 7,     // disk images
    FSTYPE_REMOTE = 8,  // network file systems
    FSTYPE_NOT_MOUNT_POINT = 10,
    FSTYPE_UNKNOWN = 11,
};

#define QUIB_FSTYPE_COUNT 9
#define QUIB_FSTYPE_NAME_LEN 10

// Volume kinds reported by VolumePathParse.
enum {
    VOLUME_KIND_INTERNAL = 1,  // /volumeN
    VOLUME_KIND_USB = 4,       // /volumeUSBN
    VOLUME_KIND_ESATA = 8,     // /volumeSATAN
};

typedef struct _tag_VOLUME_INFO_ {
    char szVolumePath[64];  // e.g. /volume1
    int kind;               // VOLUME_KIND_*
} VOLUME_INFO, *PVOLUME_INFO;

// ACL permission bits of QUIBACLPermGet.
enum {
    ACL_PERM_EXECUTE = 0x0001,
    ACL_PERM_WRITE = 0x0002,
    ACL_PERM_READ = 0x0004,
    ACL_PERM_APPEND = 0x0008,
    ACL_PERM_READ_XATTR = 0x0010,
    ACL_PERM_WRITE_XATTR = 0x0020,
    ACL_PERM_DELETE_CHILD = 0x0040,
    ACL_PERM_READ_ATTR = 0x0080,
    ACL_PERM_WRITE_ATTR = 0x0100,
    ACL_PERM_DELETE = 0x0200,
    ACL_PERM_READ_ACL = 0x0400,
    ACL_PERM_WRITE_ACL = 0x0800,
    ACL_PERM_CHANGE_OWNER = 0x1000,
    ACL_PERM_ALL = 0x1FFF,
};

QUIB_BEGIN_C

// The platform's table of file-system type names, indexed by FSTYPE_*.
QUIB_API extern const char rgszFsType[QUIB_FSTYPE_COUNT][QUIB_FSTYPE_NAME_LEN];

// Type index of the file system holding path (from statfs and the mount table).
// With flags 0 any path; with flags 1 only a mount directory (FSTYPE_NOT_MOUNT_POINT otherwise).
// -1 with errno set when path can't be examined.
QUIB_API int QUIBGetFSType(const char *path, int flags);
// Type index of the data mount that holds path: the deepest mount, among those whose directory
// is a volume (/volumeN, /volumeUSBN, /volumeSATAN) or lies below one, whose directory is path
// or a parent of it. Read from /proc/self/mounts without examining path itself, so it works on
// a network mount whose server is gone. -1 when no data mount holds path (the system disk is
// none), or on failure (error slot set).
QUIB_API int QUIBFSIsInMountTable(const char *path);
// Type index of a mount-table type name ("ext4", "fuse.sshfs", ...; aliases in
// platform/README.md); source (may be null) names the driver of FUSE mounts without subtype.
// FSTYPE_UNKNOWN when the name is of no known family; -1 (0x0D00) when type is null.
QUIB_API int QUIBFSTypeFromName(const char *type, const char *source);
// 1 for a network file system index, else 0.
QUIB_API int QUIBFSIsRemoteFS(int fstype);
// 1 for a disk-image file system index, else 0.
QUIB_API int QUIBFSIsImageFS(int fstype);

// Parses the volume of path: 1 and *info filled when path lies on /volumeN, /volumeUSBN or
// /volumeSATAN; 0 when it lies on no volume; -1 on bad argument (0x0D00).
QUIB_API int VolumePathParse(const char *path, PVOLUME_INFO info);

// 1 when name is one of the platform's extended-attribute directories ("@eaDir"), else 0.
QUIB_API int QUIBEAIsHiddenDir(const char *name);
// 1 when name is an entry no listing or walk shows: ".", "..", "@eaDir", "@tmp", "@sharebin",
// "#snapshot", ".DS_Store"; else 0 (also for null).
QUIB_API int QUIBEAIsHiddenFile(const char *name);

// Creates path and its missing parents (when recursive), each new one owned by uid:gid
// ((uid_t)-1 or (gid_t)-1 keep the creator's) with exactly mode (umask does not apply);
// existing directories, and links to them, are left untouched. 0 on success. -1 on failure
// with errno and the error slot set; stopAt (if not null, stopAtSize bytes) receives the path
// of the component that could not be created (EEXIST: it is not a directory).
QUIB_API int QUIBFSMkdirP(const char *path, char *stopAt, int stopAtSize, int recursive, uid_t uid, gid_t gid,
                          mode_t mode);

// The ACL_PERM_* mask the effective identity holds on path (a final link is not followed),
// judged as the kernel judges (POSIX ACLs and modes count). 0 and *mask on success; -1 with
// 0x0600 (no such file), 0x0700 (a parent is not a directory), 0x0300 (a parent can't be
// searched), 0xD800 (the file system does not support ACLs), 0x0D00 (bad argument), 0xC300
// (path of 4096 bytes or more), 0x8100 (other, EIO among them). A read-only file system is no
// error: its mask lacks the writing bits.
// Cost: on tmpfs, ext2/3/4 and XFS one statx and one read of the ACL attribute of path, plus a
// statx of its directory (whose write and search rights are evaluated once while it stays
// unchanged); the caller's ids, groups and capabilities are read afresh on every call, so
// seteuid and setgroups count at once. The facts of a mount (type, read-only, no-exec) are
// read once per mount per process. Elsewhere the kernel is asked (faccessat) for each bit.
QUIB_API int QUIBACLPermGet(const char *path, unsigned int *mask);
// Non-zero when access-control lists govern the file: 1 when its file system supports POSIX
// ACLs, 0 when not (FUSE file systems count as not supporting them), -1 on failure (error slot
// as for QUIBACLPermGet). fd -1: the file is path, a final link not followed (the directory
// holding a link answers for it). fd >= 0: the file open on fd (any open mode, O_PATH too, but
// not a link), and path is ignored and may be null. flags is reserved: no bit changes the
// answer (the listing passes 2).
QUIB_API int QUIBACLIsSupport(const char *path, int fd, int flags);

QUIB_END_C
