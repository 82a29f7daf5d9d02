#include <fcntl.h>
#include <grp.h>
#include <linux/capability.h>
#include <sys/syscall.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvouser.h"
#include "quib_login.h"

namespace {

using norvo::testing::Appliance;
using Lines = std::vector<std::string>;

bool InGroups(gid_t gid) {
    gid_t groups[64];
    const int n = getgroups(64, groups);
    return std::find(groups, groups + std::max(n, 0), gid) != groups + std::max(n, 0);
}

// Each switch runs in a child that starts as root (or as `from`), as a CGI program does.
TEST(Identity, TakesTheUsersIdsAndReportsAFailedSwitch) {
    Appliance app;
    app.Basic();
    char sid[64] = "";
    ASSERT_EQ(QUIBLoginCreate("alice", "secret", "192.0.2.1", sid, sizeof sid), 0);
    const uid_t alice = app.Uid("alice"), bob = app.Uid("bob");
    const gid_t users = app.Gid("users"), staff = app.Gid("staff");
    struct Row {
        const char *from, *sid, *user;
        int rc, err;
        uid_t euid;
        gid_t egid, group;  // group: a supplementary group that must be held (0: none asked)
        Lines lines;
    } rows[] = {
        {"root", nullptr, "alice", 0, 0, alice, users, staff, {}},
        {"root", sid, "alice", 0, 0, alice, users, staff, {}},
        {"root", "no-such-login", "bob", 0, 0, bob, users, staff, {}},  // the name answers instead
        {"root", nullptr, "admin", 0, 0, 0, users, 0, {}},                // administrators keep uid 0
        {"root", nullptr, "ghost", -1, 403, 0, 0, 0, {"norvouser.cpp:# Failed to get GID for user=ghost"}},
        {"root", "x", "ghost", -1, 403, 0, 0, 0, {"norvouser.cpp:# Failed to get GID for user=ghost, sid=x"}},
        {"root", nullptr, nullptr, -1, 400, 0, 0, 0, {"norvouser.cpp:# Bad parameter"}},
        {"bob", nullptr, "alice", -1, 401, bob, users, 0, {"norvouser.cpp:# Failed to set UID for user=alice, sid=(null)"}},
        {"bob", nullptr, "admin", -1, 401, bob, users, 0, {"norvouser.cpp:# Failed to set UID for user=admin, sid=(null)"}},
        {"bob", nullptr, "root", -1, 401, bob, users, 0, {"norvouser.cpp:# Failed to set GID for user=root, sid=(null)"}},
    };
    for (const Row &row : rows) {
        app.ClearLogs();
        const int got = app.RunAs(row.from, [&] {
            const int rc = NvoLibUGIDSet(row.sid, row.user);
            if (rc != row.rc || (rc != 0 && NvoLibGetErr() != row.err)) {
                return 1;
            }
            const bool switched = row.euid != 0 || row.egid != 0;
            return switched && (geteuid() != row.euid || getegid() != row.egid) ? 2 : row.group && !InGroups(row.group) ? 3 : 0;
        });
        EXPECT_EQ(got, 0) << row.from << " as " << (row.user ? row.user : "null");
        EXPECT_EQ(app.ErrorLines(), row.lines) << (row.user ? row.user : "null");
    }
    // Root without the right to change groups: no request goes on with root's group.
    app.ClearLogs();
    EXPECT_EQ(app.RunAs("root", [] {
        __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
        __user_cap_data_struct caps[2];
        syscall(SYS_capget, &header, caps);
        caps[0].effective &= ~(1u << CAP_SETGID);
        syscall(SYS_capset, &header, caps);
        return NvoLibUGIDSet(nullptr, "alice") == -1 && NvoLibGetErr() == 401 && getegid() == 0 && geteuid() == 0;
    }), 1);
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvouser.cpp:# Failed to initgroup for user=alice, sid=(null)",
                                       "norvouser.cpp:# Failed to set GID for user=alice, sid=(null)"}));
    app.ClearLogs();
    EXPECT_EQ(app.RunAs("root", [] { return NvoLibEGIDSet(nullptr, "alice", ~0u) == -1 && NvoLibGetErr() == 400 &&
                                              NvoLibEUIDSet(nullptr, "alice", ~0u) == -1 && geteuid() == 0 &&
                                              NvoLibEUIDSet(nullptr, "ghost", 5) == -1 && NvoLibGetErr() == 401; }), 1);
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvouser.cpp:# bad parameter", "norvouser.cpp:# bad parameter",
                                       "norvouser.cpp:# QUIBGroupIsAdminGroupMem(ghost) failed. [0x1D00 account_records.cc:#]"}));
}

TEST(Identity, Chown2AdminSkipsFatAndNetworkMountsAndNeverFollowsALink) {
    Appliance app;
    app.Basic().MountFat("/volumeUSB1").MountDeadRemote("/volume1/public/nas").WriteFile("/volume1/public/f", "x").WriteFile("/volume1/public/target", "t");
    ASSERT_EQ(symlink("/volume1/public/target", "/volume1/public/link"), 0);
    ASSERT_EQ(close(creat("/volumeUSB1/f", 0644)), 0);
    struct stat st;
    ASSERT_EQ(stat("/volumeUSB1/f", &st), 0);
    const uid_t fat = st.st_uid;
    for (const char *path : {"/volumeUSB1/f", "/volume1/public/nas", "/volume1/public/f", "/volume1/public/link"}) {
        EXPECT_EQ(NvoLibChown2Admin(path, "alice"), 0) << path;  // FAT and network mounts: skipped
    }
    // The link itself changed hands, not what it points at.
    for (const auto &[path, uid] : {std::pair{"/volumeUSB1/f", fat}, {"/volume1/public/f", app.Uid("alice")},
                                    {"/volume1/public/target", 0u}, {"/volume1/public/link", app.Uid("alice")}}) {
        ASSERT_EQ(lstat(path, &st), 0);
        EXPECT_EQ(st.st_uid, uid) << path;
    }
    EXPECT_EQ(NvoLibChown2Admin("/volume1/public/f", "ghost"), -1);
    EXPECT_EQ(NvoLibChown2Admin(nullptr, "alice"), -1);
    EXPECT_EQ(NvoLibChown2Admin("/volume1/public/gone", "alice"), -1);
    EXPECT_EQ(app.RunAs("bob", [] { return NvoLibChown2Admin("/volume1/public/target", "bob"); }), -1);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvouser.cpp(#) bad parameter",
                     "NvoLibChown2Admin:#(norvouser.cpp) : failed to get file-system type dir = /volume1/public/gone",
                     "norvouser.cpp(#) change /volume1/public/target owner to admin fail(Operation not permitted)"}));
}

}  // namespace
