// Login records: password check against a real crypt hash in shadow, sid issue, the sliding
// expiry, purging, rollback of failed writes, and refusal of hostile input and of a database
// that is not ours; and the login state of a CGI request.
#include <ctype.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <fcntl.h>

#include <functional>
#include <string>
#include <utility>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_login.h"
#include "quib_paths.h"
#include "vlibc_err.h"

namespace {

using namespace norvo::testing;

constexpr char kUnknownSid[] = "AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA";

// Runs statements on the login database through the sqlite3 shell; its output, trimmed.
// The tests use it to read what was stored and to age records, as time can't be moved.
std::string Sql(const std::string &statements) {
    std::string out;
    char buffer[256];
    if (FILE *pipe = popen(("sqlite3 " QUIB_LOGIN_DB " \"" + statements + "\" 2>&1").c_str(), "r")) {
        while (fgets(buffer, sizeof buffer, pipe) != nullptr) out += buffer;
        pclose(pipe);
    }
    while (!out.empty() && isspace(static_cast<unsigned char>(out.back()))) out.pop_back();
    return out;
}

class Login : public ::testing::Test {
protected:
    Login() { appliance_.Basic(); }

    // Logs user in; "" when refused.
    std::string LogIn(const char *user) {
        char sid[64];
        return QUIBLoginCreate(user, "secret", "192.0.2.7", sid, sizeof sid) == 0 ? sid : "";
    }
    Outcome Create(const char *user) {
        char sid[64];
        return OUTCOME(QUIBLoginCreate(user, "secret", "", sid, sizeof sid));
    }
    Outcome Get(const char *sid, int size = 64) { return OUTCOME(QUIBLoginGet(sid, user_, size)); }
    Outcome Remove(const char *sid) { return OUTCOME(QUIBLoginRemove(sid)); }
    std::string UserOf(const std::string &sid) { return Get(sid.c_str()).rc == 0 ? user_ : ""; }

