// Settings files: what readers make of hand-written files, what writers keep, the errors,
// and that concurrent writers neither tear a reader's view nor lose each other's updates.
#include <dirent.h>
#include <fcntl.h>
#include <limits.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <memory>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "vlibc_err.h"
#include "vlibc_file.h"
#include "vlibc_szlist.h"

namespace {

using norvo::testing::Appliance;
using Strings = std::vector<std::string>;

constexpr const char kDir[] = "/tmp/conf";
constexpr const char kFile[] = "/tmp/conf/test.conf";

std::string ReadText(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

// The value readers see, or "<absent>" / "<failed>".
std::string Get(const char *file, const char *key, int flags = 0) {
    char buf[4096];
    int rc = VLIBCFileGetKeyValue(file, key, buf, sizeof buf, flags);
    if (rc < 0) {
        return "<failed>";
    }
    return rc == 0 ? "<absent>" : std::string(buf);
}

Strings DirEntries(const char *dir) {
    Strings names;
    std::unique_ptr<DIR, int (*)(DIR *)> d(opendir(dir), closedir);
    if (!d) {
        return names;
    }
    while (dirent *e = readdir(d.get())) {
        std::string name = e->d_name;
        if (name != "." && name != "..") {
            names.push_back(name);
        }
    }
    std::sort(names.begin(), names.end());
    return names;
}

int OpenDescriptors() {
    return static_cast<int>(DirEntries("/proc/self/fd").size());
}

struct ListFree {
    void operator()(PSZLIST list) const { VLIBCSzListFree(list); }
};
using List = std::unique_ptr<SZLIST, ListFree>;

Strings Items(PSZLIST list) {
    Strings out;
    for (int i = 0; i < VLIBCSzListCount(list); ++i) {
        out.emplace_back(VLIBCSzListGet(list, i));
    }
    return out;
}

class SettingsFile : public ::testing::Test {
protected:
    void SetUp() override { app_.MakeDir(kDir); }
    void Put(const std::string &text) { app_.WriteFile(kFile, text); }

    Appliance app_;
};

TEST_F(SettingsFile, ReadsHandWrittenLines) {
    const struct {
        const char *text;
        const char *expected;
    } cases[] = {
        {"key=\"value\"\n", "value"},
        {"key = \"spaced\"\n", "spaced"},
        {"\t key\t=\t\"tabs\"  \n", "tabs"},
        {"key=bare value  \n", "bare value"},
        {"key=\"a=b=c\"\n", "a=b=c"},
        {"key=a=b\n", "a=b"},
        {"key=\"say \\\"hi\\\"\"\n", "say \"hi\""},
        {"key=\"back\\\\slash\"\n", "back\\slash"},
        {"key=\"CORP\\dave\"\n", "CORP\\dave"},
        {"key=\"value\" # trailing comment\n", "value"},
        {"key='single \"quoted\"'\n", "single \"quoted\""},
        {"key=\"unterminated\n", "unterminated"},
        {"key=\"#not a comment\"\n", "#not a comment"},
        {"key=color#fff\n", "color#fff"},
        {"key=\"crlf\"\r\n", "crlf"},
        {"other=\"1\"\r\nkey=\"crlf2\"\r\n", "crlf2"},
        {"key=\"no newline\"", "no newline"},
        {"key=\"\"\n", ""},
        {"key=\n", ""},
        {"key=\"caf\xc3\xa9\"\n", "caf\xc3\xa9"},
        {"key=\"first\"\nkey=\"second\"\n", "first"},
        {"# key=\"commented\"\nkey=\"live\"\n", "live"},
        {"\n\n   \nkey=\"after blanks\"\n", "after blanks"},
        {"# key=\"commented\"\n", "<absent>"},
        {"  # key=\"indented comment\"\n", "<absent>"},
        {"key\n", "<absent>"},
        {"keyx=\"prefix only\"\n", "<absent>"},
        {"Key=\"other case\"\n", "<absent>"},
        {"=\"no key\"\n", "<absent>"},
        {"", "<absent>"},
    };
    for (const auto &c : cases) {
        Put(c.text);
        EXPECT_EQ(Get(kFile, "key"), c.expected) << "file: " << c.text;
    }
}

TEST_F(SettingsFile, CaseInsensitiveKeysOnRequest) {
    Put("UserHomeEnable=\"yes\"\n");
    EXPECT_EQ(Get(kFile, "userhomeenable", 0), "<absent>");
    EXPECT_EQ(Get(kFile, "userhomeenable", 1), "yes");
    EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "userhomeenable", "YES", 1), 1);
    EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "UserHomeEnable", "YES", 0), 0);
    EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "UserHomeEnable", "yes", 0), 1);
    EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "missing", "yes", 0), 0);
}

