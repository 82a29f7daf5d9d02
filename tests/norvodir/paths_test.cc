#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <memory>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
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

TEST(PathToken, FirstAndLastComponents) {
    Appliance app;
    const struct {
        const char *path;
        const char *first;
        const char *last;
    } table[] = {
        {"/photo/2012/a.jpg", "photo", "a.jpg"},
        {"//photo//", "photo", "photo"},
        {"/photo", "photo", "photo"},
        {"photo/a", "photo", "a"},
        {"/\xff\xfe/x", "\xff\xfe", "x"},
    };
    for (const auto &row : table) {
        EXPECT_EQ(Token(row.path, 1), row.first) << row.path;
        EXPECT_EQ(Token(row.path, 0), row.last) << row.path;
    }
    EXPECT_TRUE(app.ErrorLines().empty());
}

TEST(PathToken, BadPathsAreRefusedAndLogged) {
    Appliance app;
    EXPECT_EQ(Token(nullptr, 1), "<null>");
    EXPECT_EQ(Token("photo", 1), "<null>");
    EXPECT_EQ(Token("/", 1), "<null>");
    EXPECT_EQ(Token("////", 0), "<null>");
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvodir.cpp(#): bad parameter!", "norvodir.cpp(#): bad path name=photo",
                                       "norvodir.cpp(#) error path", "norvodir.cpp(#) error path"}));
}

TEST(PathToken, LongPathsAreCutNotRefused) {
    Appliance app;
    const std::string longPath = "/" + std::string(5000, 'a') + "/tail";
    // The copy keeps 4094 characters: the last component is the cut run of a's.
    EXPECT_EQ(Token(longPath.c_str(), 0), std::string(4093, 'a'));
}

TEST(TransFullPath, SharePathsBecomeRealPaths) {
    Appliance app;
    app.Basic();
    char out[4096];
    ASSERT_EQ(NvoLibTransFullPath("/photo/2012/a.jpg", out, sizeof(out)), 0);
    EXPECT_STREQ(out, "/volume1/photo/2012/a.jpg");
    ASSERT_EQ(NvoLibTransFullPath("/photo", out, sizeof(out)), 0);
    EXPECT_STREQ(out, "/volume1/photo");
    ASSERT_EQ(NvoLibTransFullPath("/photo/2012", out, 12), 0);
    EXPECT_STREQ(out, "/volume1/ph");

    EXPECT_EQ(NvoLibTransFullPath("/nosuch/x", out, sizeof(out)), -1);
    EXPECT_EQ(VLIBCErrGet(), 0x1400);
    EXPECT_EQ(NvoLibTransFullPath("nosuch", out, sizeof(out)), -1);
    EXPECT_EQ(VLIBCErrGet(), 0x8100);
    EXPECT_EQ(NvoLibTransFullPath(nullptr, out, sizeof(out)), -1);
    EXPECT_EQ(VLIBCErrGet(), 0xD00);
    EXPECT_EQ(NvoLibTransFullPath("/photo", nullptr, 10), -1);
    EXPECT_EQ(NvoLibTransFullPath("/photo", out, 0), -1);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvodir.cpp(#): bad path name=nosuch", "norvodir.cpp(#) NvoLibGetTokOfPath fail",
                     "norvodir.cpp(#) bad parameter, oldpath=(null), new path=",
                     "norvodir.cpp(#) bad parameter, oldpath=/photo, new path=(null)",
                     "norvodir.cpp(#) bad parameter, oldpath=/photo, new path="}));
}

TEST(FullPathGet, ResolvesSharePaths) {
    Appliance app;
    app.Basic();
    app.AddShare({.name = "archive", .volume = "/volume2", .readOnly = "alice"});

    Resolved r = Resolve("/photo/2012/a.jpg", "alice");
    ASSERT_EQ(r.ok, 1);
    EXPECT_EQ(r.full, "/volume1/photo/2012/a.jpg");
    EXPECT_EQ(r.share, "photo");
    EXPECT_EQ(r.volume, "/volume1");
    EXPECT_EQ(r.sharePath, "/volume1/photo");

    EXPECT_EQ(Resolve("/photo", "alice").full, "/volume1/photo");
    EXPECT_EQ(Resolve("/photo/", "alice").full, "/volume1/photo/");
    EXPECT_EQ(Resolve("/archive/x", "alice").volume, "/volume2");
    // The tail always starts after "/<share>": without the leading slash a character is lost.
    EXPECT_EQ(Resolve("photo/a", "alice").full, "/volume1/photoa");
}

