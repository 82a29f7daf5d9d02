// Whole-database enumerations of users and groups, a user's groups, the reading of the
// platform's group list with its fixed log lines, and the name caches: one platform lookup per
// known id, unknown ids asked again.
#include <syslog.h>

#include <fstream>
#include <list>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/norvoenum.h"
#include "norvoenum/group_ids.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::GroupSpec;
using norvo::testing::LogLine;
using norvo::testing::UserSpec;
using Ids = std::list<unsigned int>;
using Names = std::set<std::string>;

std::string ReadWhole(const char *path) {
    std::ifstream in(path);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

class Accounts : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic()
            .AddUser(UserSpec{.name = "CORP\\dave", .groups = {"CORP\\domain users"}})
            .AddUser("erin@corp.example");
    }
    Appliance app_;
    NvoEnum enum_;
};

template <typename Info>
Names NamesOf(const std::map<unsigned int, Info> &entries) {
    Names names;
    for (const auto &entry : entries) {
        names.insert(entry.second.name);
    }
    return names;
}

TEST_F(Accounts, AuthTypeSelectsLocalDomainOrDirectoryAccounts) {
    std::map<unsigned int, _tag_USER_INFO_> local, directory;
    ASSERT_EQ(enum_.EnumAllUsers(local, AUTH_LOCAL), 1);
    ASSERT_EQ(enum_.EnumAllUsers(directory, AUTH_LDAP), 1);
    EXPECT_EQ(NamesOf(local), (Names{"root", "nobody", "admin", "alice", "bob"}));
    EXPECT_EQ(NamesOf(directory), Names{"erin@corp.example"});
    const _tag_USER_INFO_ &alice = local.at(app_.Uid("alice"));
    EXPECT_EQ(alice.name, "alice");
    EXPECT_EQ(alice.uid, app_.Uid("alice"));
    EXPECT_EQ(alice.gid, app_.Gid("users"));

    std::map<unsigned int, _tag_GROUP_INFO_> groups;
    ASSERT_EQ(enum_.EnumAllGroups(groups, AUTH_DOMAIN), 1);
    ASSERT_EQ(groups.size(), 1u);
    EXPECT_EQ(groups.at(app_.Gid("CORP\\domain users")).name, "CORP\\domain users");
}

TEST_F(Accounts, ARepeatedIdKeepsTheLastRecordAndOtherEntriesStay) {
    app_.WriteFile("/etc/passwd", ReadWhole("/etc/passwd") + "toor:x:0:101::/root:/bin/sh\n");
    app_.WriteFile("/etc/group", ReadWhole("/etc/group") + "wheel:x:0:\n");
    std::map<unsigned int, _tag_USER_INFO_> users{{77777, {"kept", 77777, 1}}};
    ASSERT_EQ(enum_.EnumAllUsers(users, AUTH_ALL), 1);
    EXPECT_EQ(users.at(0).name, "toor");
    EXPECT_EQ(users.at(0).gid, 101u);
    EXPECT_EQ(users.at(77777).name, "kept");
    std::map<unsigned int, _tag_GROUP_INFO_> groups;
    ASSERT_EQ(enum_.EnumAllGroups(groups, AUTH_LOCAL), 1);
    EXPECT_EQ(groups.at(0).name, "wheel");
}

TEST_F(Accounts, ADatabaseThatCannotBeOpenedIsLogged) {
    // A record NSS can't deliver within 16 MiB makes the platform's open fail.
    app_.WriteFile("/etc/passwd", "root:x:0:0:" + std::string(17 << 20, 'g') + ":/root:/bin/sh\n");
    app_.WriteFile("/etc/group", "big:x:5000:" + std::string(17 << 20, 'm') + "\n");
    std::map<unsigned int, _tag_USER_INFO_> users;
    std::map<unsigned int, _tag_GROUP_INFO_> groups;
    EXPECT_EQ(enum_.EnumAllUsers(users, AUTH_ALL), 0);
    EXPECT_EQ(enum_.EnumAllGroups(groups, AUTH_ALL), 0);
    EXPECT_EQ(app_.Logs(), (std::vector<LogLine>{{LOG_ERR, "norvoenum.cpp:558 Failed to open user db"},
                                                 {LOG_ERR, "norvoenum.cpp:527 Failed to open group db"}}));
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_FAILED);  // the platform's reason
}

TEST_F(Accounts, UserGroupsAreAppendedPrimaryFirst) {
    Ids gids{7};
    EXPECT_EQ(enum_.EnumUserGroups(gids, "alice"), 1);
    EXPECT_EQ(gids, (Ids{7, app_.Gid("users"), app_.Gid("staff")}));
    // Unknown users and names no account can have get no groups, and that is no failure.
    for (const std::string &user : {std::string("zed"), std::string(), std::string(5000, 'a'),
                                    std::string("\xff\xfe"), std::string("a\0b", 3)}) {
        Ids none;
        EXPECT_EQ(enum_.EnumUserGroups(none, user), 1);
        EXPECT_TRUE(none.empty());
    }
    EXPECT_TRUE(app_.Logs().empty());
}