    Appliance appliance_;
    char user_[64] = "";
};

TEST_F(Login, ACorrectPasswordGivesASidThatNamesTheUser) {
    appliance_.AddUser("CORP\\dave").AddUser("erin@corp.example");
    const mode_t old = umask(0);
    const std::string sid = LogIn("alice");
    umask(old);
    ASSERT_EQ(sid.size(), 32u);
    EXPECT_EQ(sid.find_first_not_of("ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_"), sid.npos);
    struct stat info {};
    ASSERT_EQ(stat(QUIB_LOGIN_DB, &info), 0);
    EXPECT_EQ(info.st_mode & 07777, 0600u) << "born private whatever the umask";
    const std::string again = LogIn("alice");
    EXPECT_NE(again, sid);
    // Domain and directory accounts log in by their full names.
    for (const auto &[login, user] : {std::pair{sid, "alice"}, {again, "alice"}, {LogIn("CORP\\dave"), "CORP\\dave"},
                                      {LogIn("erin@corp.example"), "erin@corp.example"}}) {
        EXPECT_EQ(UserOf(login), user);
    }
    EXPECT_EQ(Remove(sid.c_str()), (Outcome{0}));
    EXPECT_EQ(Get(sid.c_str()), Failed(QUIB_ERR_ACCESS_DENIED));
    EXPECT_EQ(Remove(sid.c_str()), Failed(QUIB_ERR_ACCESS_DENIED));
    EXPECT_EQ(UserOf(again), "alice");
    // The ids of a login are those of its account.
    EXPECT_EQ(QuibCgiUIDGet(again.c_str(), "alice"), appliance_.Uid("alice"));
    EXPECT_EQ(QuibCgiGIDGet(again.c_str(), "alice"), appliance_.Gid("users"));
    EXPECT_EQ(QuibCgiUIDGet(again.c_str(), "ALICE"), appliance_.Uid("alice"));
    EXPECT_EQ(OUTCOME(QuibCgiUIDGet(again.c_str(), "bob")), (Outcome{static_cast<uid_t>(-1), QUIB_ERR_ACCESS_DENIED}));
    EXPECT_EQ(QuibCgiGIDGet(sid.c_str(), "alice"), static_cast<gid_t>(-1));
}

TEST_F(Login, WrongPasswordsClosedAccountsAndHostileArgumentsAreRefused) {
    appliance_.AddUser("gone").AddUser("locked").AddUser("starred").AddUser("empty");
    // Expired on day 1; locked as passwd -l does (the old hash behind a "!"), locked with "*"; no password.
    ASSERT_EQ(system("sed -i 's/^\\(gone\\(:[^:]*\\)\\{6\\}\\):[^:]*/\\1:1/; s/^locked:/&!/; "
                     "s/^starred:[^:]*/starred:*/; s/^empty:[^:]*/empty:/' /etc/shadow"), 0);
    const std::string longPassword(10000, 's'), longName(300, 'a'), longAddress(256, '1');
    constexpr int kDenied = QUIB_ERR_ACCESS_DENIED, kBad = QUIB_ERR_BAD_PARAMETER;
    struct Case { const char *user, *password; int slot; const char *address = ""; int size = 64; } cases[] = {
        {"alice", "Secret", kDenied}, {"alice", "", kDenied}, {"alice", longPassword.c_str(), kDenied},
        {"carol", "secret", QUIB_ERR_NO_SUCH_USER}, {"Alice", "secret", QUIB_ERR_NO_SUCH_USER},
        {"gone", "secret", kDenied}, {"locked", "secret", kDenied}, {"starred", "secret", kDenied},
        {"empty", "secret", kDenied}, {"empty", "", kDenied}, {nullptr, "secret", kBad}, {"", "secret", kBad},
        {"alice", nullptr, kBad}, {"alice", "secret", kBad, "", 32},  // no room for the terminator
        {"alice", "secret", kBad, "", -1}, {"al\xff\xfeice", "secret", kBad}, {longName.c_str(), "secret", kBad},
        {"alice", "secret", kBad, "192.0.2.7\r\nX-Injected: 1"}, {"alice", "secret", kBad, longAddress.c_str()},
    };
    for (const Case &c : cases) {
        char sid[64] = "untouched";
        EXPECT_EQ(OUTCOME(QUIBLoginCreate(c.user, c.password, c.address, sid, c.size)),
                  Failed(c.slot)) << (c.user ? c.user : "null") << " " << (c.password ? c.password : "null");
        EXPECT_STREQ(sid, "untouched");
    }
    EXPECT_EQ(QUIBLoginCreate("alice", "secret", "192.0.2.7", nullptr, 64), -1);
    char sid[33];
    EXPECT_EQ(QUIBLoginCreate("alice", "secret", nullptr, sid, sizeof sid), 0) << "null address, exact room";

    const std::string overlong(129, 'A');
    for (const char *bad :
         {static_cast<const char *>(nullptr), "", "../etc/passwd", "a'b", "\xff\xfe", overlong.c_str()}) {
        EXPECT_EQ(Get(bad), Failed(kBad)) << (bad ? bad : "null");
        EXPECT_EQ(Remove(bad), Failed(kBad)) << (bad ? bad : "null");
    }
    EXPECT_EQ(Get(sid, 0), Failed(kBad));
    EXPECT_EQ(Get(sid, 5), Failed(kBad)) << "\"alice\" needs 6 bytes, and is never cut";
    EXPECT_EQ(QUIBLoginGet(sid, nullptr, 64), -1);
    EXPECT_EQ(Get(sid, 6), (Outcome{0}));
    EXPECT_STREQ(user_, "alice");
}

// The records live in root's own directory: SQLite rolls in whatever journal it finds beside
// a database, so anything there that root did not make, or a link, is refused, never used.
TEST_F(Login, OnlyRootsOwnDirectoryAndFilesAreUsed) {
    EXPECT_EQ(Get(kUnknownSid), Failed(QUIB_ERR_ACCESS_DENIED)) << "a lookup creates nothing";
    EXPECT_EQ(Remove(kUnknownSid), Failed(QUIB_ERR_ACCESS_DENIED));
    EXPECT_EQ(access(QUIB_LOGIN_DIR, F_OK), -1);
    // The old place in /tmp, taken by bob: a journal of his pages and a link at the name.
    ASSERT_EQ(appliance_.RunAs("bob", [] {
        return symlink("/tmp/bobs.db", "/tmp/quib_login.db") == 0 &&
               creat("/tmp/quib_login.db-journal", 0666) >= 0 ? 0 : 1;
    }), 0);
    const std::string sid = LogIn("alice");
    EXPECT_EQ(UserOf(sid), "alice");
    EXPECT_EQ(access("/tmp/bobs.db", F_OK), -1);
    struct stat info {};
    ASSERT_EQ(stat(QUIB_LOGIN_DIR, &info), 0);
    EXPECT_EQ(info.st_mode & 07777, 0700u);
    EXPECT_EQ(info.st_uid, 0u);
    EXPECT_EQ(appliance_.RunAs("bob", [] { return creat(QUIB_LOGIN_DB "-journal", 0666) < 0 ? errno : 0; }),
              EACCES);
    EXPECT_EQ(appliance_.RunAs("alice", [&] { return QUIBLoginGet(sid.c_str(), user_, 64) == -1 ? VLIBCErrGet() >> 8 : 0; }),
              QUIB_ERR_ACCESS_DENIED >> 8) << "only root reads the records";

    // What root finds planted in its own place (as if by another user) is an error, not a login.
    const auto chownToBob = [&](const char *path) { return lchown(path, appliance_.Uid("bob"), 0); };
    const struct Case { const char *what; std::function<int()> plant; int slot; } cases[] = {
        {"dir is a link", [] { return mkdir("/tmp/d", 0700) | symlink("/tmp/d", QUIB_LOGIN_DIR); }, QUIB_ERR_ACCESS_DENIED},
        {"dir writable by others", [] { return mkdir(QUIB_LOGIN_DIR, 0700) | chmod(QUIB_LOGIN_DIR, 0733); }, QUIB_ERR_ACCESS_DENIED},
        {"dir of bob's", [&] { return mkdir(QUIB_LOGIN_DIR, 0700) | chownToBob(QUIB_LOGIN_DIR); }, QUIB_ERR_ACCESS_DENIED},
        {"dir is a file", [] { return creat(QUIB_LOGIN_DIR, 0600) < 0; }, QUIB_ERR_ACCESS_DENIED},
        {"db is a link", [] { return mkdir(QUIB_LOGIN_DIR, 0700) | symlink("/tmp/x.db", QUIB_LOGIN_DB); }, QUIB_ERR_ACCESS_DENIED},
        {"db is a dir", [] { return mkdir(QUIB_LOGIN_DIR, 0700) | mkdir(QUIB_LOGIN_DB, 0700); }, QUIB_ERR_ACCESS_DENIED},
        {"db of bob's", [&] { return mkdir(QUIB_LOGIN_DIR, 0700) | (creat(QUIB_LOGIN_DB, 0600) < 0) | chownToBob(QUIB_LOGIN_DB); }, QUIB_ERR_ACCESS_DENIED},
        {"db readable by others", [] { return mkdir(QUIB_LOGIN_DIR, 0700) | (creat(QUIB_LOGIN_DB, 0644) < 0); }, QUIB_ERR_ACCESS_DENIED},
        {"journal of bob's", [&] { return mkdir(QUIB_LOGIN_DIR, 0700) | (creat(QUIB_LOGIN_DB "-journal", 0600) < 0) | chownToBob(QUIB_LOGIN_DB "-journal"); }, QUIB_ERR_ACCESS_DENIED},
        {"journal is a link", [] { return mkdir(QUIB_LOGIN_DIR, 0700) | symlink("/tmp/j", QUIB_LOGIN_DB "-journal"); }, QUIB_ERR_ACCESS_DENIED},
        {"wal of bob's", [&] { return mkdir(QUIB_LOGIN_DIR, 0700) | (creat(QUIB_LOGIN_DB "-wal", 0600) < 0) | chownToBob(QUIB_LOGIN_DB "-wal"); }, QUIB_ERR_ACCESS_DENIED},
        {"db not a database", [] { return mkdir(QUIB_LOGIN_DIR, 0700) | (system("echo junk > " QUIB_LOGIN_DB "; chmod 600 " QUIB_LOGIN_DB) != 0); }, QUIB_ERR_FAILED},
    };
    for (const Case &c : cases) {
        ASSERT_EQ(system("rm -rf " QUIB_LOGIN_DIR " /tmp/d /tmp/x.db /tmp/j"), 0);
        ASSERT_EQ(c.plant(), 0) << c.what;
        EXPECT_EQ(Create("alice"), Failed(c.slot)) << c.what;
        EXPECT_EQ(Get(sid.c_str()), Failed(c.slot)) << c.what;
        EXPECT_EQ(access("/tmp/d/" QUIB_LOGIN_DB_NAME, F_OK) | access("/tmp/x.db", F_OK) | access("/tmp/j", F_OK), -1) << c.what;
    }
}

// What was stored, read and aged through the sqlite3 shell.
class LoginRecords : public Login {
protected:
    void SetUp() override {
        if (system("sqlite3 -version >/dev/null 2>&1") != 0) GTEST_SKIP() << "needs the sqlite3 shell";
    }
    std::string Of(const std::string &sid, const std::string &what) {
        return Sql("SELECT " + what + " FROM login_session WHERE sid = '" + sid + "'");
    }
    void Expire(const std::string &sid, const std::string &when) {
        Sql("UPDATE login_session SET expires = strftime('%s','now') " + when + " WHERE sid = '" + sid + "'");
    }
};

TEST_F(LoginRecords, TheLifetimeComesFromTheSettingAndSlides) {
    EXPECT_EQ(Of(LogIn("alice"), "user, remote_addr, expires - created"), "alice|192.0.2.7|900");
    for (const auto &[value, lifetime] : {std::pair{"30", "1800"}, {"1", "60"}, {"525600", "31536000"},
                                          {"525601", "900"}, {"abc", "900"}, {"0", "900"}, {"-5", "900"},
                                          {"99999999999", "900"}, {"", "900"}, {"15x", "900"}, {" 30", "900"}}) {
        appliance_.SetSetting("login_timeout_minutes", value);
        EXPECT_EQ(Of(LogIn("alice"), "expires - created"), lifetime) << '"' << value << '"';
    }
    // Aged to 5 seconds before expiry, a login gets the whole lifetime again from a lookup.
    appliance_.SetSetting("login_timeout_minutes", "30");
    const std::string sid = LogIn("alice");
    Expire(sid, "+ 5");
    const std::string now = std::to_string(time(nullptr));
    EXPECT_EQ(UserOf(sid), "alice");
    EXPECT_EQ(Of(sid, "expires >= " + now + " + 1800 AND last_active >= " + now), "1");
}

// An expired login is refused and purged by the next lookup; a write that fails is a failure,
// not an unknown sid, and takes its purge back with it.
TEST_F(LoginRecords, ExpiredLoginsArePurgedUnlessTheWriteFails) {
    const std::string old = LogIn("alice"), live = LogIn("bob");
    Expire(old, "- 1");
    const std::string records = Sql("SELECT * FROM login_session ORDER BY sid");
    Sql("CREATE TRIGGER no_insert BEFORE INSERT ON login_session BEGIN SELECT RAISE(ABORT, 'x'); END;"
        "CREATE TRIGGER no_update BEFORE UPDATE ON login_session BEGIN SELECT RAISE(ABORT, 'x'); END;");
    EXPECT_EQ(Create("alice"), Failed(QUIB_ERR_FAILED));
    EXPECT_EQ(Get(live.c_str()), Failed(QUIB_ERR_FAILED));
    EXPECT_EQ(Sql("SELECT * FROM login_session ORDER BY sid"), records);
    Sql("DROP TRIGGER no_insert; DROP TRIGGER no_update;");
    EXPECT_EQ(Get(old.c_str()), Failed(QUIB_ERR_ACCESS_DENIED));
    EXPECT_EQ(Sql("SELECT count(*) FROM login_session"), "1");
    EXPECT_EQ(UserOf(live), "bob");
}

// Every byte as %XX, as a client may encode it.
std::string EncodeAll(const std::string &text) {
    std::string out;
    for (unsigned char c : text) out += std::string("%") + "0123456789ABCDEF"[c >> 4] + "0123456789ABCDEF"[c & 0xF];
    return out;
}

// The login state of a CGI request: the sid from the cookie "id" or the query parameter "_sid",
// parsed as browsers and clients really send them, and the account-kind mask.
class WebManTest : public Login {
protected:
    WebManTest() { appliance_.AddUser("CORP\\dave").AddUser("erin@corp.example"); }

