// ACL permission masks of the effective identity, judged by the kernel: faccessat with
// AT_EACCESS goes through faccessat2, which applies the effective ids, supplementary groups,
// capabilities and POSIX ACLs exactly as an open or unlink would.
#include <errno.h>
#include <fcntl.h>
#include <linux/capability.h>
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <string>

#include "api_guard.h"
#include "fs_path.h"
#include "quib_fs.h"

namespace norvo::platform {
namespace {

enum class Access { kGranted, kDenied, kFailed };
enum class AclSupport { kSupported, kUnsupported, kFailed };

// Denials come as EACCES, EPERM (immutable files) or EROFS; anything else is a real failure.
Access Check(const char *path, int how, int flags) {
    if (faccessat(AT_FDCWD, path, how, AT_EACCESS | flags) == 0) {
        return Access::kGranted;
    }
    return errno == EACCES || errno == EPERM || errno == EROFS || errno == ETXTBSY ? Access::kDenied
                                                                                   : Access::kFailed;
}

bool HasEffectiveCapability(int capability) {
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct data[_LINUX_CAPABILITY_U32S_3] = {};
    if (syscall(SYS_capget, &header, data) != 0) {
        return false;
    }
    return (data[capability / 32].effective & (1u << (capability % 32))) != 0;
}

bool HasAttribute(const struct statx &info, unsigned long long attribute) {
    return (info.stx_attributes_mask & attribute) != 0 && (info.stx_attributes & attribute) != 0;
}

// FUSE file systems pass ACL attributes through to their server unless it negotiated POSIX
// ACLs, which nothing outside the kernel can see; so the kernel enforces no ACL there and an
// empty answer ("no ACL") proves nothing. Every other file system answers EOPNOTSUPP itself.
AclSupport ProbeAclSupport(const char *target, struct statfs *info) {
    if (statfs(target, info) != 0) {
        return AclSupport::kFailed;
    }
    if (static_cast<unsigned long>(info->f_type) == FUSE_SUPER_MAGIC) {
        return AclSupport::kUnsupported;
    }
    if (lgetxattr(target, "system.posix_acl_access", nullptr, 0) >= 0 || errno == ENODATA) {
        return AclSupport::kSupported;
    }
    return errno == EOPNOTSUPP ? AclSupport::kUnsupported : AclSupport::kFailed;
}

// A symbolic link carries no ACL of its own: the directory holding it answers for its file
// system.
std::string ProbeTargetOf(const char *path, const struct statx &info) {
    std::string parent;
    std::string_view last;
    if (!S_ISLNK(info.stx_mode) || !SplitLastComponent(path, &parent, &last)) {
        return path;
    }
    return parent;
}

// Whether unlink or rmdir of path would pass the kernel's may_delete: write and search on the
// directory, its append-only flag, the sticky bit, and the entry's own immutable, append-only
// and mount-root states.
bool MayDelete(const char *path, const struct statx &entry) {
    if (HasAttribute(entry, STATX_ATTR_IMMUTABLE) || HasAttribute(entry, STATX_ATTR_APPEND) ||
        HasAttribute(entry, STATX_ATTR_MOUNT_ROOT)) {
        return false;
    }
    std::string parent;
    std::string_view last;
    if (!SplitLastComponent(path, &parent, &last) || last == "." || last == "..") {
        return false;  // the root, and what rmdir refuses (EINVAL, ENOTEMPTY)
    }
    struct statx dir;
    if (statx(AT_FDCWD, parent.c_str(), 0, STATX_MODE | STATX_UID, &dir) != 0 ||
        HasAttribute(dir, STATX_ATTR_APPEND) ||
        Check(parent.c_str(), W_OK | X_OK, 0) != Access::kGranted) {
        return false;
    }
    if ((dir.stx_mode & S_ISVTX) == 0) {
        return true;
    }
    const uid_t self = geteuid();
    return entry.stx_uid == self || dir.stx_uid == self || HasEffectiveCapability(CAP_FOWNER);
}

}  // namespace
}  // namespace norvo::platform

