// The volume index: what a query of it returns equals what a result database filled by a walk
// of the same tree returns for the same chains; it keeps up (update, watch); and it is used
// only when it is whole, root's and within the caller's reach.
#include <dirent.h>
#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <functional>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "fileidx.h"
#include "platform_test_util.h"
#include "quib_stat.h"
#include "vlibc_err.h"
#include "vlibc_file.h"
#include "vlibc_unicode.h"

namespace {

using norvo::testing::Failed;

const char kVolume[] = "/volume1";
const std::string kOut = "/volume1/@tmp/out.db";  // outside the index

__tag_FI_SQL_COND Cond(__tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op, const std::string &value) {
    __tag_FI_SQL_COND c{};
    snprintf(c.value, sizeof c.value, "%s", value.c_str());
    c.type = type;
    c.op = op;
    return c;
}

std::string Text(const FI_FILE_INFO_DATA &r) {
    char numbers[256];
    snprintf(numbers, sizeof numbers, "|%d|%lld|%lld|%lld|%lld|%lld|%u|%u|%u", r.isDir, r.size, r.crtime, r.ctime,
             r.atime, r.mtime, r.mode, r.uid, r.gid);
    return std::string(r.share) + ":" + r.path + "|" + r.name + "|" + r.realPath + "|" + r.parentPath + "|" +
           r.type + "|" + r.posix + "|" + r.userName + "|" + r.groupName + numbers;
}

// Every row of a result database, as text, sorted.
std::vector<std::string> Rows(const std::string &db, __tag_FI_SQL_COND *where = nullptr) {
    std::vector<std::string> rows;
    FI_QUERY query{};
    query.where = where;
    const auto collect = [](FI_FILE_INFO_DATA *r, void *arg) {
        static_cast<std::vector<std::string> *>(arg)->push_back(Text(*r));
        return 1;
    };
    EXPECT_EQ(FILEIDXDBSelect(db.c_str(), &query, collect, &rows, nullptr, nullptr, 0), 0) << std::hex << VLIBCErrGet();
    std::sort(rows.begin(), rows.end());
    return rows;
}

// The slow reference: a plain walk of the share folders, each entry stored as the search
// walker stores it.
void Walk(const std::string &share, const std::string &root, const std::string &rest,
          std::vector<FI_FILE_INFO_DATA> *out) {
    const std::string dir = rest.empty() ? root : root + "/" + rest;
    DIR *d = opendir(dir.c_str());
    ASSERT_NE(d, nullptr) << dir;
    while (const dirent *e = readdir(d)) {
        const std::string name = e->d_name;
        if (name == "." || name == "..") {
            continue;
        }
        const std::string path = rest.empty() ? name : rest + "/" + name;
        QUIBSTAT st;
        ASSERT_EQ(VLIBCFileLStat((dir + "/" + name).c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st), 0);
        FI_FILE_INFO_DATA r{};
        const bool isDir = S_ISDIR(st.st_mode);
        snprintf(r.name, sizeof r.name, "%s", name.c_str());
        snprintf(r.realPath, sizeof r.realPath, "%s", root.c_str());
        snprintf(r.parentPath, sizeof r.parentPath, "%s", rest.c_str());
        snprintf(r.share, sizeof r.share, "%s", share.c_str());
        snprintf(r.path, sizeof r.path, "%s", path.c_str());
        const size_t dot = name.rfind('.');
        if (!isDir && dot != std::string::npos && dot != 0) {
            std::string ext = name.substr(dot + 1);
            for (char &c : ext) {
                c = static_cast<char>(c >= 'A' && c <= 'Z' ? c + 32 : c);
            }
            snprintf(r.type, sizeof r.type, "%s", ext.c_str());
        }
        r.isDir = isDir;
        r.size = isDir ? 0 : st.st_size;
        r.crtime = st.st_crtim.tv_sec;
        r.ctime = st.st_ctim.tv_sec;
        r.atime = st.st_atim.tv_sec;
        r.mtime = st.st_mtim.tv_sec;
        for (int i = 0; i < 9; ++i) {
            r.posix[i] = (st.st_mode & (0400u >> i)) ? "rwxrwxrwx"[i] : '-';
        }
        r.mode = st.st_mode;
        r.uid = st.st_uid;
        r.gid = st.st_gid;
        if (const passwd *pw = getpwuid(st.st_uid)) {
            snprintf(r.userName, sizeof r.userName, "%s", pw->pw_name);
        }
        if (const group *gr = getgrgid(st.st_gid)) {
            snprintf(r.groupName, sizeof r.groupName, "%s", gr->gr_name);
        }
        out->push_back(r);
        if (isDir) {
            Walk(share, root, path, out);
        }
    }
    closedir(d);
}

class VolumeIndex : public ::testing::Test {
protected:
    void SetUp() override {
        app.Basic();
        MakeTree();
    }

