// Accounts and groups through NSS: records, "not found" kept apart from bad input and from a
// failing lookup, shadow expiry, membership (primary and supplementary), administrators, lists;
// the database cursors over NSS enumeration and a user's group ids as text; and the home
// service: per-kind switches, the homes root, and homes outside it.
#include <stdio.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <fstream>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_paths.h"
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

// Names by id are the enumeration's (tests/norvoenum); here the lookups by name, and a group
// too big for the first NSS buffer.
TEST_F(UsersAndGroups, Records) {
    for (const char *name : {"alice", "CORP\\dave", "erin@corp.example"}) {
        PQUIBUSER user = nullptr;
        ASSERT_EQ(QUIBUserGet(name, &user), 0) << name;
        EXPECT_EQ(std::tuple(user->nUID, user->nGID, user->authType, std::string(user->szHome)),
                  std::tuple(app_.Uid(name), app_.Gid("users"), QUIBUserAuthTypeOf(name),
                             "/volume1/homes/" + std::string(name)));
        QUIBUserFree(user);
    }
    uid_t uid = 0;
    gid_t gid = 0;
    ASSERT_EQ(QUIBUserGetUGID("bob", &uid, &gid), 0);
    EXPECT_EQ(std::pair(uid, gid), std::pair(app_.Uid("bob"), app_.Gid("users")));
    PQUIBGROUP group = nullptr;
    EXPECT_EQ(QUIBGroupGetByGID(app_.Gid("staff"), &group, 0), 0);
    EXPECT_EQ(GroupLine(group), "staff " + std::to_string(app_.Gid("staff")) + ": alice bob");
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
    EXPECT_EQ(OUTCOME(QUIBUserGet("ALICE", &user)), noUser);  // local names are exact
    EXPECT_EQ(OUTCOME(QUIBUserGetByUID(424242, &user, 0)), noUser);
    EXPECT_EQ(OUTCOME(QUIBUserIsExpired("zed")), noUser);
    EXPECT_EQ(OUTCOME(QUIBGroupGet("nogroup-here", &group)), noGroup);
    EXPECT_EQ(OUTCOME(QUIBGroupGetByGID(424242, &group, 0)), noGroup);

    const Outcome bad{-1, QUIB_ERR_BAD_PARAMETER};
    std::string longName(300, 'a');
    for (const char *name : {static_cast<const char *>(nullptr), longName.c_str(), "\xff\xfe", "a\nb"}) {
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
        // Holders, groups and case as the application privileges show them; here the separators,
        // whole names, the primary group, and quoting.
        {"alice", " ,bob,,\talice, ", 1}, {"alice", "alic", 0},          {"alice", "alice2", 0},
        {"alice", ",,,", 0},              {"alice", "@users", 1},        {"alice", "@", 0},
        {"alice", "\"alice\"", 1},        {"alice", "\"bob alice\"", 0},
        {"zed", "zed", 1},  // names compare without asking NSS
        {"CORP\\dave", "dave", 0},        {"CORP\\dave", "@\"CORP\\domain users\"", 1},
        {"CORP\\dave", "@CORP\\domain users", 0},  // unquoted: two entries, neither matches
    };
    for (const auto &row : rows) {
        EXPECT_EQ(BlSDKUserIsInList(row.user, row.list), row.expected) << row.user << " in [" << row.list << "]";
    }
    for (const Outcome &outcome : {OUTCOME(BlSDKUserIsInList(nullptr, "alice")), OUTCOME(BlSDKUserIsInList("alice", nullptr)),
                                   OUTCOME(BlSDKUserIsInList("", "alice")), OUTCOME(BlSDKUserIsInList("\xff", "alice"))}) {
        EXPECT_EQ(outcome, (Outcome{-1, QUIB_ERR_BAD_PARAMETER}));
    }
}

// Every name a fresh cursor delivers for type; the cursor then stays at its end.
Strings UserNames(AUTH_TYPE type) {
    Strings names;
    PQUIBUSER_DB db = QUIBUserDBOpen();
    PQUIBUSER user = nullptr;
    while (QUIBUserDBGetByCursor(db, &user, type, 1) == 0) {
        names.emplace_back(user->szName);
        EXPECT_EQ(user->authType, QUIBUserAuthTypeOf(user->szName));
    }
    EXPECT_EQ(QUIBUserDBGetByCursor(db, &user, type, 1), 1);
    QUIBUserFree(user);
    QUIBUserDBClose(db);
    return names;
}

Strings GroupNames(AUTH_TYPE type) {
    Strings names;
    PQUIBGROUP_DB db = QUIBGroupDBOpen();
    PQUIBGROUP group = nullptr;
    while (QUIBGroupDBGetByCursor(db, &group, type, 0) == 0) {
        names.emplace_back(group->szName);
    }
    QUIBGroupFree(group);
    QUIBGroupDBClose(db);
    return names;
}

