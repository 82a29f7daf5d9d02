#include <stdlib.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/nvoman.h"
#include "quib_login.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using Lines = std::vector<std::string>;

TEST(ReservedNames, Table) {
    Appliance app;
    const struct {
        const char *name;
        int ok;
    } table[] = {
        {".", 0},     {"..", 0},   {"...", 1},   {".foo", 1},     {"._foo", 0}, {"._", 0},
        {"a:b", 0},   {"a/b", 0},  {"@eaDir", 0}, {"@eadir", 1},  {"a?b", 1},   {"\xff\xfe", 1},
        {"a b", 1},   {"_.x", 1},
    };
    for (const auto &row : table) {
        NvoLibSetErr(0);
        EXPECT_EQ(NvoCheckReservedName(row.name), row.ok) << row.name;
        EXPECT_EQ(NvoLibGetErr(), row.ok ? 0 : 418) << row.name;
    }
    EXPECT_EQ(NvoCheckReservedName(nullptr), 0);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(NvoCheckReservedName(""), 0);
    EXPECT_EQ(NvoLibGetErr(), 400);
}

TEST(FileNames, FatCharactersOnlyOnFatAndBadArguments) {
    Appliance app;
    app.MountFat("/volumeUSB1");
    const char *fatNames[] = {"a\\b", "a*b", "a?b", "a\"b", "a>b", "a<b", "a|b", "a\rb", "a\nb"};
    for (const char *name : fatNames) {
        EXPECT_EQ(NvoCheckFileName("/volume1", name), 0) << name;
        EXPECT_EQ(NvoCheckFileName("/volumeUSB1", name), -1) << name;
        EXPECT_EQ(NvoLibGetErr(), 419) << name;
    }
    EXPECT_EQ(NvoCheckFileName("/volumeUSB1", "plain name.txt"), 0);
    // Reserved names are refused before the file system is asked.
    EXPECT_EQ(NvoCheckFileName("/volumeUSB1", "a:b"), -1);
    EXPECT_EQ(NvoLibGetErr(), 418);
    EXPECT_TRUE(app.ErrorLines().empty());
    EXPECT_EQ(NvoCheckFileName(nullptr, "a"), -1);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(NvoCheckFileName("/volume1", ""), -1);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(NvoCheckFileName("/volume1/missing", "a"), -1);
    EXPECT_EQ(NvoLibGetErr(), 408);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"nvoman.cpp:# Failed to statfs /volume1/missing, reason=No such file or directory"}));
}

