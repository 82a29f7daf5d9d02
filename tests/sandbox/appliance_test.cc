// The sandbox itself: isolation from the host, the syslog capture, identity switching and the
// appliance-file parser. The accounts, mounts and the masking of line numbers in ErrorLines are
// what every other test builds on and compares.
#include <errno.h>
#include <fcntl.h>
#include <grp.h>
#include <mntent.h>
#include <pwd.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "appliance_file.h"
#include "private_root.h"

namespace norvo::testing {
namespace {

std::string Slurp(const std::string &path) {
    std::ifstream in(path);
    std::ostringstream out;
    out << in.rdbuf();
    return out.str();
}

bool Exists(const std::string &path) {
    struct stat st;
    return lstat(path.c_str(), &st) == 0;
}

// The mount lines about places the appliance mounts over; the host's other mounts may change
// under a concurrent build.
std::string SandboxRelevantMounts() {
    std::string lines;
    FILE *table = setmntent("/proc/self/mounts", "re");
    while (const mntent *entry = getmntent(table)) {
        const std::string dir = entry->mnt_dir;
        for (const char *prefix : {"/mnt", "/volume", "/etc", "/usr", "/tmp", "/run", "/dev"})
            if (dir.rfind(prefix, 0) == 0) lines += dir + " " + entry->mnt_type + "\n";
    }
    endmntent(table);
    return lines;
}

// Appliances in turn in one process, the middle one with a dead network share and a thread
// still ending when it goes (as a thread just joined may be): each starts from the host.
TEST(ApplianceTest, AppliancesInTurnLeaveTheHostUntouched) {
    ASSERT_FALSE(Exists("/etc/quibinfo.conf")) << "the host itself has appliance settings";
    const std::string passwd = Slurp("/etc/passwd");
    const std::string mounts = SandboxRelevantMounts();

    const pid_t pid = fork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
        int failures = 0;
        for (int round = 0; round < 3; ++round) {
            {
                Appliance appliance;
                appliance.Basic().SetSetting("probe", "1").SetDefaultSetting("probe", "1");
                if (round != 1) continue;
                appliance.WriteFile("/volume1/norvo-probe", "x").WriteFile("/tmp/norvo-probe", "x");
                appliance.WriteFile("/usr/norvo-probe", "x").WriteFile("/etc/norvo-probe", "x");
                appliance.MountDeadRemote("/volume1/dead");
                for (const std::string dir : {"/var/tmp", "/root", "/home", "/opt", "/srv"})  // read-only
                    close(open((dir + "/norvo-probe").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644));
                // The appliance's accounts are seen through NSS, and none of the host's.
                if (getpwnam("alice") == nullptr || getpwnam("daemon") != nullptr || !Exists("/volume1/norvo-probe"))
                    failures |= 1;
                std::thread([] { std::this_thread::sleep_for(std::chrono::milliseconds(50)); }).detach();
            }
            if (Exists("/etc/quibinfo.conf") || Exists("/volume1/norvo-probe")) failures |= 2 << round;
        }
        _exit(failures);
    }
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    ASSERT_TRUE(WIFEXITED(status)) << "signal " << WTERMSIG(status);
    EXPECT_EQ(WEXITSTATUS(status), 0);

