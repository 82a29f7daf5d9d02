// The user and group name caches: one platform lookup per known id, unknown ids asked again.
#include <fstream>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/norvoenum.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::GroupSpec;
using norvo::testing::UserSpec;

std::string ReadWhole(const char *path) {
    std::ifstream in(path);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

// Renames an entry in /etc/passwd or /etc/group behind the platform's back.
void Rename(Appliance &app, const char *file, const std::string &from, const std::string &to) {
    std::string text = ReadWhole(file);
    const size_t at = text.find("\n" + from + ":");
    ASSERT_NE(at, std::string::npos) << from;
    text.replace(at + 1, from.size(), to);
    app.WriteFile(file, text);
}

TEST(NameCache, KnownIdsAreLookedUpOnce) {
    Appliance app;
    app.Basic();
    NvoEnum enumeration;
    NorvoUserEnum &names = enumeration.UserEnum();
    const unsigned int alice = app.Uid("alice");
    const unsigned int staff = app.Gid("staff");
    EXPECT_EQ(names.GetUserNameByUID(alice), "alice");
    EXPECT_EQ(names.GetGroupNameByGID(staff), "staff");
    EXPECT_EQ(names.GetUserNameByUID(0), "root");

    Rename(app, "/etc/passwd", "alice", "alicia");
    Rename(app, "/etc/group", "staff", "crew");
    EXPECT_EQ(names.GetUserNameByUID(alice), "alice");  // cached
    EXPECT_EQ(names.GetGroupNameByGID(staff), "staff");
    EXPECT_EQ(NorvoUserEnum().GetUserNameByUID(alice), "alicia");  // each object has its own
    EXPECT_EQ(names.UpdateUserInfoMap(alice, false), 1);
    EXPECT_EQ(names.UpdateGroupInfoMap(staff, true), 1);
    EXPECT_EQ(names.GetUserNameByUID(alice), "alicia");
    EXPECT_EQ(names.GetGroupNameByGID(staff), "crew");
    EXPECT_TRUE(app.ErrorLines().empty());
}

TEST(NameCache, UnknownIdsGiveEmptyNamesAndAreAskedAgain) {
    Appliance app;
    app.Basic();
    NorvoUserEnum names;
    EXPECT_EQ(names.GetUserNameByUID(4242), "");
    EXPECT_EQ(names.GetGroupNameByGID(4343), "");
    EXPECT_EQ(names.UpdateUserInfoMap(4242, true), 0);
    EXPECT_EQ(names.UpdateGroupInfoMap(4343, false), 0);
    EXPECT_EQ(names.GetUserNameByUID(4294967295u), "");

    app.AddUser(UserSpec{.name = "late", .uid = 4242}).AddGroup(GroupSpec{"lategroup", 4343, {}});
    EXPECT_EQ(names.GetUserNameByUID(4242), "late");
    EXPECT_EQ(names.GetGroupNameByGID(4343), "lategroup");

    // Names are bytes: whatever the database holds comes back unchanged.
    app.WriteFile("/etc/passwd", ReadWhole("/etc/passwd") + "\xff\xfe:x:4444:100::/:/bin/sh\n");
    EXPECT_EQ(names.GetUserNameByUID(4444), "\xff\xfe");
}

}  // namespace
