// Accounts and groups through NSS: records, "not found" kept apart from bad input and from a
// failing lookup, shadow expiry, membership (primary and supplementary), administrators, lists.
#include <stdio.h>
#include <sys/stat.h>
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

// "rc" for a call that did not fail, "-1/0xcode" with the code a failure set.
std::string Fails(int code) {
    char text[32];
    snprintf(text, sizeof text, "-1/%#x", code);
    return text;
}
std::string Outcome(int rc) { return rc < 0 ? Fails(VLIBCErrGet()) : std::to_string(rc); }
#define OUTCOME(call) (VLIBCErrSetEx(0, "", 0), Outcome(call))

User GetUser(const char *name) {
    PQUIBUSER raw = nullptr;
    EXPECT_EQ(QUIBUserGet(name, &raw), 0) << name;
    return User(raw);
}

Group GetGroup(const char *name) {
    PQUIBGROUP raw = nullptr;
    EXPECT_EQ(QUIBGroupGet(name, &raw), 0) << name;
    return Group(raw);
}

Strings Members(const Group &group) {
    Strings out;
    for (int i = 0; group && i < VLIBCSzListCount(group->pMembers); ++i) {
        out.emplace_back(VLIBCSzListGet(group->pMembers, i));
    }
    return out;
}

UserSpec Account(const std::string &name, Strings groups = {}, long expireDay = -1) {
    return UserSpec{.name = name, .groups = std::move(groups), .expireDay = expireDay};
}

// Basic() plus a domain and a directory account; "users" lists nobody, so membership in it
// can only come from the primary group.
class UsersAndGroups : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().AddUser(Account("CORP\\dave", {"CORP\\domain users"})).AddUser("erin@corp.example");
        std::ifstream in("/etc/group");
        std::stringstream out;
        for (std::string line; std::getline(in, line);) {
            out << (line.rfind("users:", 0) == 0 ? line.substr(0, line.rfind(':') + 1) : line) << "\n";
        }
        app_.WriteFile("/etc/group", out.str());
    }
    Appliance app_;
};

TEST_F(UsersAndGroups, Records) {
    User alice = GetUser("alice");
    ASSERT_NE(alice, nullptr);
    EXPECT_STREQ(alice->szName, "alice");
    EXPECT_EQ(alice->nUID, app_.Uid("alice"));
    EXPECT_EQ(alice->nGID, app_.Gid("users"));
    EXPECT_STREQ(alice->szHome, "/volume1/homes/alice");
    EXPECT_STREQ(alice->szShell, "/bin/sh");
    EXPECT_EQ(alice->authType, AUTH_LOCAL);
    EXPECT_EQ(GetUser("erin@corp.example")->authType, AUTH_LDAP);
    PQUIBUSER raw = nullptr;
    ASSERT_EQ(QUIBUserGetByUID(app_.Uid("CORP\\dave"), &raw, 1), 0);
    User dave(raw);
    EXPECT_STREQ(dave->szName, "CORP\\dave");
    EXPECT_EQ(dave->authType, AUTH_DOMAIN);

    uid_t uid = 0;
    gid_t gid = 0;
    ASSERT_EQ(QUIBUserGetUGID("bob", &uid, nullptr), 0);
    EXPECT_EQ(uid, app_.Uid("bob"));
    ASSERT_EQ(QUIBUserGetUGID("bob", &uid, &gid), 0);
    EXPECT_EQ(uid, app_.Uid("bob"));
    EXPECT_EQ(gid, app_.Gid("users"));
    ASSERT_EQ(QUIBGroupGetGID("staff", &gid), 0);
    EXPECT_EQ(gid, app_.Gid("staff"));

    Group staff = GetGroup("staff");
    EXPECT_EQ(Members(staff), (Strings{"alice", "bob"}));
    EXPECT_EQ(Members(GetGroup("users")), Strings{});
    PQUIBGROUP graw = nullptr;
    ASSERT_EQ(QUIBGroupGetByGID(app_.Gid("staff"), &graw, 0), 0);
    EXPECT_STREQ(Group(graw)->szName, "staff");

    GroupSpec big{"big", 0, {}};
    for (int i = 0; i < 2000; ++i) {
        big.members.push_back("member" + std::to_string(i));
    }
    app_.AddGroup(big);
    Strings members = Members(GetGroup("big"));  // the NSS buffer had to grow
    ASSERT_EQ(members.size(), 2000u);
    EXPECT_EQ(members.back(), "member1999");
}

