// Search result database tasks: folders and ids, paging against a sorted reference, moves and
// deletes of hits, and what a full volume, a damaged file or a hostile argument leave behind.
#include <fcntl.h>
#include <stdio.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <random>
#include <regex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "../platform/platform_test_util.h"
#include "fileidx.h"
#include "norvo/norvoenum.h"
#include "norvo/norvomisc.h"
#include "norvo/searchdb.h"
#include "vlibc_exec.h"
#include "vlibc_unicode.h"

namespace {

using Strings = std::vector<std::string>;

class SearchDb : public ::testing::Test {
protected:
    void SetUp() override { app.Basic(); }
    // A task of alice's on /volume1 with its database made.
    std::unique_ptr<NvoSearchDBTask> NewTask(const char *volume = "/volume1") {
        std::unique_ptr<NvoSearchDBTask> task(NvoSearchDBTaskMgr("alice").createDBTask(volume, nullptr));
        EXPECT_TRUE(task && FILEIDXDBCreate(task->getDBTaskFilePath().c_str()) == 0);
        return task;
    }
    norvo::testing::Appliance app;
};

std::string ModeOwner(const std::string &path) {
    struct stat st {};
    lstat(path.c_str(), &st);
    char text[64];
    snprintf(text, sizeof text, "%o %u", st.st_mode & 07777, st.st_uid);
    return text;
}

// One page as "share:path" lines.
Strings Page(const NvoSearchDBTask &task, unsigned long offset, unsigned long limit, const char *sortBy,
             bool desc, int type = 2, const char *pattern = nullptr, unsigned long long *total = nullptr) {
    Strings hits;
    unsigned long long count = 0;
    const auto t = static_cast<_tag_dir_entry_type_>(type);
    const auto collect = [](FI_FILE_INFO_DATA *r, void *arg) {
        static_cast<Strings *>(arg)->push_back(std::string(r->share) + ":" + r->path);
        return 1;
    };
    EXPECT_TRUE(task.queryResult(offset, limit, sortBy, sortBy ? &desc : nullptr, &t, pattern, collect, &hits,
                                 total ? total : &count));
    return hits;
}

TEST_F(SearchDb, FoldersModesAndIdsUnderTheUsersIdentity) {
    const uid_t alice = app.Uid("alice");
    std::string path;
    ASSERT_EQ(app.RunAs("root", [&] {
        if (setegid(app.Gid("users")) != 0 || seteuid(alice) != 0) return 1;
        NvoSearchDBTaskMgr mgr("alice");
        std::unique_ptr<NvoSearchDBTask> task(mgr.createDBTask("/volume1", nullptr));
        if (geteuid() != alice || !task || FILEIDXDBCreate(task->getDBTaskFilePath().c_str()) != 0) return 2;
        std::unique_ptr<NvoSearchDBTask> again(mgr.getDBTask("/volume1", task->getDBTaskId().c_str()));
        if (!again || again->getDBTaskFilePath() != task->getDBTaskFilePath()) return 3;
        return std::regex_match(task->getDBTaskId(), std::regex("[1-9A-F][0-9A-F]{1,15}")) ? 0 : 4;
    }), 0);
    const std::string root = "/volume1/@tmp/norvo/FBSearch";
    EXPECT_EQ(ModeOwner("/volume1/@tmp") + ModeOwner("/volume1/@tmp/norvo") + ModeOwner(root), "1777 01777 01777 0");
    EXPECT_EQ(ModeOwner(root + "/alice"), "700 " + std::to_string(alice));
    EXPECT_EQ(NvoSearchDBTaskMgr("alice").getDBTaskDir("/volume1"), root + "/alice");

    // With no random device, tasks made in the same second by two processes still differ.
    for (const char *device : {"/dev/urandom", "/dev/random"}) {
        ASSERT_EQ(umount2(device, MNT_DETACH) | unlink(device), 0);
    }
    const pid_t other = fork();
    for (int i = 0; i < 20; ++i) {
        if (!NewTask()) break;
    }
    if (other == 0) _exit(::testing::Test::HasFailure() ? 1 : 0);
    int status = 0;
    ASSERT_EQ(waitpid(other, &status, 0), other);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(root + "/alice"), {}), 41);
}

