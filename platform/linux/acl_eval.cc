// User-space evaluation of the kernel's generic permission check (fs/namei.c:
// acl_permission_check, generic_permission, inode_permission; fs/posix_acl.c:
// posix_acl_permission) and of faccessat's extra tests (fs/open.c: do_faccessat).
#include "acl_eval.h"

#include <errno.h>
#include <fcntl.h>
#include <linux/capability.h>
#include <linux/magic.h>
#include <stdio.h>
#include <string.h>
#include <sys/fsuid.h>
#include <sys/statfs.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <mutex>
#include <unordered_map>

namespace norvo::platform::acl {
namespace {

// The tags of the POSIX ACL attribute (include/uapi/linux/posix_acl.h).
constexpr uint16_t kUserObj = 0x01, kUser = 0x02, kGroupObj = 0x04, kGroup = 0x08, kMask = 0x10,
                   kOther = 0x20;
constexpr uint32_t kAclVersion = 0x0002;

// Unique mount ids (never reused) came with Linux 6.8.
#ifndef STATX_MNT_ID_UNIQUE
#define STATX_MNT_ID_UNIQUE 0x00004000U
#endif
#ifndef STATX_MNT_ID
#define STATX_MNT_ID 0x00001000U
#endif

bool HasCapability(const __user_cap_data_struct *data, int capability) {
    return (data[capability / 32].effective & (1u << (capability % 32))) != 0;
}

std::string ReadSmallFile(const char *path) {
    char buffer[512];
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return {};
    const ssize_t got = read(fd, buffer, sizeof buffer - 1);
    close(fd);
    return got > 0 ? std::string(buffer, static_cast<size_t>(got)) : std::string();
}

// Facts of the process read once: whether a security module may veto inode permissions, and
// how this user namespace maps ids.
struct ProcessFacts {
    bool securityModule = false;
    bool allIdsMapped = true;
    uid_t overflowUid = 65534;
    gid_t overflowGid = 65534;
};

const ProcessFacts &Process() {
    static const ProcessFacts facts = [] {
        ProcessFacts f;
        const std::string lsm = ReadSmallFile("/sys/kernel/security/lsm");
        for (const char *name : {"selinux", "smack", "tomoyo"}) {
            if (lsm.find(name) != std::string::npos)
                f.securityModule = true;
        }
        if (access("/sys/fs/selinux/enforce", F_OK) == 0 || access("/sys/fs/smackfs", F_OK) == 0) {
            f.securityModule = true;
        }
        // AppArmor mediates only confined processes.
        const std::string profile = ReadSmallFile("/proc/self/attr/apparmor/current");
        if (!profile.empty() && profile.rfind("unconfined", 0) != 0)
            f.securityModule = true;
        const auto fullMap = [](const std::string &map) {
            unsigned long inside = 1, outside = 1, count = 0;
            return sscanf(map.c_str(), "%lu %lu %lu", &inside, &outside, &count) == 3 && inside == 0 &&
                   outside == 0 && count == 4294967295UL && map.find('\n') + 1 == map.size();
        };
        f.allIdsMapped =
            fullMap(ReadSmallFile("/proc/self/uid_map")) && fullMap(ReadSmallFile("/proc/self/gid_map"));
        const std::string uid = ReadSmallFile("/proc/sys/kernel/overflowuid");
        const std::string gid = ReadSmallFile("/proc/sys/kernel/overflowgid");
        if (!uid.empty())
            f.overflowUid = static_cast<uid_t>(strtoul(uid.c_str(), nullptr, 10));
        if (!gid.empty())
            f.overflowGid = static_cast<gid_t>(strtoul(gid.c_str(), nullptr, 10));
        return f;
    }();
    return facts;
}

std::mutex g_mountsLock;
std::unordered_map<uint64_t, MountFacts> g_mounts;  // by unique mount id

bool UniqueMountId(const struct statx &info) {
    return (info.stx_mask & STATX_MNT_ID_UNIQUE) != 0;
}

bool ReadMount(const char *probe, MountFacts *facts) {
    struct statfs fs;
    if (statfs(probe, &fs) != 0)
        return false;
    switch (static_cast<unsigned long>(fs.f_type)) {
        case TMPFS_MAGIC:
        case EXT4_SUPER_MAGIC:  // also ext2 and ext3
        case XFS_SUPER_MAGIC:
            facts->kind = MountFacts::Kind::kGeneric;
            break;
        case FUSE_SUPER_MAGIC:
            facts->kind = MountFacts::Kind::kFuse;
            break;
        default:
            facts->kind = MountFacts::Kind::kKernel;
            break;
    }
    facts->readOnly = (fs.f_flags & ST_RDONLY) != 0;
    facts->noExec = (fs.f_flags & ST_NOEXEC) != 0;
    facts->aclSupport = -1;
    return true;
}

// posix_acl_permission: true granted, false EACCES.
bool AclGrants(const Identity &who, const Inode &inode, unsigned want) {
    const Acl &acl = *inode.acl;
    bool found = false;
    for (size_t i = 0; i < acl.size(); ++i) {
        const AclEntry &entry = acl[i];
        const AclEntry *matched = nullptr;
        switch (entry.tag) {
            case kUserObj:
                if (inode.uid == who.fsuid)
                    return (entry.perm & want) == want;
                break;
            case kUser:
                if (entry.id == who.fsuid)
                    matched = &entry;
                break;
            case kGroupObj:
                if (InGroup(who, inode.gid)) {
                    found = true;
                    if ((entry.perm & want) == want)
                        matched = &entry;
                }
                break;
            case kGroup:
                if (InGroup(who, entry.id)) {
                    found = true;
                    if ((entry.perm & want) == want)
                        matched = &entry;
                }
                break;
            case kMask:
                break;
            case kOther:
                return !found && (entry.perm & want) == want;
            default:
                return false;  // ParseAcl admits no other tag
        }
        if (matched != nullptr) {
            for (size_t m = i + 1; m < acl.size(); ++m) {
                if (acl[m].tag == kMask)
                    return (matched->perm & acl[m].perm & want) == want;
            }
            return (matched->perm & want) == want;
        }
    }
    return false;  // no ACL_OTHER: the kernel answers EIO
}

// acl_permission_check: true granted, false EACCES (the capabilities come after).
bool ModeGrants(const Identity &who, const Inode &inode, unsigned want) {
    unsigned mode = inode.mode;
    if (inode.uid == who.fsuid) {
        return (want & ~(mode >> 6) & 7) == 0;
    }
    if (inode.acl != nullptr && (mode & S_IRWXG) != 0) {
        return AclGrants(who, inode, want);
    }
    if ((want & (mode ^ (mode >> 3))) != 0 && InGroup(who, inode.gid)) {
        mode >>= 3;
    }
    return (want & ~mode & 7) == 0;
}

// generic_permission. The capabilities count only for inodes whose ids this user namespace
// maps (capable_wrt_inode_uidgid): NeedsKernel sends the others to the kernel.
bool GenericGrants(const Identity &who, const Inode &inode, unsigned want) {
    if (ModeGrants(who, inode, want))
        return true;
    if (S_ISDIR(inode.mode)) {
        if ((want & kMayWrite) == 0 && who.dacReadSearch)
            return true;
        return who.dacOverride;
    }
    if (want == kMayRead && who.dacReadSearch)
        return true;
    if ((want & kMayExec) == 0 || (inode.mode & (S_IXUSR | S_IXGRP | S_IXOTH)) != 0) {
        return who.dacOverride;
    }
    return false;
}

}  // namespace

bool Identity::operator==(const Identity &other) const {
    return fsuid == other.fsuid && fsgid == other.fsgid && groups == other.groups &&
           dacOverride == other.dacOverride && dacReadSearch == other.dacReadSearch && fowner == other.fowner;
}

bool ReadIdentity(Identity *identity) {
    // setfsuid and setfsgid with an invalid id change nothing and return the current ids.
    identity->fsuid = static_cast<uid_t>(setfsuid(static_cast<uid_t>(-1)));
    identity->fsgid = static_cast<gid_t>(setfsgid(static_cast<gid_t>(-1)));
    gid_t groups[64];
    int count = getgroups(64, groups);
    if (count >= 0) {
        identity->groups.assign(groups, groups + count);
    } else {
        if (errno != EINVAL)
            return false;
        for (;;) {  // more than 64 groups: ask the size, then read them
            count = getgroups(0, nullptr);
            if (count < 0)
                return false;
            identity->groups.resize(static_cast<size_t>(count) + 1);
            const int got = getgroups(count + 1, identity->groups.data());
            if (got >= 0) {
                identity->groups.resize(static_cast<size_t>(got));
                break;
            }
            if (errno != EINVAL)
                return false;
        }
    }
    std::sort(identity->groups.begin(), identity->groups.end());
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct data[_LINUX_CAPABILITY_U32S_3] = {};
    if (syscall(SYS_capget, &header, data) != 0)
        return false;
    identity->dacOverride = HasCapability(data, CAP_DAC_OVERRIDE);
    identity->dacReadSearch = HasCapability(data, CAP_DAC_READ_SEARCH);
    identity->fowner = HasCapability(data, CAP_FOWNER);
    return true;
}

bool InGroup(const Identity &identity, gid_t gid) {
    return gid == identity.fsgid || std::binary_search(identity.groups.begin(), identity.groups.end(), gid);
}

bool ParseAcl(const void *value, size_t size, Acl *acl) {
    acl->clear();
    if (size < 4 || (size - 4) % 8 != 0)
        return false;
    const auto *bytes = static_cast<const unsigned char *>(value);
    uint32_t version;
    memcpy(&version, bytes, 4);
    if (version != kAclVersion)
        return false;
    uint16_t lastTag = 0;
    for (size_t offset = 4; offset < size; offset += 8) {
        AclEntry entry;
        memcpy(&entry.tag, bytes + offset, 2);
        memcpy(&entry.perm, bytes + offset + 2, 2);
        memcpy(&entry.id, bytes + offset + 4, 4);
        switch (entry.tag) {
            case kUserObj:
            case kUser:
            case kGroupObj:
            case kGroup:
            case kMask:
            case kOther:
                break;
            default:
                return false;
        }
        if (entry.tag < lastTag)
            return false;  // the kernel keeps them in tag order
        lastTag = entry.tag;
        acl->push_back(entry);
    }
    return !acl->empty() && acl->back().tag == kOther;
}

unsigned MountIdMask() {
    return STATX_MNT_ID_UNIQUE;
}

bool LookupMount(const struct statx &info, const char *probe, MountFacts *facts) {
    if (!UniqueMountId(info))
        return ReadMount(probe, facts);
    {
        std::lock_guard<std::mutex> hold(g_mountsLock);
        const auto found = g_mounts.find(info.stx_mnt_id);
        if (found != g_mounts.end()) {
            *facts = found->second;
            return true;
        }
    }
    if (!ReadMount(probe, facts))
        return false;
    std::lock_guard<std::mutex> hold(g_mountsLock);
    g_mounts.emplace(info.stx_mnt_id, *facts);
    return true;
}

void RememberAclSupport(const struct statx &info, bool supported) {
    if (!UniqueMountId(info))
        return;
    std::lock_guard<std::mutex> hold(g_mountsLock);
    const auto found = g_mounts.find(info.stx_mnt_id);
    if (found != g_mounts.end() && found->second.kind == MountFacts::Kind::kGeneric) {
        found->second.aclSupport = supported ? 1 : 0;
    }
}

bool NeedsKernel(const struct statx &info) {
    const ProcessFacts &process = Process();
    if (process.securityModule)
        return true;
    return !process.allIdsMapped &&
           (info.stx_uid == process.overflowUid || info.stx_gid == process.overflowGid);
}

bool MayAccess(const Identity &who, const Inode &inode, const MountFacts &mount, unsigned want) {
    const bool special = !S_ISREG(inode.mode) && !S_ISDIR(inode.mode) && !S_ISLNK(inode.mode);
    if ((want & kMayExec) != 0 && S_ISREG(inode.mode) && mount.noExec)
        return false;
    if ((want & kMayWrite) != 0) {
        if (mount.readOnly && !special)
            return false;  // EROFS (sb_permission, mnt read-only)
        if (inode.immutable)
            return false;  // EPERM
    }
    return GenericGrants(who, inode, want);
}

}  // namespace norvo::platform::acl
