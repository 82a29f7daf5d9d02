// Directory listings and file records over the sandbox's real file systems: what is never
// listed, what the flags fill, the page against the steps taken one by one, the errors with
// their log lines, real non-root readers (and a user's links that must not lead out of the
// share), and a network mount whose server is gone. Then the listing of "/".
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <stddef.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <syslog.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvoenum.h"
#include "norvo/norvomisc.h"
#include "norvo/norvosearch.h"
#include "quib_fs.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::LogLine;

const std::string kDir = "/volume1/public/dir";
const std::string kUserDir = "/public/dir";

struct Listed {
    int rc = -1;
    int err = -1;
    unsigned long total = 99;
    std::list<DIRENTRY_INFO> out;
    std::string Names() const {
        std::string names;
        for (const DIRENTRY_INFO &e : out) names += (names.empty() ? "" : " ") + e.name;
        return names;
    }
    const DIRENTRY_INFO &Entry(const std::string &name) const {
        for (const DIRENTRY_INFO &e : out) if (e.name == name) return e;
        static const DIRENTRY_INFO none;
        ADD_FAILURE() << "no entry " << name;
        return none;
    }
};

Listed List(const char *userPath, const char *realPath, const char *key = "name", int info = 0, bool ascending = true,
            unsigned long offset = 0, unsigned long limit = 0, std::vector<FileSearch::FindComp *> conditions = {}) {
    Listed r;
    NvoEnum enumeration;
    r.rc = enumeration.NvoLibDirEntryListEnum(userPath, realPath, key, info, offset, limit, ascending,
                                              DIR_ENTRY_TYPE_ALL, conditions, r.out, &r.total);
    r.err = NvoLibGetErr();
    return r;
}

Listed ListIn(const std::string &relative, const char *key = "name", int info = 0) {
    return List((kUserDir + relative).c_str(), (kDir + relative).c_str(), key, info);
}

LogLine Err(const std::string &text) {
    return {LOG_ERR, text};
}

class Listing : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic()
            .WriteFile(kDir + "/a.txt", "hello", "alice", 0640)
            .WriteFile(kDir + "/B.TXT", "hi")
            .WriteFile(kDir + "/b.txt", "ho")
            .MakeDir(kDir + "/sub");
    }
    Appliance app_;
};

TEST_F(Listing, HiddenNamesLinksSocketsAndPipesAreNeverListed) {
    app_.MakeDir(kDir + "/@eaDir").WriteFile(kDir + "/.DS_Store").MakeDir(kDir + "/@tmp");
    ASSERT_EQ(symlink("a.txt", (kDir + "/link").c_str()), 0);
    ASSERT_EQ(symlink("sub", (kDir + "/dirlink").c_str()), 0);
    ASSERT_EQ(mkfifo((kDir + "/pipe").c_str(), 0644), 0);  // a socket takes the same way
    for (int info : {0, 0x7F}) {  // the reader's type byte alone, then the stat as well
        const Listed r = ListIn("", "name", info);
        EXPECT_EQ(std::pair(r.rc, r.out.size()), std::pair(1, size_t{4})) << info;
        EXPECT_EQ(r.Names().substr(0, 10), "sub a.txt ") << info;
    }
    const Listed empty = ListIn("/sub");
    EXPECT_EQ(std::tuple(empty.rc, empty.total, empty.out.size()), std::tuple(1, 0ul, size_t{0}));

    const struct {
        const char *name;
        unsigned char dtype;
        int info;
        _tag_dir_entry_type_ type;
        int want;
    } table[] = {
        {"link", DT_UNKNOWN, 0, DIR_ENTRY_TYPE_ALL, 1},   {"link", DT_LNK, 0, DIR_ENTRY_TYPE_ALL, 1},
        {"dirlink", DT_UNKNOWN, 0, DIR_ENTRY_TYPE_DIR, 1}, {"pipe", DT_UNKNOWN, 0x7F, DIR_ENTRY_TYPE_ALL, 1},
        {"pipe", DT_FIFO, 0, DIR_ENTRY_TYPE_ALL, 1},      {"a.txt", DT_UNKNOWN, 0, DIR_ENTRY_TYPE_ALL, 0},
        {"a.txt", DT_REG, 0, DIR_ENTRY_TYPE_FILE, 0},     {"a.txt", DT_REG, 0, DIR_ENTRY_TYPE_DIR, 1},
        {"a.txt", DT_UNKNOWN, 0, DIR_ENTRY_TYPE_DIR, 1},  {"sub", DT_DIR, 0, DIR_ENTRY_TYPE_FILE, 1},
        {"sub", DT_UNKNOWN, 0, DIR_ENTRY_TYPE_FILE, 1},   {"sub", DT_UNKNOWN, 0, DIR_ENTRY_TYPE_DIR, 0},
        {"sub", DT_DIR, 0, static_cast<_tag_dir_entry_type_>(7), 0},
        // Vanished between the read and the stat: skipped silently. Without a stat it can't show.
        {"gone", DT_REG, NVO_INFO_SIZE, DIR_ENTRY_TYPE_ALL, 1}, {"gone", DT_UNKNOWN, 0, DIR_ENTRY_TYPE_ALL, 1},
        {"gone", DT_REG, NVO_INFO_REAL_PATH, DIR_ENTRY_TYPE_ALL, 0},
    };
    NvoEnum enumeration;
    NvoLibSetErr(NVO_ERR_NONE);
    for (const auto &row : table) {
        DIRENTRY_INFO entry;
        const int got = enumeration.FillFileInfo((kUserDir + "/" + row.name).c_str(),
                                                 (kDir + "/" + row.name).c_str(), row.name, row.type, row.dtype,
                                                 row.info, entry);
        EXPECT_EQ(got, row.want) << row.name << " " << int(row.dtype) << " " << row.type;
    }
    EXPECT_EQ(NvoLibGetErr(), NVO_ERR_NONE);
    EXPECT_TRUE(app_.ErrorLines().empty());
}