TEST_F(SettingsFile, ReturnsFullLengthAndTruncates) {
    Put("key=\"abcdef\"\n");
    char buf[4] = {'x', 'x', 'x', 'x'};
    EXPECT_EQ(VLIBCFileGetKeyValue(kFile, "key", buf, sizeof buf, 0), 7);
    EXPECT_STREQ(buf, "abc");
    EXPECT_EQ(VLIBCFileGetKeyValue(kFile, "key", nullptr, 0, 0), 7);
    char one[1] = {'x'};
    EXPECT_EQ(VLIBCFileGetKeyValue(kFile, "key", one, 1, 0), 7);
    EXPECT_EQ(one[0], '\0');
    Put("key=\"\"\n");
    EXPECT_EQ(VLIBCFileGetKeyValue(kFile, "key", buf, sizeof buf, 0), 1);
    EXPECT_STREQ(buf, "");
}

TEST_F(SettingsFile, MissingFileAndAbsentKeyAreTold) {
    char buf[16];
    EXPECT_EQ(VLIBCFileGetKeyValue("/tmp/conf/none.conf", "key", buf, sizeof buf, 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);
    VLIBCErrSetEx(0, "", 0);
    Put("other=\"1\"\n");
    EXPECT_EQ(VLIBCFileGetKeyValue(kFile, "key", buf, sizeof buf, 0), 0);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);
    // A directory is no settings file.
    EXPECT_EQ(VLIBCFileGetKeyValue(kDir, "key", buf, sizeof buf, 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);

    EXPECT_EQ(VLIBCFileCheckKeyValue("/tmp/conf/none.conf", "key", "v", 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);
    EXPECT_EQ(VLIBCFileRemoveKey("/tmp/conf/none.conf", "key"), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);
    EXPECT_EQ(access("/tmp/conf/none.conf", F_OK), -1);  // remove never creates
    List keys(VLIBCSzListAlloc(1));
    PSZLIST raw = keys.get();
    EXPECT_EQ(VLIBCFileGetKeys("/tmp/conf/none.conf", &raw, nullptr), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);
}

TEST_F(SettingsFile, RejectsBadArguments) {
    Put("key=\"v\"\n");
    std::string longKey(300, 'k');
    std::string longPath = "/tmp/" + std::string(PATH_MAX, 'p');
    char buf[16];
    const struct {
        const char *file;
        const char *key;
        char *buf;
        size_t size;
        int flags;
        int code;
    } reads[] = {
        {nullptr, "key", buf, sizeof buf, 0, QUIB_ERR_BAD_PARAMETER},
        {"", "key", buf, sizeof buf, 0, QUIB_ERR_BAD_PARAMETER},
        {longPath.c_str(), "key", buf, sizeof buf, 0, QUIB_ERR_NAME_TOO_LONG},
        {kFile, nullptr, buf, sizeof buf, 0, QUIB_ERR_BAD_PARAMETER},
        {kFile, "", buf, sizeof buf, 0, QUIB_ERR_BAD_PARAMETER},
        {kFile, "a=b", buf, sizeof buf, 0, QUIB_ERR_BAD_PARAMETER},
        {kFile, "line\nbreak", buf, sizeof buf, 0, QUIB_ERR_BAD_PARAMETER},
        {kFile, "\xff\xfe", buf, sizeof buf, 0, QUIB_ERR_BAD_PARAMETER},
        {kFile, longKey.c_str(), buf, sizeof buf, 0, QUIB_ERR_BAD_PARAMETER},
        {kFile, "key", buf, sizeof buf, 2, QUIB_ERR_BAD_PARAMETER},
        {kFile, "key", nullptr, 8, 0, QUIB_ERR_BAD_PARAMETER},
    };
    for (const auto &c : reads) {
        VLIBCErrSetEx(0, "", 0);
        EXPECT_EQ(VLIBCFileGetKeyValue(c.file, c.key, c.buf, c.size, c.flags), -1);
        EXPECT_EQ(VLIBCErrGet(), c.code) << (c.key ? c.key : "(null key)");
    }

    const struct {
        const char *key;
        const char *value;
        int format;
    } writes[] = {
        {nullptr, "v", 0},         {"", "v", 0},           {"two words", "v", 0},
        {"a=b", "v", 0},           {"#key", "v", 0},       {"\"key", "v", 0},
        {"\xff", "v", 0},          {longKey.c_str(), "v", 0}, {"key", nullptr, 0},
        {"key", "line\nbreak", 0}, {"key", "cr\rhere", 0}, {"key", "\xc3(", 0},
        {"key", " padded", 1},     {"key", "padded ", 1},  {"key", "\"quoted", 1},
        {"key", "v", 2},
    };
    for (const auto &c : writes) {
        VLIBCErrSetEx(0, "", 0);
        EXPECT_EQ(VLIBCFileSetKeyValue(kFile, c.key, c.value, c.format), -1)
            << (c.key ? c.key : "(null)") << " = " << (c.value ? c.value : "(null)");
        EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    }
    EXPECT_EQ(VLIBCFileSetKeyValue(nullptr, "k", "v", 0), -1);
    EXPECT_EQ(VLIBCFileSetKeyValue(longPath.c_str(), "k", "v", 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NAME_TOO_LONG);
    EXPECT_EQ(VLIBCFileRemoveKey(kFile, nullptr), -1);
    EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "key", nullptr, 0), -1);
    EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "key", "v", 5), -1);
    EXPECT_EQ(VLIBCFileGetKeys(kFile, nullptr, nullptr), -1);
    EXPECT_EQ(ReadText(kFile), "key=\"v\"\n");  // nothing was written
}

