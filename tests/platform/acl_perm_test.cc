// ACL permission masks, judged as a real user by the kernel: modes, POSIX ACL entries, the
// sticky bit, read-only and attribute-flagged files, and file systems without ACLs.
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <linux/fs.h>
#include <spawn.h>
#include <stdio.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_fs.h"
#include "vlibc_err.h"

extern char **environ;

namespace {

using norvo::testing::Appliance;

// Open descriptors of this process, to prove every path releases what it opened.
int OpenDescriptors() {
    int count = 0;
    if (DIR *dir = opendir("/proc/self/fd")) {
        while (readdir(dir) != nullptr) {
            ++count;
        }
        closedir(dir);
    }
    return count;
}

constexpr unsigned kAlways = ACL_PERM_READ_ATTR | ACL_PERM_READ_ACL;
constexpr unsigned kRead = ACL_PERM_READ | ACL_PERM_READ_XATTR;
constexpr unsigned kWrite = ACL_PERM_WRITE | ACL_PERM_APPEND | ACL_PERM_WRITE_XATTR;
constexpr unsigned kOwner = ACL_PERM_WRITE_ATTR | ACL_PERM_WRITE_ACL | ACL_PERM_CHANGE_OWNER;

// setfacl -m entries path; true when it succeeded.
bool SetAcl(const std::string &path, const std::string &entries) {
    const char *argv[] = {"setfacl", "-m", entries.c_str(), path.c_str(), nullptr};
    pid_t pid = 0;
    if (posix_spawnp(&pid, "setfacl", nullptr, nullptr, const_cast<char **>(argv), environ) != 0) {
        return false;
    }
    int status = 0;
    return waitpid(pid, &status, 0) == pid && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

// The mask of path as seen by user, or -1 - the error slot when the call failed.
long MaskAs(Appliance &appliance, const std::string &user, const std::string &path) {
    // RunAs results travel in -100..100: send the mask 6 bits at a time.
    long mask = 0;
    for (int shift = 0; shift < 14; shift += 6) {
        const int part = appliance.RunAs(user, [&] {
            unsigned m = 0;
            if (QUIBACLPermGet(path.c_str(), &m) != 0) {
                return -1;
            }
            return static_cast<int>((m >> shift) & 0x3F);
        });
        if (part < 0) {
            return -1;
        }
        mask |= static_cast<long>(part) << shift;
    }
    return mask;
}

// Whether the call fails as user, leaving the mask untouched and code in the error slot.
bool FailsAs(Appliance &appliance, const std::string &user, const std::string &path, int code) {
    return appliance.RunAs(user, [&] {
        unsigned m = 0x5A5A;
        return QUIBACLPermGet(path.c_str(), &m) == -1 && m == 0x5A5A && VLIBCErrGet() == code ? 1 : 0;
    }) == 1;
}

class AclPerm : public ::testing::Test {
protected:
    AclPerm() {
        appliance_.Basic();
        appliance_.MakeDir("/volume1/s", "root", 0777);
    }
    Appliance appliance_;
};

TEST_F(AclPerm, ModesDecideForAnOrdinaryUser) {
    appliance_.WriteFile("/volume1/s/own", "x", "alice", 0600);
    appliance_.WriteFile("/volume1/s/group", "x", "root:staff", 0640);
    appliance_.WriteFile("/volume1/s/closed", "x", "root", 0600);
    appliance_.WriteFile("/volume1/s/tool", "x", "root", 0755);
    appliance_.MakeDir("/volume1/s/dir", "alice", 0755);
    appliance_.MakeDir("/volume1/s/rootdir", "root", 0755);
    const unsigned del = ACL_PERM_DELETE;
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/own"), kAlways | kRead | kWrite | kOwner | del);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/group"), kAlways | kRead | del);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/closed"), kAlways | del);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/tool"), kAlways | kRead | ACL_PERM_EXECUTE | del);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/dir"),
              kAlways | kRead | kWrite | ACL_PERM_EXECUTE | ACL_PERM_DELETE_CHILD | kOwner | del);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/rootdir"), kAlways | kRead | ACL_PERM_EXECUTE | del);
}

