// Settings files: what readers make of hand-written files, what writers keep, the errors,
// and that concurrent writers neither tear a reader's view nor lose each other's updates.
#include <limits.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <regex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "vlibc_err.h"
#include "vlibc_file.h"
#include "vlibc_szlist.h"

namespace {

using norvo::testing::Outcome;
using Strings = std::vector<std::string>;
#define OUTCOME(call) norvo::testing::OutcomeOf([&] { return call; })

constexpr const char kDir[] = "/tmp/conf";
constexpr const char kFile[] = "/tmp/conf/test.conf";
constexpr const char kNone[] = "/tmp/conf/none.conf";

// The value readers see, or "<absent>" / "<failed>".
std::string Get(const char *file, const char *key, int flags = 0) {
    char buf[4096];
    int rc = VLIBCFileGetKeyValue(file, key, buf, sizeof buf, flags);
    return rc < 0 ? "<failed>" : rc == 0 ? "<absent>" : std::string(buf);
}

Strings DirEntries(const char *dir) {
    Strings names;
    for (const auto &entry : std::filesystem::directory_iterator(dir)) {
        names.push_back(entry.path().filename());
    }
    std::sort(names.begin(), names.end());
    return names;
}

// VLIBCFileGetKeys as "count: key=value ..." (without values: "count: key ...").
std::string KeysOf(const char *file, bool values = true) {
    PSZLIST keyList = VLIBCSzListAlloc(1);
    PSZLIST valueList = VLIBCSzListAlloc(1);
    std::string out = std::to_string(VLIBCFileGetKeys(file, &keyList, values ? &valueList : nullptr)) + ":";
    for (int i = 0; i < VLIBCSzListCount(keyList); ++i) {
        out += std::string(" ") + VLIBCSzListGet(keyList, i);
        out += values ? std::string("=") + VLIBCSzListGet(valueList, i) : "";
    }
    VLIBCSzListFree(keyList);
    VLIBCSzListFree(valueList);
    return out;
}

class SettingsFile : public ::testing::Test {
protected:
    void SetUp() override { app_.MakeDir(kDir); }
    void Put(const std::string &text) { app_.WriteFile(kFile, text); }
    norvo::testing::Appliance app_;
};

TEST_F(SettingsFile, ReadsHandWrittenLines) {
    const struct { const char *text, *expected; } rows[] = {
        {"key=\"value\"\n", "value"},                  {"\t key\t=\t\"tabs\"  \n", "tabs"},
        {"key=bare value  \n", "bare value"},          {"key=\"a=b=c\"\n", "a=b=c"},
        {"key=a=b\n", "a=b"},                          {"key=\"say \\\"hi\\\"\"\n", "say \"hi\""},
        {"key=\"back\\\\slash\"\n", "back\\slash"},    {"key=\"CORP\\dave\"\n", "CORP\\dave"},
        {"key=\"value\" # trailing comment\n", "value"}, {"key='single \"quoted\"'\n", "single \"quoted\""},
        {"key=\"unterminated\n", "unterminated"},      {"key=\"#not a comment\"\n", "#not a comment"},
        {"key=color#fff\n", "color#fff"},              {"other=\"1\"\r\nkey=\"crlf\"\r\n", "crlf"},
        {"key=\"no newline\"", "no newline"},          {"key=\"\"\n", ""},
        {"key=\n", ""},                                {"key=\"caf\xc3\xa9\"\n", "caf\xc3\xa9"},
        {"key=\"first\"\nkey=\"second\"\n", "first"},  {"# key=\"commented\"\nkey=\"live\"\n", "live"},
        {"\n\n   \nkey=\"after blanks\"\n", "after blanks"}, {"  # key=\"indented comment\"\n", "<absent>"},
        {"key\n", "<absent>"},                         {"keyx=\"prefix only\"\n", "<absent>"},
        {"Key=\"other case\"\n", "<absent>"},          {"=\"no key\"\n", "<absent>"},
        {"", "<absent>"},
    };
    for (const auto &row : rows) {
        Put(row.text);
        EXPECT_EQ(Get(kFile, "key"), row.expected) << "file: " << row.text;
    }
}

TEST_F(SettingsFile, ReaderResultsAndErrors) {
    Put("UserHomeEnable=\"yes\"\n");
    EXPECT_EQ(Get(kFile, "userhomeenable", 1), "yes");
    EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "userhomeenable", "YES", 1), 1);
    EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "UserHomeEnable", "YES", 0), 0);
    EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "missing", "yes", 0), 0);

    Put("# c=1\nkey=\"abcdef\"\na = one\nkey=\"shadowed\"\nbroken\nc=\"x=y\"\n");
    EXPECT_EQ(KeysOf(kFile), "3: key=abcdef a=one c=x=y");  // each key once, as readers see it
    EXPECT_EQ(KeysOf(kFile, false), "3: key a c");
    char buf[4] = {'x', 'x', 'x', 'x'};  // the full length + 1, and whatever fits
    EXPECT_EQ(VLIBCFileGetKeyValue(kFile, "key", buf, sizeof buf, 0), 7);
    EXPECT_STREQ(buf, "abc");
    EXPECT_EQ(VLIBCFileGetKeyValue(kFile, "key", nullptr, 0, 0), 7);
    EXPECT_EQ(VLIBCFileGetKeyValue(kFile, "key", buf, 1, 0), 7);
    EXPECT_EQ(buf[0], '\0');

    const Outcome openFailed{-1, QUIB_ERR_OPEN_FAILED};
    EXPECT_EQ(OUTCOME(VLIBCFileGetKeyValue(kFile, "absent", buf, sizeof buf, 0)), (Outcome{0, QUIB_ERR_OPEN_FAILED}));
    EXPECT_EQ(OUTCOME(VLIBCFileGetKeyValue(kNone, "key", buf, sizeof buf, 0)), openFailed);
    EXPECT_EQ(OUTCOME(VLIBCFileGetKeyValue(kDir, "key", buf, sizeof buf, 0)), openFailed);
    EXPECT_EQ(OUTCOME(VLIBCFileCheckKeyValue(kNone, "key", "v", 0)), openFailed);
    EXPECT_EQ(OUTCOME(VLIBCFileRemoveKey(kNone, "key")), openFailed);
    VLIBCErrSetEx(0, "", 0);
    EXPECT_EQ(KeysOf(kNone), "-1:");
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);
    EXPECT_EQ(access(kNone, F_OK), -1);  // remove never creates
}

