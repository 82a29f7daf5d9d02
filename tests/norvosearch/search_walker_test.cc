// The search walker against find(1) run as the same user over generated trees on two volumes
// and several shares, for every kind of condition; cancellation, folders that vanish, two
// searches at once and a full result volume; and the exact log lines of each failure.
#include <fcntl.h>
#include <stdio.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <functional>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "../norvodir/find_oracle.h"
#include "appliance.h"
#include "norvo/norvouser.h"
#include "norvo/searchdb.h"
#include "norvo/searchwalker.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using Hits = std::set<std::string>;
using FileSearch::FindFactory;

struct Field {
    FindFactory::_tag_FIND_FIELD_ field;
    const char *op;
    std::string value;
};

// A condition that runs a step the first time (or the nth time) it is asked, and holds.
struct Hook : FileSearch::FindComp {
    Hook(int at, std::function<void()> fn) : nth(at), step(std::move(fn)) {}
    bool operator()(const char *, const _tag_QUIBSTAT_ &) override {
        if (++calls == nth) {
            step();
        }
        return true;
    }
    using FindComp::operator();
    int nth, calls = 0;
    std::function<void()> step;
};

// One search in the calling process: its result, the platform error, and the hits as
// "share/path".
struct Result {
    bool ok;
    int error;
    Hits hits;
};

Result SearchHere(const std::string &user, const std::vector<std::string> &folders, const std::vector<Field> &fields,
                  bool currentDirOnly = false, Hook *hook = nullptr, int *cancel = nullptr) {
    std::vector<FileSearch::FindComp *> conds;
    std::vector<FileSearch::FindATimeComp *> extra;
    for (const Field &f : fields) {
        EXPECT_TRUE(FindFactory::createFindOp(f.field, f.op, f.value.c_str(), conds));
        if (f.field == FindFactory::FIND_FIELD_ATIME) {
            extra.push_back(static_cast<FileSearch::FindATimeComp *>(conds.back()));
        }
    }
    if (hook != nullptr) {
        conds.push_back(hook);
    }
    Result result{};
    {
        FileSearch::NvoSearchWalker walker(user.c_str(), "sid", cancel);
        walker.setSearchCurrentDir(currentDirOnly);
        result.ok = walker.init(folders, conds) && walker.Walk(extra);
        result.error = VLIBCErrGet();
        const FI_QUERY all{};
        FILEIDXDBSelect(
            walker.getDBPath().c_str(), &all,
            [](FI_FILE_INFO_DATA *r, void *arg) {
                static_cast<Hits *>(arg)->insert(std::string(r->share) + "/" + r->path);
                return 1;
            },
            &result.hits, nullptr, nullptr, 0);
    }
    for (FileSearch::FindComp *cond : conds) {
        if (cond != hook) {
            delete cond;
        }
    }
    return result;
}

// The same in a child, the result travelling through a file: as user through and through, or
// (asRequest) as a request runs, the real user root and the effective one user's, so that the
// platform may read a volume's index.
Result Search(Appliance &app, const std::string &user, const std::vector<std::string> &folders,
              const std::vector<Field> &fields, bool currentDirOnly = false, bool asRequest = false) {
    const std::string file = "/tmp/hits." + user;
    const auto run = [&] {
        const Result r = SearchHere(user, folders, fields, currentDirOnly);
        std::ofstream out(file, std::ios::binary | std::ios::trunc);
        out << r.ok << ' ' << r.error << '\0';
        for (const std::string &hit : r.hits) {
            out << hit << '\0';
        }
        return 0;
    };
    if (!asRequest) {
        app.RunAs(user, run);
    } else if (const pid_t child = fork(); child == 0) {
        _exit(NvoLibUGIDSet(nullptr, user.c_str()) == 0 ? run() : 1);
    } else {
        int status = 0;
        waitpid(child, &status, 0);
    }
    Result r{};
    const std::string text = norvo::testing::ReadFile(file);
    int ok = 0;
    sscanf(text.c_str(), "%d %d", &ok, &r.error);
    r.ok = ok != 0;
    for (size_t at = text.find('\0') + 1, end; (end = text.find('\0', at)) != std::string::npos; at = end + 1) {
        r.hits.insert(text.substr(at, end - at));
    }
    return r;
}

