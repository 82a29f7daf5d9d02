#include <stdlib.h>
#include <sys/stat.h>

#include <memory>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "norvo/pathinfo.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using Lines = std::vector<std::string>;

std::string Token(const char *path, int first) {
    std::unique_ptr<char, decltype(&free)> token(NvoLibGetTokOfPath(path, first), &free);
    return token ? token.get() : "<null>";
}

struct Resolved {
    int ok;
    std::string full, share, volume, sharePath;
};

Resolved Resolve(const char *path, const std::string &user) {
    Resolved r;
    r.ok = NvoFullPathGet(path, r.full, r.share, r.volume, r.sharePath, user);
    return r;
}

// Which component is the first and which the last the path_resolve fuzzer asserts; here the
// paths that have none, and their log lines.
TEST(PathToken, PathsWithoutAComponentAreLogged) {
    Appliance app;
    for (const char *path : {static_cast<const char *>(nullptr), "photo", "/"}) {
        EXPECT_EQ(Token(path, 1) + Token(path, 0), "<null><null>") << (path ? path : "(null)");
    }
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvodir.cpp(#): bad parameter!", "norvodir.cpp(#): bad parameter!",
                                       "norvodir.cpp(#): bad path name=photo", "norvodir.cpp(#): bad path name=photo",
                                       "norvodir.cpp(#) error path", "norvodir.cpp(#) error path"}));
}

// Both resolvers of share paths agree: the real path, or the failure.
TEST(Resolution, SharePathsAndFailures) {
    Appliance app;
    app.Basic();
    app.AddShare({.name = "archive", .volume = "/volume2", .readOnly = "alice"});
    const struct {
        const char *path;
        const char *user;
        const char *full;  // nullptr: refused with code
        int code;
        int quibErr;  // of NvoLibTransFullPath
    } table[] = {
        {"/photo/2012/a.jpg", "alice", "/volume1/photo/2012/a.jpg", 0, 0},
        {"/photo", "alice", "/volume1/photo", 0, 0},
        {"/photo/", "alice", "/volume1/photo/", 0, 0},
        {"/photo//x", "alice", "/volume1/photo//x", 0, 0},
        {"/archive/x", "alice", "/volume2/archive/x", 0, 0},
        {"/photo", "", nullptr, 400, 0},
        {"", "alice", nullptr, 400, 0xD00},
        {"/", "alice", nullptr, 401, 0x8100},
        {"/nosuch/a", "alice", nullptr, 408, 0x1400},
        {"/photo/\xff", "alice", "/volume1/photo/\xff", 0, 0},  // bytes that are not UTF-8 are names too
        {"/\xff/x", "alice", nullptr, 408, 0x1400},
    };
    for (const auto &row : table) {
        SCOPED_TRACE(row.path);
        const Resolved r = Resolve(row.path, row.user);
        char out[4096] = "unchanged";
        const int trans = NvoLibTransFullPath(row.path, out, sizeof(out));
        if (row.full != nullptr) {
            ASSERT_EQ(r.ok, 1);
            EXPECT_EQ(r.full, row.full);
            EXPECT_EQ(trans, 0);
            EXPECT_STREQ(out, row.full);
        } else {
            EXPECT_EQ(r.ok, 0);
            EXPECT_EQ(NvoLibGetErr(), row.code);
            if (row.quibErr != 0) {
                EXPECT_EQ(trans, -1);
                EXPECT_EQ(VLIBCErrGet(), row.quibErr);
            }
        }
    }
    // Over-long user paths are cut to the buffer, not refused.
    EXPECT_EQ(Resolve(("/photo/" + std::string(5000, 'x')).c_str(), "alice").share, "photo");
    const Resolved r = Resolve("/archive/x", "alice");
    EXPECT_EQ(r.share, "archive");
    EXPECT_EQ(r.volume, "/volume2");
    EXPECT_EQ(r.sharePath, "/volume2/archive");
    char out[4096];
    ASSERT_EQ(NvoLibTransFullPath("/photo/2012", out, 12), 0);
    EXPECT_STREQ(out, "/volume1/ph");
    EXPECT_EQ(NvoLibTransFullPath(nullptr, out, sizeof(out)), -1);
    EXPECT_EQ(NvoLibTransFullPath("/photo", out, 0), -1);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvodir.cpp(#) bad parameter, oldpath=, new path=", "norvodir.cpp(#) error path",
                     "norvodir.cpp:# NvoLibGetTokOfPath fail", "norvodir.cpp(#) error path",
                     "norvodir.cpp(#) NvoLibGetTokOfPath fail", "norvodir.cpp:# QUIBShareGet fail",
                     "norvodir.cpp:# QUIBShareGet fail",
                     "norvodir.cpp(#) bad parameter, oldpath=(null), new path=",
                     "norvodir.cpp(#) bad parameter, oldpath=/photo, new path="}));
}