TEST_F(Listing, FillsWhatTheFlagsAsk) {
    app_.WriteFile(kDir + "/Mixed.TxT", "12345", "alice:staff", 0754);
    const std::string real = kDir + "/Mixed.TxT";
    NvoEnum enumeration;
    DIRENTRY_INFO e;
    ASSERT_EQ(enumeration.FillFileInfo("/public/dir/Mixed.TxT", real.c_str(), "Mixed.TxT", DIR_ENTRY_TYPE_ALL,
                                       DT_REG, 0x7F, e), 0);
    struct stat st {};
    ASSERT_EQ(lstat(real.c_str(), &st), 0);
    EXPECT_EQ(std::tuple(e.name, e.path, e.real_path, e.type, e.size, e.mode, e.isdir, e.mount_point_type),
              std::tuple("Mixed.TxT", "/public/dir/Mixed.TxT", real, "txt", 5u, 0100754u, false, ""));
    EXPECT_EQ(std::tuple(e.acl_privilege, e.is_acl_mode),
              std::tuple(GetACLPrivilege(real.c_str()), QUIBACLIsSupport(real.c_str(), -1, 2) != 0));
    EXPECT_EQ(std::tuple(e.mtime, e.atime, e.ctime), std::tuple(st.st_mtime, st.st_atime, st.st_ctime));
    EXPECT_EQ(std::tuple(e.uid, e.user, e.gid, e.group),
              std::tuple(app_.Uid("alice"), "alice", app_.Gid("staff"), "staff"));
    DIRENTRY_INFO bare;  // only what the reader told: no stat, no real path
    ASSERT_EQ(enumeration.FillFileInfo("/public/dir/sub", (kDir + "/sub").c_str(), "sub", DIR_ENTRY_TYPE_ALL, DT_DIR,
                                       0, bare), 0);
    EXPECT_EQ(std::tuple(bare.isdir, bare.real_path, bare.user, bare.share_privilege), std::tuple(true, "", "", 4));
    DIRENTRY_INFO folder;
    ASSERT_EQ(enumeration.FillFileInfo("/public/dir/sub", (kDir + "/sub").c_str(), "sub", DIR_ENTRY_TYPE_ALL,
                                       DT_UNKNOWN, NVO_INFO_TYPE | NVO_INFO_MOUNT_POINT_TYPE, folder), 0);
    EXPECT_EQ(std::tuple(folder.isdir, folder.type, folder.mount_point_type), std::tuple(true, "", ""));
    EXPECT_TRUE(app_.ErrorLines().empty());
}