TEST_F(SettingsFile, ValuesSurviveARoundTrip) {
    const char *values[] = {
        "plain", "", "with spaces", "a=b=c", "say \"hi\"", "back\\slash", "trailing\\",
        "\\\"", "#hash", "  padded  ", "tab\there", "caf\xc3\xa9 \xe6\x97\xa5\xe6\x9c\xac", "'single'",
    };
    for (const char *value : values) {
        ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "key", value, 0), 0) << value;
        EXPECT_EQ(Get(kFile, "key"), value);
        EXPECT_EQ(VLIBCFileCheckKeyValue(kFile, "key", value, 0), 1) << value;
    }
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "bare", "x=1 #2", 1), 0);
    EXPECT_EQ(Get(kFile, "bare"), "x=1 #2");
    EXPECT_NE(ReadText(kFile).find("\nbare=x=1 #2\n"), std::string::npos);
}

TEST_F(SettingsFile, RewriteKeepsEverythingElse) {
    Put("# Appliance settings\r\n"
        "\r\n"
        "  # indented comment\r\n"
        "first = unquoted\r\n"
        "malformed line\r\n"
        "key=\"old\"\r\n"
        "key=\"duplicate\"\r\n"
        "last=\"no newline\"");
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "key", "new \"one\"", 0), 0);
    EXPECT_EQ(ReadText(kFile),
              "# Appliance settings\r\n"
              "\r\n"
              "  # indented comment\r\n"
              "first = unquoted\r\n"
              "malformed line\r\n"
              "key=\"new \\\"one\\\"\"\r\n"
              "last=\"no newline\"");
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "added", "1", 0), 0);
    EXPECT_EQ(ReadText(kFile),
              "# Appliance settings\r\n"
              "\r\n"
              "  # indented comment\r\n"
              "first = unquoted\r\n"
              "malformed line\r\n"
              "key=\"new \\\"one\\\"\"\r\n"
              "last=\"no newline\"\r\n"
              "added=\"1\"\r\n");
    ASSERT_EQ(VLIBCFileRemoveKey(kFile, "first"), 0);
    ASSERT_EQ(VLIBCFileRemoveKey(kFile, "last"), 0);
    EXPECT_EQ(ReadText(kFile),
              "# Appliance settings\r\n"
              "\r\n"
              "  # indented comment\r\n"
              "malformed line\r\n"
              "key=\"new \\\"one\\\"\"\r\n"
              "added=\"1\"\r\n");
}