// A bad volume, user or id reaches no path: nothing is made and every question says no.
TEST_F(SearchDb, BadVolumesUsersAndIdsTouchNothing) {
    const struct {
        const char *volume, *user, *id;
    } rows[] = {{"/volume1/..", "alice", nullptr}, {"/volume1/photo", "alice", nullptr}, {"/tmp", "alice", nullptr},
                {"/volume1", "..", nullptr},        {"/volume1", "a/b", nullptr}, {"/volume1", "a\nb", nullptr},         {"/volume1", "alice", "../x"},
                {"/volume1", "alice", "5f5e"},      {"/volume1", "alice", "0A"},          {"/volume1", "alice", "A"},
                {"/volume1", "alice", "12345678901234567"}};
    for (const auto &row : rows) {
        NvoSearchDBTaskMgr mgr(row.user);
        EXPECT_EQ(mgr.createDBTask(row.volume, row.id), nullptr) << row.volume << " " << row.user;
        EXPECT_FALSE(mgr.hasDBTask(row.volume, row.id ? row.id : "5F5E"));
        EXPECT_FALSE(NvoSearchDBTask(row.volume, row.user, row.id).createDBTaskDir(row.volume, row.user, row.id));
    }
    EXPECT_NE(access("/volume1/@tmp", F_OK), 0);
    EXPECT_EQ(app.ErrorLines(), Strings(33, "norvosearch.cpp:# Bad Parameter"));
}

struct Ref {
    std::string share, path;
    bool dir;
    std::map<std::string, std::string> text;  // by sort key; "ppath" is the parent folder
    std::map<std::string, long long> number;
};

// Every sort key and direction, paged in random steps, gives the reference order (ties in the
// order stored); filters give the reference's counts.
TEST_F(SearchDb, PagesFollowTheReferenceOrder) {
    std::unique_ptr<NvoSearchDBTask> task = NewTask();
    std::mt19937 random(7);
    std::vector<Ref> refs;
    const Strings stems = {"a", "B", "b", "doc", "é", "É"}, exts = {"", ".txt", ".TXT", ".doc"};
    const std::pair<mode_t, const char *> modes[] = {{0644, "rw-r--r--"}, {0600, "rw-------"}, {0755, "rwxr-xr-x"}};
    for (int i = 0; i < 60; ++i) {
        Ref r;
        const std::string share = i % 3 ? "photo" : "home", ext = exts[random() % exts.size()];
        r.dir = random() % 4 == 0;
        r.text["ppath"] = "d" + std::to_string(random() % 3);
        r.text["name"] = stems[random() % stems.size()] + "_" + std::to_string(i) + ext;
        r.text["type"] = r.dir || ext.empty() ? "" : ext == ".TXT" ? "txt" : ext.substr(1);
        r.text["user"] = i % 2 ? "alice" : "bob";
        r.text["group"] = i % 3 ? "users" : "staff";
        const auto &mode = modes[random() % 3];
        r.text["posix"] = mode.second;
        _tag_QUIBSTAT_ st{};
        st.st_mode = mode.first | (r.dir ? S_IFDIR : S_IFREG);
        st.st_uid = app.Uid(r.text["user"]);
        st.st_gid = app.Gid(r.text["group"]);
        st.st_size = r.dir ? 99 : random() % 3;  // a directory's own size is never stored
        r.number["size"] = r.dir ? 0 : st.st_size;
        for (auto [key, time] : {std::pair{"crtime", &st.st_crtim}, {"ctime", &st.st_ctim}, {"atime", &st.st_atim},
                                 {"mtime", &st.st_mtim}}) {
            time->tv_sec = static_cast<int32_t>(random() % 3) - 1;
            r.number[key] = time->tv_sec;
        }
        r.path = r.text["ppath"] + "/" + r.text["name"];
        const std::string real = "/volume1/" + share + "/" + r.path;
        ASSERT_TRUE(task->insertFile(share, real, share, real, st));
        r.share = share == "home" ? "homes" : share;
        refs.push_back(r);
    }
    const auto text = [](const std::string &a, const std::string &b) { return VLIBCUnicodeUTF8StrCaseCmp(a.c_str(), b.c_str()); };
    for (const std::string key : {"name", "bogus", "user", "group", "posix", "type", "ppath", "size", "mtime", "crtime",
                                  "ctime", "atime"}) {
        const auto cmp = [&](Ref a, Ref b) -> int {
            if (key == "ppath" && text(a.share, b.share) != 0) return text(a.share, b.share);
            if (a.number.count(key)) return (a.number[key] > b.number[key]) - (a.number[key] < b.number[key]);
            return a.text.count(key) ? text(a.text[key], b.text[key]) : text(a.text["name"], b.text["name"]);
        };
        for (const bool desc : {false, true}) {
            std::vector<Ref> want = refs;
            std::stable_sort(want.begin(), want.end(), [&](const Ref &a, const Ref &b) {
                return desc ? cmp(b, a) < 0 : cmp(a, b) < 0;
            });
            Strings expected, got;
            for (const Ref &r : want) expected.push_back(r.share + ":" + r.path);
            while (got.size() < refs.size() + 3) {
                const Strings page = Page(*task, got.size(), 1 + random() % 7, key.c_str(), desc);
                if (page.empty()) break;
                got.insert(got.end(), page.begin(), page.end());
            }
            EXPECT_EQ(got, expected) << key << (desc ? " desc" : "");
        }
    }
    for (const auto &filter : std::vector<std::pair<int, std::string>>{{2, "doc"}, {1, "DOC"}, {0, ""}, {7, "é"}}) {
        const int type = filter.first;
        const std::string pattern = filter.second;
        unsigned long long total = 0;
        Page(*task, 0, 1000, nullptr, false, type, pattern.c_str(), &total);
        const auto n = std::count_if(refs.begin(), refs.end(), [&](const Ref &r) {
            return (type == 2 || r.dir == (type != 1)) && NvoLibStrLikeCompare(("*" + pattern + "*").c_str(), r.text.at("name").c_str(), '\\') == 1;
        });
        EXPECT_EQ(total, static_cast<unsigned long long>(n)) << type << pattern;
    }
    unsigned long long untouched = 42;
    EXPECT_FALSE(task->queryResult(0, 0, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, &untouched));
    EXPECT_FALSE(task->queryResult(0, 1, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr));
    EXPECT_EQ(untouched, 42u);
}

