// Sharing-link sessions: login, authorisation and its sweep, blocking, the log, and many
// processes on one session file. The one-second sleep per id tried is counted, not slept.
#include <signal.h>
#include <stdlib.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysinfo.h>
#include <sys/wait.h>
#include <unistd.h>

#include <regex>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "../platform/platform_test_util.h"
#include "appliance.h"
#include "norvo/norvologin.h"
#include "quib_autoblock.h"

static int g_sleeps;
extern "C" __attribute__((visibility("default"))) unsigned sleep(unsigned) {
    ++g_sleeps;
    return 0;
}

namespace {

using norvo::testing::Appliance;
using NorvoLogin::FolderSharingLoginManager;

const std::string kFile = "/tmp/foldersharing.current.users";
const char kApp[] = "QUIB.TVQ.App.Tovana3.Instance";

const auto Read = norvo::testing::ReadFile;

long Now() {
    struct sysinfo info;
    sysinfo(&info);
    return info.uptime;
}

void Env(const char *name, const std::string &value) {
    value.empty() ? unsetenv(name) : setenv(name, value.c_str(), 1);
}

// One request as the web server hands it over (the cookie's header is the web test's).
struct Request {
    std::string addr = "192.0.2.1", cookie, query, forwarded, clientIp;
};
struct Cgi {
    QUIB::WebCGI cgi;
    explicit Cgi(const Request &r = {}) {
        Env("REQUEST_METHOD", "GET"), Env("QUERY_STRING", r.query), Env("HTTP_COOKIE", r.cookie);
        Env("REMOTE_ADDR", r.addr), Env("HTTP_X_FORWARDED_FOR", r.forwarded), Env("HTTP_CLIENT_IP", r.clientIp);
        static const int sink = open("/dev/null", O_WRONLY | O_CLOEXEC);
        EXPECT_EQ(cgi.Init(-1, sink), 0);
    }
};

int Login(const std::string &user, const char *cookieName, std::string *id, const Request &r = {}) {
    Cgi c(r);
    LOGIN_PARAMS params = {user.c_str(), "Anomyous", "folderSharing", 15, 0};
    char session[64] = "";
    const int rc = FolderSharingLoginManager().login(&c.cgi, session, sizeof session, &params, cookieName);
    *id = session;
    return rc;
}

int Authorize(const std::string &id, const Request &r = {}, CONFIRM_POLICY policy = {15, 0},
                 _tag_cgi_position position = CGI_POSITION_FILE_BROWSER, const char *cookieName = "L") {
    Cgi c(r);
    char user[64] = "";
    return NorvoLogin::IsAuthorizedByPath(&c.cgi, id.c_str(), user, sizeof user, &policy, position, cookieName);
}

class SharingLogin : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().SetAppPrivilege(kApp, "@users,admin").SetSetting("obx_timeout_minutes", "15");
        g_sleeps = 0;
    }
    Appliance app_;
};