TEST_F(SettingsFile, RemoveTakesEveryOccurrenceAndLeavesAbsentKeysAlone) {
    Put("a=\"1\"\n# note\na=\"2\"\nb=\"3\"\n");
    ASSERT_EQ(VLIBCFileRemoveKey(kFile, "a"), 0);
    EXPECT_EQ(ReadText(kFile), "# note\nb=\"3\"\n");
    struct stat before;
    ASSERT_EQ(stat(kFile, &before), 0);
    EXPECT_EQ(VLIBCFileRemoveKey(kFile, "absent"), 0);
    struct stat after;
    ASSERT_EQ(stat(kFile, &after), 0);
    EXPECT_EQ(before.st_ino, after.st_ino);  // not rewritten
    // Setting the value it already has does not rewrite either.
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "b", "3", 0), 0);
    ASSERT_EQ(stat(kFile, &after), 0);
    EXPECT_EQ(before.st_ino, after.st_ino);
}

TEST_F(SettingsFile, NewFilesAre0644WhateverTheUmask) {
    mode_t old = umask(077);
    ASSERT_EQ(VLIBCFileSetKeyValue("/tmp/conf/new.conf", "key", "v", 0), 0);
    umask(old);
    struct stat st;
    ASSERT_EQ(stat("/tmp/conf/new.conf", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0644u);
    EXPECT_EQ(ReadText("/tmp/conf/new.conf"), "key=\"v\"\n");
}

TEST_F(SettingsFile, RewriteKeepsOwnerModeAndSymlink) {
    app_.AddUser("alice");
    app_.WriteFile(kFile, "key=\"v\"\n", "alice", 0600);
    ASSERT_EQ(VLIBCFileSetKeyValue(kFile, "key", "w", 0), 0);
    struct stat st;
    ASSERT_EQ(stat(kFile, &st), 0);
    EXPECT_EQ(st.st_uid, app_.Uid("alice"));
    EXPECT_EQ(st.st_mode & 07777, 0600u);

    ASSERT_EQ(symlink(kFile, "/tmp/conf/link.conf"), 0);
    ASSERT_EQ(VLIBCFileSetKeyValue("/tmp/conf/link.conf", "key", "through link", 0), 0);
    ASSERT_EQ(lstat("/tmp/conf/link.conf", &st), 0);
    EXPECT_TRUE(S_ISLNK(st.st_mode));
    EXPECT_EQ(Get(kFile, "key"), "through link");
    EXPECT_EQ(DirEntries(kDir), (Strings{"link.conf", "test.conf"}));
}

TEST_F(SettingsFile, WriterFailuresAreTranslatedAndLeaveNoTrace) {
    EXPECT_EQ(VLIBCFileSetKeyValue("/tmp/conf/missing/x.conf", "k", "v", 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_FILE);
    app_.WriteFile("/tmp/conf/plain", "not a directory");
    EXPECT_EQ(VLIBCFileSetKeyValue("/tmp/conf/plain/x.conf", "k", "v", 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_PATH);

    app_.MakeDir("/volume2/conf");
    app_.WriteFile("/volume2/conf/ro.conf", "key=\"v\"\n");
    app_.RemountReadOnly("/volume2");
    EXPECT_EQ(VLIBCFileSetKeyValue("/volume2/conf/ro.conf", "key", "w", 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_READ_ONLY_FS);
    EXPECT_EQ(Get("/volume2/conf/ro.conf", "key"), "v");  // readers still read it
}

TEST_F(SettingsFile, UnprivilegedWritersCantReplaceOrGiveAwayFiles) {
    app_.AddUser("alice");
    // The file is writable by everyone, but its directory is not: no temporary can be made.
    app_.MakeDir("/tmp/conf/closed", "root", 0755);
    app_.WriteFile("/tmp/conf/closed/a.conf", "key=\"v\"\n", "root", 0666);
    // The directory is open, but the rewritten file could not keep root as its owner.
    app_.MakeDir("/tmp/conf/open", "root", 0777);
    app_.WriteFile("/tmp/conf/open/b.conf", "key=\"v\"\n", "root", 0666);
    int result = app_.RunAs("alice", [] {
        if (VLIBCFileSetKeyValue("/tmp/conf/closed/a.conf", "key", "w", 0) != -1 ||
            VLIBCErrGet() != QUIB_ERR_ACCESS_DENIED) {
            return 1;
        }
        if (VLIBCFileSetKeyValue("/tmp/conf/open/b.conf", "key", "w", 0) != -1 ||
            VLIBCErrGet() != QUIB_ERR_ACCESS_DENIED) {
            return 2;
        }
        // Reading needs no more than read permission.
        char buf[8];
        return VLIBCFileGetKeyValue("/tmp/conf/open/b.conf", "key", buf, sizeof buf, 0) == 2 ? 0 : 3;
    });
    EXPECT_EQ(result, 0);
    EXPECT_EQ(Get("/tmp/conf/open/b.conf", "key"), "v");
    EXPECT_EQ(DirEntries("/tmp/conf/open"), (Strings{"b.conf"}));
    EXPECT_EQ(DirEntries("/tmp/conf/closed"), (Strings{"a.conf"}));
}

TEST_F(SettingsFile, GetKeysListsEachKeyOnceInFileOrder) {
    Put("# c\nb=\"2\"\na = one\nb=\"shadowed\"\nbroken\nc=\"x=y\"\n");
    List keys(VLIBCSzListAlloc(1));
    List values(VLIBCSzListAlloc(1));
    PSZLIST k = keys.release();
    PSZLIST v = values.release();
    EXPECT_EQ(VLIBCFileGetKeys(kFile, &k, &v), 3);
    keys.reset(k);
    values.reset(v);
    EXPECT_EQ(Items(keys.get()), (Strings{"b", "a", "c"}));
    EXPECT_EQ(Items(values.get()), (Strings{"2", "one", "x=y"}));

    List onlyKeys(VLIBCSzListAlloc(1));
    k = onlyKeys.release();
    EXPECT_EQ(VLIBCFileGetKeys(kFile, &k, nullptr), 3);
    onlyKeys.reset(k);
    EXPECT_EQ(Items(onlyKeys.get()), (Strings{"b", "a", "c"}));
}

TEST_F(SettingsFile, NoDescriptorLeaksOnAnyPath) {
    Put("key=\"v\"\n");
    int before = OpenDescriptors();
    char buf[8];
    for (int i = 0; i < 50; ++i) {
        (void)VLIBCFileGetKeyValue(kFile, "key", buf, sizeof buf, 0);
        (void)VLIBCFileGetKeyValue(kFile, "absent", buf, sizeof buf, 0);
        (void)VLIBCFileGetKeyValue("/tmp/conf/none", "key", buf, sizeof buf, 0);
        (void)VLIBCFileGetKeyValue(kDir, "key", buf, sizeof buf, 0);
        (void)VLIBCFileSetKeyValue(kFile, "key", i % 2 ? "a" : "b", 0);
        (void)VLIBCFileSetKeyValue("/tmp/conf/missing/x", "key", "v", 0);
        (void)VLIBCFileSetKeyValue(kDir, "key", "v", 0);
        (void)VLIBCFileRemoveKey(kFile, "absent");
        (void)VLIBCFileRemoveKey("/tmp/conf/none", "key");
        (void)VLIBCFileCheckKeyValue(kFile, "key", "a", 0);
    }
    EXPECT_EQ(OpenDescriptors(), before);
    EXPECT_EQ(DirEntries(kDir), (Strings{"test.conf"}));
}

// Runs body(index) in count children; their exit status is body's result.
template <typename Body>
std::vector<pid_t> Spawn(int count, Body body) {
    std::vector<pid_t> pids;
    for (int i = 0; i < count; ++i) {
        fflush(nullptr);
        pid_t pid = fork();
        if (pid == 0) {
            _exit(body(i));
        }
        pids.push_back(pid);
    }
    return pids;
}

bool AllSucceeded(const std::vector<pid_t> &pids) {
    bool ok = true;
    for (pid_t pid : pids) {
        int status = 0;
        if (waitpid(pid, &status, 0) != pid || !WIFEXITED(status) || WEXITSTATUS(status) != 0) {
            ok = false;
        }
    }
    return ok;
}

bool AnyRunning(const std::vector<pid_t> &pids) {
    for (pid_t pid : pids) {
        siginfo_t info{};
        if (waitid(P_PID, static_cast<id_t>(pid), &info, WEXITED | WNOHANG | WNOWAIT) == 0 &&
            info.si_pid == 0) {
            return true;  // not exited yet; WNOWAIT leaves it for AllSucceeded to reap
        }
    }
    return false;
}

TEST_F(SettingsFile, ReadersNeverSeeATornFile) {
    Put("# header comment\nhead=\"H\"\n\n# middle comment\npayload=\"x\"\ntail=\"T\"\n");
    std::vector<pid_t> writers = Spawn(2, [](int index) {
        for (int i = 0; i < 300; ++i) {
            // Large values of one repeated letter: a mixture of two writes would show.
            std::string value(1000 + (i * 7919) % 60000, static_cast<char>('a' + index * 13 + i % 13));
            if (VLIBCFileSetKeyValue(kFile, "payload", value.c_str(), 0) != 0) {
                return 1;
            }
        }
        return 0;
    });
    int reads = 0;
    int torn = 0;
    while (AnyRunning(writers) || reads < 200) {
        List keys(VLIBCSzListAlloc(4));
        List values(VLIBCSzListAlloc(4));
        PSZLIST k = keys.release();
        PSZLIST v = values.release();
        int n = VLIBCFileGetKeys(kFile, &k, &v);
        keys.reset(k);
        values.reset(v);
        std::string raw = ReadText(kFile);
        ++reads;
        bool whole = n == 3 && Items(keys.get()) == Strings{"head", "payload", "tail"} &&
                     raw.rfind("# header comment\nhead=\"H\"\n\n# middle comment\npayload=\"", 0) == 0 &&
                     raw.size() > 9 && raw.compare(raw.size() - 9, 9, "tail=\"T\"\n") == 0;
        if (whole) {
            std::string payload = VLIBCSzListGet(values.get(), 1);
            whole = !payload.empty() && payload.find_first_not_of(payload[0]) == std::string::npos;
        }
        torn += whole ? 0 : 1;
    }
    EXPECT_TRUE(AllSucceeded(writers));
    EXPECT_EQ(torn, 0) << "of " << reads << " reads";
}

TEST_F(SettingsFile, ConcurrentWritersLoseNoUpdate) {
    Put("# shared by four writers\n");
    constexpr int kWriters = 4;
    constexpr int kRounds = 500;
    std::vector<pid_t> writers = Spawn(kWriters, [](int index) {
        std::string key = "writer" + std::to_string(index);
        for (int i = 1; i <= kRounds; ++i) {
            if (VLIBCFileSetKeyValue(kFile, key.c_str(), std::to_string(i).c_str(), 0) != 0) {
                return 1;
            }
        }
        return 0;
    });
    ASSERT_TRUE(AllSucceeded(writers));
    for (int i = 0; i < kWriters; ++i) {
        EXPECT_EQ(Get(kFile, ("writer" + std::to_string(i)).c_str()), std::to_string(kRounds));
    }
    EXPECT_EQ(ReadText(kFile).rfind("# shared by four writers\n", 0), 0u);
    EXPECT_EQ(DirEntries(kDir), (Strings{"test.conf"}));
}

}  // namespace
