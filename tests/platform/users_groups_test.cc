// Accounts and groups through NSS: records, "not found" kept apart from bad input, shadow
// expiry, membership (primary and supplementary), administrators, and user lists.
#include <time.h>

#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_share.h"
#include "quib_user.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::GroupSpec;
using norvo::testing::UserSpec;
using Strings = std::vector<std::string>;

struct UserFree {
    void operator()(PQUIBUSER user) const { QUIBUserFree(user); }
};
using User = std::unique_ptr<QUIBUSER, UserFree>;
struct GroupFree {
    void operator()(PQUIBGROUP group) const { QUIBGroupFree(group); }
};
using Group = std::unique_ptr<QUIBGROUP, GroupFree>;

User GetUser(const char *name, int *code = nullptr) {
    PQUIBUSER raw = nullptr;
    VLIBCErrSetEx(0, "", 0);
    int rc = QUIBUserGet(name, &raw);
    if (code != nullptr) {
        *code = rc == 0 ? 0 : VLIBCErrGet();
    }
    return User(raw);
}

Group GetGroup(const char *name, int *code = nullptr) {
    PQUIBGROUP raw = nullptr;
    VLIBCErrSetEx(0, "", 0);
    int rc = QUIBGroupGet(name, &raw);
    if (code != nullptr) {
        *code = rc == 0 ? 0 : VLIBCErrGet();
    }
    return Group(raw);
}

Strings Members(const Group &group) {
    Strings out;
    for (int i = 0; i < VLIBCSzListCount(group->pMembers); ++i) {
        out.emplace_back(VLIBCSzListGet(group->pMembers, i));
    }
    return out;
}

long Today() {
    return static_cast<long>(time(nullptr) / 86400);
}

UserSpec Account(const std::string &name, Strings groups = {}) {
    UserSpec account;
    account.name = name;
    account.groups = std::move(groups);
    return account;
}

class UsersAndGroups : public ::testing::Test {
protected:
    void SetUp() override { app_.Basic(); }
    Appliance app_;
};

TEST_F(UsersAndGroups, LocalUserRecord) {
    User alice = GetUser("alice");
    ASSERT_NE(alice, nullptr);
    EXPECT_STREQ(alice->szName, "alice");
    EXPECT_EQ(alice->nUID, app_.Uid("alice"));
    EXPECT_EQ(alice->nGID, app_.Gid("users"));
    EXPECT_STREQ(alice->szHome, "/volume1/homes/alice");
    EXPECT_STREQ(alice->szShell, "/bin/sh");
    EXPECT_NE(alice->szGecos, nullptr);
    EXPECT_EQ(alice->authType, AUTH_LOCAL);

    PQUIBUSER raw = nullptr;
    ASSERT_EQ(QUIBUserGetByUID(app_.Uid("alice"), &raw, 0), 0);
    User byUid(raw);
    EXPECT_STREQ(byUid->szName, "alice");
    ASSERT_EQ(QUIBUserGetByUID(app_.Uid("alice"), &raw, 1), 0);
    QUIBUserFree(raw);
    QUIBUserFree(nullptr);
}

TEST_F(UsersAndGroups, DomainAndDirectoryAccountsComeThroughTheSameLookups) {
    app_.AddUser("CORP\\dave").AddUser("erin@corp.example");
    User dave = GetUser("CORP\\dave");
    ASSERT_NE(dave, nullptr);
    EXPECT_EQ(dave->authType, AUTH_DOMAIN);
    EXPECT_EQ(dave->nUID, app_.Uid("CORP\\dave"));
    User erin = GetUser("erin@corp.example");
    ASSERT_NE(erin, nullptr);
    EXPECT_EQ(erin->authType, AUTH_LDAP);
    PQUIBUSER raw = nullptr;
    ASSERT_EQ(QUIBUserGetByUID(app_.Uid("CORP\\dave"), &raw, 0), 0);
    User byUid(raw);
    EXPECT_STREQ(byUid->szName, "CORP\\dave");
    EXPECT_EQ(byUid->authType, AUTH_DOMAIN);
}