// Renames of a file and a folder move their hits; a folder's delete spares its namesake
// prefix; a malformed path changes nothing; the sqlite3 shell reads the result.
TEST_F(SearchDb, MovesAndDeletesFollowTheFiles) {
    std::unique_ptr<NvoSearchDBTask> task = NewTask();
    const std::string p = "/volume1/photo/";
    for (const char *dir : {"a", "a/b", "ab", "*"}) app.MakeDir(p + dir);
    for (const char *file : {"a/x.jpg", "a/b/y.jpg", "ab/z.jpg", "*/w"}) app.WriteFile(p + file);
    for (const char *hit : {"a", "a/x.jpg", "a/b", "a/b/y.jpg", "ab", "ab/z.jpg", "*", "*/w"}) {
        _tag_QUIBSTAT_ st{};
        ASSERT_EQ(VLIBCFileLStat((p + hit).c_str(), 0, &st), 0);
        ASSERT_TRUE(task->insertFile("photo", p + hit, "photo", p + hit, st));
    }
    ASSERT_EQ(rename((p + "a").c_str(), (p + "c").c_str()) | rename((p + "ab/z.jpg").c_str(), (p + "ab/Z.png").c_str()), 0);
    _tag_QUIBSTAT_ st{};
    ASSERT_EQ(VLIBCFileLStat((p + "c").c_str(), 0, &st), 0);
    EXPECT_TRUE(task->updateFile("photo", p + "a", "photo", p + "c", st));
    EXPECT_TRUE(task->updateFileInFolder("photo", p + "a", "photo", p + "c"));
    EXPECT_TRUE(task->updateFile("photo", p + "ab/z.jpg", "photo", p + "ab/Z.png", st));
    st.st_mode = 040700;
    EXPECT_TRUE(task->updatePermRecs("photo", p + "ab", "bob", "staff", st));
    EXPECT_TRUE(task->delRecs("photo", p + "*"));
    EXPECT_EQ(Page(*task, 0, 100, "name", false),
              (Strings{"photo:ab", "photo:c/b", "photo:c", "photo:c/x.jpg", "photo:c/b/y.jpg", "photo:ab/Z.png"}));
    EXPECT_FALSE(task->insertFile("photo", "/volume1", "photo", p, st));
    EXPECT_FALSE(task->delRecs("photo", "/volume1/photo"));
    EXPECT_TRUE(task->delRecs("photo", p + "c"));

    const std::string out = "/volume1/public/out", output = ".output " + out;
    const char *shell[] = {"sqlite3", "-readonly", task->getDBTaskFilePath().c_str(), output.c_str(),
                           "SELECT share, path, parent_path, name, type, posix, user_name FROM fileinfo ORDER BY path;",
                           nullptr};
    ASSERT_EQ(VLIBCExec("/usr/bin/sqlite3", shell), 0);
    EXPECT_EQ(norvo::testing::ReadFile(out), "photo|ab||ab||rwx------|bob\nphoto|ab/Z.png|ab|Z.png|png|rw-r--r--|root\n");
    EXPECT_EQ(app.ErrorLines(), (Strings{"norvosearch.cpp:# Fail to find the share name photo from /volume1",
                                         "norvosearch.cpp:# Fail to find the path name /volume1/photo"}));
}