TEST_F(Listing, BadArgumentsAndPathsGetTheirErrors) {
    const std::string longName(4087, 'a');
    const std::string longPath = "/volume1/public/" + longName;
    const std::string longUser = "/public/" + longName;
    const std::string file = kDir + "/a.txt";
    const struct {
        const char *userPath;
        const char *realPath;
        bool noTotal;
        int err;
        std::vector<LogLine> logs;
    } table[] = {
        {nullptr, kDir.c_str(), false, NVO_ERR_GENERAL, {}},
        {"", kDir.c_str(), false, NVO_ERR_GENERAL, {}},
        {"/public/dir", nullptr, false, NVO_ERR_GENERAL, {}},
        {"/public/dir", "", false, NVO_ERR_GENERAL, {}},
        {"/public/dir", kDir.c_str(), true, NVO_ERR_GENERAL, {}},
        {"/", "/volume1", false, NVO_ERR_PRIVILEGE, {}},
        {"/public/none", "/volume1/public/none", false, NVO_ERR_NO_PATH, {}},
        {"/public/\xff\xfe", "/volume1/public/\xff\xfe", false, NVO_ERR_NO_PATH, {}},
        {"/public/dir/a.txt", file.c_str(), false, NVO_ERR_ACCESS,
         {Err("norvoenum.cpp:152 Failed to access " + file + ", errno=Not a directory")}},
        {longUser.c_str(), longPath.c_str(), false, NVO_ERR_ACCESS,
         {Err("norvoenum.cpp:152 Failed to access " + longPath + ", errno=File name too long")}},
        // Not a resolved user path: a real path that is not the user path's, dot components.
        {"/public/x", longPath.c_str(), false, NVO_ERR_GENERAL, {}},
        {"/public/dir", "/volume1/photo", false, NVO_ERR_GENERAL, {}},
        {"public/dir", kDir.c_str(), false, NVO_ERR_GENERAL, {}},
        {"/public/../photo", "/volume1/public/../photo", false, NVO_ERR_GENERAL, {}},
        {"/public/dir/.", "/volume1/public/dir/.", false, NVO_ERR_GENERAL, {}},
    };
    for (const auto &row : table) {
        app_.ClearLogs();
        NvoLibSetErr(NVO_ERR_IO);
        NvoEnum enumeration;
        std::list<DIRENTRY_INFO> out;
        unsigned long total = 99;
        EXPECT_EQ(enumeration.NvoLibDirEntryListEnum(row.userPath, row.realPath, "name", 0x7F, 0, 0, true,
                                                     DIR_ENTRY_TYPE_ALL, {}, out, row.noTotal ? nullptr : &total),
                  0);
        EXPECT_EQ(NvoLibGetErr(), row.err) << (row.realPath ? row.realPath : "null");
        // The argument checks come before the total is reset.
        const bool argumentStage = row.err == NVO_ERR_GENERAL || (row.userPath && std::string(row.userPath) == "/");
        EXPECT_EQ(total, argumentStage ? 99u : 0u);
        EXPECT_TRUE(out.empty());
        EXPECT_EQ(app_.Logs(), row.logs);
    }

    // A stat that fails otherwise: 401 and the line 306.
    app_.ClearLogs();
    const std::string notDir = file + "/x";
    NvoEnum enumeration;
    DIRENTRY_INFO e;
    EXPECT_EQ(enumeration.FillFileInfo("/public/dir/a.txt/x", notDir.c_str(), "x", DIR_ENTRY_TYPE_ALL, DT_REG,
                                       NVO_INFO_SIZE, e), -1);
    EXPECT_EQ(NvoLibGetErr(), NVO_ERR_SYSTEM);
    EXPECT_EQ(enumeration.FillFileInfo(nullptr, "/", "x", DIR_ENTRY_TYPE_ALL, DT_REG, 0, e), -1);
    EXPECT_EQ(NvoLibGetErr(), NVO_ERR_GENERAL);
    EXPECT_EQ(enumeration.FillFileInfo("/p", nullptr, "x", DIR_ENTRY_TYPE_ALL, DT_REG, 0, e), -1);
    EXPECT_EQ(enumeration.FillFileInfo("/p", "/", nullptr, DIR_ENTRY_TYPE_ALL, DT_REG, 0, e), -1);
    EXPECT_EQ(app_.Logs(), std::vector<LogLine>{Err("norvoenum.cpp:306 Failed to stat " + notDir + ". Not a directory")});
}

