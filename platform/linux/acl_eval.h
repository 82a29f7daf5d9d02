// The kernel's permission decision, evaluated in user space from one statx and one read of the
// POSIX ACL: what generic_permission, may_delete and faccessat(AT_EACCESS) answer on the file
// systems whose inodes use the generic check (tmpfs, ext2/3/4, XFS). Everything else (FUSE,
// network and stacking file systems, btrfs with its read-only subvolumes, an active security
// module, ids this user namespace can't map) is left to the kernel itself: the callers ask
// faccessat there, so an answer is never a guess.
//
// What is cached, and for how long:
//  - nothing about the caller's identity: the file-system uid and gid, the supplementary groups
//    and the effective capabilities are read on every call (four system calls that walk no
//    path), so seteuid, setegid and setgroups take effect at once;
//  - per mount, for the life of the process: the file-system type, the read-only and no-exec
//    flags and whether POSIX ACLs are supported. Keyed by the kernel's unique mount id, which is
//    never reused (kernel 6.8 and later); without it nothing is cached and statfs runs per call.
//    A remount of an already-seen mount by this very process is not noticed;
//  - whether the security modules or the user namespace require the kernel's own answer: read
//    once per process.
#pragma once
#include <fcntl.h>
#include <stdint.h>
#include <sys/stat.h>
#include <sys/types.h>

#include <string>
#include <vector>

namespace norvo::platform::acl {

// The access bits of faccessat and of ACL entries.
enum : unsigned { kMayExec = 1, kMayWrite = 2, kMayRead = 4 };

// The caller as the kernel's permission checks see it.
struct Identity {
    uid_t fsuid = 0;
    gid_t fsgid = 0;
    std::vector<gid_t> groups;   // supplementary groups, sorted
    bool dacOverride = false;    // CAP_DAC_OVERRIDE
    bool dacReadSearch = false;  // CAP_DAC_READ_SEARCH
    bool fowner = false;         // CAP_FOWNER
    bool operator==(const Identity &other) const;
};

// Reads the identity of the calling thread. false with errno on failure.
bool ReadIdentity(Identity *identity);

// Whether fsgid or a supplementary group is gid (in_group_p).
bool InGroup(const Identity &identity, gid_t gid);

// One entry of a POSIX ACL, as the system.posix_acl_access attribute stores it.
struct AclEntry {
    uint16_t tag;
    uint16_t perm;
    uint32_t id;
};
using Acl = std::vector<AclEntry>;

// Decodes an attribute value. false when it is not a well-formed ACL (the kernel decides then).
bool ParseAcl(const void *value, size_t size, Acl *acl);

// The facts of one mount that the decision needs.
struct MountFacts {
    enum class Kind { kGeneric, kFuse, kKernel } kind = Kind::kKernel;
    bool readOnly = false;
    bool noExec = false;
    int aclSupport = -1;  // 1 yes, 0 no, -1 not known yet
};

// The statx mask to ask for so that LookupMount can key its cache.
unsigned MountIdMask();

// The facts of the mount holding the file info describes; probe is a path on that mount
// (statfs is asked there when the mount is new, or on every call without unique mount ids).
// false with errno when statfs fails.
bool LookupMount(const struct statx &info, const char *probe, MountFacts *facts);
// Records whether the mount of info supports POSIX ACLs (only cached for generic mounts).
void RememberAclSupport(const struct statx &info, bool supported);

// Whether the process or the entry need the kernel's own answer instead of this evaluation:
// an active security module that mediates inode permissions, or ids that this user namespace
// shows as the overflow id while not mapping every id.
bool NeedsKernel(const struct statx &info);

// The inode as the permission check sees it.
struct Inode {
    mode_t mode;
    uid_t uid;
    gid_t gid;
    bool immutable;
    const Acl *acl;  // null when the inode has none
};

// inode_permission + faccessat's read-only test for want (kMay* bits), on a mount with facts.
bool MayAccess(const Identity &who, const Inode &inode, const MountFacts &mount, unsigned want);

}  // namespace norvo::platform::acl