// Each kind alone is the enumeration's (tests/norvoenum); here the order and a mask of two kinds.
TEST_F(UsersAndGroups, CursorsDeliverTheSelectedKindsInDatabaseOrder) {
    EXPECT_EQ(UserNames(AUTH_ALL), (Strings{"root", "nobody", "admin", "alice", "bob", "CORP\\dave", "erin@corp.example"}));
    EXPECT_EQ(UserNames(static_cast<AUTH_TYPE>(AUTH_DOMAIN | AUTH_LDAP)), (Strings{"CORP\\dave", "erin@corp.example"}));
    EXPECT_EQ(GroupNames(AUTH_ALL), (Strings{"root", "users", "administrators", "nogroup", "staff", "CORP\\domain users"}));
}

TEST_F(UsersAndGroups, BadArgumentsAndBrokenDatabases) {
    PQUIBUSER user = nullptr;
    PQUIBGROUP group = nullptr;
    PQUIBUSER_DB db = QUIBUserDBOpen();
    PQUIBGROUP_DB gdb = QUIBGroupDBOpen();
    const Outcome bad{-1, QUIB_ERR_BAD_PARAMETER};
    const AUTH_TYPE none = static_cast<AUTH_TYPE>(0);
    EXPECT_EQ(norvo::testing::OutcomeOf([&] { return QUIBUserDBGetByCursor(db, &user, none, 1); }), bad);
    EXPECT_EQ(norvo::testing::OutcomeOf([&] { return QUIBGroupDBGetByCursor(gdb, &group, none, 1); }), bad);
    QUIBUserDBClose(db);
    QUIBGroupDBClose(gdb);
    QUIBUserDBClose(nullptr);

    // An entry beyond the first buffer is offered again in a bigger one (up to 16 MiB; the
    // library's tests show a bigger one failing the open).
    app_.WriteFile("/etc/passwd", norvo::testing::ReadFile("/etc/passwd") + "wide:x:5555:100:" + std::string(100000, 'g') + ":/:/bin/sh\nlast:x:5556:100::/:/bin/sh\n");
    const Strings names = UserNames(AUTH_LOCAL);
    EXPECT_EQ(Strings(names.end() - 2, names.end()), (Strings{"wide", "last"}));
}

// The ids appended after a first item, and the call's result.
std::pair<int, Strings> GroupList(const char *user, int flags = 0) {
    PSZLIST list = VLIBCSzListAlloc(1);
    VLIBCSzListPush(&list, "before");
    VLIBCErrSetEx(0, "", 0);
    const int rc = QUIBGroupInfoGetgroupList(user, &list, flags);
    Strings ids;
    for (int i = 1; i < VLIBCSzListCount(list); ++i) {
        ids.emplace_back(VLIBCSzListGet(list, i));
    }
    VLIBCSzListFree(list);
    return {rc == 0 ? 0 : VLIBCErrGet(), ids};
}

TEST_F(UsersAndGroups, GroupListIsDecimalIdsPrimaryFirst) {
    const auto id = [this](const std::string &group) { return std::to_string(app_.Gid(group)); };
    norvo::testing::UserSpec joiner{.name = "joiner"};
    for (int i = 0; i < 600; ++i) {
        joiner.groups.push_back("team" + std::to_string(i));
    }
    app_.AddUser(joiner);
    const Strings many = GroupList("joiner").second;  // the one-slot list had to grow
    ASSERT_EQ(many.size(), 601u);
    EXPECT_EQ(many.front(), id("users"));
    EXPECT_EQ(many.back(), id("team599"));

    EXPECT_EQ(GroupList("zed"), std::make_pair(static_cast<int>(QUIB_ERR_NO_SUCH_USER), Strings{}));
    EXPECT_EQ(GroupList("alice", 1), std::make_pair(static_cast<int>(QUIB_ERR_BAD_PARAMETER), Strings{}));
    for (const char *bad : {static_cast<const char *>(nullptr), "", "\xff\xfe", "a\nb"}) {
        EXPECT_EQ(GroupList(bad), std::make_pair(static_cast<int>(QUIB_ERR_BAD_PARAMETER), Strings{}));
    }
    PSZLIST none = nullptr;
    EXPECT_EQ(QUIBGroupInfoGetgroupList("alice", &none, 0), -1);
    EXPECT_EQ(QUIBGroupInfoGetgroupList("alice", nullptr, 0), -1);
}

// user's home folder, or "<none 0xcode>".
std::string HomePath(const char *user) {
    char buf[256];
    VLIBCErrSetEx(0, "", 0);
    if (QUIBServiceHomePathGet(user, buf, sizeof buf) == 0) {
        return buf;
    }
    snprintf(buf, sizeof buf, "<none %#x>", VLIBCErrGet());
    return buf;
}

class HomeService : public ::testing::Test {
protected:
    norvo::testing::Appliance app_;
};

