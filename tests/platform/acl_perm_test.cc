// ACL permission masks, judged as a real user by the kernel: modes, POSIX ACL entries, the
// sticky bit, read-only and attribute-flagged files, and file systems without ACLs.
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <linux/fs.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <grp.h>
#include <sys/acl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_dir_pass.h"
#include "quib_fs.h"
#include "quib_stat.h"

namespace {

using namespace norvo::testing;

constexpr long kNone = ACL_PERM_READ_ATTR | ACL_PERM_READ_ACL;  // held by anyone who can look
constexpr long kR = kNone | ACL_PERM_READ | ACL_PERM_READ_XATTR;
constexpr long kW = ACL_PERM_WRITE | ACL_PERM_APPEND | ACL_PERM_WRITE_XATTR, kRW = kR | kW;
constexpr long kOwn = ACL_PERM_WRITE_ATTR | ACL_PERM_WRITE_ACL | ACL_PERM_CHANGE_OWNER;
constexpr long kX = ACL_PERM_EXECUTE, kDel = ACL_PERM_DELETE, kDC = ACL_PERM_DELETE_CHILD, kAll = ACL_PERM_ALL;

// As "setfacl -m entries path": each entry replaces the one of its tag and qualifier or is
// added, and the mask is recomputed unless given.
bool SetAcl(const std::string &path, const std::string &entries) {
    acl_t acl = acl_get_file(path.c_str(), ACL_TYPE_ACCESS);
    acl_t add = acl_from_text(entries.c_str());
    bool ok = acl != nullptr && add != nullptr, maskGiven = false;
    acl_entry_t from, to;
    for (int i = ACL_FIRST_ENTRY; ok && acl_get_entry(add, i, &from) == 1; i = ACL_NEXT_ENTRY) {
        acl_tag_t tag, otherTag;
        acl_get_tag_type(from, &tag);
        maskGiven |= tag == ACL_MASK;
        void *id = acl_get_qualifier(from);
        bool found = false;
        for (int j = ACL_FIRST_ENTRY; !found && acl_get_entry(acl, j, &to) == 1; j = ACL_NEXT_ENTRY) {
            void *otherId = acl_get_qualifier(to);
            acl_get_tag_type(to, &otherTag);
            found = otherTag == tag && (id == nullptr || *static_cast<id_t *>(id) == *static_cast<id_t *>(otherId));
            acl_free(otherId);
        }
        acl_free(id);
        ok = (found || acl_create_entry(&acl, &to) == 0) && acl_copy_entry(to, from) == 0;
    }
    ok = ok && (maskGiven || acl_calc_mask(&acl) == 0) && acl_set_file(path.c_str(), ACL_TYPE_ACCESS, acl) == 0;
    acl_free(acl);
    acl_free(add);
    return ok;
}

// The mask user holds on path, or minus the error slot when the call failed and left the mask
// alone. Users other than root ask in a child, whose answer comes back through a pipe.
long MaskAs(Appliance &appliance, const std::string &user, const char *path) {
    const auto get = [path]() -> long {
        unsigned mask = 0x5A5A;
        if (QUIBACLPermGet(path, &mask) == 0) return mask;
        return mask == 0x5A5A ? -VLIBCErrGet() : LONG_MAX;
    };
    int fds[2];
    if (user == "root" || pipe(fds) != 0) return user == "root" ? get() : LONG_MIN;
    long value = LONG_MIN;
    appliance.RunAs(user, [&] { value = get(); return write(fds[1], &value, sizeof value) == sizeof value ? 0 : 1; });
    close(fds[1]);
    if (read(fds[0], &value, sizeof value) != sizeof value) value = LONG_MIN;
    close(fds[0]);
    return value;
}

class AclPerm : public ::testing::Test {
protected:
    AclPerm() { appliance_.Basic(); }
    Appliance appliance_;
};

// What the generated trees below can't show: mount roots, read-only and foreign file systems,
// links, the errors, and an ACL where two groups each grant half of what deleting a child takes.
TEST_F(AclPerm, EachUserHoldsWhatTheKernelGrants) {
    struct Made { const char *path, *owner; mode_t mode; bool dir; const char *acl = ""; } made[] = {
        {"/volume1/s", "root", 0777, true}, {"/volume1/s/own", "alice", 0600, false},
        {"/volume1/s/dir", "alice", 0755, true},
        {"/volume1/s/split", "root", 0700, true, "g:staff:-w-,g:users:--x"}, {"/volume1/s/split/f", "root", 0666, false},
        {"/volume1/locked", "alice", 0555, true}, {"/volume1/locked/mine", "alice", 0600, false},
        {"/volume1/private", "root", 0700, true}, {"/volume1/private/inside", "root", 0644, false},
        {"/volume2/file", "alice", 0666, false}, {"/volume2/dir", "alice", 0777, true},
    };
    for (const Made &m : made) {
        m.dir ? appliance_.MakeDir(m.path, m.owner, m.mode) : appliance_.WriteFile(m.path, "x", m.owner, m.mode);
        ASSERT_TRUE(*m.acl == '\0' || SetAcl(m.path, m.acl)) << m.path;
    }
    appliance_.RemountReadOnly("/volume2").MountFat("/volume1/usb").MountDeadRemote("/volume1/remote");
    ASSERT_EQ(close(open("/volume1/usb/photo.jpg", O_WRONLY | O_CREAT | O_CLOEXEC, 0644)), 0);
    ASSERT_EQ(symlink("/volume1/usb", "/volume1/s/tousb"), 0);
    ASSERT_EQ(symlink("/volume1/s/nowhere", "/volume1/s/dangling"), 0);
    const std::string overlong = "/volume1/" + std::string(PATH_MAX, 'a');

    struct Case { const char *user, *path; long mask; } cases[] = {  // the mask, or minus the error slot
        {"root", "/volume1", kAll & ~kDel},  // a mount root can't be removed, not even by root
        {"alice", "/volume1/s/split", kNone | kW | kX | kDel}, {"alice", "/volume1/s/split/f", kRW},
        // The parent decides deletion, and "." can't be removed.
        {"alice", "/volume1/locked/mine", kRW | kOwn}, {"alice", "/volume1/s/dir/.", kRW | kX | kDC | kOwn},
        // A read-only volume is no error: the mask just lacks every writing bit.
        {"root", "/volume2/file", kR}, {"alice", "/volume2/file", kR}, {"root", "/volume2/dir", kR | kX},
        // A link is judged itself, never followed (here not into the FAT): nothing but its name.
        {"root", "/volume1/s/tousb", kNone | kDel}, {"alice", "/volume1/s/dangling", kNone | kDel},
        {"alice", "/volume1/s/missing", -QUIB_ERR_NO_SUCH_FILE}, {"alice", "/volume1/s/own/x", -QUIB_ERR_NO_SUCH_PATH},
        {"alice", "/volume1/locked/mine/", -QUIB_ERR_NO_SUCH_PATH},
        {"alice", "/volume1/private/inside", -QUIB_ERR_ACCESS_DENIED},
        {"alice", overlong.c_str(), -QUIB_ERR_NAME_TOO_LONG}, {"alice", "", -QUIB_ERR_BAD_PARAMETER},
        {"root", nullptr, -QUIB_ERR_BAD_PARAMETER},
        {"root", "/volume1/s/\xff\xfe", -QUIB_ERR_NO_SUCH_FILE},  // names are bytes, not UTF-8
        {"root", "/volume1/usb/photo.jpg", -QUIB_ERR_ACL_NOT_SUPPORTED},
        {"root", "/volume1/usb", -QUIB_ERR_ACL_NOT_SUPPORTED},
        // A lost network share fails as an I/O error.
        {"root", "/volume1/remote/a.txt", -QUIB_ERR_FAILED}, {"root", "/volume1/remote", -QUIB_ERR_FAILED},
    };
    const int before = OpenDescriptors();  // the root cases run in this process
    for (const Case &c : cases) {
        EXPECT_EQ(MaskAs(appliance_, c.user, c.path), c.mask) << c.user << " " << (c.path ? c.path : "null");
    }
    EXPECT_EQ(MaskAs(appliance_, "root", "/") & kDel, 0);
    EXPECT_EQ(OUTCOME(QUIBACLPermGet("/volume1/s/own", nullptr)), Failed(QUIB_ERR_BAD_PARAMETER));
    struct Support { const char *path; Outcome want; } support[] = {
        {"/volume1/usb/photo.jpg", {0}}, {"/volume1/usb", {0}}, {"/volume2", {1}}, {"/volume1/s/dangling", {1}},
        {"/volume1/s/tousb", {1}},  // the directory holding a link answers for it
        {"/volume1/remote/a.txt", Failed(QUIB_ERR_FAILED)}, {"/volume1/s/missing", Failed(QUIB_ERR_NO_SUCH_FILE)},
        {nullptr, Failed(QUIB_ERR_BAD_PARAMETER)},
    };
    for (const Support &s : support) {
        EXPECT_EQ(OUTCOME(QUIBACLIsSupport(s.path, -1, 2)), s.want) << (s.path ? s.path : "null");
    }
    EXPECT_EQ(OpenDescriptors(), before);
}

TEST_F(AclPerm, AppendOnlyAndImmutableFilesAreHonoured) {
    for (const auto &[path, flag] : {std::pair{"/volume1/log", FS_APPEND_FL}, {"/volume1/frozen", FS_IMMUTABLE_FL}}) {
        appliance_.WriteFile(path, "x", "root", 0666);
        const int fd = open(path, O_RDONLY | O_CLOEXEC);
        int flags = 0;
        const bool set =
            ioctl(fd, FS_IOC_GETFLAGS, &flags) == 0 && (flags |= flag, ioctl(fd, FS_IOC_SETFLAGS, &flags) == 0);
        close(fd);
        if (!set) GTEST_SKIP() << "the volume's file system takes no attribute flags";
    }
    EXPECT_EQ(MaskAs(appliance_, "root", "/volume1/log"), kR | ACL_PERM_APPEND | ACL_PERM_WRITE_XATTR);
    EXPECT_EQ(MaskAs(appliance_, "root", "/volume1/frozen"), kR);
}

// Every bit an operation can prove, compared with that operation tried by the caller: the
// number of disagreements, or 100 when the entries could not be judged.
int CountDisagreements(const std::vector<std::string> &entries) {
    int wrong = 0, judged = 0;
    for (const std::string &entry : entries) {
        const char *path = entry.c_str();
        unsigned mask = 0;
        struct stat info {};
        if (QUIBACLPermGet(path, &mask) != 0) {
            // Below a directory the caller can't search there is no mask; the kernel must agree.
            if (VLIBCErrGet() == QUIB_ERR_ACCESS_DENIED && lstat(path, &info) != 0 && errno == EACCES) continue;
            fprintf(stderr, "%s: failed with %#x\n", path, VLIBCErrGet());
            return 100;
        }
        ++judged;
        const auto expect = [&](const char *what, unsigned bit, bool actual) {
            if (((mask & bit) != 0) == actual) return;
            fprintf(stderr, "%s: %s claimed %d, kernel says %d (%s)\n", path, what, !actual, actual, strerror(errno));
            ++wrong;
        };
        // The kernel's own access answers for the bits no harmless operation shows.
        const auto access = [path](int how) { return faccessat(AT_FDCWD, path, how, AT_EACCESS | AT_SYMLINK_NOFOLLOW) == 0; };
        expect("execute (access)", ACL_PERM_EXECUTE, access(X_OK));
        expect("write (access)", ACL_PERM_APPEND, access(W_OK));
        const int fd = open(path, O_RDONLY | O_CLOEXEC);
        expect("read", ACL_PERM_READ, fd >= 0);
        close(fd);
        expect("change attributes", ACL_PERM_WRITE_ATTR,
               lstat(path, &info) == 0 && chmod(path, info.st_mode & 07777) == 0);
        if (S_ISDIR(info.st_mode)) {
            const std::string child = entry + "/child";
            expect("search", ACL_PERM_EXECUTE, lstat(child.c_str(), &info) == 0);
            expect("delete child", ACL_PERM_DELETE_CHILD, unlink(child.c_str()) == 0);
            expect("delete", ACL_PERM_DELETE, rmdir(path) == 0 || errno == ENOTEMPTY);
        } else {
            const int wfd = open(path, O_WRONLY | O_CLOEXEC);
            expect("write", ACL_PERM_WRITE, wfd >= 0);
            close(wfd);
            expect("delete", ACL_PERM_DELETE, unlink(path) == 0);
        }
    }
    if (judged >= static_cast<int>(entries.size()) / 4) return std::min(wrong, 99);
    fprintf(stderr, "only %d of %zu entries could be judged\n", judged, entries.size());
    return 100;
}

// A tree of directories and entries with random modes, owners and ACLs (named users and groups,
// masks that hide entries, masks of nothing, sticky directories), the same for every seed.
std::vector<std::string> MakeTree(Appliance &appliance, const std::string &root, unsigned seed) {
    std::mt19937 random(seed);
    const char *owners[] = {"root", "alice", "bob", "alice:users", "bob:staff", "root:staff", "admin:administrators"};
    const char *acls[] = {"", "u:alice:rw-", "u:alice:r-x,m::r--", "g:staff:rwx", "u:alice:---",
                          "g:users:-w-", "u:bob:rwx,g:staff:r--", "u:bob:r-x,g:users:rw-,m::rwx",
                          "u:alice:rwx,g:staff:-wx,m::-w-", "g:administrators:rwx", "u:alice:rw-,m::---",
                          "o::rwx,u:alice:---", "g::rwx,m::r-x", "u:admin:rwx,g:staff:---,o::r--",
                          "u:alice:-wx,u:bob:-wx,g:users:r-x,g:staff:rw-"};
    auto pick = [&](auto &list) { return list[random() % (sizeof list / sizeof list[0])]; };
    std::vector<std::string> entries;
    for (int d = 0; d < 12; ++d) {
        const std::string dir = root + "/d" + std::to_string(d);
        const mode_t dirMode = (random() % 2 ? 01000 : 0) | (random() & 0777) | 0100;
        for (int f = 0; f < 10; ++f) {
            const std::string path = dir + "/e" + std::to_string(f);
            if (f % 3 == 2) {
                appliance.MakeDir(path, pick(owners), random() & 0777);
                // The child belongs to the tester, so only the directory's bits decide.
                appliance.WriteFile(path + "/child", "", "alice", 0600);
            } else {
                appliance.WriteFile(path, "x", pick(owners), random() & 0777);
            }
            const std::string acl = pick(acls);
            if (!acl.empty() && !SetAcl(path, acl)) return {};
            entries.push_back(path);
        }
        appliance.MakeDir(dir, pick(owners), dirMode);
        const std::string acl = pick(acls);
        if (!acl.empty() && !SetAcl(dir, acl)) return {};
    }
    return entries;
}

// Every account of the appliance, root among them (its capabilities: execute only with some x
// bit, deletion past the sticky bit), each on its own copy of several generated trees.
TEST_F(AclPerm, AgreesWithTheKernelForEveryUser) {
    for (const unsigned seed : {1u, 2u, 3u}) {
        for (const char *user : {"root", "alice", "bob", "admin"}) {
            const std::vector<std::string> entries =
                MakeTree(appliance_, "/volume1/" + std::string(user) + std::to_string(seed), seed);
            ASSERT_FALSE(entries.empty());
            EXPECT_EQ(appliance_.RunAs(user, [&] { return CountDisagreements(entries); }), 0) << user << " " << seed;
        }
    }
}

// Everything the file calls answer about path: the stat, the mask and the ACL support, or the
// error slot of each failure.
std::string AnswersAbout(const std::string &path) {
    QUIBSTAT st{};
    unsigned mask = 0;
    std::string out;
    if (VLIBCFileLStat(path.c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st) == 0) {
        out += std::to_string(st.st_mode) + " " + std::to_string(st.st_uid) + " " + std::to_string(st.st_gid) + " " +
               std::to_string(st.st_size) + " " + std::to_string(st.st_mtim.tv_sec) + "." +
               std::to_string(st.st_mtim.tv_nsec) + " " + std::to_string(st.st_crtim.tv_sec);
    } else {
        out += "stat error " + std::to_string(VLIBCErrGet());
    }
    out += QUIBACLPermGet(path.c_str(), &mask) == 0 ? " mask " + std::to_string(mask)
                                                    : " mask error " + std::to_string(VLIBCErrGet());
    const int support = QUIBACLIsSupport(path.c_str(), -1, 2);
    out += " support " + std::to_string(support) + (support < 0 ? " " + std::to_string(VLIBCErrGet()) : "");
    return out;
}

// The number of entries (links and missing names among them) whose answers inside a pass over
// their directory differ from the answers outside one.
int CountPassDifferences(const std::vector<std::string> &entries) {
    int differences = 0;
    for (const std::string &entry : entries) {
        const std::string dir = entry.substr(0, entry.rfind('/'));
        const std::vector<std::string> paths = {entry, dir + "/link", dir + "/missing", entry + "/child"};
        std::vector<std::string> outside;
        for (const std::string &path : paths) outside.push_back(AnswersAbout(path));
        QUIBDirPass *pass = QUIBDirPassBegin(dir.c_str());
        if (pass == nullptr) {
            // Only a directory the caller can't reach has no pass.
            if (VLIBCErrGet() != QUIB_ERR_ACCESS_DENIED) ++differences;
            continue;
        }
        for (size_t i = 0; i < paths.size(); ++i) {
            const std::string inside = AnswersAbout(paths[i]);
            if (inside != outside[i]) {
                fprintf(stderr, "%s: outside [%s], inside [%s]\n", paths[i].c_str(), outside[i].c_str(), inside.c_str());
                ++differences;
            }
        }
        QUIBDirPassEnd(pass);
    }
    return std::min(differences, 100);
}

// A pass changes what the calls cost, never what they answer.
TEST_F(AclPerm, APassAnswersAsTheCallsDoAlone) {
    for (const unsigned seed : {1u, 2u}) {
        for (const char *user : {"root", "alice", "bob", "admin"}) {
            const std::string root = "/volume1/pass-" + std::string(user) + std::to_string(seed);
            const std::vector<std::string> entries = MakeTree(appliance_, root, seed);
            ASSERT_FALSE(entries.empty());
            for (int d = 0; d < 12; ++d) {
                ASSERT_EQ(symlink("e0", (root + "/d" + std::to_string(d) + "/link").c_str()), 0);
            }
            EXPECT_EQ(appliance_.RunAs(user, [&] { return CountPassDifferences(entries); }), 0) << user << " " << seed;
        }
    }
}

// Nothing about the caller or the parent directory outlives a change: the same process asks,
// changes its identity or the directory, and asks again.
TEST_F(AclPerm, ChangesOfIdentityAndDirectoryShowAtOnce) {
    appliance_.MakeDir("/volume1/p", "root", 0777).WriteFile("/volume1/p/f", "x", "bob:staff", 0640);
    const uid_t alice = appliance_.Uid("alice"), bob = appliance_.Uid("bob");
    const gid_t staff = appliance_.Gid("staff"), users = appliance_.Gid("users");
    const int result = appliance_.RunAs("root", [&]() -> int {
        const auto mask = [] { unsigned m = 0; return QUIBACLPermGet("/volume1/p/f", &m) == 0 ? static_cast<long>(m) : -1L; };
        if (mask() != (kAll & ~(kX | kDC))) return 1;
        // alice with only her primary group: other bits, and the directory lets her delete.
        if (setgroups(0, nullptr) != 0 || setegid(users) != 0 || seteuid(alice) != 0) return 2;
        if (mask() != (kNone | kDel)) return 3;
        // Back to root and into staff as well: the owning group's read.
        if (seteuid(0) != 0 || setgroups(1, &staff) != 0 || seteuid(alice) != 0) return 4;
        if (mask() != (kR | kDel)) return 5;
        if (seteuid(0) != 0 || seteuid(bob) != 0) return 6;
        if (mask() != (kRW | kOwn | kDel)) return 7;
        // The directory changes under the cached facts: no write, then a named entry, then sticky.
        if (seteuid(0) != 0 || chmod("/volume1/p", 0755) != 0 || seteuid(bob) != 0) return 8;
        if (mask() != (kRW | kOwn)) return 9;
        if (seteuid(0) != 0 || !SetAcl("/volume1/p", "u:bob:rwx") || seteuid(bob) != 0) return 10;
        if (mask() != (kRW | kOwn | kDel)) return 11;
        if (seteuid(0) != 0 || chmod("/volume1/p", 01777) != 0 || seteuid(alice) != 0) return 12;
        if (mask() != kR) return 13;  // sticky: alice owns neither the file nor the directory
        if (seteuid(0) != 0 || seteuid(bob) != 0) return 14;
        return mask() == (kRW | kOwn | kDel) ? 0 : 15;
    });
    EXPECT_EQ(result, 0);
}

}  // namespace