// A path without its leading slash or with two, or with a "." or ".." component, would be judged
// on one share and land in another: every resolving entry point refuses it as a bad parameter.
TEST(Resolution, PathsThatWouldLeaveTheirShareAreRefusedEverywhere) {
    Appliance app;
    app.Basic();
    app.AddUser(norvo::testing::UserSpec{.name = "carol"});
    app.AddShare({.name = "public2", .noAccess = "carol", .readWrite = "carol"});
    app.AddShare({.name = "ab", .readWrite = "carol"});
    app.AddShare({.name = "abb", .noAccess = "carol"});
    app.MakeDir("/volume1/public/x");
    for (const char *path : {"public/2", "//ab/x", "/public/../photo", "/public/./x", "/public/x/..", "/home/../photo",
                             "/home/../../volume1/photo", "/homes/carol/../alice", "/../volume1"}) {
        SCOPED_TRACE(path);
        EXPECT_EQ(Resolve(path, "carol").ok, 0);
        EXPECT_EQ(NvoLibGetErr(), NVO_ERR_GENERAL);
        char out[4096];
        EXPECT_EQ(NvoLibTransFullPath(path, out, sizeof(out)), -1);
        EXPECT_EQ(VLIBCErrGet(), 0xD00);
        int priv = -1;
        EXPECT_EQ(NvoLibGetPrivilege(path, "carol", nullptr, &priv, nullptr), -1);
        EXPECT_EQ(IsDirUserHome(path, "carol"), 0);
        EXPECT_EQ(CheckShareListPrivilege("carol", nullptr, path), 0);
        PathInfo info;
        EXPECT_EQ(PathInfoFactory::create("carol", path, info), 0);
        EXPECT_EQ(VLIBCErrGet(), 0xD00);
    }
    // The same places with their single leading slash are resolved as usual.
    EXPECT_EQ(Resolve("/public/x", "carol").full, "/volume1/public/x");
    EXPECT_EQ(Resolve("/ab/x", "carol").full, "/volume1/ab/x");
}

// The caller's home resolved and made with its owner and mode is the fault loop's row and the
// path_resolve fuzzer's; here a user without an account.
TEST(UserHome, AnUnknownUserHasNone) {
    Appliance app;
    app.Basic();
    EXPECT_EQ(Resolve("/home/a", "ghost").ok, 0);
    EXPECT_EQ(NvoLibGetErr(), 403);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvodir.cpp:# Failed to get user (ghost)", "norvodir.cpp:# NvoUserHomeFullPathGet fail"}));
}

// An account whose name is not one path component gets no home: "a/b" would create, and own,
// a folder inside a's home.
TEST(UserHome, ANameThatIsNotOneComponentGetsNoHome) {
    Appliance app;
    app.Basic();
    app.AddUser(norvo::testing::UserSpec{.name = "a"});
    app.AddUser(norvo::testing::UserSpec{.name = "a/b"});
    std::string home;
    EXPECT_EQ(NvoUserHomeFullPathGet(home, "a/b"), 0);
    EXPECT_EQ(NvoLibGetErr(), NVO_ERR_NO_USER);
    EXPECT_EQ(Resolve("/home/x", "a/b").ok, 0);
    EXPECT_EQ(NvoUserHomeFullPathGet(home, std::string("a\0b", 3)), 0);
    struct stat st;
    EXPECT_NE(stat("/volume1/homes/a", &st), 0);
    EXPECT_EQ(IsDirUserHome("/homes/a/b", "a/b"), 0);
    EXPECT_EQ(IsDirUserHome("/homes/..", ".."), 0);
    EXPECT_EQ(NvoUserHomeFullPathGet(home, "a"), 1);
    EXPECT_EQ(home, "/volume1/homes/a");
    ASSERT_EQ(stat("/volume1/homes/a", &st), 0);
    EXPECT_EQ(st.st_uid, app.Uid("a"));
}