// Linux's platform prints gid_t values itself, so a bad element can't come from getgrouplist:
// the reader the enumeration uses is fed such lists directly.
TEST(GroupListReading, EveryElementMustBeADecimalId) {
    Appliance app;
    const std::string badFormat = "norvoenum.cpp:606 Get Error Formate from QUIBGroupInfoGetgroupList ";
    const struct {
        std::vector<const char *> elements;
        bool ok;
        Ids ids;
        std::string log;  // the raw line, with its fixed number
    } table[] = {
        {{"100", "0", "4294967295"}, true, {100, 0, 4294967295u}, ""},
        {{}, true, {}, ""},
        {{"100", "12abc", "7"}, false, {100}, badFormat + "(12abc)"},
        {{""}, false, {}, badFormat + "()"},
        {{"4294967296"}, false, {}, badFormat + "(4294967296)"},
        {{"-1"}, false, {}, badFormat + "(-1)"},
        {{" 1"}, false, {}, badFormat + "( 1)"},
        {{"1\xff"}, false, {}, badFormat + "(1\xff)"},
        {{"5", nullptr, "6"}, false, {5}, "norvoenum.cpp:601 Get NULL from QUIBGroupInfoGetgroupList"},
    };
    for (const auto &row : table) {
        app.ClearLogs();
        // Laid out by hand: the platform's push never stores a null element.
        std::vector<char *> items;
        for (const char *element : row.elements) {
            items.push_back(const_cast<char *>(element));
        }
        SZLIST list{static_cast<int>(items.size()), static_cast<int>(items.size()), items.data()};
        Ids ids;
        EXPECT_EQ(norvo::AppendGroupIds(&list, ids), row.ok);
        EXPECT_EQ(ids, row.ids);
        EXPECT_EQ(app.Logs(), (row.log.empty() ? std::vector<LogLine>{} : std::vector<LogLine>{{LOG_ERR, row.log}}));
    }
}

// Renames an entry in /etc/passwd or /etc/group behind the platform's back.
void Rename(Appliance &app, const char *file, const std::string &from, const std::string &to) {
    std::string text = ReadWhole(file);
    const size_t at = text.find("\n" + from + ":");
    ASSERT_NE(at, std::string::npos) << from;
    text.replace(at + 1, from.size(), to);
    app.WriteFile(file, text);
}

TEST_F(Accounts, NameCachesLookKnownIdsUpOnce) {
    NorvoUserEnum &names = enum_.UserEnum();
    const unsigned int alice = app_.Uid("alice");
    const unsigned int staff = app_.Gid("staff");
    EXPECT_EQ(names.GetUserNameByUID(alice), "alice");
    EXPECT_EQ(names.GetGroupNameByGID(staff), "staff");
    EXPECT_EQ(names.GetUserNameByUID(0), "root");

    Rename(app_, "/etc/passwd", "alice", "alicia");
    Rename(app_, "/etc/group", "staff", "crew");
    EXPECT_EQ(names.GetUserNameByUID(alice), "alice");  // cached
    EXPECT_EQ(names.GetGroupNameByGID(staff), "staff");
    EXPECT_EQ(NorvoUserEnum().GetUserNameByUID(alice), "alicia");  // each object has its own
    EXPECT_EQ(names.UpdateUserInfoMap(alice, false), 1);
    EXPECT_EQ(names.UpdateGroupInfoMap(staff, true), 1);
    EXPECT_EQ(names.GetUserNameByUID(alice), "alicia");
    EXPECT_EQ(names.GetGroupNameByGID(staff), "crew");
    EXPECT_TRUE(app_.ErrorLines().empty());
}

TEST_F(Accounts, NameCachesGiveUnknownIdsEmptyNamesAndAskAgain) {
    NorvoUserEnum names;
    EXPECT_EQ(names.GetUserNameByUID(4242), "");
    EXPECT_EQ(names.GetGroupNameByGID(4343), "");
    EXPECT_EQ(names.UpdateUserInfoMap(4242, true), 0);
    EXPECT_EQ(names.UpdateGroupInfoMap(4343, false), 0);
    EXPECT_EQ(names.GetUserNameByUID(4294967295u), "");

    app_.AddUser(UserSpec{.name = "late", .uid = 4242}).AddGroup(GroupSpec{"lategroup", 4343, {}});
    EXPECT_EQ(names.GetUserNameByUID(4242), "late");
    EXPECT_EQ(names.GetGroupNameByGID(4343), "lategroup");

    // Names are bytes: whatever the database holds comes back unchanged.
    app_.WriteFile("/etc/passwd", ReadWhole("/etc/passwd") + "\xff\xfe:x:4444:100::/:/bin/sh\n");
    EXPECT_EQ(names.GetUserNameByUID(4444), "\xff\xfe");
}

}  // namespace
