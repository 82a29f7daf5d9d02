// Application privileges: holders, groups, denials, administrators.
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::UserSpec;

constexpr const char kPriv[] = "QUIB.TVQ.App.Tovana3.Instance";

class AppPrivilege : public ::testing::Test {
protected:
    // Writes the privilege file by hand, so holders may carry quotes (escaped as \").
    void Grant(const std::string &holders) {
        std::string escaped;
        for (char c : holders) {
            if (c == '"' || c == '\\') {
                escaped += '\\';
            }
            escaped += c;
        }
        app_.WriteFile(QUIB_APP_PRIVILEGE_CONF, std::string(kPriv) + "=\"" + escaped + "\"\n");
    }

    void SetUp() override {
        app_.Basic();
        UserSpec intern;
        intern.name = "ivan";
        intern.groups = {"interns", "staff"};
        app_.AddUser(intern);
        UserSpec dave;
        dave.name = "CORP\\dave";
        dave.groups = {"CORP\\domain users"};
        app_.AddUser(dave);
    }
    Appliance app_;
};

TEST_F(AppPrivilege, HoldersGroupsAndDenials) {
    const struct {
        const char *holders;
        const char *user;
        int expected;
    } cases[] = {
        {"alice", "alice", 1},
        {"alice", "bob", 0},
        {"bob,alice", "alice", 1},
        {"ALICE", "alice", 1},
        {"@staff", "alice", 1},
        {"@staff", "ivan", 1},
        {"@staff,!bob", "bob", 0},
        {"@staff,!bob", "alice", 1},
        {"!alice,alice", "alice", 0},  // a denial wins wherever it stands
        {"alice,!alice", "alice", 0},
        {"@staff,!@interns", "ivan", 0},
        {"@staff,!@interns", "alice", 1},
        {"!@interns", "alice", 0},  // a denial alone grants nothing
        {"@nogroup-here", "alice", 0},
        {"", "alice", 0},
        {"!", "alice", 0},
        {"corp\\dave", "CORP\\dave", 1},
        {"\"@CORP\\domain users\"", "CORP\\dave", 1},
        {"\"@CORP\\domain users\",!CORP\\dave", "CORP\\dave", 0},
        {"zed", "zed", 0},  // unknown users hold nothing
        {"!admin", "admin", 1},  // administrators hold every privilege
    };
    for (const auto &c : cases) {
        Grant(c.holders);
        EXPECT_EQ(VLIBUserPrivilegeHas(c.user, kPriv), c.expected) << c.user << " with [" << c.holders << "]";
    }
}

TEST_F(AppPrivilege, OnlyTheNamedPrivilegeCounts) {
    app_.SetAppPrivilege(kPriv, "alice");
    app_.SetAppPrivilege("QUIB.Other.App", "bob");
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", kPriv), 1);
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", "QUIB.Other.App"), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("bob", "QUIB.Other.App"), 1);
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", "quib.tvq.app.tovana3.instance"), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", "QUIB.Unknown"), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("admin", "QUIB.Unknown"), 1);
}

TEST_F(AppPrivilege, WithoutTheFileOnlyAdministratorsHoldPrivileges) {
    app_.SetAppPrivilege(kPriv, "alice");
    ASSERT_EQ(unlink(QUIB_APP_PRIVILEGE_CONF), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", kPriv), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("admin", kPriv), 1);
}

TEST_F(AppPrivilege, HandWrittenFile) {
    app_.WriteFile(QUIB_APP_PRIVILEGE_CONF,
                   "# application privileges\n"
                   "QUIB.TVQ.App.Tovana3.Instance = \"alice, @interns ,!ivan\"\r\n");
    EXPECT_EQ(VLIBUserPrivilegeHas("alice", kPriv), 1);
    EXPECT_EQ(VLIBUserPrivilegeHas("ivan", kPriv), 0);
    EXPECT_EQ(VLIBUserPrivilegeHas("bob", kPriv), 0);
}

TEST_F(AppPrivilege, BadArgumentsHoldNothing) {
    app_.SetAppPrivilege(kPriv, "alice");
    std::string longPriv(300, 'p');
    const struct {
        const char *user;
        const char *priv;
    } cases[] = {
        {nullptr, kPriv}, {"", kPriv}, {"\xff", kPriv}, {"alice", nullptr},
        {"alice", ""},    {"alice", "\xc3"}, {"alice", longPriv.c_str()},
    };
    for (const auto &c : cases) {
        VLIBCErrSetEx(0, "", 0);
        EXPECT_EQ(VLIBUserPrivilegeHas(c.user, c.priv), 0);
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    }
}

}  // namespace