    // Two shares with the same sub-folder names, a folder outside every share, hidden names,
    // links, odd bytes, and a deep chain.
    void MakeTree() {
        std::mt19937 random(7);
        const std::vector<std::string> pieces{"report", "Report", "ab", "AB", "k", "\xe2\x84\xaa", "s", "S", "\xc5\xbf",
                                              "é", "É", "ß", "\xc1\xa1", "*", "?", "\\", "\n", "\xff", ".txt", ".PNG", " ", "%", "_"};
        auto name = [&] {
            std::string n;
            for (int i = 2 + static_cast<int>(random() % 4); i > 0; --i) {
                n += pieces[random() % pieces.size()];
            }
            return n;
        };
        for (const std::string share : {"public", "photo"}) {
            for (const std::string dir : {"2013", "2013/x", "@eaDir", ".hidden", "#recycle", "deep"}) {
                app.MakeDir("/volume1/" + share + "/" + dir, "root", 0755);
            }
            for (int i = 0; i < 40; ++i) {
                const std::string dirs[] = {"", "2013/", "2013/x/", "@eaDir/", ".hidden/"};
                const std::string path = "/volume1/" + share + "/" + dirs[i % 5] + name() + std::to_string(i);
                app.WriteFile(path, std::string(static_cast<size_t>(random() % 3000), 'x'), i % 3 ? "alice" : "bob",
                              i % 2 ? 0644 : 0600);
            }
        }
        std::string deep = "/volume1/public/deep";
        for (int i = 0; i < 40; ++i) {
            deep += "/d" + std::to_string(i);
            app.MakeDir(deep, "root", 0755);
        }
        app.WriteFile(deep + "/report.bottom");
        app.MakeDir("/volume1/loose", "root", 0755).WriteFile("/volume1/loose/report.outside");
        app.MakeDir("/volume1/@tmp", "root", 0777).WriteFile("/volume1/@tmp/report.tmp");
        symlink("/volume1/loose", "/volume1/public/2013/report-link");
        symlink("/nowhere", "/volume1/photo/dangling report");
        app.WriteFile("/volume1/photo/2013/x/MyReport.TXT", "12345", "alice", 0640);
    }

    // The reference rows of both chains.
    std::vector<std::string> Expected(__tag_FI_SQL_COND *conditions, __tag_FI_SQL_COND *folders) {
        const std::string db = "/volume1/@tmp/ref.db";
        unlink(db.c_str());
        EXPECT_EQ(FILEIDXDBCreate(db.c_str()), 0);
        std::vector<FI_FILE_INFO_DATA> all;
        Walk("public", "/volume1/public", "", &all);
        Walk("photo", "/volume1/photo", "", &all);
        EXPECT_EQ(FILEIDXDBInsert(db.c_str(), all.data(), static_cast<int>(all.size())), 0);
        // Both chains hold: the rows each selects, intersected.
        std::vector<std::string> rows = Rows(db, conditions);
        const std::vector<std::string> byFolder = Rows(db, folders);
        std::vector<std::string> both;
        std::set_intersection(rows.begin(), rows.end(), byFolder.begin(), byFolder.end(), std::back_inserter(both));
        rows = both;
        unlink(db.c_str());
        return rows;
    }

    std::vector<std::string> Indexed(__tag_FI_SQL_COND *conditions, __tag_FI_SQL_COND *folders,
                                     FILEIDX_ROW_FILTER filter = nullptr, void *arg = nullptr) {
        unlink(kOut.c_str());
        EXPECT_EQ(FILEIDXDBCreate(kOut.c_str()), 0);
        FI_TABLE_GEN_CONTEXT context{kOut.c_str(), arg, 0};
        EXPECT_EQ(FILEIDXResultGetAndTableGen(kVolume, conditions, folders, filter, &context), 0)
            << std::hex << VLIBCErrGet();
        std::vector<std::string> rows = Rows(kOut);
        unlink(kOut.c_str());
        return rows;
    }