TEST_F(Listing, AFailurePartWayKeepsTheRecordsSoFar) {
    // A folder whose path leaves no room for a long name: that entry's stat fails.
    std::string deep = "/volume1/public";
    for (int i = 0; i < 19; ++i) {
        deep += "/" + std::string(200, 'd');
    }
    deep += "/" + std::string(100, 'e');
    app_.MakeDir(deep).WriteFile(deep + "/ok");
    const std::string longName(255, 'n');
    ASSERT_EQ(chdir(deep.c_str()), 0);
    close(open(longName.c_str(), O_CREAT | O_WRONLY, 0644));
    const Listed r = List(("/public" + deep.substr(15)).c_str(), deep.c_str(), "name", NVO_INFO_SIZE);
    EXPECT_EQ(std::tuple(r.rc, r.err, r.total), std::tuple(0, int{NVO_ERR_SYSTEM}, 0ul));
    EXPECT_LE(r.out.size(), 1u);  // "ok", if the reader gave it first
    for (const DIRENTRY_INFO &e : r.out) {  // the records so far carry their paths
        EXPECT_EQ(e.path, "/public" + deep.substr(15) + "/" + e.name);
    }
    EXPECT_EQ(app_.Logs(), std::vector<LogLine>{Err("norvoenum.cpp:306 Failed to stat " + deep + "/" + longName +
                                                    ". File name too long")});
}

// Every field of a record, in one line.
std::string AllFields(const DIRENTRY_INFO &e) {
    std::string out;
    for (const std::string *text : {&e.name, &e.path, &e.real_path, &e.type, &e.user, &e.group, &e.mount_point_type,
                                    &e.extra}) {
        out += "[" + *text + "]";
    }
    for (const long long number : {static_cast<long long>(e.size), static_cast<long long>(e.mode),
                                   static_cast<long long>(e.acl_privilege), static_cast<long long>(e.mtime),
                                   static_cast<long long>(e.ctime), static_cast<long long>(e.crtime),
                                   static_cast<long long>(e.atime), static_cast<long long>(e.uid),
                                   static_cast<long long>(e.gid), static_cast<long long>(e.share_privilege),
                                   static_cast<long long>(e.ftp_privilege), static_cast<long long>(e.freespace),
                                   static_cast<long long>(e.totalspace)}) {
        out += " " + std::to_string(number);
    }
    for (const bool flag : {e.is_acl_mode, e.isdir, e.acl_enabled, e.synced_share, e.readonly}) {
        out += flag ? " y" : " n";
    }
    return out;
}