// Which keys and values a writer refuses, and that it then leaves the file alone, the settings
// fuzzer asserts (an accepted one must read back); here what it can't reach.
TEST_F(SettingsFile, RejectsBadArguments) {
    Put("key=\"v\"\n");
    std::string longPath = "/tmp/" + std::string(PATH_MAX, 'p');
    char buf[16];
    const Outcome bad{-1, QUIB_ERR_BAD_PARAMETER};
    for (const Outcome &outcome :
         {OUTCOME(VLIBCFileGetKeyValue(nullptr, "key", buf, 8, 0)), OUTCOME(VLIBCFileGetKeyValue(kFile, "a=b", buf, 8, 0)),
          OUTCOME(VLIBCFileGetKeyValue(kFile, "key", buf, 8, 2)), OUTCOME(VLIBCFileGetKeyValue(kFile, "key", nullptr, 8, 0)),
          OUTCOME(VLIBCFileSetKeyValue(kFile, nullptr, "v", 0)), OUTCOME(VLIBCFileSetKeyValue(kFile, "key", nullptr, 0)),
          OUTCOME(VLIBCFileSetKeyValue(kFile, "key", "v", 2)), OUTCOME(VLIBCFileRemoveKey(kFile, nullptr)),
          OUTCOME(VLIBCFileCheckKeyValue(kFile, "key", nullptr, 0)), OUTCOME(VLIBCFileGetKeys(kFile, nullptr, nullptr)),
          OUTCOME(VLIBCFileCheckKeyValue(kFile, "key", "v", 5))}) {
        EXPECT_EQ(outcome, bad);
    }
    const Outcome tooLong{-1, QUIB_ERR_NAME_TOO_LONG};
    EXPECT_EQ(OUTCOME(VLIBCFileGetKeyValue(longPath.c_str(), "key", buf, 8, 0)), tooLong);
    EXPECT_EQ(OUTCOME(VLIBCFileSetKeyValue(longPath.c_str(), "k", "v", 0)), tooLong);
    EXPECT_EQ(norvo::testing::ReadFile(kFile), "key=\"v\"\n");  // nothing was written
}