// Each row: the file's lines before (T stands for an uptime: T0 now, T900 900 s ago, T-5 ahead),
// the request, the answer, and the file after ("=" unchanged).
TEST_F(SharingLogin, AuthorisesEachLineAsItsFieldsSay) {
    app_.SetSetting("obx_timeout_minutes", "bad").SetSetting("auto_block_attempts", "0");  // timeout -1: 15
    struct Row {
        const char *before;
        Request request;
        CONFIRM_POLICY policy;
        int position;
        int rc;
        const char *after;
    } rows[] = {
        {"192.0.2.1,alice,ID,T9,T900,1,0,L", {}, {15, 0}, 2, 1, "192.0.2.1,alice,ID,T9,T0,2,0,L"},
        {"192.0.2.1,alice,ID,T9,T901,1,0,L", {}, {15, 0}, 2, -1, ""},
        {"192.0.2.1,alice,ID,T9,T901,1,0,L", {}, {15, 1}, 2, -1, "="},
        {"192.0.2.1,alice,ID,T9,T901,1,7,L", {}, {15, 0}, 0, 1, "192.0.2.1,alice,ID,T9,T0,0,7,L"},
        {"192.0.2.1,alice,ID,T9,T-5,1,0,L", {}, {15, 0}, 2, -1, ""},
        {"192.0.2.1,alice,ID,T9,0,1,0,L", {}, {15, 0}, 2, -1, ""},
        {"192.0.2.1,alice,ID,T9,T1,1,0,L", {.addr = "192.0.2.2"}, {15, 0}, 2, -2, "="},
        {"192.0.2.1,alice,ID,T9,T1,1,0,L", {.addr = "192.0.2.9", .forwarded = "192.0.2.1, 10.0.0.2"}, {15, 0}, 2, 1, "192.0.2.1,alice,ID,T9,T0,2,0,L"},
        {"192.0.2.1,alice,ID,T9,T1,1,0,M", {}, {15, 0}, 2, -2, "="},
        {"192.0.2.1,alice,ID,T9,T1,1,0,L", {}, {15, 0}, 3, -2, ""},       // no Aurelo privilege
        {"192.0.2.1,zed,ID,T9,T1,1,0,L", {}, {15, 0}, 0, -2, ""},          // no such account
        {"192.0.2.1,admin,ID,T9,T1,1,0,L", {}, {15, 0}, 2, 2, "192.0.2.1,admin,ID,T9,T0,2,0,L"},
        {"192.0.2.1,admin,ID,T9,T1,1,0,L", {}, {2, 0}, 2, 1, "192.0.2.1,admin,ID,T9,T0,2,0,L"},
        {"192.0.2.1,alice,ID,T9,T1,1,0,L", {}, {1, 0}, 2, -2, "192.0.2.1,alice,ID,T9,T0,2,0,L"},
        {"192.0.2.1,alice,ID,T9,T1,1\n192.0.2.1,bob,X,T9,T1\n", {}, {15, 0}, 0, -2, "192.0.2.1,alice,ID,T9,T1,1,0,0"},
        {"192.0.2.1,alice,ID,T9,T1,1", {}, {15, 0}, 0, -2, "192.0.2.1,alice,ID,T9,T1,1,0,0"},
        {"192.0.2.1,bob,X,T9,T901,1,0,L\n192.0.2.1,bob,Y,T9,T2,1,1,L", {}, {15, 0}, 0, -2, "192.0.2.1,bob,Y,T9,T2,1,1,L"},
        {"192.0.2.1,bob,X,T9,T2,1,0,L\n192.0.2.1,alice,ID,T9,T1,1,0,L\n192.0.2.1,bob,Y,T9,T901,1,0,L\n192.0.2.1,bob,Z,T9,T3,1,0,L", {}, {15, 0}, 2, 1,
         "192.0.2.1,bob,X,T9,T2,1,0,L\n192.0.2.1,alice,ID,T9,T0,2,0,L\n192.0.2.1,bob,Z,T9,T3,1,0,L"},
    };
    const auto expand = [](std::string text, long now) {
        std::smatch m;
        while (std::regex_search(text, m, std::regex("T(-?[0-9]+)"))) {
            text = m.prefix().str() + std::to_string(now - std::stol(m[1])) + m.suffix().str();
        }
        return text;
    };
    for (const Row &row : rows) {
        long now;
        int got;
        do {  // again when the uptime ticked meanwhile
            now = Now();
            app_.WriteFile(kFile, expand(std::string(row.before) + "\n", now), "root", 0600);
            got = Authorize("ID", row.request, row.policy, static_cast<_tag_cgi_position>(row.position));
        } while (Now() != now);
        const std::string after = row.after == std::string("=") ? row.before : row.after;
        EXPECT_EQ(got, row.rc) << row.before;
        EXPECT_EQ(Read(kFile), after.empty() ? "" : expand(after + "\n", now)) << row.before;
    }
    app_.SetSetting("skip_checksrcip", "yes");
    app_.WriteFile(kFile, expand("192.0.2.1,alice,ID,T9,T1,1,0,L\n", Now()), "root", 0600);
    EXPECT_EQ(Authorize("ID", {.addr = "192.0.2.2"}), 1);
}

