// Directory creation with parents: owner and exact mode on what is created, nothing else
// touched, and the component where creation stopped.
#include <dirent.h>
#include <errno.h>
#include <limits.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_fs.h"
#include "vlibc_err.h"

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

struct Attributes {
    mode_t mode = 0;
    uid_t uid = 0;
    gid_t gid = 0;
    bool isDir = false;
};

Attributes AttributesOf(const std::string &path) {
    struct stat info {};
    Attributes out;
    if (lstat(path.c_str(), &info) == 0) {
        out = {info.st_mode & 07777, info.st_uid, info.st_gid, S_ISDIR(info.st_mode)};
    }
    return out;
}

class MkdirP : public ::testing::Test {
protected:
    MkdirP() {
        norvo::testing::UserSpec alice;
        alice.name = "alice";
        alice.groups = {"staff"};
        appliance_.AddUser(alice);
    }
    Appliance appliance_;
    char stop_[PATH_MAX] = "untouched";
};

TEST_F(MkdirP, EveryCreatedComponentGetsOwnerAndExactMode) {
    appliance_.MakeDir("/volume1/homes", "root", 0711);
    const mode_t old = umask(0077);
    const uid_t uid = appliance_.Uid("alice");
    const gid_t gid = appliance_.Gid("staff");
    EXPECT_EQ(QUIBFSMkdirP("/volume1/homes/alice/a/b", stop_, sizeof stop_, 1, uid, gid, 02775), 0);
    umask(old);
    for (const char *path : {"/volume1/homes/alice", "/volume1/homes/alice/a", "/volume1/homes/alice/a/b"}) {
        const Attributes made = AttributesOf(path);
        EXPECT_TRUE(made.isDir) << path;
        EXPECT_EQ(made.mode, 02775u) << path;
        EXPECT_EQ(made.uid, uid) << path;
        EXPECT_EQ(made.gid, gid) << path;
    }
    const Attributes existing = AttributesOf("/volume1/homes");
    EXPECT_EQ(existing.mode, 0711u);
    EXPECT_EQ(existing.uid, 0u);
    EXPECT_STREQ(stop_, "untouched");
}

TEST_F(MkdirP, ExistingDirectoriesAndLinksToThemAreLeftAlone) {
    appliance_.MakeDir("/volume1/a/b", "alice", 0750);
    ASSERT_EQ(symlink("/volume1/a", "/volume1/link"), 0);
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a/b", stop_, sizeof stop_, 1, 0, 0, 0777), 0);
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a/b", stop_, sizeof stop_, 0, 0, 0, 0777), 0);
    EXPECT_EQ(QUIBFSMkdirP("/volume1/link/b/c/", stop_, sizeof stop_, 1, 0, 0, 0700), 0);
    EXPECT_EQ(AttributesOf("/volume1/a/b").mode, 0750u);
    EXPECT_EQ(AttributesOf("/volume1/a/b").uid, appliance_.Uid("alice"));
    EXPECT_TRUE(AttributesOf("/volume1/a/b/c").isDir);
    EXPECT_EQ(AttributesOf("/volume1/a/b/c").mode, 0700u);
    EXPECT_EQ(QUIBFSMkdirP("/", stop_, sizeof stop_, 1, 0, 0, 0755), 0);
    EXPECT_EQ(QUIBFSMkdirP("///", stop_, sizeof stop_, 0, 0, 0, 0755), 0);
}

TEST_F(MkdirP, AFileInTheWayStopsCreation) {
    appliance_.WriteFile("/volume1/a/file");
    errno = 0;
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a/file", stop_, sizeof stop_, 1, 0, 0, 0755), -1);
    EXPECT_EQ(errno, EEXIST);
    EXPECT_STREQ(stop_, "/volume1/a/file");
    errno = 0;
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a/file/b/c", stop_, sizeof stop_, 1, 0, 0, 0755), -1);
    EXPECT_EQ(errno, ENOTDIR);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_PATH);
    EXPECT_STREQ(stop_, "/volume1/a/file");
}

TEST_F(MkdirP, WithoutRecursionOnlyTheLastComponentIsMade) {
    errno = 0;
    EXPECT_EQ(QUIBFSMkdirP("/volume1/x/y", stop_, sizeof stop_, 0, 0, 0, 0755), -1);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_FILE);
    EXPECT_STREQ(stop_, "/volume1/x/y");
    EXPECT_FALSE(AttributesOf("/volume1/x").isDir);
    EXPECT_EQ(QUIBFSMkdirP("/volume1/x", stop_, sizeof stop_, 0, 0, 0, 0705), 0);
    EXPECT_EQ(AttributesOf("/volume1/x").mode, 0705u);
}

TEST_F(MkdirP, RelativePathsStartAtTheWorkingDirectory) {
    appliance_.MakeDir("/volume1/base");
    ASSERT_EQ(chdir("/volume1/base"), 0);
    EXPECT_EQ(QUIBFSMkdirP("r/s", stop_, sizeof stop_, 1, 0, 0, 0710), 0);
    EXPECT_EQ(AttributesOf("/volume1/base/r/s").mode, 0710u);
    EXPECT_EQ(QUIBFSMkdirP("t", stop_, sizeof stop_, 0, 0, 0, 0710), 0);
    EXPECT_TRUE(AttributesOf("/volume1/base/t").isDir);
}

