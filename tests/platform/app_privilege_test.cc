// Application privileges: holders, groups, denials, administrators.
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;

constexpr const char kPriv[] = "QUIB.TVQ.App.Tovana3.Instance";
constexpr const char kOther[] = "QUIB.Other.App";

class AppPrivilege : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().AddUser("ivan").AddUser("CORP\\dave");
        app_.AddGroup({.name = "interns", .members = {"ivan"}}).AddGroup({.name = "staff", .members = {"ivan"}});
        app_.AddGroup({.name = "CORP\\domain users", .members = {"CORP\\dave"}});
    }
    // Writes the file as an administrator might: a comment, spaces around "=", CRLF, and the
    // holders quoted (quotes in them escaped as \").
    void Grant(const std::string &holders) {
        std::string escaped;
        for (char c : holders) {
            escaped += (c == '"' || c == '\\' ? "\\" : "") + std::string(1, c);
        }
        app_.WriteFile(QUIB_APP_PRIVILEGE_CONF,
                       "# application privileges\r\n" + std::string(kPriv) + " = \"" + escaped + "\"\r\n");
    }
    Appliance app_;
};

TEST_F(AppPrivilege, HoldersGroupsAndDenials) {
    const struct { const char *holders, *user; int expected; } rows[] = {
        {"alice", "alice", 1},              {"alice", "bob", 0},
        {"bob, alice", "alice", 1},         {"ALICE", "alice", 1},
        {"@staff", "alice", 1},             {"@staff", "ivan", 1},
        {"@staff,!bob", "bob", 0},          {"@staff,!bob", "alice", 1},
        {"!alice,alice", "alice", 0},       {"alice,!alice", "alice", 0},  // a denial wins wherever it stands
        {"@staff ,!@interns", "ivan", 0},   {"@staff ,!@interns", "alice", 1},
        {"!@interns", "alice", 0},          // a denial alone grants nothing
        {"@nogroup-here", "alice", 0},      {"", "alice", 0},                   {"!", "alice", 0},
        {"corp\\dave", "CORP\\dave", 1},    {"\"@CORP\\domain users\"", "CORP\\dave", 1},
        {"\"@CORP\\domain users\",!CORP\\dave", "CORP\\dave", 0},
        {"zed", "zed", 0},                  // unknown users hold nothing
        {"!admin", "admin", 1},             // administrators hold every privilege
    };
    for (const auto &row : rows) {
        Grant(row.holders);
        EXPECT_EQ(VLIBUserPrivilegeHas(row.user, kPriv), row.expected) << row.user << " with [" << row.holders << "]";
    }
}

TEST_F(AppPrivilege, OnlyTheNamedPrivilegeCounts) {
    app_.SetAppPrivilege(kPriv, "alice").SetAppPrivilege(kOther, "bob");
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", kPriv), 1);
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", kOther), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("bob", kOther), 1);
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", "quib.tvq.app.tovana3.instance"), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", "QUIB.Unknown"), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("admin", "QUIB.Unknown"), 1);
    // Without the file only administrators hold privileges.
    ASSERT_EQ(unlink(QUIB_APP_PRIVILEGE_CONF), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", kPriv), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("admin", kPriv), 1);
}

// A damaged line (a control byte, invalid UTF-8, an unbalanced quote) could have lost a denial:
// it grants nobody. Each row was a way in for carol, whom the intact line denies.
TEST_F(AppPrivilege, ADamagedLineGrantsNobody) {
    app_.AddUser("carol");
    const std::string p = std::string(kPriv) + "=";
    const struct { std::string line; int alice; } rows[] = {
        {p + "\"@users,!carol\" # intact, with a note", 1},
        {p + "\"@users,!carol" + std::string(1, '\0') + "\"", 0},
        {p + "\"@users,!carol", 0},
        {p + "@users,\"!carol", 0},
        {p + "\"@users,\\\"!carol\"", 0},
        {p + "\"@users,\"!carol\"", 0},
        {p + "\"@users,!ca\x1brol\"", 0},
        {p + "\"@users,!carol\rx\"", 0},
        {p + "\"@users,!car\xffol\"", 0},
        {p + "'@users,!carol", 0},
    };
    for (const auto &row : rows) {
        app_.WriteFile(QUIB_APP_PRIVILEGE_CONF, "# privileges\n" + row.line + "\n");
        EXPECT_EQ(VLIBUserPrivilegeHas("carol", kPriv), 0) << row.line;
        EXPECT_EQ(VLIBUserPrivilegeHas("alice", kPriv), row.alice) << row.line;
        EXPECT_EQ(VLIBUserPrivilegeHas("admin", kPriv), 1) << row.line;
    }
}

// A holder that can't be checked might have been a denial: the privilege is refused.
TEST_F(AppPrivilege, UncheckableDenialRefuses) {
    app_.SetAppPrivilege(kPriv, "alice,!@interns").SetAppPrivilege(kOther, "alice");
    ASSERT_EQ(chmod("/etc/group", 0600), 0);  // group lookups fail for everyone but root
    int result = app_.RunAs("alice", [] {
        return VLIBUserPrivilegeHas("alice", kOther) * 10 + VLIBUserPrivilegeHas("alice", kPriv);
    });
    EXPECT_EQ(result, 10);
}

TEST_F(AppPrivilege, BadArgumentsHoldNothing) {
    app_.SetAppPrivilege(kPriv, "alice");
    std::string longPriv(300, 'p');
    const struct { const char *user, *priv; } rows[] = {
        {nullptr, kPriv}, {"", kPriv}, {"\xff", kPriv}, {"alice", nullptr}, {"alice", ""}, {"alice", "\xc3"},
        {"alice", longPriv.c_str()},
    };
    for (const auto &row : rows) {
        VLIBCErrSetEx(0, "", 0);
        EXPECT_EQ(VLIBUserPrivilegeHas(row.user, row.priv), 0) << (row.user ? row.user : "(null)");
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER) << (row.priv ? row.priv : "(null)");
    }
}

}  // namespace