TEST_F(SharingLogin, RefusesAddressesItCannotTrustAndAccountsThePolicyExcludes) {
    app_.AddUser("CORP\\dave");
    std::string id;
    struct Row {
        const char *user;
        Request request;
        int mask;
        int rc;
    } rows[] = {
        {"alice", {.addr = "", .forwarded = "10.0.0.1, 10.0.0.2"}, 15, 1},
        {"alice", {.addr = "2001:db8::1"}, 15, 1},
        {"alice", {.clientIp = "10.0.0.3,10.0.0.4"}, 15, -4},
        {"alice", {.addr = "host.example"}, 15, -4},
        {"alice", {.addr = ""}, 15, -4},
        {"admin", {}, 14, -3},
        {"alice", {}, 13, -3},
        {"CORP\\dave", {}, 11, -3},
        {"erin@corp.example", {}, 7, -3},
        {"erin@corp.example", {}, 8, 1},
    };
    for (const Row &row : rows) {
        Cgi c(row.request);
        LOGIN_PARAMS params = {row.user, "Anomyous", "folderSharing", row.mask, 0};
        char session[64];
        EXPECT_EQ(FolderSharingLoginManager().login(&c.cgi, session, sizeof session, &params, "L"), row.rc) << row.user;
    }
    EXPECT_EQ(Read(kFile).substr(0, 15), "10.0.0.1,alice,");
    EXPECT_EQ(app_.ErrorLines(), (std::vector<std::string>{
                                     "norvologin:# Failed to get client ip.",
                                     "norvologin:# Failed to get client ip.",
                                     "norvologin:# Failed to get client ip.",
                                     "norvologin:# LOGIN_ERR_INVALID",
                                     "norvologin:# LOGIN_ERR_INVALID",
                                     "norvologin:# LOGIN_ERR_INVALID",
                                     "norvologin:# LOGIN_ERR_INVALID",
                                 }));
}

TEST_F(SharingLogin, TheManagerFindsItsCookieOrSaysWhyNot) {
    FolderSharingLoginManager manager;
    char user[64];
    CONFIRM_POLICY policy = {15, 0};
    Cgi plain;
    EXPECT_EQ(manager.isAuthorized(&plain.cgi, user, sizeof user, &policy, CGI_POSITION_FILE_BROWSER, "L"), -5);
    EXPECT_FALSE(manager.isAuthorized(plain.cgi));
    Cgi first({.query = "FOLDER_SHARING=L"});
    ASSERT_TRUE(manager.folderSharingLogin(first.cgi, "L", "bob"));
    EXPECT_EQ(manager.GetLoginUserName(), "bob");
    EXPECT_STREQ(getenv("USERNAME"), "bob");
    const std::string id = Read(kFile).substr(Read(kFile).find(",bob,") + 5, 13);
    Cgi byParameter({.cookie = "L=" + id, .query = "FOLDER_SHARING=L"});
    EXPECT_TRUE(manager.isAuthorized(byParameter.cgi));
    setenv("HTTP_FOLDER_SHARING", "M", 1);
    EXPECT_FALSE(manager.isAuthorized(byParameter.cgi));
    unsetenv("HTTP_FOLDER_SHARING");
    ASSERT_TRUE(manager.folderSharingLogin(byParameter.cgi, "L", "alice"));  // authorised: no new line
    EXPECT_EQ(manager.GetLoginUserName(), "bob");
    const std::string lines = Read(kFile);
    EXPECT_EQ(std::count(lines.begin(), lines.end(), '\n'), 1);
    EXPECT_EQ(g_sleeps, 1);

    // The CGI record's lookup by the "id" cookie.
    setenv("HTTP_COOKIE", ("id=" + id).c_str(), 1);
    QuibCgi *record = QuibCgiAlloc(kFile.c_str(), (kFile + ".lock").c_str());
    EXPECT_EQ(QuibCgiHasRecord(record, user, sizeof user, "L"), 1);
    EXPECT_STREQ(user, "bob");
    EXPECT_EQ(QuibCgiHasRecord(record, user, sizeof user, "M"), 0);
    QuibCgiFree(record);
    unsetenv("REMOTE_ADDR");
    manager.folderSharingFailLoginSet();
    EXPECT_EQ(app_.ErrorLines(), std::vector<std::string>{"norvologin:# Failed to get client ip."});
}