    EXPECT_EQ(Slurp("/etc/passwd"), passwd);
    EXPECT_EQ(SandboxRelevantMounts(), mounts);
    for (const char *path : {"/etc/quibinfo.conf", "/etc.defaults", "/usr/quib", "/volume1/norvo-probe",
                             "/tmp/norvo-probe", "/usr/norvo-probe", "/etc/norvo-probe", "/volume1/dead",
                             "/mnt/.norvo-sandbox", "/var/tmp/norvo-probe", "/root/norvo-probe",
                             "/home/norvo-probe", "/opt/norvo-probe", "/srv/norvo-probe"}) {
        EXPECT_FALSE(Exists(path)) << path;
        unlink(path);
    }
}

// A checkout in a directory no other user may enter (a clone in /root, or under a 0700 /tmp/ci):
// appliance users still run its programs, and the rest of that directory stays out of sight.
TEST(ApplianceTest, ProjectTreesAreReachableFromAnyCheckout) {
    const pid_t pid = fork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
        // A host of the test's own: /var/locked (0700) holds the checkout n and a private folder.
        if (unshare(CLONE_NEWNS) != 0 || mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
            mount("tmpfs", "/var", "tmpfs", 0, "mode=0755") != 0)
            _exit(100);
        mkdir("/var/locked", 0700);
        mkdir("/var/locked/private", 0700);
        mkdir("/var/locked/n", 0755);
        std::ofstream("/var/locked/n/prog") << "#!/bin/sh\nexit 7\n";
        chmod("/var/locked/n/prog", 0755);
        const int tree = open("/var/locked/n", O_PATH | O_DIRECTORY | O_CLOEXEC);
        internal::EnterPrivateRoot({"/var/locked/n"});
        int failures = 0;
        const pid_t user = fork();
        if (user == 0) {
            if (setgroups(0, nullptr) == 0 && setresgid(100, 100, 100) == 0 &&
                setresuid(1026, 1026, 1026) == 0)
                execl("/var/locked/n/prog", "prog", nullptr);
            _exit(1);
        }
        int status = 0;
        if (waitpid(user, &status, 0) != user || !WIFEXITED(status) || WEXITSTATUS(status) != 7)
            failures |= 1;
        if (Exists("/var/locked/private")) failures |= 2;
        std::ofstream("/var/locked/n/written") << "x";
        if (faccessat(tree, "written", F_OK, 0) != 0) failures |= 4;  // the tree is the host's, writable
        if (mkdir("/var/elsewhere", 0755) == 0 || errno != EROFS) failures |= 8;
        _exit(failures);
    }
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
}

TEST(ApplianceTest, SyslogCapturesTheProcessAndRunAsChildren) {
    Appliance appliance;
    appliance.Basic();
    syslog(LOG_ERR, "%s:%d parent %s", "norvodir", 12, "speaks");
    // More lines than a datagram socket queues by default: the capture must keep draining.
    const int result = appliance.RunAs("alice", [] {
        openlog("child", LOG_PID, LOG_USER);
        for (int i = 0; i < 40; ++i) syslog(LOG_DEBUG, "line %d", i);
        syslog(LOG_WARNING, "child as %d", int(geteuid()));
        return 0;
    });
    ASSERT_EQ(result, 0);
    syslog(LOG_INFO, "parent again");

    std::vector<LogLine> expected{{LOG_ERR, "norvodir:12 parent speaks"}};
    for (int i = 0; i < 40; ++i) expected.push_back({LOG_DEBUG, "line " + std::to_string(i)});
    expected.push_back({LOG_WARNING, "child as " + std::to_string(appliance.Uid("alice"))});
    expected.push_back({LOG_INFO, "parent again"});
    EXPECT_EQ(appliance.Logs(), expected);
    appliance.ClearLogs();
    EXPECT_TRUE(appliance.Logs().empty());
}

TEST(ApplianceTest, RunAsTakesTheUsersIdentity) {
    Appliance appliance;
    appliance.Basic();
    const uid_t alice = appliance.Uid("alice");
    const gid_t staff = appliance.Gid("staff");
    const gid_t administrators = appliance.Gid("administrators");
    EXPECT_EQ(appliance.RunAs("alice", [&] {
        if (getuid() != alice || geteuid() != alice || getgid() != 100 || getegid() != 100) return 1;
        gid_t groups[64];
        const int count = getgroups(64, groups);
        const auto has = [&](gid_t gid) { return std::find(groups, groups + count, gid) != groups + count; };
        if (!has(staff) || !has(100) || has(administrators) || has(0)) return 2;
        return 42;
    }), 42);
    EXPECT_EQ(appliance.RunAs("admin", [&] {
        gid_t groups[64];
        const int count = getgroups(64, groups);
        return std::find(groups, groups + count, administrators) != groups + count ? -7 : 3;
    }), -7);
    EXPECT_EQ(appliance.RunAs("bob", [] { return 1000; }), 100);
    EXPECT_EQ(appliance.RunAs("bob", [] {
        raise(SIGKILL);
        return 0;
    }), -1000 - SIGKILL);
}

