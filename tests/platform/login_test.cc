// Login records: password check against a real crypt hash in shadow, sid issue, the sliding
// expiry, purging, and refusal of hostile input and of a database that is not ours.
#include <dirent.h>
#include <errno.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <fstream>
#include <memory>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_login.h"
#include "quib_paths.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::UserSpec;

// Open descriptors of this process, to prove every path releases what it opened.
int OpenDescriptors() {
    int count = 0;
    if (DIR *dir = opendir("/proc/self/fd")) {
        while (readdir(dir) != nullptr) {
            ++count;
        }
        closedir(dir);
    }
    return count;
}

struct PipeCloser {
    void operator()(FILE *pipe) const { pclose(pipe); }
};

// Runs one statement on the login database through the sqlite3 shell; its output, trimmed.
// The tests use it to read what was stored and to age records, as time can't be moved.
std::string Sql(const std::string &statement) {
    const std::string command = "sqlite3 " QUIB_LOGIN_DB " \"" + statement + "\" 2>&1";
    std::unique_ptr<FILE, PipeCloser> pipe(popen(command.c_str(), "r"));
    std::string out;
    char buffer[256];
    while (pipe && fgets(buffer, sizeof buffer, pipe.get()) != nullptr) {
        out += buffer;
    }
    while (!out.empty() && (out.back() == '\n' || out.back() == ' ')) {
        out.pop_back();
    }
    return out;
}

bool HaveSqliteShell() {
    return access("/usr/bin/sqlite3", X_OK) == 0 || access("/bin/sqlite3", X_OK) == 0;
}

// Replaces the password field of user in the private /etc/shadow.
void SetShadowHash(const std::string &user, const std::string &hash) {
    std::ifstream in("/etc/shadow");
    std::stringstream rewritten;
    std::string line;
    while (std::getline(in, line)) {
        if (line.compare(0, user.size() + 1, user + ":") == 0) {
            const size_t second = line.find(':', user.size() + 1);
            line = user + ":" + hash + line.substr(second);
        }
        rewritten << line << "\n";
    }
    in.close();
    std::ofstream("/etc/shadow", std::ios::trunc) << rewritten.str();
}

class Login : public ::testing::Test {
protected:
    Login() { appliance_.Basic(); }

    // Logs user in; "" when refused.
    std::string LogIn(const char *user, const char *password = "secret") {
        char sid[64];
        return QUIBLoginCreate(user, password, "192.0.2.7", sid, sizeof sid) == 0 ? sid : "";
    }

    std::string UserOf(const std::string &sid) {
        char user[64];
        return QUIBLoginGet(sid.c_str(), user, sizeof user) == 0 ? user : "";
    }

    Appliance appliance_;
};

TEST_F(Login, ACorrectPasswordGivesASidThatNamesTheUser) {
    const std::string sid = LogIn("alice");
    ASSERT_EQ(sid.size(), 32u);
    EXPECT_EQ(sid.find_first_not_of("ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_"),
              std::string::npos);
    EXPECT_EQ(UserOf(sid), "alice");
    const std::string again = LogIn("alice");
    EXPECT_NE(again, sid);
    EXPECT_EQ(UserOf(again), "alice");
    EXPECT_EQ(UserOf(sid), "alice");

    struct stat info {};
    ASSERT_EQ(stat(QUIB_LOGIN_DB, &info), 0);
    EXPECT_EQ(info.st_mode & 07777, 0600u);
    EXPECT_EQ(info.st_uid, 0u);
    if (HaveSqliteShell()) {
        EXPECT_EQ(Sql("SELECT user, remote_addr FROM login_session WHERE sid = '" + sid + "'"),
                  "alice|192.0.2.7");
    }
}

TEST_F(Login, TheDatabaseIsBornPrivateWhateverTheUmask) {
    const mode_t old = umask(0);
    const std::string sid = LogIn("bob");
    umask(old);
    ASSERT_FALSE(sid.empty());
    struct stat info {};
    ASSERT_EQ(stat(QUIB_LOGIN_DB, &info), 0);
    EXPECT_EQ(info.st_mode & 07777, 0600u);
}