TEST(FullPathGet, ResolvesTheCallersHomeAndCreatesIt) {
    Appliance app;
    app.Basic();
    Resolved r = Resolve("/home/x", "bob");
    ASSERT_EQ(r.ok, 1);
    EXPECT_EQ(r.full, "/volume1/homes/bob/x");
    EXPECT_EQ(r.share, "home");
    EXPECT_EQ(r.volume, "/volume1");
    struct stat st;
    ASSERT_EQ(stat("/volume1/homes/bob", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0755u);
    EXPECT_EQ(st.st_uid, app.Uid("bob"));
}

TEST(FullPathGet, FailuresSetTheirCodes) {
    Appliance app;
    app.Basic();
    EXPECT_EQ(Resolve(nullptr, "alice").ok, 0);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(Resolve("", "alice").ok, 0);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(Resolve("/photo", "").ok, 0);
    EXPECT_EQ(NvoLibGetErr(), 400);
    EXPECT_EQ(Resolve("/", "alice").ok, 0);
    EXPECT_EQ(NvoLibGetErr(), 401);
    EXPECT_EQ(Resolve("/nosuch/a", "alice").ok, 0);
    EXPECT_EQ(NvoLibGetErr(), 408);
    EXPECT_EQ(Resolve("/home/a", "ghost").ok, 0);
    EXPECT_EQ(NvoLibGetErr(), 403);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvodir.cpp(#) error path", "norvodir.cpp:# NvoLibGetTokOfPath fail",
                     "norvodir.cpp:# QUIBShareGet fail", "norvodir.cpp:# Failed to get user (ghost)",
                     "norvodir.cpp:# NvoUserHomeFullPathGet fail"}));
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

TEST(HomeDetection, LocalUsersAndNoUser) {
    Appliance app;
    app.Basic();
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
    };
    for (const auto &row : table) {
        EXPECT_EQ(IsDirUserHome(row.name, row.user), row.home) << row.name << " / " << (row.user ? row.user : "-");
    }
}

TEST(HomeDetection, DomainAndDirectoryUsersUseTheirNssHome) {
    Appliance app;
    app.Basic();
    app.AddUser(norvo::testing::UserSpec{.name = "CORP\\dave", .home = "/volume1/homes/@DH-CORP/1/dave"});
    app.AddUser(norvo::testing::UserSpec{.name = "erin@corp.example", .home = "/volume1/homes/@LH-CORP.EXAMPLE/erin"});
    app.AddUser(norvo::testing::UserSpec{.name = "CORP\\nohome", .home = "/var/empty/nohome"});

    EXPECT_EQ(IsDirUserHome("/homes/@DH-CORP/1/dave/docs", "CORP\\dave"), 1);
    EXPECT_EQ(IsDirUserHome("/homes/@dh-corp/1/DAVE", "CORP\\dave"), 1);
    EXPECT_EQ(IsDirUserHome("/homes/@DH-CORP/1/davey", "CORP\\dave"), 0);
    EXPECT_EQ(IsDirUserHome("/homes/CORP\\dave", "CORP\\dave"), 0);
    EXPECT_EQ(IsDirUserHome("/homes/@LH-CORP.EXAMPLE/erin", "erin@corp.example"), 1);
    EXPECT_EQ(IsDirUserHome("/homes/x", "CORP\\nohome"), 0);
    EXPECT_EQ(IsDirUserHome("/homes/x", "CORP\\ghost"), 0);
    // Asking created the homes, as resolving them would.
    struct stat st;
    ASSERT_EQ(stat("/volume1/homes/@DH-CORP/1/dave", &st), 0);
    EXPECT_EQ(st.st_uid, app.Uid("CORP\\dave"));
}

}  // namespace