// A full volume: the folders say 0x2500 and why; an insert that does not fit fails with its
// line and the hits stored stay readable. A damaged file is an error, not a crash.
TEST_F(SearchDb, FullVolumesAndDamagedFilesFailCleanly) {
    app.MakeDir("/volume3");
    ASSERT_EQ(mount("tmpfs", "/volume3", "tmpfs", 0, "size=256k,nr_inodes=1"), 0);
    NvoSearchDBTask full("/volume3", "alice", "5F5E10A3");
    EXPECT_EQ(VLIBCErrGet(), 0x2500);
    EXPECT_EQ(app.ErrorLines(), (Strings{
        "nvoman.cpp(#)Failed to mkdir : /volume3/@tmp , reason=No space left on device[28]",
        "norvosearch.cpp(#): failed to create tmp folder /volume3/@tmp/norvo, errno=No space left on device(28)"}));
    app.ClearLogs();
    ASSERT_EQ(umount2("/volume3", MNT_DETACH) | mount("tmpfs", "/volume3", "tmpfs", 0, "size=256k"), 0);
    std::unique_ptr<NvoSearchDBTask> task = NewTask("/volume3");
    _tag_QUIBSTAT_ st{};
    int stored = 0;
    while (task->insertFile("photo", "/volume3/photo/" + std::string(4000, 'x') + std::to_string(stored), "photo",
                            "/volume3/photo/" + std::string(4000, 'x') + std::to_string(stored), st)) {
        ++stored;
    }
    unsigned long long total = 0;
    EXPECT_EQ(Page(*task, 0, 1, nullptr, false, 2, nullptr, &total).size(), 1u);
    EXPECT_EQ(total, static_cast<unsigned long long>(stored));
    const std::string db = task->getDBTaskFilePath();
    EXPECT_EQ(app.ErrorLines(), Strings{"norvosearch.cpp:# Fail to insert data in DB " + db});
    app.ClearLogs();

    unlink((db + "-wal").c_str());
    unlink((db + "-shm").c_str());
    std::ofstream(db, std::ios::trunc) << std::string(8192, 'S');
    const auto none = [](FI_FILE_INFO_DATA *, void *) { return 1; };
    EXPECT_FALSE(task->queryResult(0, 1, nullptr, nullptr, nullptr, nullptr, none, nullptr, &total));
    EXPECT_FALSE(task->insertFile("photo", "/volume3/photo/a", "photo", "/volume3/photo/a", st));
    EXPECT_EQ(app.ErrorLines(), (Strings{"norvosearch.cpp:# Fail to Select the record from DB " + db,
                                         "norvosearch.cpp:# Fail to select data from DB " + db}));
    EXPECT_TRUE(task->remove());
    EXPECT_FALSE(NvoSearchDBTaskMgr("alice").hasDBTask("/volume3", task->getDBTaskId().c_str()));
}

}  // namespace