TEST(CheckPath, ExistingPartReservedComponentsAndDeadMounts) {
    Appliance app;
    app.Basic();
    std::string existing;
    EXPECT_EQ(NvoCheckPath("/volume1/photo/new/sub", true, 32, &existing), 0);
    EXPECT_EQ(existing, "/volume1/photo");
    EXPECT_EQ(NvoCheckPath("/volume1/photo", false, 32, &existing), 0);
    EXPECT_EQ(existing, "/volume1/photo");
    // Without the search a missing path fails.
    EXPECT_EQ(NvoCheckPath("/volume1/photo/new", false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 408);
    EXPECT_EQ(VLIBCErrGet(), 0x600);
    EXPECT_EQ(NvoCheckPath("/volume1/photo/new/._x/y", true, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 418);
    EXPECT_EQ(NvoCheckPath("/volume1/photo/@eaDir", true, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 418);
    // Character rules are not applied to paths, even on FAT.
    app.MountFat("/volumeUSB1");
    EXPECT_EQ(NvoCheckPath("/volumeUSB1/a?b/c*d", true, 32, nullptr), 0);
}

TEST(CheckPath, ErrorsByArgumentAndFileType) {
    Appliance app;
    app.Basic();
    symlink("/volume1/photo", "/volume1/link");
    mkfifo("/volume1/fifo", 0644);
    EXPECT_EQ(NvoCheckPath(nullptr, false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(NvoCheckPath("", false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(NvoCheckPath("volume1/photo", false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(VLIBCErrGet(), 0xD00);
    EXPECT_EQ(NvoCheckPath("/", false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 408);
    // Only "/" itself is refused; other spellings of the root are a directory like any other.
    EXPECT_EQ(NvoCheckPath("////", false, 32, nullptr), 0);
    EXPECT_EQ(NvoCheckPath("/volume1/link", false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 401);
    EXPECT_EQ(NvoCheckPath("/volume1/fifo", false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 401);
    const std::string tooLong = "/volume1/" + std::string(5000, 'x');
    EXPECT_EQ(NvoCheckPath(tooLong.c_str(), false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 401);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"nvoman.cpp:# Path is not regular file and directory:/volume1/link",
                     "nvoman.cpp:# Path is not regular file and directory:/volume1/fifo",
                     "nvoman.cpp:# Failed to lstat " + tooLong.substr(0, 4095) + ", reason=File name too long"}));
}

TEST(CheckPath, AccessIsJudgedForTheCaller) {
    Appliance app;
    app.Basic();
    app.MakeDir("/volume1/photo/mine", "alice", 0700);
    app.MakeDir("/volume1/photo/open", "alice", 0755);
    EXPECT_EQ(app.RunAs("bob", [] { return NvoCheckPath("/volume1/photo/open", false, 0x1, nullptr); }), 0);
    EXPECT_EQ(app.RunAs("bob", [] {
        return NvoCheckPath("/volume1/photo/open/new", true, 0x2, nullptr) == -1 ? NvoLibGetErr() - 400 : 0;
    }), 7);
    // A directory the caller can't search: lstat below it is refused.
    EXPECT_EQ(app.RunAs("bob", [] {
        return NvoCheckPath("/volume1/photo/mine/x", false, 32, nullptr) == -1 ? NvoLibGetErr() - 400 : 0;
    }), 7);
    EXPECT_EQ(app.ErrorLines(), (Lines{"nvoman.cpp:# Can't access /volume1/photo/open, errno=197 "}));
    app.MountDeadRemote("/volume1/photo/nas2");
    EXPECT_EQ(NvoCheckPath("/volume1/photo/nas2/docs", false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 410);
    EXPECT_EQ(VLIBCErrGet(), 0x1100);
    EXPECT_EQ(NvoCheckPath("/volume1/photo/nas2", false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 410);
    // A missing path on a local volume stays a missing path.
    EXPECT_EQ(NvoCheckPath("/volume1/photo/gone", false, 32, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 408);
}

TEST(TmpDir, CreatesBothLevelsOpenToAllAndLeavesWhatStandsThere) {
    Appliance app;
    ASSERT_EQ(NvoCreateTmpDir("/volume1"), 0);
    struct stat st;
    ASSERT_EQ(stat("/volume1/@tmp/norvo", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0777u);
    ASSERT_EQ(stat("/volume1/@tmp", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0777u);
    EXPECT_EQ(umask(022), 0u);  // left open for every user's search
    EXPECT_EQ(NvoCreateTmpDir("/volume1"), 0);  // again: nothing to do
    app.WriteFile("/volume2/@tmp", "a file");
    EXPECT_EQ(NvoCreateTmpDir("/volume2"), -1);
    EXPECT_EQ(NvoCreateTmpDir(nullptr), -1);
    EXPECT_EQ(NvoCreateTmpDir(""), -1);
    ASSERT_EQ(rmdir("/volume1/@tmp/norvo"), 0);
    ASSERT_EQ(rmdir("/volume1/@tmp"), 0);
    symlink("/nowhere", "/volume1/@tmp");
    EXPECT_EQ(NvoCreateTmpDir("/volume1"), 0);  // a dangling link is replaced
    EXPECT_EQ(lstat("/volume1/@tmp", &st), 0);
    EXPECT_TRUE(S_ISDIR(st.st_mode));
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"nvoman.cpp(#)Failed to mkdir : /volume2/@tmp/norvo , reason=Not a directory[20]",
                     "nvoman.cpp(#) Bad Parameter", "nvoman.cpp(#) Bad Parameter"}));
}


TEST(Authorized, NeedsALiveLoginAndTheApplicationPrivilege) {
    Appliance app;
    app.Basic();
    app.AddUser("carol");
    app.SetAppPrivilege("QUIB.TVQ.App.Tovana3.Instance", "@staff");
    char sid[128] = {0};
    ASSERT_EQ(QUIBLoginCreate("alice", "secret", "127.0.0.1", sid, sizeof(sid)), 0);
    char carolSid[128] = {0};
    ASSERT_EQ(QUIBLoginCreate("carol", "secret", "127.0.0.1", carolSid, sizeof(carolSid)), 0);

    const auto authorized = [](const std::string &cookie) {
        setenv("HTTP_COOKIE", cookie.c_str(), 1);
        WebMan webman;
        return IsAuthorized(webman, "test");
    };
    EXPECT_TRUE(authorized(std::string("lang=en; id=") + sid));
    EXPECT_FALSE(authorized(std::string("id=") + carolSid));  // logged in, but not a file-manager user
    EXPECT_FALSE(authorized("id=forged"));
    EXPECT_FALSE(authorized(""));
    QUIBLoginRemove(sid);
    EXPECT_FALSE(authorized(std::string("id=") + sid));
}

}  // namespace
