#include <unistd.h>

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "quib_login.h"
#include "quib_paths.h"
#include "quib_share.h"
#include "vlibc_szlist.h"

namespace {

using norvo::testing::Appliance;
using Lines = std::vector<std::string>;

struct Privilege {
    int result;
    int priv;
    unsigned flags;
};

Privilege Ask(const char *path, const char *user, const char *sid = nullptr) {
    Privilege p{0, -1, 0xdead};
    p.result = NvoLibGetPrivilege(path, user, sid, &p.priv, &p.flags);
    return p;
}

std::vector<std::string> ValidShares(const char *user, int sort, int writableOnly) {
    std::vector<std::string> names;
    PSZLIST list = NvoLibValidShareGen(user, sort, writableOnly);
    if (list == nullptr) {
        return {"<null>"};
    }
    for (int i = 0; i < VLIBCSzListCount(list); ++i) {
        names.push_back(VLIBCSzListGet(list, i));
    }
    VLIBCSzListFree(list);
    return names;
}

std::string Login(const char *user) {
    char sid[128] = {0};
    EXPECT_EQ(QUIBLoginCreate(user, "secret", "127.0.0.1", sid, sizeof(sid)), 0) << user;
    return sid;
}

TEST(SharePrivilege, ListsDecideInPrecedenceOrder) {
    Appliance app;
    app.Basic();
    app.AddUser(norvo::testing::UserSpec{.name = "carol", .groups = {"staff"}});
    app.AddShare({.name = "mixed", .noAccess = "carol", .readWrite = "alice,carol,@staff", .readOnly = "bob,alice"});
    app.AddShare({.name = "groups", .readOnly = "@staff"});

    const struct {
        const char *path;
        const char *user;
        int priv;
    } table[] = {
        {"/mixed/a", "carol", 0},   // no access wins over read-write
        {"/mixed/a", "alice", 2},   // read-write wins over read-only
        {"/mixed", "bob", 2},       // bob is in @staff
        {"/mixed", "admin", 0},     // administrators are not in the lists by rank alone
        {"/groups/x/y", "alice", 1},
        {"/groups", "admin", 0},
        {"/photo", "bob", 1},
        {"/PHOTO", "alice", 2},     // share names compare case-insensitively
    };
    for (const auto &row : table) {
        const Privilege p = Ask(row.path, row.user);
        EXPECT_EQ(p.result, 0) << row.path << " " << row.user;
        EXPECT_EQ(p.priv, row.priv) << row.path << " " << row.user;
    }
    // Restriction flags spare administrators.
    app.AddShare({.name = "drop", .readWrite = "alice,admin", .restrict = SHARE_RESTRICT_NO_BROWSE | SHARE_RESTRICT_NO_DOWNLOAD});
    EXPECT_EQ(Ask("/drop", "alice").flags, 0x5u);
    EXPECT_EQ(Ask("/drop", "admin").flags, 0u);
    EXPECT_EQ(Ask("/photo", "alice").flags, 0u);
}

TEST(SharePrivilege, FailuresAreLogged) {
    Appliance app;
    app.Basic();
    int priv = 0;
    EXPECT_EQ(NvoLibGetPrivilege("/photo", "alice", nullptr, nullptr, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 401);
    EXPECT_EQ(NvoLibGetPrivilege("/nosuch/x", "alice", nullptr, &priv, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 408);
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvodir.cpp(#): bad parameter!", "norvodir.cpp(#): QUIBShareGet nosuch fail"}));

    // The administrator test runs first, so an unknown user fails there, with the platform's
    // own error and where it was set.
    app.ClearLogs();
    EXPECT_EQ(NvoLibGetPrivilege("/photo", "ghost", nullptr, &priv, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 401);
    const Lines lines = app.ErrorLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].rfind("norvodir.cpp:# QUIBGroupIsAdminGroupMem(ghost) failed. [0x1D00 ", 0), 0u) << lines[0];
    EXPECT_EQ(NvoLibGetPrivilege("/photo", nullptr, nullptr, &priv, nullptr), -1);
    EXPECT_EQ(NvoLibGetErr(), 401);
}

TEST(SharePrivilege, DomainAndDirectoryAccountsAreAskedWithTheirSid) {
    Appliance app;
    app.Basic();
    app.AddUser(norvo::testing::UserSpec{.name = "CORP\\dave"});
    app.AddUser(norvo::testing::UserSpec{.name = "erin@corp.example"});
    app.AddShare({.name = "projects", .readWrite = "CORP\\dave", .readOnly = "erin@corp.example"});

    // Without a sid the share's lists decide, as for a local account.
    EXPECT_EQ(Ask("/projects", "CORP\\dave").priv, 2);
    // With a sid but no domain configured the join test fails.
    EXPECT_EQ(Ask("/projects", "CORP\\dave", "anything").result, -1);
    EXPECT_EQ(NvoLibGetErr(), 406);
    EXPECT_EQ(Ask("/projects", "erin@corp.example", "anything").result, -1);
    EXPECT_EQ(NvoLibGetErr(), 406);

    app.SetDomain("CORP");
    app.SetDirectory("ldap.corp.example");
    const std::string daveSid = Login("CORP\\dave");
    const std::string erinSid = Login("erin@corp.example");
    Privilege p = Ask("/projects", "CORP\\dave", daveSid.c_str());
    EXPECT_EQ(p.result, 0);
    EXPECT_EQ(p.priv, 2);
    p = Ask("/projects", "erin@corp.example", erinSid.c_str());
    EXPECT_EQ(p.result, 0);
    EXPECT_EQ(p.priv, 1);
    // Someone else's sid is no proof of login.
    EXPECT_EQ(Ask("/projects", "CORP\\dave", erinSid.c_str()).result, -1);
    EXPECT_EQ(NvoLibGetErr(), 402);
    // A local account's sid is never sent to the domain.
    EXPECT_EQ(Ask("/photo", "alice", "not-a-sid").priv, 2);
}

TEST(HasPrivilege, ComparesExactly) {
    Appliance app;
    app.Basic();
    EXPECT_EQ(NvoLibHasPrivilege("/photo", "alice", nullptr, 2), 1);
    EXPECT_EQ(NvoLibHasPrivilege("/photo", "alice", nullptr, 1), 0);
    EXPECT_EQ(NvoLibHasPrivilege("/photo", "bob", nullptr, 1), 1);
    EXPECT_EQ(NvoLibGetErr(), 0);
    EXPECT_EQ(NvoLibHasPrivilege(nullptr, "bob", nullptr, 1), -1);
    EXPECT_EQ(NvoLibGetErr(), 401);
    EXPECT_EQ(NvoLibHasPrivilege("/gone", "bob", nullptr, 1), -1);
    EXPECT_EQ(NvoLibGetErr(), 408);
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvodir.cpp(#): bad parameter! username=bob, path=(null)",
                                       "norvodir.cpp(#): QUIBShareGet gone fail",
                                       "norvodir.cpp(#): failed to get privilege of bob at /gone"}));
}

TEST(ValidShares, VisibleReadableAndWritableSharesAndAMissingDatabase) {
    Appliance app;
    app.Basic();
    app.AddShare({.name = "Zeta", .readOnly = "alice"});
    app.AddShare({.name = "hiddenone", .readWrite = "alice", .hidden = true});
    app.AddShare({.name = "banned", .noAccess = "alice", .readWrite = "alice"});
    app.AddShare({.name = "apple", .readWrite = "@staff"});

    EXPECT_EQ(ValidShares("alice", 0, 0), (std::vector<std::string>{"public", "photo", "secret", "Zeta", "apple"}));
    EXPECT_EQ(ValidShares("alice", 1, 0), (std::vector<std::string>{"apple", "photo", "public", "secret", "Zeta"}));
    EXPECT_EQ(ValidShares("alice", 1, 1), (std::vector<std::string>{"apple", "photo", "public", "secret"}));
    EXPECT_EQ(ValidShares("bob", 1, 1), (std::vector<std::string>{"apple", "public"}));
    EXPECT_EQ(ValidShares("nobody-at-all", 0, 0), (std::vector<std::string>{}));
    EXPECT_EQ(NvoLibGetErr(), 0);

    EXPECT_EQ(ValidShares(nullptr, 0, 0), (std::vector<std::string>{"<null>"}));
    EXPECT_EQ(NvoLibGetErr(), 401);
    // A missing share database is an error, not an empty list.
    unlink(QUIB_SHARE_CONF);
    EXPECT_EQ(ValidShares("alice", 0, 0), (std::vector<std::string>{"<null>"}));
    EXPECT_EQ(NvoLibGetErr(), 401);
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvodir.cpp(#) bad parameter", "norvodir.cpp:# QUIBShareDBOpenFile Error[900]\n"}));
}

}  // namespace