TEST(AuthType, ToldByTheName) {
    const struct {
        const char *name;
        AUTH_TYPE type;
    } rows[] = {
        {"alice", AUTH_LOCAL},      {"CORP\\dave", AUTH_DOMAIN}, {"erin@corp.example", AUTH_LDAP},
        {"CORP\\x@y", AUTH_DOMAIN}, {"", AUTH_LOCAL},            {"\\", AUTH_DOMAIN},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(QUIBUserAuthTypeOf(row.name), row.type) << row.name;
    }
    EXPECT_EQ(QUIBUserAuthTypeOf(nullptr), AUTH_LOCAL);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
}

TEST_F(UsersAndGroups, UnknownIsNotFoundAndBadInputIsRejected) {
    PQUIBUSER user = nullptr;
    PQUIBGROUP group = nullptr;
    uid_t uid;
    gid_t gid;
    const std::string noUser = Fails(QUIB_ERR_NO_SUCH_USER);
    const std::string noGroup = Fails(QUIB_ERR_NO_SUCH_GROUP);
    EXPECT_EQ(OUTCOME(QUIBUserGet("zed", &user)), noUser);
    EXPECT_EQ(OUTCOME(QUIBUserGet("ALICE", &user)), noUser);  // local names are exact
    EXPECT_EQ(OUTCOME(QUIBUserGetByUID(424242, &user, 0)), noUser);
    EXPECT_EQ(OUTCOME(QUIBUserGetUGID("zed", &uid, &gid)), noUser);
    EXPECT_EQ(OUTCOME(QUIBUserIsExpired("zed")), noUser);
    EXPECT_EQ(OUTCOME(QUIBGroupIsAdminGroupMem("zed")), noUser);
    EXPECT_EQ(OUTCOME(QUIBGroupGet("nogroup-here", &group)), noGroup);
    EXPECT_EQ(OUTCOME(QUIBGroupGetByGID(424242, &group, 0)), noGroup);
    EXPECT_EQ(OUTCOME(QUIBGroupGetGID("nogroup-here", &gid)), noGroup);

    const std::string bad = Fails(QUIB_ERR_BAD_PARAMETER);
    std::string longName(300, 'a');
    for (const char *name : {static_cast<const char *>(nullptr), "", longName.c_str(), "\xff\xfe", "a\nb", "tab\tname"}) {
        const std::string outcomes[] = {
            OUTCOME(QUIBUserGet(name, &user)),       OUTCOME(QUIBGroupGet(name, &group)),
            OUTCOME(QUIBUserGetUGID(name, &uid, &gid)), OUTCOME(QUIBGroupGetGID(name, &gid)),
            OUTCOME(QUIBUserIsExpired(name)),        OUTCOME(QUIBGroupIsMember(name, "alice")),
            OUTCOME(QUIBGroupIsMember("staff", name)), OUTCOME(QUIBGroupIsAdminGroupMem(name)),
        };
        for (const std::string &outcome : outcomes) {
            EXPECT_EQ(outcome, bad) << (name ? name : "(null)");
        }
    }
    EXPECT_EQ(user, nullptr);
    EXPECT_EQ(group, nullptr);
    QUIBUserFree(nullptr);
    QUIBGroupFree(nullptr);
    for (const std::string &outcome :
         {OUTCOME(QUIBUserGet("alice", nullptr)), OUTCOME(QUIBUserGetByUID(0, nullptr, 0)),
          OUTCOME(QUIBGroupGet("staff", nullptr)), OUTCOME(QUIBGroupGetByGID(0, nullptr, 0)),
          OUTCOME(QUIBGroupGetGID("staff", nullptr)), OUTCOME(QUIBUserGetUGID("alice", nullptr, nullptr))}) {
        EXPECT_EQ(outcome, bad);
    }
}

// A lookup that fails is not an answer: with the group file unreadable, group lookups fail
// rather than say "no such group", and a list decides on names alone or not at all.
TEST_F(UsersAndGroups, FailingLookupsAreNotNotFound) {
    ASSERT_EQ(chmod("/etc/group", 0600), 0);
    int result = app_.RunAs("alice", [] {
        PQUIBGROUP group = nullptr;
        if (QUIBGroupGet("staff", &group) != -1 || VLIBCErrGet() == QUIB_ERR_NO_SUCH_GROUP ||
            QUIBGroupIsMember("staff", "alice") != -1 || VLIBCErrGet() == QUIB_ERR_NO_SUCH_GROUP) {
            return 1;
        }
        if (BlSDKUserIsInList("alice", "@staff") != -1 || BlSDKUserIsInList("alice", "@staff,bob") != -1) {
            return 2;
        }
        return BlSDKUserIsInList("alice", "@staff,alice") == 1 ? 0 : 3;
    });
    EXPECT_EQ(result, 0);
}