// Hostile names and planted files forge no line and touch nothing that is not the process's.
TEST_F(SharingLogin, ForgesNothingAndLogsEachFailure) {
    std::string id;
    EXPECT_EQ(Login("alice", "L\n192.0.2.1,admin,X,1,1,1,1,L", &id), -4);
    EXPECT_EQ(Login("alice,x", "L", &id), -4);
    EXPECT_EQ(Login("alice", "a b", &id), 1);  // logged in, but no header can carry that cookie
    EXPECT_EQ(Login("al\x01ice", "L", &id), 1);
    char user[64];
    const std::string before = Read(kFile);

    // bob's files at the scratch file's, the session file's and the lock's places.
    app_.WriteFile(kFile + ".tmp", "bob's", "bob", 0644);
    EXPECT_EQ(Authorize(id), -4);
    EXPECT_EQ(Read(kFile), before);
    EXPECT_EQ(Read(kFile + ".tmp"), "bob's");
    app_.WriteFile("/tmp/bob", "bob's\n", "bob", 0644);
    ASSERT_EQ(rename("/tmp/bob", kFile.c_str()), 0);
    EXPECT_EQ(Login("alice", "L", &id), -4);
    EXPECT_EQ(Authorize(id), -2);
    unlink(kFile.c_str()), unlink((kFile + ".lock").c_str());
    ASSERT_EQ(symlink("/tmp/bob.lock", (kFile + ".lock").c_str()), 0);
    EXPECT_EQ(Login("alice", "L", &id), -4);
    EXPECT_EQ(Authorize(id), -2);
    setenv("HTTP_COOKIE", "id=x", 1);
    QuibCgi *record = QuibCgiAlloc(kFile.c_str(), (kFile + ".lock").c_str());
    EXPECT_EQ(QuibCgiHasRecord(record, user, sizeof user, "L"), 0);
    QuibCgiFree(record);
    struct stat st;
    EXPECT_NE(lstat(kFile.c_str(), &st), 0);
    EXPECT_NE(lstat("/tmp/bob.lock", &st), 0);

    EXPECT_EQ(app_.ErrorLines(), (std::vector<std::string>{
                         "norvologin (#) Bad parameter.",
                         "norvologin (#) Bad parameter.",
                         "norvologin (#) AddCookieToHeader failed.",
                         "norvologin:# QUIBGroupIsAdminGroupMem(al\x01ice) failed. [0x0D00 groups.cc:#]",
                         "norvologin(#): file open error, reason=Permission denied",
                         "norvologin (#) QuibCgiBeginCriticalSection Failed.",
                         "norvologin (#) QuibCgiLoginAddUser failed.",
                         "norvologin (#) QuibCgiBeginCriticalSection Failed.",
                         "norvologin (#) QuibCgiBeginCriticalSection Failed.",
                     }));
}

// Eight processes log in and are authorised at once; then a rewrite is killed midway, again and
// again. No line may be lost, torn or duplicated, and the file is always whole.
TEST_F(SharingLogin, ManyProcessesShareOneFileAndAKilledRewriteLeavesItWhole) {
    constexpr int kProcesses = 8, kRounds = 500;
    app_.SetSetting("auto_block_attempts", "0");
    for (int p = 0; p < kProcesses; ++p) {
        app_.AddUser("u" + std::to_string(p));
    }
    for (int p = 0; p < kProcesses; ++p) {
        if (fork() == 0) {
            const Request r{.addr = "10.0.0." + std::to_string(p)};
            std::string id;
            int i = 0;
            while (i < kRounds && Login("u" + std::to_string(p), "L", &id, r) == 1 && Authorize(id, r) == 1) ++i;
            _exit(i == kRounds ? 0 : 1);
        }
    }
    for (int p = 0, status = -1; p < kProcesses; ++p) {
        EXPECT_EQ((wait(&status), status), 0);
    }
    // Every line whole and refreshed, every id once.
    const auto lines = [] {
        static const std::regex kLine("10\\.0\\.0\\.[0-7],u[0-7],([^,/]{13}),[0-9]+,[0-9]+,2,0,L\n");
        std::set<std::string> ids;
        const std::string text = Read(kFile);
        size_t covered = 0, n = 0;
        for (std::sregex_iterator m(text.begin(), text.end(), kLine), end; m != end; ++m, ++n) {
            ids.insert((*m)[1]), covered += static_cast<size_t>(m->length(0));
        }
        return covered == text.size() && ids.size() == n ? n : 0;
    };
    EXPECT_EQ(lines(), static_cast<size_t>(kProcesses * kRounds));
    for (int kill = 0; kill < 20; ++kill) {
        const pid_t pid = fork();
        if (pid == 0) {
            for (;;) Authorize("none", {.addr = "10.0.0.9"});
        }
        usleep(static_cast<useconds_t>(1000 + rand() % 20000));
        ::kill(pid, SIGKILL), waitpid(pid, nullptr, 0);
        ASSERT_EQ(lines(), static_cast<size_t>(kProcesses * kRounds));
    }
    EXPECT_TRUE(app_.ErrorLines().empty());
}

}  // namespace
