// Settings files: what readers make of hand-written files, what writers keep, the errors,
// and that concurrent writers neither tear a reader's view nor lose each other's updates.
#include <limits.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <iterator>
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

std::string ReadText(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), {});
}

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

TEST_F(SettingsFile, RejectsBadArguments) {
    Put("key=\"v\"\n");
    std::string longKey(300, 'k');
    std::string longPath = "/tmp/" + std::string(PATH_MAX, 'p');
    char buf[16];
    const Outcome bad{-1, QUIB_ERR_BAD_PARAMETER};
    const Outcome tooLong{-1, QUIB_ERR_NAME_TOO_LONG};
    const struct { const char *file, *key; char *buf; int flags; Outcome outcome; } reads[] = {
        {nullptr, "key", buf, 0, bad},  {longPath.c_str(), "key", buf, 0, tooLong}, {kFile, nullptr, buf, 0, bad},
        {kFile, "", buf, 0, bad},       {kFile, "a=b", buf, 0, bad},   {kFile, "line\nbreak", buf, 0, bad},
        {kFile, "\xff\xfe", buf, 0, bad}, {kFile, longKey.c_str(), buf, 0, bad}, {kFile, "key", buf, 2, bad},
        {kFile, "key", nullptr, 0, bad},
    };
    for (const auto &row : reads) {
        EXPECT_EQ(OUTCOME(VLIBCFileGetKeyValue(row.file, row.key, row.buf, 8, row.flags)), row.outcome)
            << (row.key ? row.key : "(null key)") << " flags " << row.flags;
    }
    const struct { const char *file, *key, *value; int format; Outcome outcome; } writes[] = {
        {nullptr, "k", "v", 0, bad},       {longPath.c_str(), "k", "v", 0, tooLong}, {kFile, nullptr, "v", 0, bad},
        {kFile, "", "v", 0, bad},          {kFile, "two words", "v", 0, bad},      {kFile, "a=b", "v", 0, bad},
        {kFile, "#key", "v", 0, bad},      {kFile, "\"key", "v", 0, bad},          {kFile, "\xff", "v", 0, bad},
        {kFile, longKey.c_str(), "v", 0, bad}, {kFile, "key", nullptr, 0, bad},    {kFile, "key", "line\nbreak", 0, bad},
        {kFile, "key", "cr\rhere", 0, bad}, {kFile, "key", "\xc3(", 0, bad},       {kFile, "key", " padded", 1, bad},
        {kFile, "key", "padded ", 1, bad}, {kFile, "key", "\"quoted", 1, bad},      {kFile, "key", "v", 2, bad},
    };
    for (const auto &row : writes) {
        EXPECT_EQ(OUTCOME(VLIBCFileSetKeyValue(row.file, row.key, row.value, row.format)), row.outcome)
            << (row.key ? row.key : "(null)") << " = " << (row.value ? row.value : "(null)");
    }
    for (const Outcome &outcome :
         {OUTCOME(VLIBCFileRemoveKey(kFile, nullptr)), OUTCOME(VLIBCFileCheckKeyValue(kFile, "key", nullptr, 0)),
          OUTCOME(VLIBCFileCheckKeyValue(kFile, "key", "v", 5)), OUTCOME(VLIBCFileGetKeys(kFile, nullptr, nullptr))}) {
        EXPECT_EQ(outcome, bad);
    }
    EXPECT_EQ(ReadText(kFile), "key=\"v\"\n");  // nothing was written
}

TEST_F(SettingsFile, RewriteKeepsEverythingElse) {
    const std::string head = "# Appliance settings\r\n\r\n  # indented comment\r\n";
    Put(head + "first = unquoted\r\nmalformed line\r\nkey=\"old\"\r\nkey=\"duplicate\"\r\nlast=\"no newline\"");
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "key", "new \"one\"", 0), 0);
    EXPECT_EQ(ReadText(kFile),
              head + "first = unquoted\r\nmalformed line\r\nkey=\"new \\\"one\\\"\"\r\nlast=\"no newline\"");
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "added", "1", 0), 0);
    EXPECT_EQ(ReadText(kFile), head + "first = unquoted\r\nmalformed line\r\nkey=\"new \\\"one\\\"\"\r\n"
                                      "last=\"no newline\"\r\nadded=\"1\"\r\n");
    ASSERT_EQ(VLIBCFileRemoveKey(kFile, "first"), 0);
    ASSERT_EQ(VLIBCFileRemoveKey(kFile, "last"), 0);
    EXPECT_EQ(ReadText(kFile), head + "malformed line\r\nkey=\"new \\\"one\\\"\"\r\nadded=\"1\"\r\n");

    // Remove takes every occurrence; removing an absent key or setting the value a key
    // already has does not rewrite the file.
    Put("a=\"1\"\n# note\na=\"2\"\nb=\"3\"\n");
    ASSERT_EQ(VLIBCFileRemoveKey(kFile, "a"), 0);
    EXPECT_EQ(ReadText(kFile), "# note\nb=\"3\"\n");
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
    EXPECT_EQ(ReadText("/tmp/conf/new.conf"), "key=\"v\"\n");

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