// That no other line moves or changes the settings fuzzer asserts; here the duplicates of a key,
// which a set and a remove both take, and the rewrites that are left out.
TEST_F(SettingsFile, RewriteTakesDuplicatesAndSkipsNoChange) {
    Put("# note\r\nkey=\"old\"\r\nkey=\"duplicate\"\r\nlast=\"no newline\"");
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "key", "new", 0), 0);
    EXPECT_EQ(norvo::testing::ReadFile(kFile), "# note\r\nkey=\"new\"\r\nlast=\"no newline\"");
    Put("a=\"1\"\n# note\na=\"2\"\nb=\"3\"\n");
    ASSERT_EQ(VLIBCFileRemoveKey(kFile, "a"), 0);
    EXPECT_EQ(norvo::testing::ReadFile(kFile), "# note\nb=\"3\"\n");
    struct stat before, after;
    ASSERT_EQ(stat(kFile, &before), 0);
    EXPECT_EQ(VLIBCFileRemoveKey(kFile, "absent"), 0);
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "b", "3", 0), 0);
    ASSERT_EQ(stat(kFile, &after), 0);
    EXPECT_EQ(before.st_ino, after.st_ino);
}

TEST_F(SettingsFile, RewriteKeepsOwnerModeAndSymlink) {
    mode_t old = umask(077);
    ASSERT_EQ(VLIBCFileSetKeyValue("/tmp/conf/new.conf", "key", "v", 0), 0);
    umask(old);
    struct stat st;
    ASSERT_EQ(stat("/tmp/conf/new.conf", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0644u);  // new files, whatever the umask
    EXPECT_EQ(norvo::testing::ReadFile("/tmp/conf/new.conf"), "key=\"v\"\n");

    app_.AddUser("alice").WriteFile(kFile, "key=\"v\"\n", "alice", 0600);
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "key", "w", 0), 0);
    ASSERT_EQ(stat(kFile, &st), 0);
    EXPECT_EQ(st.st_uid, app_.Uid("alice"));
    EXPECT_EQ(st.st_mode & 07777, 0600u);

    ASSERT_EQ(symlink(kFile, "/tmp/conf/link.conf"), 0);
    ASSERT_EQ(VLIBCFileSetKeyValue("/tmp/conf/link.conf", "key", "through link", 0), 0);
    ASSERT_EQ(lstat("/tmp/conf/link.conf", &st), 0);
    EXPECT_TRUE(S_ISLNK(st.st_mode));
    EXPECT_EQ(Get(kFile, "key"), "through link");
    EXPECT_EQ(DirEntries(kDir), (Strings{"link.conf", "new.conf", "test.conf"}));
}

TEST_F(SettingsFile, WriterFailuresAreTranslated) {
    app_.WriteFile("/tmp/conf/plain", "not a directory");
    app_.MakeDir("/volume2/conf").WriteFile("/volume2/conf/ro.conf", "key=\"v\"\n").RemountReadOnly("/volume2");
    EXPECT_EQ(OUTCOME(VLIBCFileSetKeyValue("/tmp/conf/missing/x.conf", "k", "v", 0)), (Outcome{-1, QUIB_ERR_NO_SUCH_FILE}));
    EXPECT_EQ(OUTCOME(VLIBCFileSetKeyValue("/tmp/conf/plain/x.conf", "k", "v", 0)), (Outcome{-1, QUIB_ERR_NO_SUCH_PATH}));
    EXPECT_EQ(OUTCOME(VLIBCFileSetKeyValue("/volume2/conf/ro.conf", "key", "w", 0)), (Outcome{-1, QUIB_ERR_READ_ONLY_FS}));
    EXPECT_EQ(Get("/volume2/conf/ro.conf", "key"), "v");  // readers still read it

    // Unprivileged writers: the first file is writable by everyone but its directory is not, so
    // no temporary can be made; the second's directory is open, but the rewritten file could
    // not keep root as its owner.
    app_.AddUser("alice");
    app_.MakeDir("/tmp/conf/closed", "root", 0755).WriteFile("/tmp/conf/closed/a.conf", "key=\"v\"\n", "root", 0666);
    app_.MakeDir("/tmp/conf/open", "root", 0777).WriteFile("/tmp/conf/open/b.conf", "key=\"v\"\n", "root", 0666);
    int result = app_.RunAs("alice", [] {
        for (const char *file : {"/tmp/conf/closed/a.conf", "/tmp/conf/open/b.conf"}) {
            if (VLIBCFileSetKeyValue(file, "key", "w", 0) != -1 || VLIBCErrGet() != QUIB_ERR_ACCESS_DENIED) {
                return 1;
            }
        }
        char buf[8];  // reading needs no more than read permission
        return VLIBCFileGetKeyValue("/tmp/conf/open/b.conf", "key", buf, sizeof buf, 0) == 2 ? 0 : 2;
    });
    EXPECT_EQ(result, 0);  // that a failed write leaves the file whole and no temporary is the fault loop's
}