TEST(UserHome, DisabledServiceAndUncreatableHomes) {
    Appliance app;
    app.Basic();
    std::string home;
    app.SetHomeService(false);
    EXPECT_EQ(NvoUserHomeFullPathGet(home, "alice"), 0);
    EXPECT_EQ(NvoLibGetErr(), 408);
    const std::string uid = std::to_string(app.Uid("alice"));
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvodir.cpp:# " + uid + ", User home isn't enalbed"}));

    app.ClearLogs();
    app.SetHomeService(true, "/volume1/homes");
    app.AddUser(norvo::testing::UserSpec{.name = "frank", .home = "/volume1/homes/file/frank"});
    app.WriteFile("/volume1/homes/file", "not a directory");
    EXPECT_EQ(NvoUserHomeFullPathGet(home, "frank"), 0);
    EXPECT_EQ(NvoLibGetErr(), 408);
    const Lines lines = app.ErrorLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].rfind("norvodir.cpp:# Fail to mkdir for home [/volume1/homes/file/frank]. (stop at /volume1/homes/file", 0), 0u) << lines[0];
    EXPECT_NE(lines[0].find("): Not a directory"), std::string::npos) << lines[0];
}

TEST(RealPath, ResolvesAndMapsErrno) {
    Appliance app;
    app.Basic();
    app.MakeDir("/volume1/photo/locked", "alice", 0700);
    app.MakeDir("/volume1/photo/locked/in", "alice", 0755);
    char out[4096];
    // Real paths, not user paths: dot components are the resolver's to remove.
    ASSERT_EQ(NvoLibRealFullPathGet("/volume1/photo/../photo/./", out, sizeof(out)), 1);
    EXPECT_STREQ(out, "/volume1/photo");
    EXPECT_EQ(NvoLibRealFullPathGet("/volume1/none", out, sizeof(out)), 0);
    EXPECT_EQ(NvoLibGetErr(), 408);
    EXPECT_EQ(NvoLibRealFullPathGet(nullptr, out, sizeof(out)), 0);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(NvoLibRealFullPathGet("/volume1", out, 0), 0);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(app.RunAs("bob", [] {
        char buf[64];
        return NvoLibRealFullPathGet("/volume1/photo/locked/in", buf, sizeof(buf)) == 0 ? NvoLibGetErr() - 400 : 0;
    }), 7);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvodir.cpp:# readpath(/volume1/none) fail (No such file or directory)",
                     "norvodir.cpp:# readpath(/volume1/photo/locked/in) fail (Permission denied)"}));
}

TEST(HomeDetection, LocalDomainAndDirectoryUsers) {
    Appliance app;
    app.Basic();
    app.AddUser(norvo::testing::UserSpec{.name = "CORP\\dave", .home = "/volume1/homes/@DH-CORP/1/dave"});
    app.AddUser(norvo::testing::UserSpec{.name = "erin@corp.example", .home = "/volume1/homes/@LH-CORP.EXAMPLE/erin"});
    app.AddUser(norvo::testing::UserSpec{.name = "CORP\\nohome", .home = "/var/empty/nohome"});
    const struct {
        const char *name;
        const char *user;
        int home;
    } table[] = {
        {"home", nullptr, 1},          {"/home", nullptr, 1},           {"/home/x", nullptr, 1},
        {"/home/", nullptr, 1},        {"/homex", nullptr, 0},          {"/hom", nullptr, 0},
        {"homes", nullptr, 0},         {"/homes/alice", nullptr, 0},    {"/homes/alice", "alice", 1},
        {"/homes/Alice/x", "alice", 1}, {"/HOMES/alice", "alice", 0},   {"/homes/alicex", "alice", 0},
        {"/homes/bob", "alice", 0},    {"/homes", "alice", 0},          {"/homes/", "alice", 0},
        {"", nullptr, 0},              {"/home", "alice", 1},
        {"/homes/@DH-CORP/1/dave/docs", "CORP\\dave", 1}, {"/homes/@dh-corp/1/DAVE", "CORP\\dave", 1},
        {"/homes/@DH-CORP/1/davey", "CORP\\dave", 0},     {"/homes/CORP\\dave", "CORP\\dave", 0},
        {"/homes/@LH-CORP.EXAMPLE/erin", "erin@corp.example", 1}, {"/homes/x", "CORP\\nohome", 0},
        {"/homes/x", "CORP\\ghost", 0},
    };
    for (const auto &row : table) {
        EXPECT_EQ(IsDirUserHome(row.name, row.user), row.home) << row.name << " / " << (row.user ? row.user : "-");
    }
    // Asking created the homes, as resolving them would.
    struct stat st;
    ASSERT_EQ(stat("/volume1/homes/@DH-CORP/1/dave", &st), 0);
    EXPECT_EQ(st.st_uid, app.Uid("CORP\\dave"));
}

}  // namespace
