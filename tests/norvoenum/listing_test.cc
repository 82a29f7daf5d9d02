// Directory listings and file records over the sandbox's real file systems: what is never
// listed, what the flags fill, the page against the steps taken one by one, the errors with
// their log lines, real non-root readers (and a user's links that must not lead out of the
// share), descriptors running out, and a network mount whose server is gone.
#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <stddef.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <filesystem>
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
        for (const DIRENTRY_INFO &e : out) {
            names += (names.empty() ? "" : " ") + e.name;
        }
        return names;
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

Listed ListIn(const std::string &relative, const char *key = "name", int info = 0, bool ascending = true,
            unsigned long offset = 0, unsigned long limit = 0) {
    return List((kUserDir + relative).c_str(), (kDir + relative).c_str(), key, info, ascending, offset, limit);
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
    // Names in the directory reader's own order, hidden ones left out.
    std::vector<std::string> ReaderOrder() {
        std::vector<std::string> names;
        DIR *dir = opendir(kDir.c_str());
        while (const dirent *e = readdir(dir)) {
            if (QUIBEAIsHiddenFile(e->d_name) == 0) {
                names.push_back(e->d_name);
            }
        }
        closedir(dir);
        return names;
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

TEST_F(Listing, SortsReversesAndPages) {
    std::vector<std::string> reader = ReaderOrder();
    const auto at = [&reader](const char *name) { return std::find(reader.begin(), reader.end(), name); };
    // "B.TXT" and "b.txt" tie on size, type and name: they keep the reader's order.
    const std::string ties = at("B.TXT") < at("b.txt") ? "B.TXT b.txt" : "b.txt B.TXT";
    const std::string tiesReversed = at("B.TXT") < at("b.txt") ? "b.txt B.TXT" : "B.TXT b.txt";
    const Listed bySize = ListIn("", "size", 0);  // the key fills the size unasked
    EXPECT_EQ(bySize.Names(), "sub " + ties + " a.txt");
    EXPECT_EQ(bySize.out.back().size, 5u);
    EXPECT_EQ(ListIn("", "name", 0, false).Names(), tiesReversed + " a.txt sub");  // folders last
    std::string reversed;
    for (auto it = reader.rbegin(); it != reader.rend(); ++it) {
        reversed += (reversed.empty() ? "" : " ") + *it;
    }
    EXPECT_EQ(ListIn("", nullptr, 0, false).Names(), reversed);

    const std::vector<std::string> byType = {"sub", "a.txt", ties.substr(0, 5), ties.substr(6)};
    const struct {
        unsigned long offset, limit;
        size_t first, last;  // the page in byType
    } pages[] = {{5, 0, 0, 4}, {1, 1, 1, 2}, {3, 5, 3, 4}, {4, 1, 4, 4}};
    for (const auto &row : pages) {
        const Listed r = ListIn("", "type", 0, true, row.offset, row.limit);
        std::string want;
        for (size_t i = row.first; i < row.last; ++i) {
            want += (want.empty() ? "" : " ") + byType[i];
        }
        EXPECT_EQ(std::tuple(r.rc, r.total, r.Names()), std::tuple(1, 4ul, want)) << row.offset << "+" << row.limit;
    }
    const Listed empty = ListIn("/sub");
    EXPECT_EQ(std::tuple(empty.rc, empty.total, empty.out.size()), std::tuple(1, 0ul, size_t{0}));
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

TEST_F(Listing, AFailurePartWayKeepsTheRecordsSoFarAndClosesTheDirectory) {
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
    const auto openFds = [] { return std::distance(std::filesystem::directory_iterator("/proc/self/fd"), {}); };
    const auto list = [&deep] { return List(("/public" + deep.substr(15)).c_str(), deep.c_str(), "name", NVO_INFO_SIZE); };
    list();  // the first log line opens the log socket
    app_.ClearLogs();
    const auto fds = openFds();
    const Listed r = list();
    EXPECT_EQ(std::tuple(r.rc, r.err, r.total), std::tuple(0, int{NVO_ERR_SYSTEM}, 0ul));
    EXPECT_LE(r.out.size(), 1u);  // "ok", if the reader gave it first
    for (const DIRENTRY_INFO &e : r.out) {  // the records so far carry their paths
        EXPECT_EQ(e.path, "/public" + deep.substr(15) + "/" + e.name);
    }
    EXPECT_EQ(openFds(), fds);
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

// Descriptors run out at each step of a listing that takes one (N more allowed, N = 0, 1, ...):
// every failure says why and leaves nothing open, until the listing succeeds.
TEST_F(Listing, RunningOutOfDescriptorsLeaksNothing) {
    const int steps = app_.RunAs("alice", [] {
        syslog(LOG_INFO, "the log socket is open");
        const auto openFds = [] {
            std::vector<int> listed, open;
            for (const auto &fd : std::filesystem::directory_iterator("/proc/self/fd")) {
                listed.push_back(std::stoi(fd.path().filename().string()));
            }
            for (const int fd : listed) {
                if (fcntl(fd, F_GETFD) != -1) open.push_back(fd);  // not the iterator's own
            }
            std::sort(open.begin(), open.end());
            return open;
        };
        // No gaps below the highest descriptor: each new one then counts against the limit.
        for (int fd = 0; fd < openFds().back(); ++fd) {
            if (fcntl(fd, F_GETFD) == -1 && ::open("/dev/null", O_RDONLY) != fd) return -4;
        }
        const std::vector<int> before = openFds();
        rlimit saved{};
        getrlimit(RLIMIT_NOFILE, &saved);
        for (int n = 0; n < 30; ++n) {
            rlimit limit = saved;
            limit.rlim_cur = static_cast<rlim_t>(before.back() + 1 + n);
            setrlimit(RLIMIT_NOFILE, &limit);
            const Listed r = ListIn("", "size", 0x7F, true, 0, 2);
            setrlimit(RLIMIT_NOFILE, &saved);
            if (openFds() != before) return -1;
            if (r.rc == 1) return n;
            if (r.err != NVO_ERR_ACCESS && r.err != NVO_ERR_SYSTEM) return -2;
        }
        return -3;
    });
    EXPECT_GE(steps, 2);  // the directory and the pass's own descriptor at least
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

}  // namespace