// Runs body(index) in count children, calling between() until every child has exited; true
// when each returned 0. (A writer that hangs is ctest's timeout to catch.)
template <typename Body, typename Between>
bool InChildren(int count, Body body, Between between) {
    std::vector<pid_t> pids;
    for (int i = 0; i < count; ++i) {
        fflush(nullptr);
        pids.push_back(fork());
        if (pids.back() == 0) {
            _exit(body(i));
        }
    }
    bool ok = true;
    while (!pids.empty()) {
        between();
        int status = 0;
        const pid_t done = waitpid(pids.back(), &status, WNOHANG);
        if (done != 0) {
            ok = ok && done == pids.back() && WIFEXITED(status) && WEXITSTATUS(status) == 0;
            pids.pop_back();
        }
    }
    return ok;
}

// Two writers put large values of one repeated letter, where a mixture of two writes would
// show; two others count their own key up, where a lost update would show.
TEST_F(SettingsFile, ConcurrentWritersNeitherTearNorLoseUpdates) {
    const std::string top = "# header comment\nhead=\"H\"\n\n# middle comment\npayload=\"";
    Put(top + "x\"\ntail=\"T\"\n");
    const std::regex counters("(writer[23]=\"[0-9]+\"\n)*");
    const auto whole = [&](const std::string &text) {
        const size_t end = text.find('"', top.size());
        return text.rfind(top, 0) == 0 && end != std::string::npos && end > top.size() &&
               text.find_first_not_of(text[top.size()], top.size()) == end &&
               text.compare(end, 11, "\"\ntail=\"T\"\n") == 0 && std::regex_match(text.substr(end + 11), counters);
    };
    int reads = 0;
    int torn = 0;
    bool ok = InChildren(
        4,
        [](int index) {
            for (int i = 1; i <= 300; ++i) {
                const std::string key = index < 2 ? "payload" : "writer" + std::to_string(index);
                const char letter = static_cast<char>('a' + index * 13 + i % 13);
                const std::string value =
                    index < 2 ? std::string(1000 + (i * 7919) % 60000, letter) : std::to_string(i);
                if (VLIBCFileSetKeyValue(kFile, key.c_str(), value.c_str(), 0) != 0) {
                    return 1;
                }
            }
            return 0;
        },
        [&] {
            ++reads;
            torn += whole(norvo::testing::ReadFile(kFile)) ? 0 : 1;
        });
    EXPECT_TRUE(ok);
    EXPECT_EQ(torn, 0) << "of " << reads << " reads";
    EXPECT_EQ(Get(kFile, "writer2") + " " + Get(kFile, "writer3"), "300 300");
    EXPECT_EQ(DirEntries(kDir), (Strings{"test.conf"}));
}

// A writer killed between making its temporary and renaming it leaves the temporary behind;
// the next writer of the same file removes it, and nothing that is not one.
TEST_F(SettingsFile, TheNextWriterRemovesTemporariesOfKilledWriters) {
    Put("key=\"v\"\n");
    for (int round = 0; round < 100; ++round) {
        const pid_t pid = fork();
        if (pid == 0) {
            for (int i = 0;; ++i) (void)VLIBCFileSetKeyValue(kFile, "key", i % 2 ? "a" : "b", 0);
        }
        usleep(static_cast<useconds_t>(round * 397 % 3000));
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
    }
    const Strings kept = {".other.conf.AbC123", ".test.conf.AbC12", ".test.conf.AbC12-", ".test.conf.AbC1234",
                          ".test.conf.Link00", "test.conf", "test.conf.AbC123"};
    for (const std::string &name : kept) {
        if (name != "test.conf" && name != ".test.conf.Link00") app_.WriteFile(std::string(kDir) + "/" + name, "");
    }
    ASSERT_EQ(symlink("test.conf", "/tmp/conf/.test.conf.Link00"), 0);
    app_.WriteFile("/tmp/conf/.test.conf.Left01", "planted");
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "key", "final", 0), 0);
    EXPECT_EQ(DirEntries(kDir), kept);
    EXPECT_EQ(Get(kFile, "key"), "final");
}

}  // namespace