// The listing's page, record for record, equals what its steps give when taken one by one:
// FillFileInfo for each entry the reader returns, appended to what the list held, EntryListSort,
// the reversal, the slice. Records the caller's list held take part and otherwise stay as they
// were.
TEST_F(Listing, ThePageEqualsTheRecordsFilledOneByOne) {
    app_.AddUser("carol");
    const char *owners[] = {"root", "alice", "bob", "carol", "admin"};
    const char *names[] = {"Zeta.JPG",    "alpha.txt", "Alpha.TXT", "\xc3\xa9t\xc3\xa9.pdf", "\xc3\x89T\xc3\x89.PDF",
                           "bad\xff.bin", "Stra\xc3\x9f\x65.doc",  "STRASSE.doc", "noext", ".dotfile",
                           "IMG_0001.JPG", "img_0001.jpg"};
    for (size_t i = 0; i < sizeof names / sizeof *names; ++i) {
        app_.WriteFile(kDir + "/" + names[i], std::string(i % 4, 'x'), owners[i % 5], i % 2 ? 0640 : 0604);
        if (i % 3 == 0) {
            app_.MakeDir(kDir + "/dir " + names[i], owners[(i + 1) % 5], 0750);
        }
    }
    DIRENTRY_INFO earlier;
    earlier.name = "Alpha.txt";
    earlier.path = "/kept/as/is";
    earlier.real_path = "kept";
    earlier.size = 2;
    earlier.extra = "earlier";
    NvoEnum enumeration;
    const char *keys[] = {"name", "size", "user", "group", "type", "mtime", "atime", "ctime", "posix", nullptr};
    const struct {
        unsigned long offset, limit;
    } pages[] = {{0, 0}, {0, 5}, {3, 4}, {0xFFFFFFFEul, 3}, {100, 3}};
    for (const int info : {0, 0x7F}) {
        for (const char *key : keys) {
            // The reference: every step by hand.
            int widened = info;
            if (key != nullptr && std::string(key) != "name") {
                const std::string k = key;
                widened |= k == "size" ? NVO_INFO_SIZE : k == "type" ? NVO_INFO_TYPE : k == "posix" ? NVO_INFO_PERM
                           : k == "user" || k == "group" ? NVO_INFO_OWNER : NVO_INFO_TIME;
            }
            std::list<DIRENTRY_INFO> filled;
            DIR *dir = opendir(kDir.c_str());
            ASSERT_NE(dir, nullptr);
            while (const dirent *found = readdir(dir)) {
                if (QUIBEAIsHiddenFile(found->d_name) == 1) continue;
                DIRENTRY_INFO e;
                const std::string name = found->d_name;
                if (enumeration.FillFileInfo((kUserDir + "/" + name).c_str(), (kDir + "/" + name).c_str(),
                                             name.c_str(), DIR_ENTRY_TYPE_ALL, found->d_type, widened, e) == 0) {
                    filled.push_back(e);
                }
            }
            closedir(dir);
            for (const bool prefilled : {false, true}) {
                std::list<DIRENTRY_INFO> all = filled;
                if (prefilled) all.push_front(earlier);
                if (key != nullptr) enumeration.EntryListSort(all, key);
                for (const bool ascending : {true, false}) {
                    std::list<DIRENTRY_INFO> ordered = all;
                    if (!ascending) ordered.reverse();
                    for (const auto &page : pages) {
                        std::list<DIRENTRY_INFO> want = ordered;
                        if (page.limit != 0) enumeration.NvoLibDirEntrySlice(want, page.offset, page.limit);
                        Listed got;
                        if (prefilled) got.out.push_back(earlier);
                        got.rc = enumeration.NvoLibDirEntryListEnum(kUserDir.c_str(), kDir.c_str(), key, info,
                                                                    page.offset, page.limit, ascending,
                                                                    DIR_ENTRY_TYPE_ALL, {}, got.out, &got.total);
                        ASSERT_EQ(got.rc, 1);
                        EXPECT_EQ(got.total, all.size());
                        ASSERT_EQ(got.out.size(), want.size());
                        auto w = want.begin();
                        for (const DIRENTRY_INFO &g : got.out) {
                            EXPECT_EQ(AllFields(g), AllFields(*w++))
                                << "key " << (key ? key : "null") << " info " << info << " ascending " << ascending
                                << " page " << page.offset << "+" << page.limit << " prefilled " << prefilled;
                        }
                    }
                }
            }
        }
    }
}

// Outcomes travel from the child as small numbers: the library error less 400 on failure,
// 50 for an empty success, 51 for a success with records.
int Outcome(const Listed &r) {
    return r.rc == 1 ? (r.out.empty() ? 50 : 51) + (r.err != 0 ? 10 : 0) : r.err - 400;
}

// From here on this process answers ENOSYS for openat2, as a kernel without it would.
bool WithoutOpenat2() {
    sock_filter filter[] = {
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_openat2, 0, 1),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | ENOSYS),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
    };
    sock_fprog program = {sizeof filter / sizeof *filter, filter};
    return prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 && prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

