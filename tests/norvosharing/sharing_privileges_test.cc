// Who may create sharing links: the per-user flags file, its writers side by side with its
// readers, and the decision that combines it with administrators, the appliance's setting, the
// application privilege and expired accounts.
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <map>
#include <regex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "../platform/platform_test_util.h"
#include "appliance.h"
#include "norvo/norvosharing.h"

namespace {

using norvo::testing::Appliance;
using NorvoSharing::SharingManager;

const char kFile[] = "/usr/quib/etc/quibsharing.conf";
const auto Read = norvo::testing::ReadFile;

class Sharing : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().AddUser(norvo::testing::UserSpec{.name = "carol", .expireDay = 1}).SetAppPrivilege("QUIB.TVQ.App.Tovana3.Instance",
                                                                                "admin,alice,carol");
    }
    std::string Key(const std::string &user) { return std::to_string(app_.Uid(user)); }
    Appliance app_;
};

TEST_F(Sharing, TheFlagsFile) {
    SharingManager manager;
    // No file yet: nobody holds the flag, nothing is logged.
    EXPECT_FALSE(manager.hasPrivilege("alice"));
    EXPECT_TRUE(manager.getPrivileges().empty());

    // Ascending names: the empty one first takes the UID 4294967295; "True" revokes; an unknown
    // name fails the call without stopping it.
    EXPECT_FALSE(manager.setPrivileges({{"", "true"}, {"alice", "true"}, {"bob", "True"}, {"zed", "true"}, {"admin", "1"}}));
    EXPECT_EQ(Read(kFile), "4294967295=\"true\"\n" + Key("alice") + "=\"true\"\n");
    struct stat st;
    ASSERT_EQ(stat(kFile, &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0644u);
    EXPECT_TRUE(manager.hasPrivilege("alice"));
    EXPECT_FALSE(manager.hasPrivilege("bob"));
    EXPECT_FALSE(manager.hasPrivilege("nobody-here"));
    EXPECT_TRUE(manager.setPrivileges({{"alice", "no"}, {"bob", "true"}}));
    EXPECT_EQ(Read(kFile), "4294967295=\"true\"\n" + Key("bob") + "=\"true\"\n");
    EXPECT_TRUE(manager.removePrivilege("4294967295"));
    EXPECT_TRUE(manager.removePrivilege("4294967295"));  // gone already: no failure
    EXPECT_EQ(Read(kFile), Key("bob") + "=\"true\"\n");

    // Keys as strtoul reads them, the first line of a UID wins, values other than "true" are false.
    app_.WriteFile(kFile, "7=\"true\"\n007=\"false\"\nabc=\"true\"\n9=TRUE\n0=\"no\"\n12 = true\n");
    EXPECT_EQ(manager.getPrivileges(), (std::map<unsigned, bool>{{0, true}, {7, true}, {9, false}, {12, true}}));
    // A value longer than the reader's buffer is not "true" cut short.
    app_.WriteFile(kFile, Key("alice") + "=\"trueish\"\n");
    EXPECT_FALSE(manager.hasPrivilege("alice"));
    EXPECT_EQ(app_.ErrorLines(), (std::vector<std::string>{
        "norvosharing:# Failed to get GID for user=zed",
        "norvosharing:# Failed to get GID for user=nobody-here",
    }));
}

TEST_F(Sharing, WhoMayShare) {
    const struct {
        const char *setting;  // FB_SHARING_SETTING; null: absent
        const char *flagged;  // users with the flag in the file
        const char *user;
        int flag;
        int expected;
    } rows[] = {
        {nullptr,      "",      "admin", 0, 1},
        {nullptr,      "",      "alice", 0, 1},
        {nullptr,      "",      "bob",   0, 0},  // no application privilege
        {nullptr,      "",      "carol", 0, 0},  // expired
        {"everyone",   "",      "alice", 0, 1},
        {"admin_only", "",      "alice", 0, 0},
        {"admin_only", "alice", "admin", 1, 1},
        {"per_user",   "",      "admin", 0, 0},  // administrators need the flag too
        {"per_user",   "admin", "admin", 0, 1},
        {"per_user",   "alice", "alice", 1, 1},
        {"per_user",   "admin", "alice", 0, 0},
        {"per_user",   "carol", "carol", 0, 0},
        {"per_user",   "bob",   "bob",   0, 0},
    };
    for (const auto &row : rows) {
        SCOPED_TRACE(std::string(row.setting ? row.setting : "(absent)") + " " + row.user);
        app_.WriteFile("/etc/quibinfo.conf", row.setting ? std::string("FB_SHARING_SETTING=\"") + row.setting + "\"\n" : "");
        app_.WriteFile(kFile, *row.flagged ? Key(row.flagged) + "=\"true\"\n" : "");
        EXPECT_EQ(NvoLibUserPrivForSharing(row.user, row.flag), row.expected);
    }
    EXPECT_EQ(NvoLibUserPrivForSharing(nullptr, 0), 0);
    EXPECT_TRUE(app_.ErrorLines().empty());
    // Without the settings file an administrator goes on; another user is refused, logged.
    ASSERT_EQ(unlink("/etc/quibinfo.conf"), 0);
    EXPECT_EQ(NvoLibUserPrivForSharing("admin", 0), 1);
    EXPECT_EQ(NvoLibUserPrivForSharing("alice", 0), 0);
    EXPECT_EQ(app_.ErrorLines(), (std::vector<std::string>{"norvouser.cpp:# VLIBCFileGetKeyValue failed"}));
}

// Two administrators save at once, each process holding the file's flock around its writes
// while the writes replace the file, and a third process reads: no key is lost, and every read
// sees whole lines only.
TEST_F(Sharing, TwoAdministratorsSaveAtOnce) {
    constexpr int kUsers = 20;
    for (int w = 0; w < 2; ++w) {
        for (int i = 0; i < kUsers; ++i) {
            app_.AddUser("w" + std::to_string(w) + "u" + std::to_string(i));
        }
    }
    const char kDone[] = "/tmp/writers-done";
    const pid_t reader = fork();
    if (reader == 0) {
        const std::regex whole("(\\d+=\"true\"\n)*");
        bool done = false;
        while (!done) {
            done = access(kDone, F_OK) == 0;
            if (!std::regex_match(Read(kFile), whole)) {
                _exit(1);
            }
        }
        _exit(0);
    }
    std::vector<pid_t> writers;
    for (int w = 0; w < 2; ++w) {
        const pid_t pid = fork();
        if (pid == 0) {
            bool ok = true;
            for (int i = 0; i < kUsers; ++i) {
                ok = SharingManager().setPrivileges({{"w" + std::to_string(w) + "u" + std::to_string(i), "true"}}) && ok;
            }
            _exit(ok ? 0 : 1);
        }
        writers.push_back(pid);
    }
    for (pid_t pid : writers) {
        int status = 0;
        ASSERT_EQ(waitpid(pid, &status, 0), pid);
        EXPECT_EQ(status, 0);
    }
    app_.WriteFile(kDone);
    int status = 0;
    ASSERT_EQ(waitpid(reader, &status, 0), reader);
    EXPECT_EQ(status, 0) << "a reader saw a torn file";
    EXPECT_EQ(SharingManager().getPrivileges().size(), 2u * kUsers);
    EXPECT_TRUE(app_.ErrorLines().empty());
}

}  // namespace
