// Accounts and groups through NSS: records, "not found" kept apart from bad input and from a
// failing lookup, shadow expiry, membership (primary and supplementary), administrators, lists.
#include <sys/stat.h>
#include <time.h>

#include <fstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_share.h"
#include "quib_user.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Outcome;
using Strings = std::vector<std::string>;
#define OUTCOME(call) norvo::testing::OutcomeOf([&] { return call; })

// The group's name, id and listed members, as "name gid: member ...".
std::string GroupLine(PQUIBGROUP group) {
    std::string out = group ? std::string(group->szName) + " " + std::to_string(group->nGID) + ":" : "<none>";
    for (int i = 0; group && i < VLIBCSzListCount(group->pMembers); ++i) {
        out += std::string(" ") + VLIBCSzListGet(group->pMembers, i);
    }
    QUIBGroupFree(group);
    return out;
}

std::string GroupLine(const char *name) {
    PQUIBGROUP group = nullptr;
    EXPECT_EQ(QUIBGroupGet(name, &group), 0) << name;
    return GroupLine(group);
}

// Basic() plus a domain and a directory account; "users" lists nobody, so membership in it
// can only come from the primary group.
class UsersAndGroups : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().AddUser("CORP\\dave").AddUser("erin@corp.example");
        app_.AddGroup({.name = "CORP\\domain users", .members = {"CORP\\dave"}});
        std::ifstream in("/etc/group");
        std::string text;
        for (std::string line; std::getline(in, line);) {
            text += (line.rfind("users:", 0) == 0 ? line.substr(0, line.rfind(':') + 1) : line) + "\n";
        }
        app_.WriteFile("/etc/group", text);
    }
    norvo::testing::Appliance app_;
};

TEST_F(UsersAndGroups, Records) {
    for (const char *name : {"alice", "CORP\\dave", "erin@corp.example"}) {
        PQUIBUSER user = nullptr;
        ASSERT_EQ(QUIBUserGetByUID(app_.Uid(name), &user, 1), 0) << name;
        EXPECT_STREQ(user->szName, name);
        EXPECT_EQ(user->nGID, app_.Gid("users")) << name;
        EXPECT_EQ(user->authType, QUIBUserAuthTypeOf(name)) << name;
        QUIBUserFree(user);
        ASSERT_EQ(QUIBUserGet(name, &user), 0) << name;
        EXPECT_EQ(user->nUID, app_.Uid(name)) << name;
        EXPECT_EQ(std::string(user->szHome), std::string("/volume1/homes/") + name);
        QUIBUserFree(user);
    }
    uid_t uid = 0;
    gid_t gid = 0;
    ASSERT_EQ(QUIBUserGetUGID("bob", &uid, nullptr), 0);
    EXPECT_EQ(uid, app_.Uid("bob"));
    ASSERT_EQ(QUIBUserGetUGID("bob", nullptr, &gid), 0);
    EXPECT_EQ(gid, app_.Gid("users"));
    ASSERT_EQ(QUIBGroupGetGID("staff", &gid), 0);
    EXPECT_EQ(gid, app_.Gid("staff"));

    const std::string staff = "staff " + std::to_string(app_.Gid("staff")) + ": alice bob";
    EXPECT_EQ(GroupLine("staff"), staff);
    PQUIBGROUP group = nullptr;
    EXPECT_EQ(QUIBGroupGetByGID(app_.Gid("staff"), &group, 0), 0);
    EXPECT_EQ(GroupLine(group), staff);
    EXPECT_EQ(GroupLine("users"), "users " + std::to_string(app_.Gid("users")) + ":");
    Strings big;
    std::string members;
    for (int i = 0; i < 2000; ++i) {
        big.push_back("member" + std::to_string(i));
        members += " " + big.back();
    }
    app_.AddGroup({.name = "big", .members = big});  // the NSS buffer has to grow
    EXPECT_EQ(GroupLine("big"), "big " + std::to_string(app_.Gid("big")) + ":" + members);
}

TEST_F(UsersAndGroups, UnknownIsNotFoundAndBadInputIsRejected) {
    PQUIBUSER user = nullptr;
    PQUIBGROUP group = nullptr;
    uid_t uid;
    gid_t gid;
    const Outcome noUser{-1, QUIB_ERR_NO_SUCH_USER}, noGroup{-1, QUIB_ERR_NO_SUCH_GROUP};
    EXPECT_EQ(OUTCOME(QUIBUserGet("zed", &user)), noUser);
    EXPECT_EQ(OUTCOME(QUIBUserGet("ALICE", &user)), noUser);  // local names are exact
    EXPECT_EQ(OUTCOME(QUIBUserGetByUID(424242, &user, 0)), noUser);
    EXPECT_EQ(OUTCOME(QUIBUserGetUGID("zed", &uid, &gid)), noUser);
    EXPECT_EQ(OUTCOME(QUIBUserIsExpired("zed")), noUser);
    EXPECT_EQ(OUTCOME(QUIBGroupIsAdminGroupMem("zed")), noUser);
    EXPECT_EQ(OUTCOME(QUIBGroupGet("nogroup-here", &group)), noGroup);
    EXPECT_EQ(OUTCOME(QUIBGroupGetByGID(424242, &group, 0)), noGroup);
    EXPECT_EQ(OUTCOME(QUIBGroupGetGID("nogroup-here", &gid)), noGroup);

    const Outcome bad{-1, QUIB_ERR_BAD_PARAMETER};
    std::string longName(300, 'a');
    for (const char *name : {static_cast<const char *>(nullptr), "", longName.c_str(), "\xff\xfe", "a\nb", "tab\tname"}) {
        for (const Outcome &outcome :
             {OUTCOME(QUIBUserGet(name, &user)), OUTCOME(QUIBGroupGet(name, &group)),
              OUTCOME(QUIBUserGetUGID(name, &uid, &gid)), OUTCOME(QUIBGroupGetGID(name, &gid)),
              OUTCOME(QUIBUserIsExpired(name)), OUTCOME(QUIBGroupIsMember(name, "alice")),
              OUTCOME(QUIBGroupIsMember("staff", name)), OUTCOME(QUIBGroupIsAdminGroupMem(name))}) {
            EXPECT_EQ(outcome, bad) << (name ? name : "(null)");
        }
    }
    EXPECT_EQ(user, nullptr);
    EXPECT_EQ(group, nullptr);
    QUIBUserFree(nullptr);
    QUIBGroupFree(nullptr);
}