// Real readers: folder modes are theirs, and carol's links inside public, made as users make
// them over the file-sharing protocols (to another share, alice's home, /etc, a folder of public
// itself), are followed by nothing, with openat2 or without; a user path that climbs with ".."
// is not even tried.
TEST_F(Listing, RealReadersAndCarolsLinksThatNeverLeadOutOfTheShare) {
    app_.AddUser("carol").MakeDir("/volume1/homes/alice", "alice", 0755).WriteFile("/volume1/photo/x.jpg");
    app_.MakeDir(kDir + "/closed", "root", 0700).WriteFile(kDir + "/closed/x")
        .MakeDir(kDir + "/blind", "root", 0311).WriteFile(kDir + "/blind/x");
    app_.AddVolume(kDir + "/usb").WriteFile(kDir + "/usb/y").MakeDir("/volume1/public/carols", "carol");
    for (const auto &made : {std::pair{"photo", "/volume1/photo"}, {"alicehome", "/volume1/homes/alice"},
                             {"etc", "/etc"}, {"inside", "dir"}, {"carols/up", ".."}}) {
        const std::string link = "/volume1/public/" + std::string(made.first);
        ASSERT_EQ(app_.RunAs("carol", [&] { return symlink(made.second, link.c_str()); }), 0) << link;
    }
    const struct {
        const char *userPath;
        int outcome;
    } table[] = {
        {"/public/photo", 7},  {"/public/photo/", 7}, {"/public/alicehome", 7}, {"/public/etc", 7},
        {"/public/inside", 7}, {"/public/carols/up", 7}, {"/public/carols/up/photo", 7},
        {"/public/../photo", 0}, {"/public/dir/../../photo", 0},  // 400
        {"/public/dir", 51},   {"/public", 51}, {"/public/dir/closed", 7}, {"/public/dir/none", 8},
        {"/public/dir/blind", 50},  // entered but not read: empty, and a success
        {"/public/dir/usb", 51},    // a mount below the share is no way out
    };
    for (const bool openat2 : {true, false}) {
        for (const auto &row : table) {
            const std::string real = "/volume1" + std::string(row.userPath);
            EXPECT_EQ(app_.RunAs("carol", [&] {
                          return openat2 || WithoutOpenat2() ? Outcome(List(row.userPath, real.c_str())) : 99;
                      }),
                      row.outcome)
                << row.userPath << (openat2 ? "" : " without openat2");
        }
    }
    EXPECT_EQ(List("/public", "/volume1/public").Names(), "carols dir");  // links are never listed
    EXPECT_TRUE(app_.ErrorLines().empty());
    const std::string hidden = kDir + "/closed/x";
    EXPECT_EQ(app_.RunAs("carol", [&hidden] {
                  NvoEnum enumeration;
                  DIRENTRY_INFO e;
                  return enumeration.FillFileInfo("/public/dir/closed/x", hidden.c_str(), "x", DIR_ENTRY_TYPE_ALL,
                                                  DT_UNKNOWN, 0, e) == -1 ? NvoLibGetErr() - 400 : 99;
              }),
              7);
    EXPECT_EQ(app_.ErrorLines(),
              std::vector<std::string>{"norvoenum.cpp:# Failed to stat " + hidden + ". Permission denied"});
}

TEST_F(Listing, ADeadRemoteMountIsListedButCannotBeEntered) {
    app_.MountDeadRemote(kDir + "/remote");
    const Listed r = ListIn("", "name", NVO_INFO_MOUNT_POINT_TYPE | NVO_INFO_SIZE);
    ASSERT_EQ(r.rc, 1);
    EXPECT_EQ(r.Names().substr(0, 11), "remote sub ");
    EXPECT_TRUE(r.out.front().isdir);
    EXPECT_EQ(r.out.front().mount_point_type, "remotefail");
    EXPECT_EQ(std::next(r.out.begin())->mount_point_type, "");
    EXPECT_EQ(ListIn("/remote").err, NVO_ERR_REMOTE_FS);
    EXPECT_EQ(ListIn("/remote/deeper").err, NVO_ERR_REMOTE_FS);
    EXPECT_TRUE(app_.ErrorLines().empty());
}

// Conditions decide on the bare name; the stat record they are given is not filled.
class NameSpy : public FileSearch::FindComp {
public:
    bool operator()(const char *path, const _tag_QUIBSTAT_ &st) override {
        const _tag_QUIBSTAT_ zero{};
        unfilled = unfilled && memcmp(&st, &zero, sizeof st) == 0;
        names += std::string(path) + " ";
        return std::string(path) != "a.txt";
    }
    std::string names;
    bool unfilled = true;
};

TEST_F(Listing, ConditionsSeeTheBareNameOnly) {
    NameSpy spy;
    FileSearch::FindNameComp notA("*b*");  // "sub", "B.TXT", "b.txt"
    const Listed r = List(kUserDir.c_str(), kDir.c_str(), "size", 0x7F, true, 0, 0, {&spy, nullptr, &notA});
    EXPECT_EQ(std::tuple(r.rc, r.out.size(), r.Names().substr(0, 4)), std::tuple(1, size_t{3}, "sub "));
    EXPECT_TRUE(spy.unfilled);
    EXPECT_EQ(std::pair(spy.names.find('/'), spy.names.find("sub ") != std::string::npos),
              std::pair(std::string::npos, true));
}

// The listing of "/": the home folder and the shares a user may see, with share privileges and
// volume figures, for local, domain and directory accounts, ordered and paged; the failures
// with their log lines.
struct Query {
    const char *user;
    const char *key = nullptr;
    int info = 0;
    bool ascending = true;
    unsigned long offset = 0, limit = 0;
};

