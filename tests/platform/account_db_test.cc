// The user and group database cursors over NSS enumeration, and a user's group ids as text.
#include <fstream>
#include <iterator>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_user.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::Outcome;
using norvo::testing::OutcomeOf;
using norvo::testing::UserSpec;
using Strings = std::vector<std::string>;

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

class AccountDB : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic()
            .AddUser(UserSpec{.name = "CORP\\dave", .groups = {"CORP\\domain users"}})
            .AddUser("erin@corp.example");
    }
    Appliance app_;
};

TEST_F(AccountDB, CursorsDeliverTheSelectedKindsInDatabaseOrder) {
    const int descriptors = norvo::testing::OpenDescriptors();
    EXPECT_EQ(UserNames(AUTH_ALL), (Strings{"root", "nobody", "admin", "alice", "bob", "CORP\\dave", "erin@corp.example"}));
    EXPECT_EQ(UserNames(AUTH_LOCAL), (Strings{"root", "nobody", "admin", "alice", "bob"}));
    EXPECT_EQ(UserNames(static_cast<AUTH_TYPE>(AUTH_DOMAIN | AUTH_LDAP)), (Strings{"CORP\\dave", "erin@corp.example"}));
    EXPECT_EQ(GroupNames(AUTH_ALL), (Strings{"root", "users", "administrators", "nogroup", "staff", "CORP\\domain users"}));
    EXPECT_EQ(GroupNames(AUTH_DOMAIN), Strings{"CORP\\domain users"});
    EXPECT_EQ(norvo::testing::OpenDescriptors(), descriptors);
}

TEST_F(AccountDB, BadArgumentsAndBrokenDatabases) {
    PQUIBUSER user = nullptr;
    PQUIBGROUP group = nullptr;
    PQUIBUSER_DB db = QUIBUserDBOpen();
    PQUIBGROUP_DB gdb = QUIBGroupDBOpen();
    const Outcome bad{-1, QUIB_ERR_BAD_PARAMETER};
    const AUTH_TYPE none = static_cast<AUTH_TYPE>(0);
    EXPECT_EQ(OutcomeOf([&] { return QUIBUserDBGetByCursor(db, &user, none, 1); }), bad);
    EXPECT_EQ(OutcomeOf([&] { return QUIBGroupDBGetByCursor(gdb, &group, none, 1); }), bad);
    QUIBUserDBClose(db);
    QUIBGroupDBClose(gdb);
    QUIBUserDBClose(nullptr);

    // An entry beyond the first buffer is offered again in a bigger one (up to 16 MiB; the
    // library's tests show a bigger one failing the open).
    std::ifstream in("/etc/passwd");
    const std::string passwd((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    app_.WriteFile("/etc/passwd", passwd + "wide:x:5555:100:" + std::string(100000, 'g') + ":/:/bin/sh\nlast:x:5556:100::/:/bin/sh\n");
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

TEST_F(AccountDB, GroupListIsDecimalIdsPrimaryFirst) {
    const auto id = [this](const std::string &group) { return std::to_string(app_.Gid(group)); };
    EXPECT_EQ(GroupList("CORP\\dave"), std::make_pair(0, Strings{id("users"), id("CORP\\domain users")}));
    UserSpec joiner{.name = "joiner"};
    for (int i = 0; i < 600; ++i) {
        joiner.groups.push_back("team" + std::to_string(i));
    }
    app_.AddUser(joiner);
    const Strings many = GroupList("joiner").second;  // the one-slot list had to grow
    ASSERT_EQ(many.size(), 601u);
    EXPECT_EQ(many.back(), id("team599"));

    EXPECT_EQ(GroupList("zed"), std::make_pair(static_cast<int>(QUIB_ERR_NO_SUCH_USER), Strings{}));
    EXPECT_EQ(GroupList("alice", 1), std::make_pair(static_cast<int>(QUIB_ERR_BAD_PARAMETER), Strings{}));
    const std::string tooLong(300, 'a');
    for (const char *bad : {static_cast<const char *>(nullptr), "", tooLong.c_str(), "\xff\xfe", "a\nb"}) {
        EXPECT_EQ(GroupList(bad), std::make_pair(static_cast<int>(QUIB_ERR_BAD_PARAMETER), Strings{}));
    }
    PSZLIST none = nullptr;
    EXPECT_EQ(QUIBGroupInfoGetgroupList("alice", &none, 0), -1);
    EXPECT_EQ(QUIBGroupInfoGetgroupList("alice", nullptr, 0), -1);
}

}  // namespace
