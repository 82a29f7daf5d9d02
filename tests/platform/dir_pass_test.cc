// Directory passes: what a pass shares between the calls about one entry, which paths it
// answers, and its life (nesting, ending out of order, bad arguments). That its answers equal
// the calls' own is proven with the ACL masks' generated trees.
#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_dir_pass.h"
#include "quib_fs.h"
#include "quib_stat.h"

namespace {

using namespace norvo::testing;

mode_t ModeOf(const char *path) {
    QUIBSTAT st{};
    return VLIBCFileLStat(path, QUIB_STAT_BASIC, &st) == 0 ? st.st_mode & 07777 : 0;
}

long MaskOf(const char *path) {
    unsigned mask = 0;
    return QUIBACLPermGet(path, &mask) == 0 ? static_cast<long>(mask) : -static_cast<long>(VLIBCErrGet());
}

class DirPass : public ::testing::Test {
protected:
    DirPass() {
        app_.Basic();
        app_.MakeDir("/volume1/p", "root", 0777)
            .WriteFile("/volume1/p/f", "x", "alice", 0640)
            .WriteFile("/volume1/p/g", "y", "bob", 0600)
            .MakeDir("/volume1/p/sub", "root", 0755)
            .WriteFile("/volume1/p/sub/h", "z", "alice", 0644);
    }
    Appliance app_;
};

// One entry's calls share one reading of it, until the pass moves on to another entry.
TEST_F(DirPass, AnEntryIsReadOncePerVisit) {
    QUIBDirPass *pass = QUIBDirPassBegin("/volume1/p");
    ASSERT_NE(pass, nullptr);
    EXPECT_EQ(ModeOf("/volume1/p/f"), 0640u);
    ASSERT_EQ(chmod("/volume1/p/f", 0604), 0);
    EXPECT_EQ(ModeOf("/volume1/p/f"), 0640u);
    EXPECT_EQ(ModeOf("/volume1/p/g"), 0600u);
    EXPECT_EQ(ModeOf("/volume1/p/f"), 0604u);
    // Gone since it was read: the pass still answers from that reading, then sees it gone.
    ASSERT_EQ(unlink("/volume1/p/f"), 0);
    EXPECT_EQ(ModeOf("/volume1/p/f"), 0604u);
    EXPECT_EQ(ModeOf("/volume1/p/g"), 0600u);
    EXPECT_EQ(OutcomeOf([] { return ModeOf("/volume1/p/f"); }), (Outcome{0, QUIB_ERR_NO_SUCH_FILE, ENOENT}));
    QUIBDirPassEnd(pass);
}

// Only direct entries named through the pass's own spelling of the directory: anything else is
// read afresh each time.
TEST_F(DirPass, OnlyTheDirectoryEntriesAnswerFromThePass) {
    QUIBDirPass *pass = QUIBDirPassBegin("/volume1/p");
    ASSERT_NE(pass, nullptr);
    for (const char *path : {"/volume1/p/sub/h", "/volume1/p", "/volume1/p/", "/volume1//p/f", "/volume1/p/./f"}) {
        const mode_t before = ModeOf(path);
        ASSERT_NE(before, 0u) << path;
        ASSERT_EQ(chmod(path, before ^ 1), 0) << path;
        EXPECT_EQ(ModeOf(path), before ^ 1) << path;
    }
    QUIBDirPassEnd(pass);
}

// The directory as it was opened: renamed and replaced meanwhile, its entries are still read in
// the one the pass began on, also when the caller opened it and has closed its descriptor since.
TEST_F(DirPass, NamesResolveInTheDirectoryThePassOpened) {
    for (const bool given : {false, true}) {
        ASSERT_EQ(chmod("/volume1/p/f", 0640), 0);
        const int fd = given ? open("/volume1/p", O_PATH | O_DIRECTORY | O_CLOEXEC) : -1;
        QUIBDirPass *pass = given ? QUIBDirPassBeginAt(fd, "/volume1/p") : QUIBDirPassBegin("/volume1/p");
        ASSERT_NE(pass, nullptr);
        close(fd);
        ASSERT_EQ(rename("/volume1/p", given ? "/volume1/old2" : "/volume1/old"), 0);
        app_.MakeDir("/volume1/p", "root", 0777).WriteFile("/volume1/p/f", "new", "bob", 0666);
        EXPECT_EQ(ModeOf("/volume1/p/f"), 0640u);
        QUIBDirPassEnd(pass);
        EXPECT_EQ(ModeOf("/volume1/p/f"), 0666u);
    }
}

// The identity of the pass's first permission question holds for the whole pass.
TEST_F(DirPass, PermissionsAreJudgedForOneIdentity) {
    const uid_t alice = app_.Uid("alice");
    const int result = app_.RunAs("root", [&]() -> int {
        QUIBDirPass *pass = QUIBDirPassBegin("/volume1/p");
        if (pass == nullptr) return 1;
        const long rootMask = MaskOf("/volume1/p/f");
        if (seteuid(alice) != 0) return 2;
        const long insideMask = MaskOf("/volume1/p/g");
        QUIBDirPassEnd(pass);
        const long aliceMask = MaskOf("/volume1/p/g");
        if (rootMask != (ACL_PERM_ALL & ~(ACL_PERM_EXECUTE | ACL_PERM_DELETE_CHILD))) return 3;
        if (insideMask != rootMask) return 4;  // still root's judgement
        return aliceMask == (ACL_PERM_READ_ATTR | ACL_PERM_READ_ACL | ACL_PERM_DELETE) ? 0 : 5;
    });
    EXPECT_EQ(result, 0);
}

TEST_F(DirPass, PassesNestAndEndInAnyOrder) {
    QUIBDirPass *outer = QUIBDirPassBegin("/volume1/p");
    QUIBDirPass *inner = QUIBDirPassBegin("/volume1/p/sub");
    ASSERT_NE(outer, nullptr);
    ASSERT_NE(inner, nullptr);
    // The inner pass is the current one: the outer directory's entries are read afresh.
    EXPECT_EQ(ModeOf("/volume1/p/f"), 0640u);
    ASSERT_EQ(chmod("/volume1/p/f", 0600), 0);
    EXPECT_EQ(ModeOf("/volume1/p/f"), 0600u);
    EXPECT_EQ(ModeOf("/volume1/p/sub/h"), 0644u);
    ASSERT_EQ(chmod("/volume1/p/sub/h", 0640), 0);
    EXPECT_EQ(ModeOf("/volume1/p/sub/h"), 0644u);
    // Ending the outer first leaves the inner current; ending that leaves none.
    QUIBDirPassEnd(outer);
    EXPECT_EQ(ModeOf("/volume1/p/sub/h"), 0644u);
    QUIBDirPassEnd(inner);
    EXPECT_EQ(ModeOf("/volume1/p/sub/h"), 0640u);
    QUIBDirPassEnd(nullptr);
}

TEST_F(DirPass, BadDirectoriesGetNoPassAndLeakNothing) {
    const int open = OpenDescriptors();
    const std::string longPath = "/volume1/" + std::string(4100, 'a');
    const struct {
        const char *path;
        int slot;
        int err;
    } cases[] = {
        {nullptr, QUIB_ERR_BAD_PARAMETER, EINVAL},
        {"", QUIB_ERR_BAD_PARAMETER, EINVAL},
        {longPath.c_str(), QUIB_ERR_NAME_TOO_LONG, ENAMETOOLONG},
        {"/volume1/none", QUIB_ERR_NO_SUCH_FILE, ENOENT},
        {"/volume1/p/f", QUIB_ERR_NO_SUCH_PATH, ENOTDIR},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(OutcomeOf([&] { return QUIBDirPassBegin(c.path) == nullptr ? -1 : 0; }), Failed(c.slot, c.err))
            << (c.path ? c.path : "(null)");
    }
    const int file = ::open("/volume1/p/f", O_RDONLY | O_CLOEXEC);
    const struct {
        int fd;
        const char *path;
        int slot, err;
    } given[] = {{file, "/volume1/p/f", QUIB_ERR_NO_SUCH_PATH, ENOTDIR}, {-1, "/volume1/p", QUIB_ERR_FAILED, EBADF},
                 {999, "/volume1/p", QUIB_ERR_FAILED, EBADF}, {file, "", QUIB_ERR_BAD_PARAMETER, EINVAL}};
    for (const auto &c : given) {
        const auto begin = [&] { return QUIBDirPassBeginAt(c.fd, c.path) == nullptr ? -1 : 0; };
        EXPECT_EQ(OutcomeOf(begin), Failed(c.slot, c.err)) << c.fd << " " << c.path;
    }
    close(file);
    app_.MakeDir("/volume1/closed", "root", 0700).MakeDir("/volume1/closed/in", "root", 0777);
    EXPECT_EQ(app_.RunAs("alice", [] {
        return QUIBDirPassBegin("/volume1/closed/in") == nullptr && VLIBCErrGet() == QUIB_ERR_ACCESS_DENIED ? 0 : 1;
    }), 0);
    // Search right alone is enough: a pass reads nothing of the directory itself.
    app_.MakeDir("/volume1/blind", "root", 0711);
    EXPECT_EQ(app_.RunAs("alice", [] {
        QUIBDirPass *pass = QUIBDirPassBegin("/volume1/blind");
        QUIBDirPassEnd(pass);
        return pass != nullptr ? 0 : 1;
    }), 0);
    EXPECT_EQ(OpenDescriptors(), open);
}

}  // namespace