// Records as a caller may build them (the accounts' own records are HomePathOfAUser's); domain
// accounts are off.
TEST_F(HomeService, EnabledForHomesBelowTheRoot) {
    app_.SetHomeService(true, "/volume1/homes", false, true);
    const struct { const char *name, *home; int kind, expected; } rows[] = {
        {"erin@corp.example", "/volume1/homes/erin", AUTH_LDAP, 1},
        {"neighbour", "/volume1/homesick/neighbour", AUTH_LOCAL, 0},  // whole components
        {"rooted", "/volume1/homes", AUTH_LOCAL, 0},  // the root itself is nobody's home
        {"homeless", nullptr, AUTH_LOCAL, 0},
        {"CORP\\carl", "/volume1/homes/carl", AUTH_DOMAIN, 0},
        {"CORP\\carl", "/volume1/homes/carl", 0, 0},  // no kind given: the name tells it
        {"carl", "/volume1/homes/carl", 0, 1},
        {"CORP\\carl", "/volume1/homes/carl", AUTH_LOCAL, 1},  // a kind given wins over the name
    };
    for (const auto &row : rows) {
        QUIBUSER user{};
        user.szName = const_cast<char *>(row.name);
        user.szHome = const_cast<char *>(row.home);
        user.authType = static_cast<AUTH_TYPE>(row.kind);
        EXPECT_EQ(QUIBServiceUserHomeIsEnabled(&user), row.expected) << row.name << " at " << (row.home ? row.home : "(null)");
    }
    EXPECT_EQ(QUIBServiceUserHomeIsEnabled(nullptr), 0);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
}

// A user's home folder by name: the account's own home, normalised, when the service covers it.
TEST_F(HomeService, HomePathOfAUser) {
    app_.SetHomeService(true, "/volume1/homes", false, true);
    app_.AddUser("alice").AddUser(norvo::testing::UserSpec{.name = "messy", .home = "/volume1//homes/./messy/"});
    app_.AddUser(norvo::testing::UserSpec{.name = "outsider", .home = "/var/lib/outsider"}).AddUser("CORP\\carl").AddUser("erin@corp.example");
    const struct { const char *user, *path; } rows[] = {
        {"alice", "/volume1/homes/alice"},
        {"messy", "/volume1/homes/messy"}, {"erin@corp.example", "/volume1/homes/erin@corp.example"},
        {"outsider", "<none 0xbe00>"}, {"CORP\\carl", "<none 0xbe00>"},  // domain homes are off
        {"nobody-here", "<none 0x1d00>"}, {"", "<none 0xd00>"},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(HomePath(row.user), row.path) << row.user;
    }
    char exact[sizeof "/volume1/homes/alice"];
    EXPECT_EQ(QUIBServiceHomePathGet("alice", exact, sizeof exact - 1), -1);  // never cut short
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NAME_TOO_LONG);
    EXPECT_EQ(QUIBServiceHomePathGet("alice", exact, sizeof exact), 0);
    EXPECT_STREQ(exact, "/volume1/homes/alice");
}

// Each row writes the settings file (a null value leaves its line out) and expects the service
// for the accounts alice, CORP\dave and erin@corp.example, and alice's home folder.
TEST_F(HomeService, SwitchesAndRoot) {
    app_.AddUser("alice").AddUser("CORP\\dave").AddUser("erin@corp.example");
    const char *keys[] = {"userHomeEnable", "domainUserHomeEnable", "ldapUserHomeEnable", "userHomeRoot"};
    const char *const off = "<none 0xbe00>";
    const struct { const char *values[4], *enabled, *root; } rows[] = {
        {{"yes", "yes", "yes", "/volume1/homes/"}, "111", "/volume1/homes/alice"},
        {{"yes", "no", "yes", "/volume1/homes"}, "101", "/volume1/homes/alice"},
        {{"yes", "yes", "no", "/volume1/homes"}, "110", "/volume1/homes/alice"},
        {{"no", "yes", nullptr, "/volume1/homes"}, "010", off},  // on for other kinds only
        {{"YES", "maybe", nullptr, "/volume1/homes"}, "100", "/volume1/homes/alice"},
        {{"no", "no", "no", "/volume1/homes"}, "000", off},
        {{"yes", "yes", "yes", nullptr}, "000", off},
        {{"yes", "yes", "yes", "relative/homes"}, "000", off},
        {{"yes", "yes", "yes", "/"}, "000", off},
        {{"yes", "yes", "yes", ""}, "000", off},
    };
    auto enabled = [] {
        std::string out;
        for (const char *name : {"alice", "CORP\\dave", "erin@corp.example"}) {
            PQUIBUSER user = nullptr;
            out += QUIBUserGet(name, &user) == 0 ? std::to_string(QUIBServiceUserHomeIsEnabled(user)) : "?";
            QUIBUserFree(user);
        }
        return out;
    };
    for (const auto &row : rows) {
        std::string text;
        for (int i = 0; i < 4; ++i) {
            text += row.values[i] ? std::string(keys[i]) + "=\"" + row.values[i] + "\"\n" : "";
        }
        app_.WriteFile(QUIB_INFO_CONF, text);
        EXPECT_EQ(enabled(), row.enabled) << text;
        EXPECT_EQ(HomePath("alice"), row.root) << text;
    }
    ASSERT_EQ(unlink(QUIB_INFO_CONF), 0);
    EXPECT_EQ(enabled(), "000");
    EXPECT_EQ(HomePath("alice"), off);  // no settings: the service was never turned on
}

}  // namespace