TEST_F(AclPerm, AclEntriesAndTheirMaskCount) {
    appliance_.WriteFile("/volume1/s/shared", "x", "root", 0600);
    ASSERT_TRUE(SetAcl("/volume1/s/shared", "u:alice:rw-"));
    appliance_.WriteFile("/volume1/s/masked", "x", "root", 0600);
    ASSERT_TRUE(SetAcl("/volume1/s/masked", "u:alice:rwx,m::r--"));
    appliance_.MakeDir("/volume1/s/team", "root", 0700);
    ASSERT_TRUE(SetAcl("/volume1/s/team", "g:staff:r-x"));
    appliance_.WriteFile("/volume1/s/denied", "x", "root", 0666);
    ASSERT_TRUE(SetAcl("/volume1/s/denied", "u:alice:---"));
    // alice is in both groups; each grants half of what removing an entry takes.
    appliance_.MakeDir("/volume1/s/split", "root", 0700);
    ASSERT_TRUE(SetAcl("/volume1/s/split", "g:staff:-w-,g:users:--x"));

    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/shared"), kAlways | kRead | kWrite | ACL_PERM_DELETE);
    EXPECT_EQ(MaskAs(appliance_, "bob", "/volume1/s/shared"), kAlways | ACL_PERM_DELETE);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/masked"), kAlways | kRead | ACL_PERM_DELETE);
    EXPECT_EQ(MaskAs(appliance_, "bob", "/volume1/s/team"), kAlways | kRead | ACL_PERM_EXECUTE | ACL_PERM_DELETE);
    EXPECT_EQ(MaskAs(appliance_, "admin", "/volume1/s/team"), kAlways | ACL_PERM_DELETE);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/denied"), kAlways | ACL_PERM_DELETE);
    EXPECT_EQ(MaskAs(appliance_, "bob", "/volume1/s/denied"), kAlways | kRead | kWrite | ACL_PERM_DELETE);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/s/split"), kAlways | kWrite | ACL_PERM_EXECUTE | ACL_PERM_DELETE);
}

TEST_F(AclPerm, TheStickyBitKeepsOthersFilesFromDeletion) {
    appliance_.MakeDir("/volume1/drop", "root", 01777);
    appliance_.WriteFile("/volume1/drop/bobs", "x", "bob", 0666);
    appliance_.WriteFile("/volume1/drop/alices", "x", "alice", 0600);
    appliance_.MakeDir("/volume1/alicedrop", "alice", 01777);
    appliance_.WriteFile("/volume1/alicedrop/bobs", "x", "bob", 0600);

    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/drop/bobs"), kAlways | kRead | kWrite);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/drop/alices") & ACL_PERM_DELETE, ACL_PERM_DELETE);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/alicedrop/bobs"), kAlways | ACL_PERM_DELETE);
    unsigned mask = 0;
    ASSERT_EQ(QUIBACLPermGet("/volume1/drop/bobs", &mask), 0);
    EXPECT_EQ(mask & ACL_PERM_DELETE, ACL_PERM_DELETE) << "root holds CAP_FOWNER";
}

TEST_F(AclPerm, TheParentDecidesDeletion) {
    appliance_.MakeDir("/volume1/locked", "alice", 0555);
    appliance_.WriteFile("/volume1/locked/mine", "x", "alice", 0600);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/locked/mine"), kAlways | kRead | kWrite | kOwner);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/locked/mine/"), -1);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume1/locked/."), kAlways | kRead | ACL_PERM_EXECUTE | kOwner);
}

TEST_F(AclPerm, RootHoldsAllButExecuteOfPlainFiles) {
    appliance_.WriteFile("/volume1/s/nothing", "x", "bob", 0000);
    appliance_.MakeDir("/volume1/s/emptydir", "bob", 0000);
    unsigned mask = 0;
    ASSERT_EQ(QUIBACLPermGet("/volume1/s/nothing", &mask), 0);
    EXPECT_EQ(mask, ACL_PERM_ALL & ~(ACL_PERM_EXECUTE | ACL_PERM_DELETE_CHILD));
    ASSERT_EQ(QUIBACLPermGet("/volume1/s/emptydir", &mask), 0);
    EXPECT_EQ(mask, static_cast<unsigned>(ACL_PERM_ALL));
    // A mount root can't be removed, not even by root.
    ASSERT_EQ(QUIBACLPermGet("/volume1", &mask), 0);
    EXPECT_EQ(mask, ACL_PERM_ALL & ~ACL_PERM_DELETE);
    ASSERT_EQ(QUIBACLPermGet("/", &mask), 0);
    EXPECT_EQ(mask & ACL_PERM_DELETE, 0u);
}