Listed ListShares(const Query &q) {
    Listed r;
    NvoLibSetErr(0);
    NvoEnum enumeration;
    r.rc = enumeration.NvoLibShareEntryListEnum(q.user, "ctx", false, q.key, q.info, q.offset, q.limit, q.ascending,
                                                r.out, &r.total);
    r.err = NvoLibGetErr();
    return r;
}

class ShareListing : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().MakeDir("/volume1/homes/alice", "alice", 0700);
        app_.AddUser(norvo::testing::UserSpec{.name = "carol", .home = "/srv/carol"});  // her home lies outside the homes root
        app_.AddUser("CORP\\dave").AddUser("erin@corp.example").AddUser("CORP\\x@y");
        app_.MakeDir("/volume1/homes/erin@corp.example").MakeDir("/volume1/homes/admin");
        app_.AddShare({.name = "archive", .volume = "/volume2", .readOnly = "alice,CORP\\dave,erin@corp.example,CORP\\x@y"});
        app_.AddShare({.name = "zeta", .readWrite = "alice", .hidden = true});
    }
    Appliance app_;
};

TEST_F(ShareListing, EachAccountSeesItsHomeAndItsShares) {
    app_.SetDomain("CORP").SetHomeService(true, "/volume1/homes", false, true);  // no homes for domain accounts
    const struct { const char *user; std::string names; } rows[] = {
        {"alice", "home public photo secret archive"},  // the hidden share is left out
        {"bob", "home public photo"},  // his home is not made yet: it is listed all the same, and stays unmade
        {"carol", "public"},  // no home folder, shares only
        {"admin", "home public"},  // administrators see what the lists give them
        {"CORP\\dave", "public archive"},
        {"CORP\\x@y", "public archive"},  // a domain account although it holds an "@"
    };
    for (const auto &row : rows) {
        const Listed got = ListShares({row.user});
        EXPECT_EQ(got.Names(), row.names) << row.user;
        EXPECT_EQ(got.rc, row.names.empty() ? 0 : 1) << row.user;
        EXPECT_EQ(got.total, row.names.empty() ? 99u : got.out.size()) << row.user;
    }
    // No directory service is configured: its account gets no share list.
    const Listed erin = ListShares({"erin@corp.example"});
    EXPECT_EQ(std::pair(erin.rc, erin.err), std::pair(0, int(NVO_ERR_SYSTEM)));
    app_.SetDirectory("ldap.corp.example");
    EXPECT_EQ(ListShares({"erin@corp.example"}).Names(), "home public archive");
    // A new user's first listing, as the user: the home entry is a folder with the volume's
    // figures, and opening it makes it.
    const int info = NVO_INFO_PERM | NVO_INFO_VOLUME_STATUS | NVO_INFO_SIZE;
    app_.ClearLogs();
    EXPECT_EQ(app_.RunAs("bob", [&] {
                  const Listed got = ListShares({"bob", "name", info});
                  const DIRENTRY_INFO &home = got.Entry("home");
                  return got.rc == 1 && home.isdir && home.share_privilege == 2 && home.totalspace > 0 ? 1 : 0;
              }),
              1);
    EXPECT_NE(access("/volume1/homes/bob", F_OK), 0);
    EXPECT_TRUE(app_.ErrorLines().empty());
}

TEST_F(ShareListing, FailuresAndTheirLogLines) {
    app_.SetSetting("domain_joined", "no").WriteFile("/volume1/homes/f");
    app_.AddUser(norvo::testing::UserSpec{.name = "frank", .home = "/volume1/homes/f/frank"});  // not a folder
    const struct { const char *user; int err; std::vector<std::string> lines; } rows[] = {
        {nullptr, NVO_ERR_NO_USER, {"norvoenum.cpp:402 Failed to get user ((null))"}},
        {"CORP\\dave", NVO_ERR_SYSTEM, {"norvoenum.cpp:407 Failed to enum valid shares"}},
        {"frank", NVO_ERR_SYSTEM, {"norvoenum.cpp:415 Failed to get real path (/volume1/homes/f/frank)"}},
    };
    for (const auto &row : rows) {
        app_.ClearLogs();
        const Listed got = ListShares({row.user});
        EXPECT_EQ(std::pair(got.rc, got.err), std::pair(0, row.err)) << (row.user ? row.user : "null");
        std::vector<std::string> enumLines;
        for (const LogLine &line : app_.Logs()) {
            EXPECT_EQ(line.priority, LOG_ERR) << line.text;
            if (line.text.rfind("norvoenum.cpp", 0) == 0) enumLines.push_back(line.text);
        }
        EXPECT_EQ(enumLines, row.lines);
    }
}