    norvo::testing::Appliance app;
};

// Every condition kind, alone and joined as the search joins them, on both shares.
TEST_F(VolumeIndex, AnswersAsAWalkedResultDatabase) {
    ASSERT_EQ(FILEIDXIndexBuild(kVolume), 0) << std::hex << VLIBCErrGet();
    struct Case {
        std::vector<__tag_FI_SQL_COND> conditions;  // joined through andNext
        std::vector<__tag_FI_SQL_COND> folders;     // joined through orNext
    };
    const std::vector<Case> cases = {
        {{}, {}},
        {{Cond(FI_COND_NAME, FI_OP_LIKE, "*report*")}, {}},
        {{Cond(FI_COND_NAME, FI_OP_LIKE, "*REP*")}, {Cond(FI_COND_PATH, FI_OP_PATH_LIKE, "2013/*")}},
        {{Cond(FI_COND_NAME, FI_OP_LIKE, "*.txt")}, {Cond(FI_COND_PATH, FI_OP_PATH_LIKE, "2013/x/*"),
                                                       Cond(FI_COND_PATH, FI_OP_PATH_LIKE, "@eaDir/*")}},
        {{Cond(FI_COND_NAME, FI_OP_EQ, "MyReport.TXT")}, {}},
        {{Cond(FI_COND_TYPE, FI_OP_EQ, "png"), Cond(FI_COND_SIZE, FI_OP_GT, "1000")}, {}},
        {{Cond(FI_COND_IS_DIR, FI_OP_EQ, "1")}, {Cond(FI_COND_PATH, FI_OP_PATH_NOT_LIKE, "*/*")}},
        {{Cond(FI_COND_USER_NAME, FI_OP_EQ, "bob"), Cond(FI_COND_MODE, FI_OP_EQ, "33152")}, {}},
        {{Cond(FI_COND_SHARE, FI_OP_EQ, "photo"), Cond(FI_COND_NAME, FI_OP_LIKE, "*\\**")}, {}},
        {{Cond(FI_COND_MTIME, FI_OP_GE, "1"), Cond(FI_COND_NAME, FI_OP_LIKE, "??")}, {}},
        {{Cond(FI_COND_NAME, FI_OP_LIKE, "*deep*")}, {Cond(FI_COND_PATH, FI_OP_PATH_LIKE, "deep/*")}},
        {{Cond(FI_COND_NAME, FI_OP_LIKE, "*.bottom")}, {Cond(FI_COND_PATH, FI_OP_PATH_LIKE, "deep/*/d39/*")}},
    };
    for (size_t i = 0; i < cases.size(); ++i) {
        std::vector<__tag_FI_SQL_COND> c = cases[i].conditions, f = cases[i].folders;
        for (size_t j = 1; j < c.size(); ++j) {
            c[j - 1].andNext = &c[j];
        }
        for (size_t j = 1; j < f.size(); ++j) {
            f[j - 1].orNext = &f[j];
        }
        __tag_FI_SQL_COND *conditions = c.empty() ? nullptr : &c[0];
        __tag_FI_SQL_COND *folders = f.empty() ? nullptr : &f[0];
        const std::vector<std::string> expected = Expected(conditions, folders);
        EXPECT_EQ(Indexed(conditions, folders), expected) << "case " << i;
        EXPECT_TRUE(i != 1 || expected.size() > 10) << "the tree must hold what the cases ask for";
    }
}

// Names found through the trigram table are every name the matcher accepts: generated
// patterns (wildcards, SQLite's too, escapes, case, non-ASCII, fewer than three characters)
// against VLIBCUnicodeUTF8LikeMatch over every walked name.
TEST_F(VolumeIndex, GeneratedPatternsMissNoName) {
    // Every three-letter name over letters that fold alike in different ways.
    const std::vector<std::string> letters{"a", "B", "k", "\xe2\x84\xaa", "\xc5\xbf", "S", "\xc1\xa1", "é"};
    app.MakeDir("/volume1/public/abc");
    for (const std::string &x : letters) {
        for (const std::string &y : letters) {
            for (const std::string &z : letters) {
                app.WriteFile("/volume1/public/abc/" + x + y + z);
            }
        }
    }
    ASSERT_EQ(FILEIDXIndexBuild(kVolume), 0);
    std::vector<FI_FILE_INFO_DATA> all;
    Walk("public", "/volume1/public", "", &all);
    Walk("photo", "/volume1/photo", "", &all);
    std::mt19937 random(3);
    const std::vector<std::string> pieces{"ab", "aB", "b", "k", "K", "\xe2\x84\xaa", "s", "S", "\xc5\xbf", "é", "É", "ß",
                                          "\xc1\xa1", "a", "*", "?", "\\*", "\\?", "\\\\", "rep", "t", "\n", "%", "_"};
    int nonEmpty = 0;
    for (int round = 0; round < 200; ++round) {
        std::string pattern = random() % 2 ? "*" : "";
        for (int i = 1 + static_cast<int>(random() % 4); i > 0; --i) {
            pattern += round % 2 ? pieces[random() % pieces.size()] : letters[random() % letters.size()];
        }
        pattern += random() % 2 ? "*" : "";
        std::vector<std::string> expected;
        for (const FI_FILE_INFO_DATA &r : all) {
            if (VLIBCUnicodeUTF8LikeMatch(pattern.c_str(), r.name, '\\')) {
                expected.push_back(Text(r));
            }
        }
        std::sort(expected.begin(), expected.end());
        __tag_FI_SQL_COND name = Cond(FI_COND_NAME, FI_OP_LIKE, pattern);
        EXPECT_EQ(Indexed(&name, nullptr), expected) << pattern;
        nonEmpty += !expected.empty();
    }
    EXPECT_GT(nonEmpty, 30);
}

// The index as it is: entries and folders, and every row a query returns.
struct Snapshot {
    unsigned long long entries, folders;
    std::vector<std::string> rows;
    bool operator==(const Snapshot &) const = default;
};

// After creates, deletes, renames of files and folders and a folder's times alone, an update
// reads only what moved and leaves what a fresh build makes.
TEST_F(VolumeIndex, UpdateEqualsAFreshBuild) {
    const auto snapshot = [&] {
        FI_INDEX_STATUS status;
        EXPECT_EQ(FILEIDXIndexStatus(kVolume, &status), 0);
        EXPECT_EQ(status.state, FI_INDEX_READY);
        return Snapshot{status.entries, status.folders, Indexed(nullptr, nullptr)};
    };
    ASSERT_EQ(FILEIDXIndexBuild(kVolume), 0);
    unsigned long long read = 99;
    ASSERT_EQ(FILEIDXIndexUpdate(kVolume, &read), 0);
    EXPECT_EQ(read, 0u) << "nothing moved";
    app.WriteFile("/volume1/public/2013/new report.txt");
    ASSERT_EQ(unlink("/volume1/photo/2013/x/MyReport.TXT"), 0);
    ASSERT_EQ(rename("/volume1/public/2013/x", "/volume1/photo/2013/x2"), 0);  // a folder moves share
    ASSERT_EQ(rename("/volume1/photo/@eaDir", "/volume1/photo/@eaDir2"), 0);
    app.MakeDir("/volume1/public/fresh").MakeDir("/volume1/public/fresh/er").WriteFile("/volume1/public/fresh/er/f");
    const timespec times[2] = {{0, UTIME_OMIT}, {12345, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, "/volume1/public/.hidden", times, AT_SYMLINK_NOFOLLOW), 0);
    ASSERT_EQ(FILEIDXIndexUpdate(kVolume, &read), 0);
    // public, public/2013, public/.hidden, photo, photo/2013, photo/2013/x, and the four new
    // or moved folders; none that stayed as they were.
    EXPECT_EQ(read, 10u);
    const Snapshot updated = snapshot();
    ASSERT_EQ(FILEIDXIndexBuild(kVolume), 0);
    EXPECT_EQ(updated, snapshot());
}

bool Eventually(const std::function<bool()> &done) {
    for (int i = 0; i < 1000; ++i) {
        if (done()) {
            return true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return false;
}

// While watch runs, a file created is found, found under its new name once renamed, and gone
// from the index once deleted; so is a folder made with a file in it.
TEST_F(VolumeIndex, WatchAppliesChangesAsTheyHappen) {
    ASSERT_EQ(FILEIDXIndexBuild(kVolume), 0);
    volatile int stop = 0;
    int watched = -2;
    std::thread watcher([&] { watched = FILEIDXIndexWatch(kVolume, &stop); });
    const auto entries = [] {
        FI_INDEX_STATUS status{};
        return FILEIDXIndexStatus(kVolume, &status) == 0 ? status.entries : 0ull;
    };
    const auto found = [&](const std::string &pattern) {
        __tag_FI_SQL_COND name = Cond(FI_COND_NAME, FI_OP_EQ, pattern);
        return Indexed(&name, nullptr).size();
    };
    const unsigned long long before = entries();
    app.WriteFile("/volume1/photo/2013/just made");
    EXPECT_TRUE(Eventually([&] { return found("just made") == 1; }));
    ASSERT_EQ(rename("/volume1/photo/2013/just made", "/volume1/public/renamed"), 0);
    EXPECT_TRUE(Eventually([&] { return found("renamed") == 1 && entries() == before + 1; }));
    app.MakeDir("/volume1/public/2013/new").WriteFile("/volume1/public/2013/new/inside");
    EXPECT_TRUE(Eventually([&] { return found("inside") == 1; }));
    ASSERT_EQ(unlink("/volume1/public/renamed"), 0);
    ASSERT_EQ(unlink("/volume1/public/2013/new/inside"), 0);
    ASSERT_EQ(rmdir("/volume1/public/2013/new"), 0);
    EXPECT_TRUE(Eventually([&] { return entries() == before; }));
    stop = 1;
    watcher.join();
    EXPECT_EQ(watched, 0);
}

// A query works only on a whole index of root's that this process can read as root: missing,
// half-built, foreign, damaged, or out of reach (no saved root) all say 0 and the search walks.
// Read as a user with root saved, every look at the tree is the user's.
TEST_F(VolumeIndex, UsedOnlyWhenWholeRootsAndReachable) {
    EXPECT_EQ(FILEIDXIsIndexEnable(kVolume), 0);
    app.MakeDir("/volume1/@fileidx", "root", 0700).WriteFile("/volume1/@fileidx/fileidx.db.new", "half", "root", 0600);
    EXPECT_EQ(FILEIDXIsIndexEnable(kVolume), 0);
    // bob may pass through alice's folder but not list it.
    app.MakeDir("/volume1/photo/2013/x/mine", "alice", 0711).WriteFile("/volume1/photo/2013/x/mine/report.a", "", "alice", 0644);
    ASSERT_EQ(FILEIDXIndexBuild(kVolume), 0);
    EXPECT_EQ(FILEIDXIsIndexEnable(kVolume), 1);
    const auto asUser = [&](const std::string &user, const std::function<int()> &fn) {
        return app.RunAs("root", [&] {
            return setegid(app.Gid("users")) == 0 && seteuid(app.Uid(user)) == 0 ? fn() : 99;
        });
    };
    // bob finds nothing in alice's folder; the filter sees each row's folder and name.
    const auto reports = [&](const std::string &user) {
        return asUser(user, [&] {
            if (FILEIDXIsIndexEnable(kVolume) != 1 || FILEIDXDBCreate("/volume1/@tmp/u.db") != 0) return -1;
            __tag_FI_SQL_COND name = Cond(FI_COND_NAME, FI_OP_LIKE, "report.*");
            FI_TABLE_GEN_CONTEXT context{"/volume1/@tmp/u.db", nullptr, 0};
            const auto filter = [](const char *dir, const char *file, void *) {
                return strcmp(dir, "/volume1/photo/2013/x/mine") == 0 && strcmp(file, "report.a") == 0 ? 1 : 0;
            };
            if (FILEIDXResultGetAndTableGen(kVolume, &name, nullptr, filter, &context) != 0) return -2;
            unsigned long long total = 99;
            FI_QUERY all{};
            const int rc = FILEIDXCountGet(context.outputDbPath, &all, &total);
            unlink(context.outputDbPath);
            return rc == 0 && geteuid() == app.Uid(user) ? static_cast<int>(total) : -3;
        });
    };
    EXPECT_EQ(reports("alice"), 1);
    EXPECT_EQ(reports("bob"), 0);
    EXPECT_EQ(app.RunAs("alice", [] { return FILEIDXIsIndexEnable(kVolume); }), 0);
    const std::string index = "/volume1/@fileidx/fileidx.db";
    ASSERT_EQ(chown(index.c_str(), app.Uid("bob"), 0), 0);
    EXPECT_EQ(FILEIDXIsIndexEnable(kVolume), 0);
    ASSERT_EQ(chown(index.c_str(), 0, 0), 0);
    EXPECT_EQ(FILEIDXIsIndexEnable(kVolume), 1);
    {
        std::fstream damage(index, std::ios::in | std::ios::out | std::ios::binary);
        damage.seekp(0);
        damage << "not a database at all";
    }
    EXPECT_EQ(FILEIDXIsIndexEnable(kVolume), 0);
    FI_TABLE_GEN_CONTEXT context{kOut.c_str(), nullptr, 0};
    ASSERT_EQ(FILEIDXDBCreate(kOut.c_str()), 0);
    EXPECT_EQ(OUTCOME(FILEIDXResultGetAndTableGen(kVolume, nullptr, nullptr, nullptr, &context)), Failed(QUIB_ERR_FAILED));
    FI_INDEX_STATUS status;
    ASSERT_EQ(FILEIDXIndexStatus(kVolume, &status), 0);
    EXPECT_EQ(status.state, FI_INDEX_DAMAGED);
    // Upkeep is root's.
    EXPECT_EQ(app.RunAs("alice", [] { return FILEIDXIndexBuild(kVolume) == -1 ? VLIBCErrGet() >> 8 : 0; }), 0x03);
}

}  // namespace