TEST_F(MkdirP, AReadOnlyVolumeStopsAtTheFirstMissingComponent) {
    appliance_.MakeDir("/volume2/a");
    appliance_.RemountReadOnly("/volume2");
    errno = 0;
    EXPECT_EQ(QUIBFSMkdirP("/volume2/a/b/c", stop_, sizeof stop_, 1, 0, 0, 0755), -1);
    EXPECT_EQ(errno, EROFS);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_READ_ONLY_FS);
    EXPECT_STREQ(stop_, "/volume2/a/b");
    // Existing directories are still fine on a read-only volume.
    EXPECT_EQ(QUIBFSMkdirP("/volume2/a", stop_, sizeof stop_, 1, 0, 0, 0755), 0);
}

// The kernel judges as the caller: a user can't create under root's 0755 directory, and can't
// give a directory away.
TEST_F(MkdirP, AnOrdinaryUserIsJudgedByTheKernel) {
    appliance_.MakeDir("/volume1/root", "root", 0755);
    appliance_.MakeDir("/volume1/mine", "alice", 0755);
    const int denied = appliance_.RunAs("alice", [] {
        char stop[64] = "";
        errno = 0;
        const int rc = QUIBFSMkdirP("/volume1/root/x/y", stop, sizeof stop, 1, -1, -1, 0755);
        return rc == -1 && errno == EACCES && VLIBCErrGet() == QUIB_ERR_ACCESS_DENIED &&
                       strcmp(stop, "/volume1/root/x") == 0
                   ? 1
                   : 0;
    });
    EXPECT_EQ(denied, 1);
    const int giveAway = appliance_.RunAs("alice", [] {
        char stop[64] = "";
        errno = 0;
        const int rc = QUIBFSMkdirP("/volume1/mine/gift", stop, sizeof stop, 1, 0, -1, 0755);
        return rc == -1 && errno == EPERM && strcmp(stop, "/volume1/mine/gift") == 0 ? 1 : 0;
    });
    EXPECT_EQ(giveAway, 1);
    EXPECT_FALSE(AttributesOf("/volume1/mine/gift").isDir) << "a half-made directory was left";
    const int own = appliance_.RunAs("alice", [] {
        char stop[64] = "";
        return QUIBFSMkdirP("/volume1/mine/p/q", stop, sizeof stop, 1, -1, -1, 0700);
    });
    EXPECT_EQ(own, 0);
    EXPECT_EQ(AttributesOf("/volume1/mine/p/q").uid, appliance_.Uid("alice"));
    EXPECT_EQ(AttributesOf("/volume1/mine/p/q").mode, 0700u);
}

TEST_F(MkdirP, TheStopPathIsCutToItsBuffer) {
    appliance_.WriteFile("/volume1/a-rather-long-file-name");
    char small[8];
    memset(small, 'z', sizeof small);
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a-rather-long-file-name/x", small, sizeof small, 1, 0, 0, 0755), -1);
    EXPECT_STREQ(small, "/volume");
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a-rather-long-file-name/x", nullptr, 100, 1, 0, 0, 0755), -1);
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a-rather-long-file-name/x", small, 0, 1, 0, 0, 0755), -1);
}

TEST_F(MkdirP, BadArgumentsAreRefused) {
    errno = 0;
    EXPECT_EQ(QUIBFSMkdirP(nullptr, stop_, sizeof stop_, 1, 0, 0, 0755), -1);
    EXPECT_EQ(errno, EINVAL);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QUIBFSMkdirP("", stop_, sizeof stop_, 1, 0, 0, 0755), -1);
    EXPECT_EQ(errno, EINVAL);
    const std::string overlong = "/volume1/" + std::string(PATH_MAX, 'a');
    EXPECT_EQ(QUIBFSMkdirP(overlong.c_str(), stop_, sizeof stop_, 1, 0, 0, 0755), -1);
    EXPECT_EQ(errno, ENAMETOOLONG);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NAME_TOO_LONG);
    // A component longer than NAME_MAX is the kernel's to refuse.
    const std::string longName = "/volume1/ok/" + std::string(300, 'b');
    EXPECT_EQ(QUIBFSMkdirP(longName.c_str(), stop_, sizeof stop_, 1, 0, 0, 0755), -1);
    EXPECT_EQ(errno, ENAMETOOLONG);
    // Names need not be UTF-8.
    EXPECT_EQ(QUIBFSMkdirP("/volume1/\xff\xfe", stop_, sizeof stop_, 1, 0, 0, 0755), 0);
    EXPECT_TRUE(AttributesOf("/volume1/\xff\xfe").isDir);
}

TEST_F(MkdirP, EveryPathReleasesItsDescriptors) {
    appliance_.WriteFile("/volume1/file");
    appliance_.MakeDir("/volume2/ro");
    appliance_.RemountReadOnly("/volume2");
    const int before = OpenDescriptors();
    for (int i = 0; i < 20; ++i) {
        const std::string fresh = "/volume1/n" + std::to_string(i) + "/a/b";
        EXPECT_EQ(QUIBFSMkdirP(fresh.c_str(), stop_, sizeof stop_, 1, 0, 0, 0755), 0);
        EXPECT_EQ(QUIBFSMkdirP("/volume1/file/a", stop_, sizeof stop_, 1, 0, 0, 0755), -1);
        EXPECT_EQ(QUIBFSMkdirP("/volume2/ro/a/b", stop_, sizeof stop_, 1, 0, 0, 0755), -1);
        EXPECT_EQ(QUIBFSMkdirP("/volume1/none/a", stop_, sizeof stop_, 0, 0, 0, 0755), -1);
        EXPECT_EQ(QUIBFSMkdirP("/volume1/again", stop_, sizeof stop_, 1, 0, 0, 0755), 0);
    }
    EXPECT_EQ(OpenDescriptors(), before);
}

}  // namespace