// Every kind of condition, with the find(1) test that says the same.
struct Row {
    std::vector<Field> fields;
    std::string find;
};
std::vector<Row> Rows(const std::string &uid, const std::string &gid) {
    return {
        {{{FindFactory::FIND_FIELD_NAME, nullptr, "report"}}, "-iname '*report*'"},
        {{{FindFactory::FIND_FIELD_NAME, nullptr, "x, \"a\", Ünï,b"}},
         "\\( -iname '*a*' -o -iname '*Ünï*' -o -iname '*b*' \\)"},
        {{{FindFactory::FIND_FIELD_EXT, nullptr, "txt,doc"}}, "-type f \\( -iname '*.txt' -o -iname '*.doc' \\)"},
        {{{FindFactory::FIND_FIELD_TYPE, "dir", ""}}, "-type d"},
        {{{FindFactory::FIND_FIELD_TYPE, "FILE", ""}, {FindFactory::FIND_FIELD_NAME, nullptr, "b"}},
         "-type f -iname '*b*'"},
        {{{FindFactory::FIND_FIELD_USER, nullptr, "alice"}}, "-uid " + uid},
        {{{FindFactory::FIND_FIELD_GROUP, nullptr, "staff"}}, "-gid " + gid},
        {{{FindFactory::FIND_FIELD_SIZE, "greater", "3"}}, "-type f -size +3c"},
        {{{FindFactory::FIND_FIELD_SIZE, "less", "2"}}, "\\( -type d -o -size -2c \\)"},
        {{{FindFactory::FIND_FIELD_MTIME, "before", "1050000000"}}, "! -newermt @1050000000"},
        {{{FindFactory::FIND_FIELD_ATIME, "Before", "1200000000"}, {FindFactory::FIND_FIELD_NAME, nullptr, "b"}},
         "! -newerat @1200000000 -iname '*b*'"},
    };
}

class SearchWalker : public ::testing::Test {
protected:
    void SetUp() override {
        app.Basic();
        app.AddShare({.name = "video", .volume = "/volume2", .readWrite = "@users"});
        app.AddShare({.name = "docs", .volume = "/volume2", .noAccess = "bob", .readWrite = "alice"});
        MakeTaskFolders("/volume1");
        MakeTaskFolders("/volume2");
    }
    // A search as a user who is not root needs its task folders made by root once.
    static void MakeTaskFolders(const char *volume) {
        for (const char *user : {"alice", "bob"}) {
            NvoSearchDBTask(volume, user, nullptr);
        }
    }
    // Generated trees in four shares of two volumes, each with a "2013" folder, the recycle
    // bin, folders alice may not list, files of hers and old ones.
    void BuildTrees() {
        uint32_t seed = 1;
        for (const char *top : {"/volume1/public", "/volume1/photo", "/volume2/video", "/volume2/docs"}) {
            const int dir = open(top, O_RDONLY | O_DIRECTORY);
            norvo::testing::TreeMaker(seed++).Build(dir, 0);
            close(dir);
            const std::string t(top);
            app.MakeDir(t + "/2013").WriteFile(t + "/2013/report-" + t.substr(9) + ".txt", "1234567", "alice");
            app.WriteFile(t + "/2013/Report.DOC", "12", "bob").WriteFile(t + "/2013/b.txt", "", "alice:staff", 0600);
        }
        app.MakeDir("/volume1/public/#recycle/report").WriteFile("/volume1/public/#recycle/report/report.txt");
        app.MakeDir("/volume1/public/report-locked", "root", 0700).WriteFile("/volume1/public/report-locked/report");
        app.MakeDir("/volume1/public/report-unenterable", "root", 0744).WriteFile("/volume1/public/report-unenterable/x");
        app.MakeDir("/volume2/docs/@sharebin/report").MakeDir("/volume1/photo/2013/deep/report");
        // Access times of files only: reading a folder would move its own.
        ASSERT_EQ(system("touch -h -d @1000000000 /volume1/photo/2013/* /volume2/video/2013/* && find /volume1/public /volume2/docs "
                         "-maxdepth 2 -type f -name '[ab]*' -exec touch -a -d @1100000000 {} +"),
                  0);
    }
    // What find says user may find below the real folders tops with the tests, as the hits of
    // the search name them.
    Hits Expected(const std::string &user, const std::string &tops, const std::string &tests, bool currentDirOnly) {
        Hits hits;
        const std::string depth = currentDirOnly ? " -maxdepth 1" : "";
        for (const std::string &p : norvo::testing::FindAs(app, user, tops + depth,
                                                           norvo::testing::FindPrune("/volume1/public", true),
                                                           "\\( -type f -o -type d \\) " + tests + " ")) {
            hits.insert(p.substr(p.find('/', 1) + 1));
        }
        return hits;
    }
    Appliance app;
};