TEST(AuthType, ToldByTheName) {
    const struct {
        const char *name;
        AUTH_TYPE type;
    } cases[] = {
        {"alice", AUTH_LOCAL},      {"CORP\\dave", AUTH_DOMAIN}, {"erin@corp.example", AUTH_LDAP},
        {"CORP\\x@y", AUTH_DOMAIN}, {"", AUTH_LOCAL},            {"\\", AUTH_DOMAIN},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(QUIBUserAuthTypeOf(c.name), c.type) << c.name;
    }
    EXPECT_EQ(QUIBUserAuthTypeOf(nullptr), AUTH_LOCAL);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
}

TEST_F(UsersAndGroups, UnknownIsNotFoundAndBadInputIsRejected) {
    int code = 0;
    EXPECT_EQ(GetUser("zed", &code), nullptr);
    EXPECT_EQ(code, QUIB_ERR_NO_SUCH_USER);
    EXPECT_EQ(GetUser("ALICE", &code), nullptr);  // local names are exact
    EXPECT_EQ(code, QUIB_ERR_NO_SUCH_USER);
    PQUIBUSER raw = nullptr;
    EXPECT_EQ(QUIBUserGetByUID(424242, &raw, 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_USER);
    EXPECT_EQ(GetGroup("nogroup-here", &code), nullptr);
    EXPECT_EQ(code, QUIB_ERR_NO_SUCH_GROUP);
    PQUIBGROUP graw = nullptr;
    EXPECT_EQ(QUIBGroupGetByGID(424242, &graw, 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_GROUP);

    std::string longName(300, 'a');
    const char *badNames[] = {nullptr, "", longName.c_str(), "\xff\xfe", "a\nb", "tab\tname"};
    for (const char *bad : badNames) {
        EXPECT_EQ(GetUser(bad, &code), nullptr);
        EXPECT_EQ(code, QUIB_ERR_BAD_PARAMETER);
        EXPECT_EQ(GetGroup(bad, &code), nullptr);
        EXPECT_EQ(code, QUIB_ERR_BAD_PARAMETER);
        uid_t uid;
        gid_t gid;
        EXPECT_EQ(QUIBUserGetUGID(bad, &uid, &gid), -1);
        EXPECT_EQ(QUIBGroupGetGID(bad, &gid), -1);
        EXPECT_EQ(QUIBUserIsExpired(bad), -1);
        EXPECT_EQ(QUIBGroupIsMember(bad, "alice"), -1);
        EXPECT_EQ(QUIBGroupIsMember("staff", bad), -1);
        EXPECT_EQ(QUIBGroupIsAdminGroupMem(bad), -1);
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    }
    EXPECT_EQ(QUIBUserGet("alice", nullptr), -1);
    EXPECT_EQ(QUIBUserGetByUID(0, nullptr, 0), -1);
    EXPECT_EQ(QUIBGroupGet("staff", nullptr), -1);
    EXPECT_EQ(QUIBGroupGetByGID(0, nullptr, 0), -1);
    EXPECT_EQ(QUIBGroupGetGID("staff", nullptr), -1);
    EXPECT_EQ(QUIBUserGetUGID("alice", nullptr, nullptr), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
}

TEST_F(UsersAndGroups, Ids) {
    uid_t uid = 0;
    gid_t gid = 0;
    ASSERT_EQ(QUIBUserGetUGID("bob", &uid, &gid), 0);
    EXPECT_EQ(uid, app_.Uid("bob"));
    EXPECT_EQ(gid, app_.Gid("users"));
    uid = 0;
    ASSERT_EQ(QUIBUserGetUGID("bob", &uid, nullptr), 0);
    EXPECT_EQ(uid, app_.Uid("bob"));
    EXPECT_EQ(QUIBUserGetUGID("zed", &uid, &gid), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_USER);
    ASSERT_EQ(QUIBGroupGetGID("staff", &gid), 0);
    EXPECT_EQ(gid, app_.Gid("staff"));
    EXPECT_EQ(QUIBGroupGetGID("nogroup-here", &gid), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_GROUP);
}

TEST_F(UsersAndGroups, Expiry) {
    const struct {
        const char *name;
        long expireDay;
        int expected;
    } cases[] = {
        {"never", -1, 0},
        {"yesterday", Today() - 1, 1},
        {"today", Today(), 1},
        {"tomorrow", Today() + 1, 0},
        {"epoch", 0, 1},
    };
    for (const auto &c : cases) {
        UserSpec account = Account(c.name);
        account.expireDay = c.expireDay;
        app_.AddUser(account);
    }
    for (const auto &c : cases) {
        EXPECT_EQ(QUIBUserIsExpired(c.name), c.expected) << c.name;
    }
    EXPECT_EQ(QUIBUserIsExpired("zed"), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_USER);
    // Only root can read shadow: others get a refusal, not a verdict.
    int result = app_.RunAs("alice", [] {
        return QUIBUserIsExpired("yesterday") == -1 && VLIBCErrGet() == QUIB_ERR_ACCESS_DENIED ? 0 : 1;
    });
    EXPECT_EQ(result, 0);
}

TEST_F(UsersAndGroups, GroupRecords) {
    Group staff = GetGroup("staff");
    ASSERT_NE(staff, nullptr);
    EXPECT_STREQ(staff->szName, "staff");
    EXPECT_EQ(staff->nGID, app_.Gid("staff"));
    EXPECT_EQ(Members(staff), (Strings{"alice", "bob"}));

    app_.AddGroup(GroupSpec{"empty", 0, {}});
    Group empty = GetGroup("empty");
    ASSERT_NE(empty, nullptr);
    EXPECT_EQ(Members(empty), Strings{});

    PQUIBGROUP raw = nullptr;
    ASSERT_EQ(QUIBGroupGetByGID(app_.Gid("staff"), &raw, 1), 0);
    Group byGid(raw);
    EXPECT_STREQ(byGid->szName, "staff");
    QUIBGroupFree(nullptr);
}

TEST_F(UsersAndGroups, GroupWithManyMembers) {
    GroupSpec big{"big", 0, {}};
    for (int i = 0; i < 2000; ++i) {
        big.members.push_back("member" + std::to_string(i));
    }
    app_.AddGroup(big);
    Group group = GetGroup("big");
    ASSERT_NE(group, nullptr);  // the NSS buffer had to grow
    Strings members = Members(group);
    ASSERT_EQ(members.size(), 2000u);
    EXPECT_EQ(members.back(), "member1999");
}

TEST_F(UsersAndGroups, Membership) {
    app_.AddUser(Account("CORP\\dave", {"CORP\\domain users"}));
    const struct {
        const char *group;
        const char *user;
        int expected;
        int code;
    } cases[] = {
        {"staff", "alice", 1, 0},
        {"users", "alice", 1, 0},
        {"staff", "admin", 0, 0},
        {"administrators", "admin", 1, 0},
        {"CORP\\domain users", "CORP\\dave", 1, 0},
        {"staff", "CORP\\dave", 0, 0},
        {"staff", "zed", -1, QUIB_ERR_NO_SUCH_USER},
        {"nogroup-here", "alice", -1, QUIB_ERR_NO_SUCH_GROUP},
    };
    for (const auto &c : cases) {
        VLIBCErrSetEx(0, "", 0);
        EXPECT_EQ(QUIBGroupIsMember(c.group, c.user), c.expected) << c.group << " " << c.user;
        if (c.expected < 0) {
            EXPECT_EQ(VLIBCErrGet(), c.code) << c.group << " " << c.user;
        }
    }
}

TEST_F(UsersAndGroups, PrimaryGroupCountsWithoutBeingListed) {
    // Take every member off the "users" line: it stays alice's primary group.
    std::ifstream in("/etc/group");
    std::stringstream out;
    for (std::string line; std::getline(in, line);) {
        if (line.rfind("users:", 0) == 0) {
            line = line.substr(0, line.rfind(':') + 1);
        }
        out << line << "\n";
    }
    app_.WriteFile("/etc/group", out.str());
    Group users = GetGroup("users");
    ASSERT_NE(users, nullptr);
    EXPECT_EQ(Members(users), Strings{});
    EXPECT_EQ(QUIBGroupIsMember("users", "alice"), 1);
    EXPECT_EQ(BlSDKUserIsInList("alice", "@users"), 1);
}

TEST_F(UsersAndGroups, Administrators) {
    app_.AddUser(Account("CORP\\boss", {"administrators"}));
    app_.AddUser(Account("chief@corp.example", {"administrators"}));
    app_.AddUser(Account("CORP\\worker"));
    const struct {
        const char *user;
        int plain;
        int withDomain;
        int localOnly;
    } cases[] = {
        {"admin", 1, 1, 1},
        {"alice", 0, 0, 0},
        {"CORP\\boss", 1, 1, 0},
        {"chief@corp.example", 1, 1, 0},
        {"CORP\\worker", 0, 0, 0},
        {"CORP\\nobody-here", -1, -1, 0},  // never an administrator: decided by the name
    };
    for (const auto &c : cases) {
        EXPECT_EQ(QUIBGroupIsAdminGroupMem(c.user), c.plain) << c.user;
        EXPECT_EQ(QUIBGroupIsAdminGroupMemEx(c.user, 1), c.withDomain) << c.user;
        EXPECT_EQ(QUIBGroupIsAdminGroupMemEx(c.user, 0), c.localOnly) << c.user;
    }
    EXPECT_EQ(QUIBGroupIsAdminGroupMem("zed"), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_USER);
}

TEST_F(UsersAndGroups, UserLists) {
    app_.AddUser(Account("CORP\\dave", {"CORP\\domain users"}));
    const struct {
        const char *user;
        const char *list;
        int expected;
    } cases[] = {
        {"alice", "alice", 1},
        {"alice", "bob,alice", 1},
        {"alice", "bob, alice", 1},
        {"alice", "bob alice", 1},
        {"alice", " ,bob,,\talice, ", 1},
        {"ALICE", "alice", 1},
        {"alice", "ALICE", 1},
        {"alice", "alic", 0},
        {"alice", "alice2", 0},
        {"alice", "", 0},
        {"alice", ",,,", 0},
        {"alice", "@staff", 1},
        {"alice", "@users", 1},
        {"admin", "@staff", 0},
        {"admin", "@administrators", 1},
        {"alice", "@nogroup-here", 0},
        {"alice", "@", 0},
        {"zed", "@staff", 0},  // unknown users belong to no group
        {"zed", "zed", 1},     // names compare without asking NSS
        {"CORP\\dave", "corp\\DAVE", 1},
        {"CORP\\dave", "dave", 0},
        {"CORP\\dave", "\"@CORP\\domain users\"", 1},
        {"CORP\\dave", "@\"CORP\\domain users\"", 1},
        {"CORP\\dave", "@CORP\\domain users", 0},  // unquoted: two entries, neither matches
        {"alice", "\"@CORP\\domain users\",alice", 1},
        {"alice", "\"alice\"", 1},
        {"alice", "\"bob alice\"", 0},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(BlSDKUserIsInList(c.user, c.list), c.expected) << c.user << " in [" << c.list << "]";
    }
    EXPECT_EQ(BlSDKUserIsInList(nullptr, "alice"), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(BlSDKUserIsInList("alice", nullptr), -1);
    EXPECT_EQ(BlSDKUserIsInList("", "alice"), -1);
    EXPECT_EQ(BlSDKUserIsInList("\xff", "alice"), -1);
}

}  // namespace