// A lookup that fails is not an answer: with the group file unreadable, group lookups fail
// rather than say "no such group", and a list decides on names alone or not at all.
TEST_F(UsersAndGroups, FailingLookupsAreNotNotFound) {
    ASSERT_EQ(chmod("/etc/group", 0600), 0);
    int result = app_.RunAs("alice", [] {
        PQUIBGROUP group = nullptr;
        for (int rc : {QUIBGroupGet("staff", &group), QUIBGroupIsMember("staff", "alice")}) {
            if (rc != -1 || VLIBCErrGet() == QUIB_ERR_NO_SUCH_GROUP) {
                return 1;
            }
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
    const struct { const char *name; long expireDay; int expected; } rows[] = {
        {"never", -1, 0}, {"yesterday", today - 1, 1}, {"today", today, 1}, {"tomorrow", today + 1, 0}, {"epoch", 0, 1},
    };
    for (const auto &row : rows) {
        app_.AddUser(norvo::testing::UserSpec{.name = row.name, .expireDay = row.expireDay});
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

TEST_F(UsersAndGroups, MembershipAndAdministrators) {
    const struct { const char *group, *user; Outcome outcome; } rows[] = {
        {"staff", "alice", {1, 0}},          {"users", "alice", {1, 0}},  // primary only
        {"staff", "admin", {0, 0}},          {"administrators", "admin", {1, 0}},
        {"CORP\\domain users", "CORP\\dave", {1, 0}}, {"staff", "CORP\\dave", {0, 0}},
        {"staff", "zed", {-1, QUIB_ERR_NO_SUCH_USER}}, {"nogroup-here", "alice", {-1, QUIB_ERR_NO_SUCH_GROUP}},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(OUTCOME(QUIBGroupIsMember(row.group, row.user)), row.outcome) << row.group << " " << row.user;
    }

    app_.AddUser("CORP\\boss").AddUser("chief@corp.example");
    app_.AddGroup({.name = "administrators", .members = {"CORP\\boss", "chief@corp.example"}});
    const struct { const char *user; int plain, withDomain, localOnly; } admins[] = {
        {"admin", 1, 1, 1},       {"alice", 0, 0, 0},          {"CORP\\boss", 1, 1, 0},
        {"CORP\\dave", 0, 0, 0},  {"chief@corp.example", 1, 1, 0},
        {"CORP\\nobody-here", -1, -1, 0},  // never an administrator: decided by the name
    };
    for (const auto &row : admins) {
        EXPECT_EQ(QUIBGroupIsAdminGroupMem(row.user), row.plain) << row.user;
        EXPECT_EQ(QUIBGroupIsAdminGroupMemEx(row.user, 1), row.withDomain) << row.user;
        EXPECT_EQ(QUIBGroupIsAdminGroupMemEx(row.user, 0), row.localOnly) << row.user;
    }
}

TEST_F(UsersAndGroups, UserLists) {
    const struct { const char *user, *list; int expected; } rows[] = {
        {"alice", "alice", 1},         {"alice", "bob alice", 1},      {"alice", " ,bob,,\talice, ", 1},
        {"ALICE", "alice", 1},         {"alice", "alic", 0},           {"alice", "alice2", 0},
        {"alice", "", 0},              {"alice", ",,,", 0},            {"alice", "@staff", 1},
        {"alice", "@users", 1},        {"admin", "@staff", 0},         {"admin", "@administrators", 1},
        {"alice", "@nogroup-here", 0}, {"alice", "@", 0},              {"alice", "\"alice\"", 1},
        {"alice", "\"bob alice\"", 0},
        {"zed", "@staff", 0},  // unknown users belong to no group
        {"zed", "zed", 1},     // names compare without asking NSS
        {"CORP\\dave", "corp\\DAVE", 1}, {"CORP\\dave", "dave", 0},
        {"CORP\\dave", "\"@CORP\\domain users\"", 1}, {"CORP\\dave", "@\"CORP\\domain users\"", 1},
        {"CORP\\dave", "@CORP\\domain users", 0},  // unquoted: two entries, neither matches
        {"alice", "\"@CORP\\domain users\",alice", 1},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(BlSDKUserIsInList(row.user, row.list), row.expected) << row.user << " in [" << row.list << "]";
    }
    for (const Outcome &outcome : {OUTCOME(BlSDKUserIsInList(nullptr, "alice")), OUTCOME(BlSDKUserIsInList("alice", nullptr)),
                                   OUTCOME(BlSDKUserIsInList("", "alice")), OUTCOME(BlSDKUserIsInList("\xff", "alice"))}) {
        EXPECT_EQ(outcome, (Outcome{-1, QUIB_ERR_BAD_PARAMETER}));
    }
}

}  // namespace