// Every kind of condition, for a user with every share and for one without docs and with
// read-only photo; the chosen folders include one in the bin, a hidden one, a file, a folder
// of a share bob may not list and a "2013" of one share but not of the other.
TEST_F(SearchWalker, FindsWhatFindFindsForTheUser) {
    BuildTrees();
    const std::vector<std::string> folders = {"/public", "/photo", "/video/2013", "/docs", "/public/#recycle",
                                              "/docs/@sharebin", "/photo/2013/b.txt"};
    const std::string uid = std::to_string(app.Uid("alice")), gid = std::to_string(app.Gid("staff"));
    for (const Row &row : Rows(uid, gid)) {
        for (const bool currentDirOnly : {false, true}) {
            for (const std::string user : {"alice", "bob"}) {
                SCOPED_TRACE(row.find + " as " + user + (currentDirOnly ? ", current folder only" : ""));
                const std::string tops = "/volume1/public /volume1/photo /volume2/video/2013" +
                                         std::string(user == "alice" ? " /volume2/docs" : "");
                const Result r = Search(app, user, folders, row.fields, currentDirOnly);
                EXPECT_TRUE(r.ok) << r.error;
                const Hits expected = Expected(user, tops, row.find, currentDirOnly);
                EXPECT_EQ(r.hits, expected);
                EXPECT_FALSE(expected.empty());
            }
        }
    }
    // The checks of the chosen folders: the file for both, the share bob may not list for him.
    const std::vector<std::string> lines = app.ErrorLines();
    EXPECT_EQ(std::set<std::string>(lines.begin(), lines.end()),
              (std::set<std::string>{"norvomisc.cpp:# Failed to chdir /volume1/photo/2013/b.txt. [Not a directory]",
                                     "norvomisc.cpp:# No privilege in path /docs",
                                     "norvomisc.cpp:# No privilege in path /docs/@sharebin"}));
    EXPECT_EQ(lines.size(), Rows(uid, gid).size() * 2 * 4u);
}

// With each volume's index built, the same searches give exactly what walking gave, for every
// kind of condition, at a share's top and below, with --current-dir-only, for "2013" folders
// of two shares beside a third share's that was not chosen, a home folder (which no share
// holds: walked), for a user who may not list docs and for an administrator; and they do come from the index: a file made after it was built
// is found by walking only.
TEST_F(SearchWalker, IndexFindsWhatTheWalkFinds) {
    BuildTrees();
    for (const char *user : {"alice", "bob", "admin"}) {
        app.MakeDir("/volume1/homes/" + std::string(user), user, 0700)
            .WriteFile("/volume1/homes/" + std::string(user) + "/b-report.txt", "", user);
    }
    const std::vector<std::string> folders = {"/photo/2013", "/video/2013", "/docs", "/public/#recycle",
                                              "/docs/@sharebin", "/home"};
    const std::vector<Row> rows = Rows(std::to_string(app.Uid("alice")), std::to_string(app.Gid("staff")));
    const auto searchAll = [&] {
        std::vector<Result> results;
        for (const Row &row : rows) {
            for (const bool currentDirOnly : {false, true}) {
                for (const std::string user : {"alice", "bob", "admin"}) {
                    results.push_back(Search(app, user, folders, row.fields, currentDirOnly, true));
                }
            }
        }
        return results;
    };
    const std::vector<Result> walked = searchAll();
    for (const char *volume : {"/volume1", "/volume2"}) {
        ASSERT_EQ(FILEIDXIndexBuild(volume), 0);
        ASSERT_EQ(FILEIDXIsIndexEnable(volume), 1);
    }
    app.WriteFile("/volume2/docs/report-late.txt", "", "alice");
    const std::vector<Result> indexed = searchAll();
    ASSERT_EQ(indexed.size(), walked.size());
    for (size_t i = 0; i < walked.size(); ++i) {
        const char *users[] = {"alice", "bob", "admin"};
        SCOPED_TRACE(rows[i / 6].find + " as " + users[i % 3] + (i / 3 % 2 ? ", current folder only" : ""));
        EXPECT_TRUE(walked[i].ok && indexed[i].ok);
        EXPECT_EQ(indexed[i].hits, walked[i].hits);
    }
    EXPECT_EQ(walked[0].hits.count("photo/2013/report-photo.txt"), 1u);
    EXPECT_EQ(walked[0].hits.count("public/2013/report-public.txt"), 0u);
    EXPECT_EQ(indexed[0].hits.count("homes/alice/b-report.txt"), 1u);
    EXPECT_EQ(Search(app, "alice", {"/docs"}, rows[0].fields, false, true).hits.count("docs/report-late.txt"), 0u);
    EXPECT_EQ(Search(app, "alice", {"/docs"}, rows[0].fields).hits.count("docs/report-late.txt"), 1u) << "walked";
}