using namespace norvo::platform;

extern "C" {

int QUIBACLPermGet(const char *path, unsigned int *mask) {
    if (mask == nullptr) {
        return NORVO_FAIL_ERRNO(EINVAL);
    }
    if (const int err = CheckPathArgument(path)) {
        return NORVO_FAIL_ERRNO(err);
    }
    return Guarded(-1, [&] {
        struct statx info;
        if (statx(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW, STATX_TYPE | STATX_MODE | STATX_UID, &info) != 0) {
            return NORVO_FAIL_ERRNO(errno);
        }
        const std::string target = ProbeTargetOf(path, info);
        struct statfs fs;
        switch (ProbeAclSupport(target.c_str(), &fs)) {
        case AclSupport::kSupported:
            break;
        case AclSupport::kUnsupported:
            QUIB_SET_ERR(QUIB_ERR_ACL_NOT_SUPPORTED);
            return -1;
        case AclSupport::kFailed:
            return NORVO_FAIL_ERRNO(errno);
        }
        const Access read = Check(path, R_OK, AT_SYMLINK_NOFOLLOW);
        const Access write = Check(path, W_OK, AT_SYMLINK_NOFOLLOW);
        const Access exec = Check(path, X_OK, AT_SYMLINK_NOFOLLOW);
        if (read == Access::kFailed || write == Access::kFailed || exec == Access::kFailed) {
            return NORVO_FAIL_ERRNO(errno);
        }
        const bool readOnlyFs = (fs.f_flags & ST_RDONLY) != 0;
        const bool immutable = HasAttribute(info, STATX_ATTR_IMMUTABLE);
        const bool appendOnly = HasAttribute(info, STATX_ATTR_APPEND);
        unsigned int result = ACL_PERM_READ_ATTR | ACL_PERM_READ_ACL;
        if (read == Access::kGranted) {
            result |= ACL_PERM_READ | ACL_PERM_READ_XATTR;
        }
        if (write == Access::kGranted) {
            // An append-only file takes appends but refuses any other write.
            result |= ACL_PERM_APPEND | ACL_PERM_WRITE_XATTR | (appendOnly ? 0u : static_cast<unsigned int>(ACL_PERM_WRITE));
            // One request for both: an ACL grants only what a single matching group entry
            // holds, so write and search may each pass alone and fail together.
            if (S_ISDIR(info.stx_mode) && exec == Access::kGranted && !appendOnly &&
                Check(path, W_OK | X_OK, AT_SYMLINK_NOFOLLOW) == Access::kGranted) {
                result |= ACL_PERM_DELETE_CHILD;
            }
        }
        if (exec == Access::kGranted) {
            result |= ACL_PERM_EXECUTE;
        }
        if (!readOnlyFs && !immutable && !appendOnly &&
            (info.stx_uid == geteuid() || HasEffectiveCapability(CAP_FOWNER))) {
            result |= ACL_PERM_WRITE_ATTR | ACL_PERM_WRITE_ACL | ACL_PERM_CHANGE_OWNER;
        }
        if (MayDelete(path, info)) {
            result |= ACL_PERM_DELETE;
        }
        *mask = result;
        return 0;
    });
}

int QUIBACLIsSupport(const char *path) {
    if (const int err = CheckPathArgument(path)) {
        return NORVO_FAIL_ERRNO(err);
    }
    return Guarded(-1, [&] {
        struct statx info;
        if (statx(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW, STATX_TYPE, &info) != 0) {
            return NORVO_FAIL_ERRNO(errno);
        }
        const std::string target = ProbeTargetOf(path, info);
        struct statfs fs;
        switch (ProbeAclSupport(target.c_str(), &fs)) {
        case AclSupport::kSupported:
            return 1;
        case AclSupport::kUnsupported:
            return 0;
        case AclSupport::kFailed:
            break;
        }
        return NORVO_FAIL_ERRNO(errno);
    });
}

}  // extern "C"