TEST_F(Login, WrongPasswordsAndUnknownUsersAreRefused) {
    char sid[64] = "untouched";
    EXPECT_EQ(QUIBLoginCreate("alice", "Secret", "", sid, sizeof sid), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(QUIBLoginCreate("alice", "", "", sid, sizeof sid), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(QUIBLoginCreate("alice", std::string(10000, 's').c_str(), "", sid, sizeof sid), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(QUIBLoginCreate("carol", "secret", "", sid, sizeof sid), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_USER);
    EXPECT_EQ(QUIBLoginCreate("Alice", "secret", "", sid, sizeof sid), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_USER);
    EXPECT_STREQ(sid, "untouched");
}

TEST_F(Login, LockedPasswordlessAndExpiredAccountsAreRefused) {
    UserSpec expired;
    expired.name = "gone";
    expired.expireDay = 1;
    appliance_.AddUser(expired);
    appliance_.AddUser("locked");
    appliance_.AddUser("starred");
    appliance_.AddUser("empty");
    std::string lockedHash;
    {
        std::ifstream in("/etc/shadow");
        std::string line;
        while (std::getline(in, line)) {
            if (line.compare(0, 7, "locked:") == 0) {
                lockedHash = line.substr(7, line.find(':', 7) - 7);
            }
        }
    }
    ASSERT_FALSE(lockedHash.empty());
    SetShadowHash("locked", "!" + lockedHash);  // passwd -l: the old hash behind a "!"
    SetShadowHash("starred", "*");
    SetShadowHash("empty", "");
    for (const char *user : {"gone", "locked", "starred", "empty"}) {
        EXPECT_EQ(LogIn(user), "") << user;
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED) << user;
    }
    EXPECT_EQ(LogIn("empty", ""), "");
}

TEST_F(Login, DomainAndDirectoryAccountsLogInByTheirFullName) {
    appliance_.AddUser("CORP\\dave").AddUser("erin@corp.example");
    EXPECT_EQ(UserOf(LogIn("CORP\\dave")), "CORP\\dave");
    EXPECT_EQ(UserOf(LogIn("erin@corp.example")), "erin@corp.example");
}

TEST_F(Login, RemoveEndsALogin) {
    const std::string sid = LogIn("alice");
    const std::string other = LogIn("bob");
    EXPECT_EQ(QUIBLoginRemove(sid.c_str()), 0);
    EXPECT_EQ(UserOf(sid), "");
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(QUIBLoginRemove(sid.c_str()), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(UserOf(other), "bob");
}

TEST_F(Login, WithoutADatabaseNobodyIsLoggedIn) {
    EXPECT_EQ(UserOf("AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA"), "");
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(QUIBLoginRemove("AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA"), -1);
    EXPECT_EQ(access(QUIB_LOGIN_DB, F_OK), -1) << "a lookup must not create the database";
}

TEST_F(Login, TheLifetimeComesFromTheSettingAndSlides) {
    if (!HaveSqliteShell()) {
        GTEST_SKIP() << "needs the sqlite3 shell to read and age records";
    }
    const std::string first = LogIn("alice");
    EXPECT_EQ(Sql("SELECT expires - created FROM login_session WHERE sid = '" + first + "'"), "900");
    appliance_.SetSetting("login_timeout_minutes", "30");
    const std::string sid = LogIn("alice");
    EXPECT_EQ(Sql("SELECT expires - created FROM login_session WHERE sid = '" + sid + "'"), "1800");

    // Age the record to 5 seconds before expiry; a lookup gives it the whole lifetime again.
    Sql("UPDATE login_session SET expires = strftime('%s','now') + 5, last_active = 0 WHERE sid = '" + sid + "'");
    const long before = static_cast<long>(time(nullptr));
    EXPECT_EQ(UserOf(sid), "alice");
    const long expires = std::stol(Sql("SELECT expires FROM login_session WHERE sid = '" + sid + "'"));
    const long active = std::stol(Sql("SELECT last_active FROM login_session WHERE sid = '" + sid + "'"));
    EXPECT_GE(expires, before + 1800);
    EXPECT_GE(active, before);
}

TEST_F(Login, ABadTimeoutSettingFallsBackToFifteenMinutes) {
    if (!HaveSqliteShell()) {
        GTEST_SKIP() << "needs the sqlite3 shell to read records";
    }
    for (const char *value : {"abc", "0", "-5", "99999999999", "", "15x", " 30"}) {
        appliance_.SetSetting("login_timeout_minutes", value);
        const std::string sid = LogIn("alice");
        EXPECT_EQ(Sql("SELECT expires - created FROM login_session WHERE sid = '" + sid + "'"), "900")
            << "\"" << value << "\"";
    }
}

TEST_F(Login, ExpiredLoginsAreRefusedAndPurged) {
    if (!HaveSqliteShell()) {
        GTEST_SKIP() << "needs the sqlite3 shell to age records";
    }
    const std::string old = LogIn("alice");
    const std::string fresh = LogIn("bob");
    Sql("UPDATE login_session SET expires = strftime('%s','now') - 1 WHERE sid = '" + old + "'");
    EXPECT_EQ(UserOf(old), "");
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(Sql("SELECT count(*) FROM login_session"), "1");
    EXPECT_EQ(UserOf(fresh), "bob");
}

TEST_F(Login, TheIdsOfALoginAreThoseOfItsAccount) {
    const std::string sid = LogIn("alice");
    EXPECT_EQ(QuibCgiUIDGet(sid.c_str(), "alice"), appliance_.Uid("alice"));
    EXPECT_EQ(QuibCgiGIDGet(sid.c_str(), "alice"), appliance_.Gid("users"));
    EXPECT_EQ(QuibCgiUIDGet(sid.c_str(), "ALICE"), appliance_.Uid("alice"));
    EXPECT_EQ(QuibCgiUIDGet(sid.c_str(), "bob"), static_cast<uid_t>(-1));
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(QuibCgiGIDGet("nosuchsid", "alice"), static_cast<gid_t>(-1));
    EXPECT_EQ(QuibCgiUIDGet(nullptr, "alice"), static_cast<uid_t>(-1));
    EXPECT_EQ(QuibCgiUIDGet(sid.c_str(), nullptr), static_cast<uid_t>(-1));
}

TEST_F(Login, HostileArgumentsAreRefusedCleanly) {
    char sid[64];
    const std::string longName(300, 'a');
    struct Case {
        const char *user;
        const char *password;
        const char *address;
        int size;
    } cases[] = {
        {nullptr, "secret", "", 64},
        {"", "secret", "", 64},
        {"alice", nullptr, "", 64},
        {"alice", "secret", "", 32},  // no room for the terminator
        {"alice", "secret", "", 0},
        {"alice", "secret", "", -1},
        {"al\xff\xfeice", "secret", "", 64},
        {"ali\nce", "secret", "", 64},
        {longName.c_str(), "secret", "", 64},
        {"alice", "secret", "192.0.2.7\r\nX-Injected: 1", 64},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(QUIBLoginCreate(c.user, c.password, c.address, sid, c.size), -1);
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    }
    EXPECT_EQ(QUIBLoginCreate("alice", "secret", "192.0.2.7", nullptr, 64), -1);
    EXPECT_EQ(QUIBLoginCreate("alice", "secret", nullptr, sid, 33), 0) << "null address, exact room";

    const std::string overlong(129, 'A');
    char user[64];
    for (const char *bad : {"", "../etc/passwd", "a'b", "a b", "sid;", "\xff\xfe", overlong.c_str()}) {
        EXPECT_EQ(QUIBLoginGet(bad, user, sizeof user), -1) << bad;
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER) << bad;
        EXPECT_EQ(QUIBLoginRemove(bad), -1) << bad;
    }
    EXPECT_EQ(QUIBLoginGet(nullptr, user, sizeof user), -1);
    EXPECT_EQ(QUIBLoginGet(sid, nullptr, 64), -1);
    EXPECT_EQ(QUIBLoginGet(sid, user, 0), -1);
    EXPECT_EQ(QUIBLoginGet(sid, user, 5), -1) << "\"alice\" needs 6 bytes";
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QUIBLoginGet(sid, user, 6), 0);
    EXPECT_STREQ(user, "alice");
    EXPECT_EQ(QUIBLoginRemove(nullptr), -1);
}

// The database lives at a well-known name in /tmp: a link or someone else's file there is
// never used.
TEST_F(Login, TheDatabaseIsNeverTakenFromSomeoneElse) {
    ASSERT_EQ(symlink("/tmp/elsewhere.db", QUIB_LOGIN_DB), 0);
    EXPECT_EQ(LogIn("alice"), "");
    EXPECT_NE(VLIBCErrGet(), 0);
    EXPECT_EQ(access("/tmp/elsewhere.db", F_OK), -1);
    ASSERT_EQ(unlink(QUIB_LOGIN_DB), 0);

    appliance_.WriteFile(QUIB_LOGIN_DB, "", "bob", 0666);
    EXPECT_EQ(LogIn("alice"), "");
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(UserOf("AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA"), "");
}

TEST_F(Login, AForeignFileIsNoDatabase) {
    appliance_.WriteFile(QUIB_LOGIN_DB, "this is not a database", "root", 0600);
    EXPECT_EQ(LogIn("alice"), "");
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_FAILED);
}

TEST_F(Login, EveryPathReleasesItsDescriptors) {
    char user[64];
    const int before = OpenDescriptors();
    (void)QUIBLoginGet("AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA", user, sizeof user);  // no database yet
    for (int i = 0; i < 20; ++i) {
        const std::string sid = LogIn("alice");
        EXPECT_EQ(LogIn("alice", "wrong"), "");
        EXPECT_EQ(LogIn("nosuchuser"), "");
        EXPECT_EQ(UserOf(sid), "alice");
        EXPECT_EQ(UserOf("BBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBB"), "");
        EXPECT_EQ(QUIBLoginGet(sid.c_str(), user, 2), -1);
        EXPECT_EQ(QuibCgiUIDGet(sid.c_str(), "alice"), appliance_.Uid("alice"));
        EXPECT_EQ(QUIBLoginRemove(sid.c_str()), 0);
        EXPECT_EQ(QUIBLoginRemove(sid.c_str()), -1);
    }
    EXPECT_EQ(OpenDescriptors(), before);
}

}  // namespace