// A cancel mid-walk ends the search with success and keeps what was found; a chosen folder
// removed before the walk reaches it ends it with 0x0600, a sub-folder removed under it is
// passed over; two searches of one user at once each get a task of their own and all hits.
TEST_F(SearchWalker, CancelVanishingFoldersAndTwoAtOnce) {
    for (int i = 0; i < 7; ++i) {
        app.MakeDir("/volume1/public/d" + std::to_string(i), "alice");
    }
    for (int i = 0; i < 300; ++i) {
        app.WriteFile("/volume1/public/d" + std::to_string(i % 7) + "/f" + std::to_string(i), "", "alice");
    }
    app.MakeDir("/volume2/video/gone", "alice").WriteFile("/volume2/video/gone/f", "", "alice");
    const std::vector<std::string> folders = {"/public", "/video/gone"};
    const int result = app.RunAs("alice", [&] {
        int cancel = 0;
        Hook stop(100, [&] { cancel = 1; });
        const Result cancelled = SearchHere("alice", folders, {}, false, &stop, &cancel);
        if (!cancelled.ok || cancelled.hits.size() < 99 || cancelled.hits.size() > 101) {
            return 1;
        }
        Hook removeChosen(1, [] { (void)!system("rm -r /volume2/video/gone"); });
        const Result vanished = SearchHere("alice", folders, {}, false, &removeChosen);
        if (vanished.ok || vanished.error != 0x0600 || vanished.hits.size() != 307) {
            return 2;
        }
        Hook removeSub(5, [] { (void)!system("rm -r /volume1/public/d3"); });
        const Result sub = SearchHere("alice", {"/public"}, {}, false, &removeSub);
        const size_t left = SearchHere("alice", {"/public"}, {}).hits.size();
        if (!sub.ok || sub.hits.size() < left || sub.hits.size() > 307 || left != 307 - 44) {
            return 3;
        }
        int status[2];
        for (int &s : status) {
            const pid_t child = fork();
            if (child == 0) {
                _exit(SearchHere("alice", {"/public"}, {}).hits.size() == left ? 0 : 1);
            }
            s = child;
        }
        for (int &s : status) {
            waitpid(s, &s, 0);
        }
        return status[0] == 0 && status[1] == 0 ? 0 : 4;
    });
    EXPECT_EQ(result, 0);
    EXPECT_EQ(app.ErrorLines(), std::vector<std::string>{});
    // Six searches, six tasks.
    EXPECT_EQ(system("test $(ls /volume1/@tmp/norvo/FBSearch/alice | grep -cv -e -wal -e -shm) = 6"), 0);
}

// The failures a caller sees, with their log lines: no folder left, a result volume that
// fills up, a volume with a task folder that is not the user's.
TEST_F(SearchWalker, FailuresAndTheirLogLines) {
    app.AddVolume("/volume3").AddShare({.name = "big", .volume = "/volume3", .readWrite = "@users"});
    for (int i = 0; i < 4000; ++i) {
        app.WriteFile("/volume3/big/" + std::string(200, 'n') + std::to_string(i));
    }
    MakeTaskFolders("/volume3");
    ASSERT_EQ(mount("tmpfs", "/volume3/@tmp/norvo/FBSearch/alice", "tmpfs", 0,
                    ("size=64k,mode=0700,uid=" + std::to_string(app.Uid("alice"))).c_str()),
              0);
    const struct {
        std::vector<std::string> folders;
        bool ok;
        int error;
        std::vector<std::string> log;
    } rows[] = {
        {{}, false, 0x0300, {"norvosearch.cpp:# Fail to find any directory"}},
        {{"/public/#recycle", "/public/@eaDir"}, false, 0x0300, {"norvosearch.cpp:# Fail to find any directory"}},
        {{"/big"}, false, 0x8000, {"norvosearch.cpp:# Fail to walk /volume3/big"}},
    };
    for (const auto &row : rows) {
        app.ClearLogs();
        const Result r = Search(app, "alice", row.folders, {{FindFactory::FIND_FIELD_NAME, nullptr, "n"}});
        EXPECT_EQ(r.ok, row.ok);
        EXPECT_EQ(r.error, row.error);
        EXPECT_EQ(app.ErrorLines(), row.log);
    }
}

}  // namespace
