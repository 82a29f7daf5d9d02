// Directory creation with parents: owner and exact mode on what is created, nothing else
// touched, and the component where creation stopped.
#include <errno.h>
#include <limits.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <utility>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_fs.h"

namespace {

using namespace norvo::testing;

// "uid:gid mode" of a directory, "" when path is no directory.
std::string DirOf(const std::string &path) {
    struct stat info {};
    char out[64] = "";
    if (lstat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode)) {
        snprintf(out, sizeof out, "%u:%u %o", info.st_uid, info.st_gid, info.st_mode & 07777);
    }
    return out;
}

class MkdirP : public ::testing::Test {
protected:
    MkdirP() { appliance_.AddUser("alice").AddGroup({"staff", 0, {"alice"}}); }
    int Make(const char *path, int recursive = 1, uid_t uid = 0, gid_t gid = 0, mode_t mode = 0755) {
        return QUIBFSMkdirP(path, stop_, sizeof stop_, recursive, uid, gid, mode);
    }
    std::string Ids(const char *user, const char *group) {
        return std::to_string(appliance_.Uid(user)) + ":" + std::to_string(appliance_.Gid(group));
    }
    Appliance appliance_;
    char stop_[PATH_MAX] = "untouched";
};

TEST_F(MkdirP, CreatedComponentsGetOwnerAndExactModeAndNothingElseChanges) {
    appliance_.MakeDir("/volume1/homes", "root", 0711).MakeDir("/volume1/a/b", "alice", 0750);
    ASSERT_EQ(symlink("/volume1/a", "/volume1/link"), 0);
    ASSERT_EQ(chdir("/volume1/homes"), 0);
    const uid_t alice = appliance_.Uid("alice");
    const gid_t staff = appliance_.Gid("staff");
    struct Call { const char *path; int recursive; uid_t uid; gid_t gid; mode_t mode; } calls[] = {
        {"/volume1/homes/alice/a/b", 1, alice, staff, 02775}, {"/volume1/a/b", 1, 0, 0, 0777},
        {"/volume1/a/b", 0, 0, 0, 0777}, {"/volume1/link/b/c/", 1, 0, 0, 0700}, {"/", 1, 0, 0, 0755},
        {"///", 0, 0, 0, 0755}, {"/volume1/x", 0, 0, 0, 0705}, {"r/s", 1, 0, 0, 0710}, {"t", 0, 0, 0, 0710},
        {"/volume1/\xff\xfe", 1, 0, 0, 0755},  // names need not be UTF-8
    };
    const mode_t old = umask(0077);  // the mode is exact whatever the umask
    for (const Call &c : calls) {
        EXPECT_EQ(Make(c.path, c.recursive, c.uid, c.gid, c.mode), 0) << c.path;
    }
    umask(old);
    const std::string made = Ids("alice", "staff") + " 2775";
    const std::pair<const char *, std::string> dirs[] = {
        {"/volume1/homes", "0:0 711"}, {"/volume1/homes/alice", made}, {"/volume1/homes/alice/a", made},
        {"/volume1/homes/alice/a/b", made}, {"/volume1/a/b", Ids("alice", "users") + " 750"},  // existing: left alone
        {"/volume1/a/b/c", "0:0 700"},  // through a link to a directory
        {"/volume1/x", "0:0 705"}, {"/volume1/homes/r/s", "0:0 710"}, {"/volume1/homes/t", "0:0 710"},
        {"/volume1/\xff\xfe", "0:0 755"},
    };
    for (const auto &[path, dir] : dirs) {
        EXPECT_EQ(DirOf(path), dir) << path;
    }
    EXPECT_STREQ(stop_, "untouched");
}

TEST_F(MkdirP, FailuresNameWhereCreationStopped) {
    appliance_.WriteFile("/volume1/a/file").MakeDir("/volume2/a");
    appliance_.RemountReadOnly("/volume2");
    const std::string overlong = "/volume1/" + std::string(PATH_MAX, 'a');
    const std::string longName = "/volume1/ok/" + std::string(300, 'b');  // the kernel's to refuse
    // Each failure names the component where creation stopped (stop null: not compared).
    struct Case { const char *path; int recursive; Outcome want; const char *stop; } cases[] = {
        {"/volume1/a/file", 1, Failed(QUIB_ERR_FAILED, EEXIST), "/volume1/a/file"},
        {"/volume1/a/file/b/c", 1, Failed(QUIB_ERR_NO_SUCH_PATH, ENOTDIR), "/volume1/a/file"},
        {"/volume1/x/y", 0, Failed(QUIB_ERR_NO_SUCH_FILE, ENOENT), "/volume1/x/y"},  // without recursion
        {"/volume2/a/b/c", 1, Failed(QUIB_ERR_READ_ONLY_FS, EROFS), "/volume2/a/b"},
        {nullptr, 1, Failed(QUIB_ERR_BAD_PARAMETER, EINVAL), ""}, {"", 1, Failed(QUIB_ERR_BAD_PARAMETER, EINVAL), ""},
        {overlong.c_str(), 1, Failed(QUIB_ERR_NAME_TOO_LONG, ENAMETOOLONG), nullptr},
        {longName.c_str(), 1, Failed(QUIB_ERR_NAME_TOO_LONG, ENAMETOOLONG), longName.c_str()},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(OUTCOME(Make(c.path, c.recursive)), c.want) << (c.path ? c.path : "null");
        EXPECT_STREQ(stop_, c.stop ? c.stop : stop_) << (c.path ? c.path : "null");
    }
    EXPECT_EQ(DirOf("/volume1/x"), "");
    EXPECT_EQ(Make("/volume2/a"), 0) << "an existing directory is fine on a read-only volume";
    char small[8];  // the stop path is cut to its buffer
    memset(small, 'z', sizeof small);
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a/file/x", small, sizeof small, 1, 0, 0, 0755), -1);
    EXPECT_STREQ(small, "/volume");
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a/file/x", nullptr, 100, 1, 0, 0, 0755), -1);
    EXPECT_EQ(QUIBFSMkdirP("/volume1/a/file/x", small, 0, 1, 0, 0, 0755), -1);
}

// The kernel judges as the caller: a user can't create under root's 0755 directory, and can't
// give a directory away.
TEST_F(MkdirP, AnOrdinaryUserIsJudgedByTheKernel) {
    appliance_.MakeDir("/volume1/root", "root", 0755).MakeDir("/volume1/mine", "alice", 0755);
    const auto as = [&](const char *path, uid_t uid, const Outcome &want, const char *stop) {
        return appliance_.RunAs("alice", [&] {
            char at[64] = "";
            return OUTCOME(QUIBFSMkdirP(path, at, sizeof at, 1, uid, -1, 0700)) == want && strcmp(at, stop) == 0;
        });
    };
    EXPECT_EQ(as("/volume1/root/x/y", -1, Failed(QUIB_ERR_ACCESS_DENIED, EACCES), "/volume1/root/x"), 1);
    EXPECT_EQ(as("/volume1/mine/gift", 0, Failed(QUIB_ERR_ACCESS_DENIED, EPERM), "/volume1/mine/gift"), 1);
    EXPECT_EQ(DirOf("/volume1/mine/gift"), "") << "a half-made directory was left";
    EXPECT_EQ(as("/volume1/mine/p/q", -1, {0}, ""), 1);
    EXPECT_EQ(DirOf("/volume1/mine/p/q"), Ids("alice", "users") + " 700");
}

}  // namespace