TEST_F(UsersAndGroups, Expiry) {
    const long today = static_cast<long>(time(nullptr) / 86400);
    const struct {
        const char *name;
        long expireDay;
        int expected;
    } rows[] = {
        {"never", -1, 0}, {"yesterday", today - 1, 1}, {"today", today, 1}, {"tomorrow", today + 1, 0}, {"epoch", 0, 1},
    };
    for (const auto &row : rows) {
        app_.AddUser(Account(row.name, {}, row.expireDay));
    }
    for (const auto &row : rows) {
        EXPECT_EQ(QUIBUserIsExpired(row.name), row.expected) << row.name;
    }
    // Only root can read shadow: others get a refusal, not a verdict.
    int result = app_.RunAs("alice", [] {
        return QUIBUserIsExpired("yesterday") == -1 && VLIBCErrGet() == QUIB_ERR_ACCESS_DENIED ? 0 : 1;
    });
    EXPECT_EQ(result, 0);
}

TEST_F(UsersAndGroups, Membership) {
    const struct {
        const char *group;
        const char *user;
        std::string expected;
    } rows[] = {
        {"staff", "alice", "1"},
        {"users", "alice", "1"},  // primary only
        {"staff", "admin", "0"},
        {"administrators", "admin", "1"},
        {"CORP\\domain users", "CORP\\dave", "1"},
        {"staff", "CORP\\dave", "0"},
        {"staff", "zed", Fails(QUIB_ERR_NO_SUCH_USER)},
        {"nogroup-here", "alice", Fails(QUIB_ERR_NO_SUCH_GROUP)},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(OUTCOME(QUIBGroupIsMember(row.group, row.user)), row.expected) << row.group << " " << row.user;
    }
}

TEST_F(UsersAndGroups, Administrators) {
    app_.AddUser(Account("CORP\\boss", {"administrators"})).AddUser(Account("chief@corp.example", {"administrators"}));
    const struct {
        const char *user;
        int plain;
        int withDomain;
        int localOnly;
    } rows[] = {
        {"admin", 1, 1, 1},
        {"alice", 0, 0, 0},
        {"CORP\\boss", 1, 1, 0},
        {"chief@corp.example", 1, 1, 0},
        {"CORP\\dave", 0, 0, 0},
        {"CORP\\nobody-here", -1, -1, 0},  // never an administrator: decided by the name
    };
    for (const auto &row : rows) {
        EXPECT_EQ(QUIBGroupIsAdminGroupMem(row.user), row.plain) << row.user;
        EXPECT_EQ(QUIBGroupIsAdminGroupMemEx(row.user, 1), row.withDomain) << row.user;
        EXPECT_EQ(QUIBGroupIsAdminGroupMemEx(row.user, 0), row.localOnly) << row.user;
    }
}

TEST_F(UsersAndGroups, UserLists) {
    const struct {
        const char *user;
        const char *list;
        int expected;
    } rows[] = {
        {"alice", "alice", 1},
        {"alice", "bob alice", 1},
        {"alice", " ,bob,,\talice, ", 1},
        {"ALICE", "alice", 1},
        {"alice", "alic", 0},
        {"alice", "alice2", 0},
        {"alice", "", 0},
        {"alice", ",,,", 0},
        {"alice", "@staff", 1},
        {"alice", "@users", 1},  // primary only
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
    for (const auto &row : rows) {
        EXPECT_EQ(BlSDKUserIsInList(row.user, row.list), row.expected) << row.user << " in [" << row.list << "]";
    }
    for (const std::string &outcome : {OUTCOME(BlSDKUserIsInList(nullptr, "alice")), OUTCOME(BlSDKUserIsInList("alice", nullptr)),
                                       OUTCOME(BlSDKUserIsInList("", "alice")), OUTCOME(BlSDKUserIsInList("\xff", "alice"))}) {
        EXPECT_EQ(outcome, Fails(QUIB_ERR_BAD_PARAMETER));
    }
}

}  // namespace