TEST_F(ShareListing, ShareFieldsAndVolumeFigures) {
    app_.AddShare({.name = "remote", .readWrite = "alice"}).MountDeadRemote("/volume1/remote");
    app_.RemountReadOnly("/volume2");
    struct statfs64 v1, v2;
    ASSERT_EQ(statfs64("/volume1", &v1), 0);
    ASSERT_EQ(statfs64("/volume2", &v2), 0);
    const int info = NVO_INFO_PERM | NVO_INFO_VOLUME_STATUS | NVO_INFO_MOUNT_POINT_TYPE;
    const Listed got = ListShares({"alice", nullptr, info});
    ASSERT_EQ(got.rc, 1);
    EXPECT_EQ(got.Names(), "home public photo secret archive remote");
    const struct { const char *name; int priv; bool acl; const struct statfs64 *volume; bool readonly; std::string type; } rows[] = {
        {"home", 2, false, &v1, false, ""}, {"photo", 2, true, &v1, false, ""},
        {"archive", 1, true, &v2, true, ""}, {"remote", 2, true, nullptr, false, "remotefail"},
    };
    for (const auto &row : rows) {
        const DIRENTRY_INFO &e = got.Entry(row.name);
        const uint64_t bsize = row.volume ? row.volume->f_bsize : 0;
        EXPECT_EQ(std::tuple(e.isdir, e.share_privilege, e.acl_enabled, e.ftp_privilege, e.mount_point_type, e.readonly,
                             e.freespace, e.totalspace),
                  std::tuple(true, row.priv, row.acl, 0, row.type, row.readonly,
                             row.volume ? row.volume->f_bavail * bsize : 0, row.volume ? row.volume->f_blocks * bsize : 0))
            << row.name;
    }
    EXPECT_EQ(std::tuple(got.Entry("home").real_path, got.Entry("home").path, got.Entry("photo").path),
              std::tuple("", "/home", "/photo"));  // the real path was not asked for
    // Without the flags nothing share-level is filled.
    const Listed bare = ListShares({"alice"});
    const DIRENTRY_INFO &plain = bare.Entry("archive");
    EXPECT_EQ(std::tuple(plain.share_privilege, plain.totalspace, plain.readonly), std::tuple(4, uint64_t{0}, false));
}

TEST_F(ShareListing, SyncedSharesNeedTheFlagAndTheCapability) {
    app_.WriteFile("/usr/quib/etc/shares.conf", "[photo]\n\tpath = /volume1/photo\n\twrite list = alice\n\tsynced = yes\n"
                                                "[public]\n\tpath = /volume1/public\n\twrite list = @users\n");
    auto synced = [&](int info) {
        std::string out;
        for (const DIRENTRY_INFO &e : ListShares({"alice", nullptr, info}).out) out += e.synced_share ? "1" : "0";
        return out;
    };
    EXPECT_EQ(synced(NVO_INFO_SYNC_SHARE), "000");  // home, photo, public: no capability
    app_.SetDefaultSetting("support_s2s", "yes");
    EXPECT_EQ(synced(NVO_INFO_SYNC_SHARE), "010");
    EXPECT_EQ(synced(NVO_INFO_PERM), "000");
}

TEST_F(ShareListing, OrderAndPagesAsADirectoryListing) {
    const struct { Query q; std::string names; unsigned long total; } rows[] = {
        {{"alice", "name"}, "archive home photo public secret", 5},  // home among the folders by name
        {{"alice", "name", 0, false}, "secret public photo home archive", 5},
        {{"alice", nullptr, 0, false}, "archive secret photo public home", 5},  // reversed list order
        {{"alice", "name", 0, true, 1, 2}, "home photo", 5},
        {{"alice", "name", 0, true, 3, 0}, "archive home photo public secret", 5},  // limit 0: all, offset ignored
        {{"carol", "size", 0, true, 0, 1}, "public", 1},
    };
    for (const auto &row : rows) {
        const Listed got = ListShares(row.q);
        EXPECT_EQ(got.Names(), row.names) << row.q.user << " " << (row.q.key ? row.q.key : "null");
        EXPECT_EQ(got.total, row.total);
    }
    // Sorting by size fills the size, as in a directory listing.
    EXPECT_NE(ListShares({"alice", "size"}).Entry("home").size, 0u);
}

}  // namespace
