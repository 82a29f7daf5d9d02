#include <stdlib.h>
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
        int err;  // 0: allowed
    } table[] = {
        {".", 418},   {"..", 418}, {"...", 0},    {".foo", 0},    {"._foo", 418}, {"._", 418},
        {"a:b", 418}, {"a/b", 418}, {"@eaDir", 418}, {"@eadir", 0}, {"a?b", 0},   {"\xff\xfe", 0},
        {"a b", 0},   {"_.x", 0},   {"", 400},    {nullptr, 400},
    };
    for (const auto &row : table) {
        NvoLibSetErr(0);
        EXPECT_EQ(NvoCheckReservedName(row.name), row.err == 0 ? 1 : 0) << (row.name ? row.name : "(null)");
        EXPECT_EQ(NvoLibGetErr(), row.err) << (row.name ? row.name : "(null)");
    }
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

// The part that exists, reserved components, file types, bad arguments and lost network shares,
// then the caller's own access: the library code, and the platform's where it is the reason.
TEST(CheckPath, AnswersAndErrors) {
    Appliance app;
    app.Basic();
    app.MakeDir("/volume1/photo/mine", "alice", 0700).MakeDir("/volume1/photo/open", "alice", 0755);
    app.MountFat("/volumeUSB1").MountDeadRemote("/volume1/photo/nas2");
    ASSERT_EQ(symlink("/volume1/photo", "/volume1/link"), 0);
    ASSERT_EQ(mkfifo("/volume1/fifo", 0644), 0);
    const std::string tooLong = "/volume1/" + std::string(5000, 'x');
    const struct {
        const char *path;
        bool find;
        int err;  // 0: success
        int quib = 0;  // the platform's slot, when not 0
        const char *existing = nullptr;
    } rows[] = {
        {"/volume1/photo/new/sub", true, 0, 0, "/volume1/photo"},
        {"/volume1/photo", false, 0, 0, "/volume1/photo"},
        {"/volume1/photo/new", false, 408, 0x600},  // without the search a missing path fails
        {"/volume1/photo/gone", false, 408},
        {"/volume1/photo/new/._x/y", true, 418}, {"/volume1/photo/@eaDir", true, 418},
        {"/volumeUSB1/a?b/c*d", true, 0},  // character rules are not applied to paths, even on FAT
        {nullptr, false, 400}, {"", false, 400}, {"volume1/photo", false, 400, 0xD00},
        {"/", false, 408},
        {"////", false, 0},  // only "/" itself is refused; other spellings are a directory like any other
        {"/volume1/link", false, 401}, {"/volume1/fifo", false, 401}, {tooLong.c_str(), false, 401},
        {"/volume1/photo/nas2/docs", false, 410, 0x1100}, {"/volume1/photo/nas2", false, 410},
    };
    for (const auto &row : rows) {
        SCOPED_TRACE(row.path ? std::string(row.path).substr(0, 40) : "(null)");
        std::string existing;
        VLIBCErrSetEx(0, "", 0);
        EXPECT_EQ(NvoCheckPath(row.path, row.find, 32, &existing), row.err == 0 ? 0 : -1);
        if (row.err != 0) {
            EXPECT_EQ(NvoLibGetErr(), row.err);
        }
        if (row.quib != 0) {
            EXPECT_EQ(VLIBCErrGet(), row.quib);
        }
        if (row.existing != nullptr) {
            EXPECT_EQ(existing, row.existing);
        }
    }
    // Access is judged for the caller; below a directory the caller can't search, lstat is refused.
    const struct {
        const char *path;
        bool find;
        int mode;
        int err;
    } asBob[] = {
        {"/volume1/photo/open", false, 0x1, 0}, {"/volume1/photo/open/new", true, 0x2, 407},
        {"/volume1/photo/mine/x", false, 32, 407},
    };
    for (const auto &row : asBob) {
        const int got = app.RunAs("bob", [&] {
            return NvoCheckPath(row.path, row.find, row.mode, nullptr) == -1 ? NvoLibGetErr() - 400 : 0;
        });
        EXPECT_EQ(got, row.err == 0 ? 0 : row.err - 400) << row.path;
    }
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"nvoman.cpp:# Path is not regular file and directory:/volume1/link",
                     "nvoman.cpp:# Path is not regular file and directory:/volume1/fifo",
                     "nvoman.cpp:# Failed to lstat " + tooLong.substr(0, 4095) + ", reason=File name too long",
                     "nvoman.cpp:# Can't access /volume1/photo/open, errno=197 "}));
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