// A read-only volume is no error: the mask just lacks every writing bit.
TEST_F(AclPerm, AReadOnlyVolumeTakesTheWritingBitsAway) {
    appliance_.WriteFile("/volume2/file", "x", "alice", 0666);
    appliance_.MakeDir("/volume2/dir", "alice", 0777);
    appliance_.RemountReadOnly("/volume2");
    unsigned mask = 0;
    ASSERT_EQ(QUIBACLPermGet("/volume2/file", &mask), 0);
    EXPECT_EQ(mask, kAlways | kRead);
    ASSERT_EQ(QUIBACLPermGet("/volume2/dir", &mask), 0);
    EXPECT_EQ(mask, kAlways | kRead | ACL_PERM_EXECUTE);
    EXPECT_EQ(MaskAs(appliance_, "alice", "/volume2/file"), kAlways | kRead);
}

TEST_F(AclPerm, AppendOnlyAndImmutableFilesAreHonoured) {
    appliance_.WriteFile("/volume1/s/log", "x", "root", 0666);
    appliance_.WriteFile("/volume1/s/frozen", "x", "root", 0666);
    for (const auto &[path, flag] : {std::pair{"/volume1/s/log", FS_APPEND_FL}, std::pair{"/volume1/s/frozen", FS_IMMUTABLE_FL}}) {
        const int fd = open(path, O_RDONLY | O_CLOEXEC);
        ASSERT_GE(fd, 0);
        int flags = 0;
        const bool set = ioctl(fd, FS_IOC_GETFLAGS, &flags) == 0 &&
                         (flags |= static_cast<int>(flag), ioctl(fd, FS_IOC_SETFLAGS, &flags) == 0);
        close(fd);
        if (!set) {
            GTEST_SKIP() << "the volume's file system takes no attribute flags";
        }
    }
    unsigned mask = 0;
    ASSERT_EQ(QUIBACLPermGet("/volume1/s/log", &mask), 0);
    EXPECT_EQ(mask, kAlways | kRead | ACL_PERM_APPEND | ACL_PERM_WRITE_XATTR);
    ASSERT_EQ(QUIBACLPermGet("/volume1/s/frozen", &mask), 0);
    EXPECT_EQ(mask, kAlways | kRead);
}

TEST_F(AclPerm, LookupFailuresGetTheirOwnCodes) {
    appliance_.WriteFile("/volume1/s/file", "x", "root", 0644);
    appliance_.MakeDir("/volume1/private", "root", 0700);
    appliance_.WriteFile("/volume1/private/inside", "x", "root", 0644);
    EXPECT_TRUE(FailsAs(appliance_, "alice", "/volume1/s/missing", QUIB_ERR_NO_SUCH_FILE));
    EXPECT_TRUE(FailsAs(appliance_, "alice", "/volume1/s/file/x", QUIB_ERR_NO_SUCH_PATH));
    EXPECT_TRUE(FailsAs(appliance_, "alice", "/volume1/private/inside", QUIB_ERR_ACCESS_DENIED));
    EXPECT_TRUE(FailsAs(appliance_, "alice", "/volume1/" + std::string(PATH_MAX, 'a'), QUIB_ERR_NAME_TOO_LONG));
    EXPECT_TRUE(FailsAs(appliance_, "alice", "", QUIB_ERR_BAD_PARAMETER));

    unsigned mask = 0;
    EXPECT_EQ(QUIBACLPermGet(nullptr, &mask), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QUIBACLPermGet("/volume1/s/file", nullptr), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QUIBACLIsSupport(nullptr), -1);
    EXPECT_EQ(QUIBACLIsSupport("/volume1/s/missing"), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_FILE);
    // Names are bytes: one that is not UTF-8 is looked up like any other.
    EXPECT_EQ(QUIBACLPermGet("/volume1/s/\xff\xfe", &mask), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_FILE);
}

