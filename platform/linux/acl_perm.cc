// ACL permission masks of the caller. On the file systems whose inodes use the kernel's generic
// permission check, one statx and one read of system.posix_acl_access per path feed an exact
// user-space evaluation (acl_eval.h), and the facts of the parent directory that deletion needs
// are kept while the parent stays the same. Elsewhere the kernel judges: faccessat with
// AT_EACCESS applies the effective ids, supplementary groups, capabilities and POSIX ACLs
// exactly as an open or unlink would. Inside a directory pass the entry's statx, the caller's
// identity and the directory's facts are the pass's (dir_pass.h).
#include <errno.h>
#include <fcntl.h>
#include <linux/capability.h>
#include <linux/magic.h>
#include <sys/fsuid.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "acl_eval.h"
#include "api_guard.h"
#include "dir_pass.h"
#include "fs_path.h"
#include "quib_fs.h"

namespace norvo::platform {
namespace {

enum class Access { kGranted, kDenied, kFailed };

// Denials come as EACCES, EPERM (immutable files) or EROFS; anything else is a real failure,
// whose errno goes to *failure (when given) before another call can overwrite it.
Access Check(int dir, const char *path, int how, int flags, int *failure = nullptr) {
    if (faccessat(dir, path, how, AT_EACCESS | flags) == 0) {
        return Access::kGranted;
    }
    const int err = errno;
    if (err == EACCES || err == EPERM || err == EROFS || err == ETXTBSY) {
        return Access::kDenied;
    }
    if (failure != nullptr) {
        *failure = err;
    }
    return Access::kFailed;
}

Access Check(const char *path, int how, int flags) {
    return Check(AT_FDCWD, path, how, flags);
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

// The entry's own side of may_delete, for an entry named last in its directory: not immutable,
// append-only or a mount root, and not "." or ".." (what rmdir refuses).
bool EntryItselfMayGo(const struct statx &entry, std::string_view last) {
    return !HasAttribute(entry, STATX_ATTR_IMMUTABLE) && !HasAttribute(entry, STATX_ATTR_APPEND) &&
           !HasAttribute(entry, STATX_ATTR_MOUNT_ROOT) && last != "." && last != "..";
}

// The same for path, which must not be the root. True with the parent's path when all pass.
bool EntryMayGo(const char *path, const struct statx &entry, std::string *parent) {
    std::string_view last;
    return SplitLastComponent(path, parent, &last) && EntryItselfMayGo(entry, last);
}

// Whether unlink or rmdir of path would pass the kernel's may_delete: write and search on the
// directory, its append-only flag, the sticky bit, and the entry's own immutable, append-only
// and mount-root states.
bool MayDelete(const char *path, const struct statx &entry) {
    std::string parent;
    if (!EntryMayGo(path, entry, &parent)) {
        return false;
    }
    struct statx dir;
    if (statx(AT_FDCWD, parent.c_str(), 0, STATX_MODE | STATX_UID, &dir) != 0 ||
        HasAttribute(dir, STATX_ATTR_APPEND) || Check(parent.c_str(), W_OK | X_OK, 0) != Access::kGranted) {
        return false;
    }
    if ((dir.stx_mode & S_ISVTX) == 0) {
        return true;
    }
    const uid_t self = geteuid();
    return entry.stx_uid == self || dir.stx_uid == self || HasEffectiveCapability(CAP_FOWNER);
}

// The kernel's answer: faccessat for each bit (the reference for the evaluation below). The
// probe has already established ACL support. Inside a pass the entry is named in the pass's
// directory.
int KernelMask(const char *path, const struct statx &info, const acl::MountFacts &mount, unsigned int *mask,
               QUIBDirPass *pass, const char *name) {
    const int dir = pass != nullptr ? pass->dir.Get() : AT_FDCWD;
    const char *entry = pass != nullptr ? name : path;
    int failure = 0;  // the errno of the first check that failed
    const Access read = Check(dir, entry, R_OK, AT_SYMLINK_NOFOLLOW, &failure);
    const Access write =
        read == Access::kFailed ? read : Check(dir, entry, W_OK, AT_SYMLINK_NOFOLLOW, &failure);
    const Access exec =
        write == Access::kFailed ? write : Check(dir, entry, X_OK, AT_SYMLINK_NOFOLLOW, &failure);
    if (exec == Access::kFailed) {
        return NORVO_FAIL_ERRNO(failure);
    }
    const bool appendOnly = HasAttribute(info, STATX_ATTR_APPEND);
    unsigned int result = ACL_PERM_READ_ATTR | ACL_PERM_READ_ACL;
    if (read == Access::kGranted) {
        result |= ACL_PERM_READ | ACL_PERM_READ_XATTR;
    }
    if (write == Access::kGranted) {
        // An append-only file takes appends but refuses any other write.
        result |= ACL_PERM_APPEND | ACL_PERM_WRITE_XATTR |
                  (appendOnly ? 0u : static_cast<unsigned int>(ACL_PERM_WRITE));
        // One request for both: an ACL grants only what a single matching group entry
        // holds, so write and search may each pass alone and fail together.
        if (S_ISDIR(info.stx_mode) && exec == Access::kGranted && !appendOnly &&
            Check(dir, entry, W_OK | X_OK, AT_SYMLINK_NOFOLLOW) == Access::kGranted) {
            result |= ACL_PERM_DELETE_CHILD;
        }
    }
    if (exec == Access::kGranted) {
        result |= ACL_PERM_EXECUTE;
    }
    if (!mount.readOnly && !HasAttribute(info, STATX_ATTR_IMMUTABLE) && !appendOnly &&
        (info.stx_uid == static_cast<uid_t>(setfsuid(static_cast<uid_t>(-1))) ||
         HasEffectiveCapability(CAP_FOWNER))) {
        result |= ACL_PERM_WRITE_ATTR | ACL_PERM_WRITE_ACL | ACL_PERM_CHANGE_OWNER;
    }
    if (MayDelete(path, info)) {
        result |= ACL_PERM_DELETE;
    }
    *mask = result;
    return 0;
}

enum class AclRead { kNone, kFound, kUnsupported, kMalformed, kFailed };

// Reads the access ACL of path (follow: through a final link) into *acl; inside a pass, of the
// pass's entry name (never followed).
AclRead ReadAcl(const char *path, bool follow, acl::Acl *acl, QUIBDirPass *pass = nullptr,
                const char *name = nullptr) {
    char buffer[512];
    const auto get = [&](void *value, size_t size) {
        if (pass != nullptr) {
            return PassGetXattr(pass, name, path, "system.posix_acl_access", value, size);
        }
        return follow ? getxattr(path, "system.posix_acl_access", value, size)
                      : lgetxattr(path, "system.posix_acl_access", value, size);
    };
    ssize_t size = get(buffer, sizeof buffer);
    std::vector<char> large;
    while (size < 0 && errno == ERANGE) {  // a long ACL: ask its size, then read it
        size = get(nullptr, 0);
        if (size < 0)
            break;
        large.resize(static_cast<size_t>(size) + 64);
        size = get(large.data(), large.size());
    }
    if (size < 0) {
        return errno == ENODATA      ? AclRead::kNone
               : errno == EOPNOTSUPP ? AclRead::kUnsupported
                                     : AclRead::kFailed;
    }
    const void *value = large.empty() ? static_cast<const void *>(buffer) : large.data();
    return acl::ParseAcl(value, static_cast<size_t>(size), acl) ? AclRead::kFound : AclRead::kMalformed;
}

constexpr unsigned kInodeMask = STATX_TYPE | STATX_MODE | STATX_UID | STATX_GID;

// The statx of path itself (a final link not followed): the pass's when it has the entry. 0 or
// the errno.
int StatEntry(const char *path, QUIBDirPass *pass, const char *name, unsigned fields, struct statx *info) {
    if (pass != nullptr) {
        return PassEntryStat(pass, name, info);
    }
    return statx(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW, fields, info) == 0 ? 0 : errno;
}

// The parent facts deletion needs, kept per thread while the parent directory, its state (inode,
// change time, mount) and the caller stay the same: a listing asks once for all its entries.
struct ParentFacts {
    std::string path;
    uint32_t devMajor = 0, devMinor = 0;
    uint64_t ino = 0, mountId = 0;
    int64_t ctimeSec = 0;
    uint32_t ctimeNsec = 0;
    acl::Identity who;
    bool writeSearch = false;  // W and X together on the directory
    bool valid = false;
};

bool SameState(const ParentFacts &facts, const struct statx &dir) {
    return facts.valid && facts.devMajor == dir.stx_dev_major && facts.devMinor == dir.stx_dev_minor &&
           facts.ino == dir.stx_ino && facts.mountId == dir.stx_mnt_id &&
           facts.ctimeSec == dir.stx_ctime.tv_sec && facts.ctimeNsec == dir.stx_ctime.tv_nsec;
}

// Whether who may write and search the directory parent (through links, as unlink resolves it).
bool ParentWriteSearch(const char *parent, const struct statx &dir, const acl::Identity &who) {
    acl::MountFacts mount;
    acl::Acl entries;
    if (acl::LookupMount(dir, parent, &mount) && mount.kind == acl::MountFacts::Kind::kGeneric &&
        !acl::NeedsKernel(dir)) {
        const AclRead read = ReadAcl(parent, true, &entries);
        if (read == AclRead::kNone || read == AclRead::kFound || read == AclRead::kUnsupported) {
            const acl::Inode inode{dir.stx_mode, dir.stx_uid, dir.stx_gid,
                                   HasAttribute(dir, STATX_ATTR_IMMUTABLE),
                                   read == AclRead::kFound ? &entries : nullptr};
            return acl::MayAccess(who, inode, mount, acl::kMayWrite | acl::kMayExec);
        }
    }
    return Check(parent, W_OK | X_OK, 0) == Access::kGranted;
}

// The sticky directory's last word (check_sticky).
bool StickyAllows(const struct statx &dir, const struct statx &entry, const acl::Identity &who) {
    return (dir.stx_mode & S_ISVTX) == 0 || entry.stx_uid == who.fsuid || dir.stx_uid == who.fsuid ||
           who.fowner;
}

// MayDelete for an entry of a pass: the directory's facts are the pass's, judged once.
bool PassMayDelete(QUIBDirPass *pass, const char *name, const struct statx &entry, const acl::Identity &who) {
    if (!EntryItselfMayGo(entry, name)) {
        return false;
    }
    struct statx dir;
    if (PassDirStat(pass, &dir) != 0 || HasAttribute(dir, STATX_ATTR_APPEND)) {
        return false;
    }
    if (pass->dirWriteSearch < 0) {
        pass->dirWriteSearch = ParentWriteSearch(pass->dirPath.c_str(), dir, who) ? 1 : 0;
    }
    return pass->dirWriteSearch == 1 && StickyAllows(dir, entry, who);
}

// MayDelete, with the parent's facts evaluated once per parent.
bool FastMayDelete(const char *path, const struct statx &entry, const acl::Identity &who) {
    std::string parent;
    if (!EntryMayGo(path, entry, &parent)) {
        return false;
    }
    struct statx dir;
    if (statx(AT_FDCWD, parent.c_str(), 0, kInodeMask | STATX_INO | STATX_CTIME | acl::MountIdMask(), &dir) !=
            0 ||
        HasAttribute(dir, STATX_ATTR_APPEND)) {
        return false;
    }
    thread_local ParentFacts facts;
    if (!(SameState(facts, dir) && facts.path == parent && facts.who == who)) {
        facts.valid = false;
        facts.writeSearch = ParentWriteSearch(parent.c_str(), dir, who);
        facts.path = parent;
        facts.devMajor = dir.stx_dev_major;
        facts.devMinor = dir.stx_dev_minor;
        facts.ino = dir.stx_ino;
        facts.mountId = dir.stx_mnt_id;
        facts.ctimeSec = dir.stx_ctime.tv_sec;
        facts.ctimeNsec = dir.stx_ctime.tv_nsec;
        facts.who = who;
        // Without a unique mount id the cache would not see a remount: keep nothing then.
        facts.valid = (dir.stx_mask & acl::MountIdMask()) != 0;
    }
    return facts.writeSearch && StickyAllows(dir, entry, who);
}

// The mask from the evaluation: the same bits, in the same way, as KernelMask.
// Inside a pass (pass and name set) the identity and the directory's facts are the pass's.
int EvaluatedMask(const char *path, const struct statx &info, const acl::MountFacts &mount,
                  const acl::Acl *entries, unsigned int *mask, QUIBDirPass *pass, const char *name) {
    acl::Identity own;
    const acl::Identity *identity = &own;
    if (pass != nullptr) {
        identity = PassIdentity(pass);
        if (identity == nullptr) {
            return NORVO_FAIL_ERRNO(errno);
        }
    } else if (!acl::ReadIdentity(&own)) {
        return NORVO_FAIL_ERRNO(errno);
    }
    const acl::Identity &who = *identity;
    const bool immutable = HasAttribute(info, STATX_ATTR_IMMUTABLE);
    const bool appendOnly = HasAttribute(info, STATX_ATTR_APPEND);
    const acl::Inode inode{info.stx_mode, info.stx_uid, info.stx_gid, immutable, entries};
    const auto may = [&](unsigned want) { return acl::MayAccess(who, inode, mount, want); };
    const bool write = may(acl::kMayWrite);
    const bool exec = may(acl::kMayExec);
    unsigned int result = ACL_PERM_READ_ATTR | ACL_PERM_READ_ACL;
    if (may(acl::kMayRead)) {
        result |= ACL_PERM_READ | ACL_PERM_READ_XATTR;
    }
    if (write) {
        result |= ACL_PERM_APPEND | ACL_PERM_WRITE_XATTR |
                  (appendOnly ? 0u : static_cast<unsigned int>(ACL_PERM_WRITE));
        if (S_ISDIR(info.stx_mode) && exec && !appendOnly && may(acl::kMayWrite | acl::kMayExec)) {
            result |= ACL_PERM_DELETE_CHILD;
        }
    }
    if (exec) {
        result |= ACL_PERM_EXECUTE;
    }
    if (!mount.readOnly && !immutable && !appendOnly && (info.stx_uid == who.fsuid || who.fowner)) {
        result |= ACL_PERM_WRITE_ATTR | ACL_PERM_WRITE_ACL | ACL_PERM_CHANGE_OWNER;
    }
    if (pass != nullptr ? PassMayDelete(pass, name, info, who) : FastMayDelete(path, info, who)) {
        result |= ACL_PERM_DELETE;
    }
    *mask = result;
    return 0;
}

// A link is no file to read, write or run, and its own mode (0777) grants nothing: it has
// attributes to look at and a name that may go.
int LinkMask(const char *path, const struct statx &info, unsigned int *mask, QUIBDirPass *pass,
             const char *name) {
    acl::Identity own;
    const acl::Identity *who = &own;
    if (pass != nullptr) {
        who = PassIdentity(pass);
        if (who == nullptr) {
            return NORVO_FAIL_ERRNO(errno);
        }
    } else if (!acl::ReadIdentity(&own)) {
        return NORVO_FAIL_ERRNO(errno);
    }
    unsigned int result = ACL_PERM_READ_ATTR | ACL_PERM_READ_ACL;
    if (pass != nullptr ? PassMayDelete(pass, name, info, *who) : FastMayDelete(path, info, *who)) {
        result |= ACL_PERM_DELETE;
    }
    *mask = result;
    return 0;
}

// Whether the file system of info supports POSIX ACLs: 1, 0, or -1 with errno. target is a
// path on it that can carry an ACL (the directory holding a link).
int AclSupportOf(const struct statx &info, const char *target, acl::MountFacts *mount, bool follow = false) {
    if (!acl::LookupMount(info, target, mount)) {
        return -1;
    }
    // FUSE file systems pass ACL attributes through to their server unless it negotiated POSIX
    // ACLs, which nothing outside the kernel can see; so the kernel enforces no ACL there and an
    // empty answer ("no ACL") proves nothing. Every other file system answers EOPNOTSUPP itself.
    if (mount->kind == acl::MountFacts::Kind::kFuse) {
        return 0;
    }
    if (mount->aclSupport >= 0) {
        return mount->aclSupport;
    }
    const ssize_t size = follow ? getxattr(target, "system.posix_acl_access", nullptr, 0)
                                : lgetxattr(target, "system.posix_acl_access", nullptr, 0);
    if (size >= 0 || errno == ENODATA) {
        acl::RememberAclSupport(info, true);
        return 1;
    }
    if (errno != EOPNOTSUPP) {
        return -1;
    }
    acl::RememberAclSupport(info, false);
    return 0;
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
        const char *name = nullptr;
        QUIBDirPass *pass = PassOf(path, &name);
        struct statx info;
        if (const int err = StatEntry(path, pass, name, kInodeMask | acl::MountIdMask(), &info); err != 0) {
            return NORVO_FAIL_ERRNO(err);
        }
        const bool link = S_ISLNK(info.stx_mode);
        const std::string target = link ? ProbeTargetOf(path, info) : std::string();
        const char *probe = link ? target.c_str() : path;
        acl::MountFacts mount;
        if (!acl::LookupMount(info, probe, &mount)) {
            return NORVO_FAIL_ERRNO(errno);
        }
        const bool generic = mount.kind == acl::MountFacts::Kind::kGeneric && !acl::NeedsKernel(info);
        acl::Acl entries;
        AclRead read = AclRead::kNone;
        if (link || !generic) {
            // A link carries no ACL; the kernel's path only needs the support answer.
            switch (AclSupportOf(info, probe, &mount)) {
                case 1:
                    break;
                case 0:
                    QUIB_SET_ERR(QUIB_ERR_ACL_NOT_SUPPORTED);
                    return -1;
                default:
                    return NORVO_FAIL_ERRNO(errno);
            }
        } else {
            read = ReadAcl(path, false, &entries, pass, name);
            switch (read) {
                case AclRead::kNone:
                case AclRead::kFound:
                case AclRead::kMalformed:
                    acl::RememberAclSupport(info, true);
                    break;
                case AclRead::kUnsupported:
                    acl::RememberAclSupport(info, false);
                    QUIB_SET_ERR(QUIB_ERR_ACL_NOT_SUPPORTED);
                    return -1;
                case AclRead::kFailed:
                    return NORVO_FAIL_ERRNO(errno);
            }
        }
        if (link) {
            return LinkMask(path, info, mask, pass, name);
        }
        if (!generic || read == AclRead::kMalformed) {
            return KernelMask(path, info, mount, mask, pass, name);
        }
        return EvaluatedMask(path, info, mount, read == AclRead::kFound ? &entries : nullptr, mask, pass,
                             name);
    });
}

int QUIBACLIsSupport(const char *path, int fd, int flags) {
    (void)flags;  // reserved: no bit changes the answer
    if (fd < 0) {
        if (const int err = CheckPathArgument(path)) {
            return NORVO_FAIL_ERRNO(err);
        }
    }
    return Guarded(-1, [&] {
        struct statx info;
        if (fd >= 0) {
            if (statx(fd, "", AT_EMPTY_PATH, STATX_TYPE | acl::MountIdMask(), &info) != 0) {
                return NORVO_FAIL_ERRNO(errno);
            }
        } else {
            const char *name = nullptr;
            QUIBDirPass *pass = PassOf(path, &name);
            if (const int err = StatEntry(path, pass, name, STATX_TYPE | acl::MountIdMask(), &info);
                err != 0) {
                return NORVO_FAIL_ERRNO(err);
            }
        }
        std::string target;
        if (fd >= 0) {
            if (S_ISLNK(info.stx_mode)) {
                return NORVO_FAIL_ERRNO(EINVAL);  // a link's directory is not known from its descriptor
            }
            target = "/proc/self/fd/" + std::to_string(fd);  // names the open file itself
        } else {
            target = ProbeTargetOf(path, info);
        }
        acl::MountFacts mount;
        const int supported = AclSupportOf(info, target.c_str(), &mount, fd >= 0);
        return supported >= 0 ? supported : NORVO_FAIL_ERRNO(errno);
    });
}

}  // extern "C"
