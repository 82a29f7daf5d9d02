// File-system type indexes: the platform's name table, the aliases that Linux mount tables
// use for the same families, and the type of the file system holding a path.
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <linux/magic.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "api_guard.h"
#include "fs_path.h"
#include "locked_file.h"
#include "mount_table.h"
#include "quib_fs.h"

extern "C" {
const char rgszFsType[QUIB_FSTYPE_COUNT][QUIB_FSTYPE_NAME_LEN] = {
    "ext4", "vfat", "ext3", "btrfs", "tmpfs", "xfs", "exfat", "iso9660", "cifs",
};
}

namespace norvo::platform {
namespace {

struct TypeAlias {
    const char *name;
    int index;
};

// Mount type names beyond the table's own, by family. FUSE mounts show "fuse.<subtype>".
constexpr TypeAlias kAliases[] = {
    {"msdos", FSTYPE_FAT},
    {"fat", FSTYPE_FAT},
    {"fuse.fusefat", FSTYPE_FAT},
    {"fuse.exfat", FSTYPE_EXFAT},
    {"fuseblk.exfat", FSTYPE_EXFAT},
    {"udf", FSTYPE_ISO},
    {"squashfs", FSTYPE_ISO},
    {"fuse.fuseiso", FSTYPE_ISO},
    {"smb3", FSTYPE_REMOTE},
    {"smbfs", FSTYPE_REMOTE},
    {"nfs", FSTYPE_REMOTE},
    {"nfs4", FSTYPE_REMOTE},
    {"ceph", FSTYPE_REMOTE},
    {"9p", FSTYPE_REMOTE},
    {"fuse.sshfs", FSTYPE_REMOTE},
    {"fuse.rclone", FSTYPE_REMOTE},
    {"fuse.s3fs", FSTYPE_REMOTE},
    {"fuse.davfs", FSTYPE_REMOTE},
    {"fuse.curlftpfs", FSTYPE_REMOTE},
    {"fuse.norvo-deadremote", FSTYPE_REMOTE},  // the test stand-in for a lost network share
};

int IndexOfName(std::string_view type) {
    for (int i = 0; i < QUIB_FSTYPE_COUNT; ++i) {
        if (type == rgszFsType[i]) {
            return i;
        }
    }
    for (const TypeAlias &alias : kAliases) {
        if (type == alias.name) {
            return alias.index;
        }
    }
    return FSTYPE_UNKNOWN;
}

// "fuseblk" is what exFAT and NTFS drivers in user space both mount as; only the volume's
// boot sector tells them apart (OEM name "EXFAT   " at offset 3).
int IndexOfBlockDevice(std::string_view source) {
    if (source.empty() || source.front() != '/' || source.size() >= PATH_MAX) {
        return FSTYPE_UNKNOWN;
    }
    const std::string device(source);
    FileDescriptor fd(open(device.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
    char boot[11];
    if (!fd.IsOpen() || pread(fd.Get(), boot, sizeof boot, 0) != static_cast<ssize_t>(sizeof boot)) {
        return FSTYPE_UNKNOWN;
    }
    return memcmp(boot + 3, "EXFAT   ", 8) == 0 ? FSTYPE_EXFAT : FSTYPE_UNKNOWN;
}

}  // namespace

int FsTypeIndexOf(std::string_view type, std::string_view source) {
    const int index = IndexOfName(type);
    if (index != FSTYPE_UNKNOWN) {
        return index;
    }
    // A FUSE mount without subtype names its driver in the source ("fusefat") or, for a
    // block device, in the device itself.
    if (type == "fuse" || type == "fuseblk") {
        if (!source.empty() && source.find('/') == std::string_view::npos) {
            return IndexOfName("fuse." + std::string(source));
        }
        if (type == "fuseblk") {
            return IndexOfBlockDevice(source);
        }
    }
    return FSTYPE_UNKNOWN;
}

int FsTypeIndexOfMagic(long magic) {
    switch (static_cast<unsigned long>(magic) & 0xFFFFFFFFul) {
        case EXT4_SUPER_MAGIC:  // ext2, ext3 and ext4 share it; ext4 is the appliance's own
            return FSTYPE_EXT4;
        case MSDOS_SUPER_MAGIC:
            return FSTYPE_FAT;
        case BTRFS_SUPER_MAGIC:
            return FSTYPE_BTRFS;
        case TMPFS_MAGIC:
            return FSTYPE_TMPFS;
        case XFS_SUPER_MAGIC:
            return FSTYPE_XFS;
        case EXFAT_SUPER_MAGIC:
            return FSTYPE_EXFAT;
        case ISOFS_SUPER_MAGIC:
        case UDF_SUPER_MAGIC:
        case SQUASHFS_MAGIC:
            return FSTYPE_ISO;
        case SMB_SUPER_MAGIC:
        case SMB2_SUPER_MAGIC:
        case CIFS_SUPER_MAGIC:
        case NFS_SUPER_MAGIC:
        case CEPH_SUPER_MAGIC:
        case V9FS_MAGIC:
            return FSTYPE_REMOTE;
        default:
            return FSTYPE_UNKNOWN;
    }
}

}  // namespace norvo::platform

using namespace norvo::platform;

extern "C" {

int QUIBFSTypeFromName(const char *type, const char *source) {
    if (type == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return Guarded(-1, [&] { return FsTypeIndexOf(type, source != nullptr ? source : ""); });
}

int QUIBFSIsInMountTable(const char *path) {
    if (const int err = CheckPathArgument(path)) {
        return NORVO_FAIL_ERRNO(err);
    }
    return Guarded(-1, [&] {
        const std::string absolute = AbsolutePath(path);
        if (absolute.empty()) {
            return NORVO_FAIL_ERRNO(errno);
        }
        std::vector<MountEntry> entries;
        if (const int err = ReadMountTable(&entries)) {
            return NORVO_FAIL_ERRNO(err);
        }
        const MountEntry *mount = FindHoldingMount(entries, absolute, MountScope::kDataVolumes);
        return mount != nullptr ? FsTypeIndexOf(mount->type, mount->source) : -1;
    });
}

int QUIBGetFSType(const char *path, int flags) {
    if (const int err = CheckPathArgument(path)) {
        return NORVO_FAIL_ERRNO(err);
    }
    if (flags != 0 && flags != 1) {
        return NORVO_FAIL_ERRNO(EINVAL);
    }
    struct statfs info;
    if (statfs(path, &info) != 0) {
        return NORVO_FAIL_ERRNO(errno);
    }
    return Guarded(-1, [&] {
        // statfs succeeded, so the path resolves: judge the mount by where it really lies.
        std::unique_ptr<char, decltype(&free)> real(realpath(path, nullptr), &free);
        const std::string where = real ? std::string(real.get()) : AbsolutePath(path);
        std::vector<MountEntry> entries;
        const MountEntry *mount = nullptr;
        if (!where.empty() && ReadMountTable(&entries) == 0) {
            mount = FindHoldingMount(entries, where, MountScope::kAll);
        }
        if (mount == nullptr) {
            // No table (no /proc, or a root outside it): the kernel still knows whether the
            // path is the root of a mount, and the magic tells the family.
            struct statx attributes;
            if (flags == 1 && (statx(AT_FDCWD, path, 0, STATX_TYPE, &attributes) != 0 ||
                               (attributes.stx_attributes & STATX_ATTR_MOUNT_ROOT) == 0)) {
                return static_cast<int>(FSTYPE_NOT_MOUNT_POINT);
            }
            return FsTypeIndexOfMagic(info.f_type);
        }
        if (flags == 1 && mount->dir != where) {
            return static_cast<int>(FSTYPE_NOT_MOUNT_POINT);
        }
        return FsTypeIndexOf(mount->type, mount->source);
    });
}

int QUIBFSIsRemoteFS(int fstype) {
    return fstype == FSTYPE_REMOTE ? 1 : 0;
}

int QUIBFSIsImageFS(int fstype) {
    return fstype == FSTYPE_ISO ? 1 : 0;
}

}  // extern "C"