TEST_F(AclPerm, FatHasNoAcls) {
    appliance_.MountFat("/volume2/usb");
    const int fd = open("/volume2/usb/photo.jpg", O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
    ASSERT_GE(fd, 0);
    close(fd);
    unsigned mask = 0x5A5A;
    EXPECT_EQ(QUIBACLPermGet("/volume2/usb/photo.jpg", &mask), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACL_NOT_SUPPORTED);
    EXPECT_EQ(mask, 0x5A5Au);
    EXPECT_EQ(QUIBACLPermGet("/volume2/usb", &mask), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACL_NOT_SUPPORTED);
    EXPECT_EQ(QUIBACLIsSupport("/volume2/usb/photo.jpg"), 0);
    EXPECT_EQ(QUIBACLIsSupport("/volume2/usb"), 0);
    EXPECT_EQ(QUIBACLIsSupport("/volume2"), 1);
}

// A link has no ACL of its own; the directory holding it speaks for the file system.
TEST_F(AclPerm, ALinkIsJudgedItselfNotFollowed) {
    appliance_.MountFat("/volume2/usb");
    ASSERT_EQ(symlink("/volume2/usb", "/volume1/s/tousb"), 0);
    ASSERT_EQ(symlink("/volume1/s/nowhere", "/volume1/s/dangling"), 0);
    EXPECT_EQ(QUIBACLIsSupport("/volume1/s/tousb"), 1);
    EXPECT_EQ(QUIBACLIsSupport("/volume1/s/dangling"), 1);
    unsigned mask = 0;
    EXPECT_EQ(QUIBACLPermGet("/volume1/s/dangling", &mask), 0);
    EXPECT_EQ(mask & ACL_PERM_DELETE, ACL_PERM_DELETE);
}

TEST_F(AclPerm, ALostNetworkShareFailsAsAnIoError) {
    appliance_.MountDeadRemote("/volume1/remote");
    unsigned mask = 0;
    EXPECT_EQ(QUIBACLPermGet("/volume1/remote/a.txt", &mask), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_FAILED);
    EXPECT_EQ(QUIBACLPermGet("/volume1/remote", &mask), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_FAILED);
    EXPECT_EQ(QUIBACLIsSupport("/volume1/remote/a.txt"), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_FAILED);
}

// Generated trees of modes, owners, groups, ACLs and sticky directories; every bit that an
// operation can prove is compared with that operation actually tried by the same user.
struct Entry {
    std::string path;
    bool isDir;
};

int CountDisagreements(const std::vector<Entry> &entries) {
    // An entry below a directory the user can't search has no mask; the kernel must agree.
    constexpr unsigned kUnreachable = ~0u;
    std::vector<unsigned> masks;
    for (const Entry &entry : entries) {
        unsigned mask = 0;
        struct stat info {};
        if (QUIBACLPermGet(entry.path.c_str(), &mask) != 0) {
            if (VLIBCErrGet() != QUIB_ERR_ACCESS_DENIED || lstat(entry.path.c_str(), &info) == 0 || errno != EACCES) {
                fprintf(stderr, "%s: failed with %#x\n", entry.path.c_str(), VLIBCErrGet());
                return 100;
            }
            mask = kUnreachable;
        }
        masks.push_back(mask);
    }
    int wrong = 0;
    int judged = 0;
    auto expect = [&](const Entry &entry, const char *what, bool claimed, bool actual) {
        if (claimed != actual) {
            fprintf(stderr, "%s: %s claimed %d, kernel says %d (%s)\n", entry.path.c_str(), what, claimed, actual, strerror(errno));
            ++wrong;
        }
    };
    for (size_t i = 0; i < entries.size(); ++i) {
        const Entry &entry = entries[i];
        const unsigned mask = masks[i];
        if (mask == kUnreachable) {
            continue;
        }
        ++judged;
        int fd = open(entry.path.c_str(), O_RDONLY | O_CLOEXEC);
        expect(entry, "read", mask & ACL_PERM_READ, fd >= 0);
        if (fd >= 0) close(fd);
        expect(entry, "change attributes", mask & ACL_PERM_WRITE_ATTR, [&] {
            struct stat info {};
            return lstat(entry.path.c_str(), &info) == 0 && chmod(entry.path.c_str(), info.st_mode & 07777) == 0;
        }());
        if (entry.isDir) {
            struct stat info {};
            const std::string child = entry.path + "/child";
            expect(entry, "search", mask & ACL_PERM_EXECUTE, lstat(child.c_str(), &info) == 0);
            expect(entry, "delete child", mask & ACL_PERM_DELETE_CHILD, unlink(child.c_str()) == 0);
            expect(entry, "delete", mask & ACL_PERM_DELETE, rmdir(entry.path.c_str()) == 0 || errno == ENOTEMPTY);
        } else {
            fd = open(entry.path.c_str(), O_WRONLY | O_CLOEXEC);
            expect(entry, "write", mask & ACL_PERM_WRITE, fd >= 0);
            if (fd >= 0) close(fd);
            expect(entry, "delete", mask & ACL_PERM_DELETE, unlink(entry.path.c_str()) == 0);
        }
    }
    if (judged < static_cast<int>(entries.size()) / 2) {
        fprintf(stderr, "only %d of %zu entries could be judged\n", judged, entries.size());
        return 100;
    }
    return wrong > 99 ? 99 : wrong;
}

TEST_F(AclPerm, AgreesWithTheKernelOnGeneratedTrees) {
    std::mt19937 random(20240611);
    const char *owners[] = {"root", "alice", "bob", "alice:users", "bob:staff", "root:staff"};
    const char *aclChoices[] = {"", "u:alice:rw-", "u:alice:r-x,m::r--", "g:staff:rwx", "u:alice:---",
                                "g:users:-w-", "u:bob:rwx,g:staff:r--"};
    auto pick = [&](auto &list) { return list[random() % (sizeof list / sizeof list[0])]; };
    std::vector<Entry> entries;
    for (int d = 0; d < 10; ++d) {
        const std::string dir = "/volume1/gen/d" + std::to_string(d);
        const mode_t dirMode = (random() % 2 ? 01000 : 0) | (random() & 0777) | 0100;
        for (int f = 0; f < 8; ++f) {
            const std::string path = dir + "/e" + std::to_string(f);
            const bool isDir = f % 3 == 2;
            if (isDir) {
                appliance_.MakeDir(path, pick(owners), random() & 0777);
                // The child belongs to the tester, so only the directory's bits decide.
                appliance_.WriteFile(path + "/child", "", "alice", 0600);
            } else {
                appliance_.WriteFile(path, "x", pick(owners), random() & 0777);
            }
            const std::string acl = pick(aclChoices);
            if (!acl.empty()) {
                ASSERT_TRUE(SetAcl(path, acl)) << path;
            }
            entries.push_back({path, isDir});
        }
        appliance_.MakeDir(dir, pick(owners), dirMode);
        const std::string acl = pick(aclChoices);
        if (!acl.empty()) {
            ASSERT_TRUE(SetAcl(dir, acl)) << dir;
        }
    }
    EXPECT_EQ(appliance_.RunAs("alice", [&] { return CountDisagreements(entries); }), 0);
}

TEST_F(AclPerm, EveryPathReleasesItsDescriptors) {
    appliance_.MountFat("/volume2/usb");
    appliance_.MountDeadRemote("/volume1/remote");
    appliance_.WriteFile("/volume1/s/file");
    ASSERT_EQ(symlink("/volume1/s/file", "/volume1/s/link"), 0);
    const int before = OpenDescriptors();
    unsigned mask = 0;
    for (int i = 0; i < 20; ++i) {
        EXPECT_EQ(QUIBACLPermGet("/volume1/s/file", &mask), 0);
        EXPECT_EQ(QUIBACLPermGet("/volume1/s/link", &mask), 0);
        EXPECT_EQ(QUIBACLPermGet("/volume2/usb", &mask), -1);
        EXPECT_EQ(QUIBACLPermGet("/volume1/remote/x", &mask), -1);
        EXPECT_EQ(QUIBACLPermGet("/volume1/s/missing", &mask), -1);
        EXPECT_EQ(QUIBACLIsSupport("/volume2/usb"), 0);
        EXPECT_EQ(QUIBACLIsSupport("/volume1/s/file"), 1);
    }
    EXPECT_EQ(OpenDescriptors(), before);
}

}  // namespace