    // The sid IsAuthorized accepts for this request ("": unset), "" when refused.
    std::string Authorize(const std::string &cookie, const std::string &query, int mask = 15) {
        cookie.empty() ? unsetenv("HTTP_COOKIE") : setenv("HTTP_COOKIE", cookie.c_str(), 1);
        query.empty() ? unsetenv("QUERY_STRING") : setenv("QUERY_STRING", query.c_str(), 1);
        WebMan request;
        if (!request.IsAuthorized("test", mask, 1)) {
            EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
            EXPECT_EQ(request.GetLoginUserName() + request.GetLoginSid(), "");
            return "";
        }
        char user[64] = "";
        EXPECT_EQ(QUIBLoginGet(request.GetLoginSid().c_str(), user, sizeof user), 0);
        EXPECT_EQ(request.GetLoginUserName(), user);
        return request.GetLoginSid();
    }
};

TEST_F(WebManTest, TheSidComesFromTheIdCookieOrElseTheSidParameter) {
    const std::string alice = LogIn("alice"), bob = LogIn("bob"), stale = LogIn("admin");
    ASSERT_EQ(QUIBLoginRemove(stale.c_str()), 0);
    const std::string huge(100000, 'A');
    // How the cookie and the query are read the request fuzzer checks against the rules; here
    // what reaches the login records: attacks on the lookup, and which of two sids is live.
    struct Case { std::string cookie, query, sid; } cases[] = {
        {"lang=en; id=" + alice, "", alice}, {"id=" + alice.substr(1), "", ""}, {"id=" + alice + "x", "", ""},
        {"id=" + alice + "' OR '1'='1", "", ""}, {"id=" + huge, "", ""},
        {"", "api=x&_sid=" + bob + "&version=1", bob}, {"", "_sid=" + EncodeAll(bob), bob},
        {"", "_sid=" + bob + "%00", ""}, {"", "_sid=" + bob.substr(0, 31) + "%2", ""},
        // A browser may still send a stale cookie while the page passes a live sid.
        {"id=" + stale, "_sid=" + bob, bob}, {"id=garbage'--", "_sid=" + bob, bob}, {"id=" + bob, "_sid=" + stale, bob},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(Authorize(c.cookie, c.query), c.sid) << c.cookie.substr(0, 60) << " | " << c.query.substr(0, 60);
    }
    EXPECT_EQ(Authorize("id=" + alice, ""), alice) << "the live login is untouched by all that";

    WebMan request;
    EXPECT_EQ(request.GetLoginUserName() + request.GetLoginSid(), "");
    setenv("HTTP_COOKIE", ("id=" + alice).c_str(), 1);
    ASSERT_TRUE(request.IsAuthorized(nullptr, 15, 0));
    unsetenv("HTTP_COOKIE");
    EXPECT_FALSE(request.IsAuthorized(nullptr, 15, 0));
    EXPECT_EQ(request.GetLoginUserName() + " " + request.GetLoginSid(), "alice " + alice) << "a refusal keeps them";
}

TEST_F(WebManTest, TheMaskSelectsKindsOfAccount) {
    const std::string alice = "id=" + LogIn("alice"), admin = "id=" + LogIn("admin");
    const std::string dave = "id=" + LogIn("CORP\\dave"), erin = "id=" + LogIn("erin@corp.example");
    struct Case { const std::string &cookie; int mask; bool allowed; } cases[] = {
        {alice, 0x1, true}, {alice, 0xE, false}, {admin, 0x8, true}, {admin, 0x1, true}, {admin, 0x6, false},
        {dave, 0x2, true}, {dave, 0xD, false}, {erin, 0x4, true}, {erin, 0xB, false}, {erin, 15, true},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(!Authorize(c.cookie, "", c.mask).empty(), c.allowed) << c.cookie << " mask " << c.mask;
    }
}

}  // namespace