TEST(ApplianceFileTest, RejectsBadLinesWithTheirNumber) {
    const std::pair<const char *, const char *> cases[] = {
        {"frob x", "t:1: unknown directive 'frob'"},
        {"user alice\n\ndir /x mode=0999", "t:3: bad mode '0999' (octal, such as 0755)"},
        {"file /x owner=zed", "t:1: unknown owner 'zed'"},
        {"basic\nfile /x owner=alice:nogrp", "t:2: unknown group 'nogrp'"},
        {"file /x owner=alice\nuser alice", "t:1: unknown owner 'alice'"},
        {"user alice\nadmin alice", "t:2: user 'alice' is already defined on line 1"},
        {"share x bogus=1", "t:1: unknown option 'bogus' for share"},
        {"share x restrict=nowrite", "t:1: unknown restriction 'nowrite' (nobrowse, nomodify, nodownload)"},
        {"share x comment=\"open", "t:1: unterminated quote"},
        {"dir relative/x", "t:1: 'relative/x' is not an absolute path"},
        {"file /x size=1 content=a", "t:1: give either size or content, not both"},
        {"home maybe", "t:1: bad home state 'maybe' (on or off)"},
        {"privilege QUIB.X", "t:1: privilege needs 2 arguments"},
        {"user bob uid=12ab", "t:1: bad uid '12ab' (a decimal number)"},
    };
    for (const auto &[text, message] : cases) {
        ApplianceFile file;
        file.steps.resize(1);
        std::string error;
        EXPECT_FALSE(ParseApplianceFile(text, "t", &file, &error)) << text;
        EXPECT_EQ(error, message) << text;
        EXPECT_EQ(file.steps.size(), 1u) << "a failed parse changed its output";
    }
}

TEST(ApplianceFileTest, BuildsWhatItDescribes) {
    const char *text = R"(# read-only remounts wait until everything else is built
basic
readonly /volume2
readonly /volume1/photo/2012
user CORP\dave uid=3000 groups=staff
share media volume=/volume2 rw=alice,@staff hidden restrict=nobrowse,nodownload acl=no comment="Family \"pics\""
dir /volume1/photo/2012 owner=alice mode=0750   # trailing comment
file /volume1/photo/2012/a.jpg owner=alice:staff mode=0640 size=10
setting FB_SHARING_SETTING="on off"
privilege QUIB.TVQ.App.Tovana3.Instance @users,admin
)";
    ApplianceFile file;
    std::string error;
    ASSERT_TRUE(ParseApplianceFile(text, "t", &file, &error)) << error;
    ASSERT_EQ(file.steps.size(), 9u);
    EXPECT_EQ(file.steps[3].user.name, "CORP\\dave");
    EXPECT_EQ(file.steps[4].share.comment, "Family \"pics\"");
    EXPECT_EQ(file.steps[4].line, 6);

    Appliance appliance;
    BuildAppliance(appliance, file);
    EXPECT_EQ(appliance.Uid("CORP\\dave"), 3000u);
    struct stat st;
    ASSERT_EQ(stat("/volume1/photo/2012/a.jpg", &st), 0);
    EXPECT_EQ(st.st_uid, appliance.Uid("alice"));
    EXPECT_EQ(st.st_gid, appliance.Gid("staff"));
    EXPECT_EQ(st.st_mode & 07777, 0640u);
    EXPECT_EQ(st.st_size, 10);
    ASSERT_EQ(stat("/volume2/media", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0777u);
    // Read-only last, whether a mount point or a folder (bound onto itself); the rest stays writable.
    for (const char *dir : {"/volume2/media/x", "/volume1/photo/2012/x"}) {
        errno = 0;
        EXPECT_EQ(mkdir(dir, 0755), -1) << dir;
        EXPECT_EQ(errno, EROFS) << dir;
    }
    EXPECT_EQ(mkdir("/volume1/photo/x", 0755), 0);

    const std::string shares = Slurp("/usr/quib/etc/shares.conf");
    EXPECT_NE(shares.find("[media]\n\tpath = /volume2/media\n\tcomment = Family \"pics\"\n"
                          "\twrite list = alice,@staff\n\tbrowseable = no\n\tdisable browsing = yes\n"
                          "\tdisable download = yes\n\tacl = no\n"),
              std::string::npos)
        << shares;
    EXPECT_NE(Slurp("/etc/quibinfo.conf").find("FB_SHARING_SETTING=\"on off\"\n"), std::string::npos);
    EXPECT_EQ(Slurp("/usr/quib/etc/app_privilege.conf"), "QUIB.TVQ.App.Tovana3.Instance=\"@users,admin\"\n");
}

}  // namespace
}  // namespace norvo::testing