TEST_F(SettingsFile, WriterFailuresAreTranslatedAndLeaveNoTrace) {
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
    EXPECT_EQ(result, 0);
    EXPECT_EQ(Get("/tmp/conf/open/b.conf", "key"), "v");
    EXPECT_EQ(DirEntries("/tmp/conf/open"), (Strings{"b.conf"}));
    EXPECT_EQ(DirEntries("/tmp/conf/closed"), (Strings{"a.conf"}));
}

// Runs body(index) in count children, calling between() until every child has exited; true
// when each returned 0. Children still running after 30 s (the whole normally takes well under
// a second) are stopped with SIGSEGV first, so that a sanitized build prints where each was
// stuck, then killed; that counts as failure.
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
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    bool ok = true;
    while (!pids.empty()) {
        if (std::chrono::steady_clock::now() > deadline) {
            ADD_FAILURE() << pids.size() << " writer(s) still running after 30 s";
            for (const pid_t pid : pids) kill(pid, SIGSEGV);
            sleep(2);
            for (const pid_t pid : pids) {
                kill(pid, SIGKILL);
                waitpid(pid, nullptr, 0);
            }
            return false;
        }
        between();
        int status = 0;
        pid_t done = waitpid(pids.back(), &status, WNOHANG);
        if (done != 0) {
            ok = ok && done == pids.back() && WIFEXITED(status) && WEXITSTATUS(status) == 0;
            pids.pop_back();
        }
    }
    return ok;
}

// True when text is before + one byte repeated + after.
bool WholeAround(const std::string &text, const std::string &before, const std::string &after) {
    size_t size = text.size() - std::min(text.size(), before.size() + after.size());
    std::string middle = text.substr(std::min(text.size(), before.size()), size);
    return size > 0 && text.rfind(before, 0) == 0 && text.compare(before.size() + size, after.size(), after) == 0 &&
           middle.find_first_not_of(middle[0]) == std::string::npos;
}

TEST_F(SettingsFile, ReadersNeverSeeATornFile) {
    const std::string top = "# header comment\nhead=\"H\"\n\n# middle comment\npayload=\"";
    Put(top + "x\"\ntail=\"T\"\n");
    int reads = 0;
    int torn = 0;
    bool ok = InChildren(
        2,
        [](int index) {
            for (int i = 0; i < 300; ++i) {
                // Large values of one repeated letter: a mixture of two writes would show.
                std::string value(1000 + (i * 7919) % 60000, static_cast<char>('a' + index * 13 + i % 13));
                if (VLIBCFileSetKeyValue(kFile, "payload", value.c_str(), 0) != 0) {
                    return 1;
                }
            }
            return 0;
        },
        [&] {
            ++reads;
            bool whole = WholeAround(KeysOf(kFile), "3: head=H payload=", " tail=T") &&
                         WholeAround(ReadText(kFile), top, "\"\ntail=\"T\"\n");
            torn += whole ? 0 : 1;
        });
    EXPECT_TRUE(ok);
    EXPECT_EQ(torn, 0) << "of " << reads << " reads";
}

TEST_F(SettingsFile, ConcurrentWritersLoseNoUpdate) {
    Put("# shared by four writers\n");
    bool ok = InChildren(
        4,
        [](int index) {
            std::string key = "writer" + std::to_string(index);
            for (int i = 1; i <= 500; ++i) {
                if (VLIBCFileSetKeyValue(kFile, key.c_str(), std::to_string(i).c_str(), 0) != 0) {
                    return 1;
                }
            }
            return 0;
        },
        [] { usleep(1000); });
    ASSERT_TRUE(ok);
    for (const char *key : {"writer0", "writer1", "writer2", "writer3"}) {
        EXPECT_EQ(Get(kFile, key), "500") << key;
    }
    EXPECT_EQ(ReadText(kFile).rfind("# shared by four writers\n", 0), 0u);
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
