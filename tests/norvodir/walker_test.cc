// The directory walker against find(1) on generated hostile trees, and on trees that change
// under it.
#include <fcntl.h>
#include <stdio.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <functional>
#include <map>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "find_oracle.h"
#include "norvo/norvodir.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::FindAs;
using norvo::testing::FindPrune;
using norvo::testing::TreeMaker;
using norvo::testing::LogLine;

const std::string kTop = "/volume1/public";

struct Event {
    std::string phase;  // "pre" or "post"
    char type;
    std::string real;
    auto operator<=>(const Event &) const = default;
};

char TypeOf(mode_t mode) {
    return S_ISDIR(mode) ? 'd' : S_ISLNK(mode) ? 'l' : S_ISREG(mode) ? 'f' : '?';
}

// Records every call; onCall may change the tree, stop (false) or cancel.
struct Recorder : NvoDirectoryWalkerCallBack {
    Recorder(std::vector<Event> *out, const char *name) : events(out), phase(name) {}
    bool operator()(const std::string &user, const std::string &base, const std::string &real,
                    const std::string &name, _tag_QUIBSTAT_ &st, const std::string *extra) override {
        EXPECT_EQ(base, "/base");
        EXPECT_EQ(extra, &kExtra);
        EXPECT_EQ(user.substr(user.size() - name.size() - 1), "/" + name);
        EXPECT_EQ("/volume1" + user.substr(0, user.size() - name.size()),
                  real.substr(0, real.size() - name.size()));
        events->push_back({phase, TypeOf(st.st_mode), real});
        return onCall ? onCall(real, events->size()) : true;
    }
    std::vector<Event> *events;
    const char *phase;
    std::function<bool(const std::string &, size_t)> onCall;
    static inline const std::string kExtra = "extra";
};

enum Order { kTopDown, kPrePost, kFirstFolder, kFirstOnly };

bool RunWalk(Order order, _enum_ignore_err_ mode, bool skipRecycle, std::vector<Event> *events,
             const std::string &real = kTop, int *cancel = nullptr,
             std::function<bool(const std::string &, size_t)> onCall = nullptr) {
    Recorder pre(events, "pre"), post(events, "post");
    pre.onCall = post.onCall = onCall;
    NvoDirectoryWalker walker(mode, cancel);
    const std::string user = real.size() > 8 ? real.substr(8) : real;  // without "/volume1"
    switch (order) {
    case kTopDown:
        return walker.Walk_TopDown(user, "/base", real, pre, &Recorder::kExtra, skipRecycle);
    case kPrePost:
        return walker.Walk(user, "/base", real, &pre, &post, &Recorder::kExtra, skipRecycle);
    default:
        return walker.Walk_FirstFolder_First(user, "/base", real, pre, &Recorder::kExtra, skipRecycle,
                                             order == kFirstOnly);
    }
}

void MakeChain(const std::string &top, int depth, const char *name) {
    int dir = open(top.c_str(), O_RDONLY | O_DIRECTORY);
    for (int i = 0; i < depth; ++i) {
        mkdirat(dir, name, 0755);
        const int child = openat(dir, name, O_RDONLY | O_DIRECTORY);
        close(dir);
        dir = child;
    }
    close(openat(dir, "end", O_CREAT | O_WRONLY, 0644));
    close(dir);
}

// What find reports for alice (see FindAs).
std::set<Event> FindAsAlice(Appliance &app, bool skipRecycle) {
    std::set<Event> found;
    for (const std::string &r : FindAs(app, "alice", kTop, FindPrune(kTop, skipRecycle), "", "%y\\t%p")) {
        found.insert({"pre", r[0], r.substr(2)});
    }
    return found;
}

// A hostile tree: generated names and links, the recycle bin, a folder alice may enter but not
// read and one she may read but not enter, and a chain 1,500 deep whose paths pass 4,096 bytes.
TEST(Walker, ReportsWhatFindReportsForTheUser) {
    Appliance app;
    app.Basic();
    for (const uint32_t seed : {1u, 2u}) {
        ASSERT_EQ(system(("rm -rf " + kTop + "/* " + kTop + "/.??*").c_str()), 0);
        const int top = open(kTop.c_str(), O_RDONLY | O_DIRECTORY);
        TreeMaker(seed).Build(top, 0);
        close(top);
        app.MakeDir(kTop + "/#recycle/old").WriteFile(kTop + "/#recycle/old/x");
        app.MakeDir(kTop + "/enter-only", "root", 0711).WriteFile(kTop + "/enter-only/known");
        app.MakeDir(kTop + "/read-only", "root", 0744).WriteFile(kTop + "/read-only/listed");
        MakeChain(kTop, 1500, "deep");

        for (const bool skipRecycle : {false, true}) {
            const std::set<Event> expected = FindAsAlice(app, skipRecycle);
            ASSERT_GT(expected.size(), 1540u);
            for (const Order order : {kTopDown, kPrePost, kFirstFolder}) {
                SCOPED_TRACE("seed " + std::to_string(seed) + " order " + std::to_string(order) +
                             (skipRecycle ? " skipping the recycle bin" : ""));
                // The walk as alice, its events written for the parent to read.
                const int result = app.RunAs("alice", [&] {
                    std::vector<Event> events;
                    const bool ok = RunWalk(order, IGNORE_ERR_PERMISSION, skipRecycle, &events);
                    std::ofstream out("/tmp/walk.out", std::ios::binary);
                    for (const Event &e : events) {
                        out << e.phase << '\0' << e.type << '\0' << e.real << '\0';
                    }
                    return ok ? 0 : 1;
                });
                ASSERT_EQ(result, 0);
                std::vector<Event> events;
                std::istringstream in(norvo::testing::ReadFile("/tmp/walk.out"));
                for (std::string phase, type, real; std::getline(in, phase, '\0') && std::getline(in, type, '\0') &&
                                                    std::getline(in, real, '\0');) {
                    events.push_back({phase, type[0], real});
                }
                std::set<Event> reported;
                std::map<std::string, size_t> preAt, postAt;
                for (size_t i = 0; i < events.size(); ++i) {
                    (events[i].phase == "pre" ? preAt : postAt)[events[i].real] = i;
                    if (events[i].phase == "pre") {
                        EXPECT_TRUE(reported.insert(events[i]).second) << "twice: " << events[i].real;
                    }
                }
                EXPECT_TRUE(reported == expected) << reported.size() << " reported, find " << expected.size();
                // Every entry comes after its folder's pre and before its folder's post.
                for (const auto &[path, at] : preAt) {
                    const std::string parent = path.substr(0, path.rfind('/'));
                    if (parent != kTop) {
                        ASSERT_LT(preAt.at(parent), at) << path;
                        if (order == kPrePost) {
                            ASSERT_LT(postAt.at(path), postAt.at(parent)) << path;
                            ASSERT_LT(at, postAt.at(path)) << path;
                        }
                    }
                }
                if (order == kFirstFolder) {  // the first folder whole, before anything deeper
                    size_t lastTop = 0, firstDeep = events.size();
                    for (size_t i = 0; i < events.size(); ++i) {
                        const bool inTop = events[i].real.rfind('/') == kTop.size();
                        lastTop = inTop ? i : lastTop;
                        firstDeep = inTop ? firstDeep : std::min(firstDeep, i);
                    }
                    EXPECT_LT(lastTop, firstDeep);
                }
            }
        }
    }
    EXPECT_EQ(app.ErrorLines(), std::vector<std::string>{});
}

// Each ignore mode on a folder alice may not enter and on one she may not read, in each order,
// with the exact log line of the failure that ends the walk.
TEST(Walker, IgnoreModesOnFoldersTheUserMayNotOpen) {
    Appliance app;
    app.Basic().MakeDir(kTop + "/d").MakeDir(kTop + "/d/x", "root", 0700).WriteFile(kTop + "/d/x/f");
    struct {
        Order order;
        mode_t mode;  // of d/x
        _enum_ignore_err_ ignore;
        bool result;
        std::string log;
    } const kCases[] = {
        {kTopDown, 0744, IGNORE_ERR_PERMISSION, true, ""},
        {kTopDown, 0711, IGNORE_ERR_ALL, true, ""},
        {kTopDown, 0744, IGNORE_ERR_NONE, false, "norvodir.cpp:658 Failed to chdir /volume1/public/d/x. [Permission denied]"},
        {kTopDown, 0711, IGNORE_ERR_NONE, false, "norvodir.cpp:667 Failed to open /volume1/public/d/x, error Permission denied"},
        {kPrePost, 0744, static_cast<_enum_ignore_err_>(7), false, "norvodir.cpp:724 Failed to chdir /volume1/public/d/x. [Permission denied]"},
        {kPrePost, 0711, IGNORE_ERR_NONE, false, "norvodir.cpp:733 Failed to open /volume1/public/d/x, error Permission denied"},
        {kPrePost, 0711, IGNORE_ERR_PERMISSION, true, ""},
        {kFirstFolder, 0744, IGNORE_ERR_NONE, false, "norvodir.cpp:658 Failed to chdir /volume1/public/d/x. [Permission denied]"},
        {kFirstOnly, 0711, IGNORE_ERR_NONE, true, ""},
    };
    for (const auto &c : kCases) {
        SCOPED_TRACE(c.log);
        ASSERT_EQ(chmod((kTop + "/d/x").c_str(), c.mode), 0);
        app.ClearLogs();
        std::vector<Event> events;
        const int result = app.RunAs("alice", [&] {
            return RunWalk(c.order, c.ignore, false, &events, c.order >= kFirstFolder ? kTop + "/d" : kTop) ? 1 : 0;
        });
        EXPECT_EQ(result, c.result ? 1 : 0);
        const std::vector<LogLine> expected = c.log.empty() ? std::vector<LogLine>{} : std::vector<LogLine>{{LOG_ERR, c.log}};
        EXPECT_EQ(app.Logs(), expected);
    }
    // The first folder itself, with its own line numbers.
    app.ClearLogs();
    EXPECT_EQ(app.RunAs("alice", [&] {
        std::vector<Event> events;
        return RunWalk(kFirstFolder, IGNORE_ERR_NONE, false, &events, kTop + "/d/x") ? 1 : 0;
    }), 0);
    EXPECT_EQ(app.Logs(), (std::vector<LogLine>{{LOG_ERR, "norvodir.cpp:594 Failed to open /volume1/public/d/x, error Permission denied"}}));
}

// Trees that change under the walk, callbacks that stop it, the cancel flag, bad starts and
// depth beyond the descriptor limit.
TEST(Walker, TreesThatChangeStopsCancelsAndDepth) {
    Appliance app;
    app.Basic().WriteFile("/volume1/photo/secret");
    const auto reset = [&] {
        ASSERT_EQ(system(("rm -rf " + kTop + "/*").c_str()), 0);
        app.MakeDir(kTop + "/a/b/c").WriteFile(kTop + "/a/b/c/f").WriteFile(kTop + "/a/b/g").WriteFile(kTop + "/z");
        app.ClearLogs();
    };
    const auto names = [](const std::vector<Event> &events) {
        std::string text;
        for (const Event &e : events) {
            text += e.phase + ":" + e.real.substr(kTop.size() + 1) + " ";
        }
        return text;
    };

    // A folder swapped for a link to another share between its stat and its opening.
    reset();
    std::vector<Event> events;
    EXPECT_FALSE(RunWalk(kTopDown, IGNORE_ERR_PERMISSION, false, &events, kTop, nullptr, [&](const std::string &p, size_t) {
        if (p == kTop + "/a") {
            EXPECT_EQ(system(("mv " + kTop + "/a " + kTop + "/a.old && ln -s /volume1/photo " + kTop + "/a").c_str()), 0);
        }
        return true;
    }));
    for (const Event &e : events) {
        EXPECT_EQ(e.real.find("secret"), std::string::npos);
    }
    EXPECT_EQ(app.Logs(), (std::vector<LogLine>{{LOG_ERR, "norvodir.cpp:658 Failed to chdir /volume1/public/a. [Not a directory]"}}));

    // An entry gone between the reading of its folder and its stat.
    reset();
    events.clear();
    const auto removeSibling = [&](const std::string &p, size_t) {
        if (p == kTop + "/a/b/c" || p == kTop + "/a/b/g") {
            unlink((kTop + "/a/b/" + (p.back() == 'c' ? "g" : "c/f")).c_str());
            rmdir((kTop + "/a/b/c").c_str());
        }
        return true;
    };
    EXPECT_FALSE(RunWalk(kTopDown, IGNORE_ERR_PERMISSION, false, &events, kTop, nullptr, removeSibling));
    const std::vector<LogLine> logged = app.Logs();
    ASSERT_EQ(logged.size(), 1u);
    {
        EXPECT_EQ(logged[0].text.rfind("norvodir.cpp:691 VLIBCFileLStat: (/volume1/public/a/b/", 0), 0u);
        EXPECT_NE(logged[0].text.find("), No such file or directory, quiberr=600."), std::string::npos);
    }
    reset();
    EXPECT_TRUE(RunWalk(kTopDown, IGNORE_ERR_ALL, false, &events, kTop, nullptr, removeSibling));
    EXPECT_EQ(app.Logs(), std::vector<LogLine>{});

    // A callback that says stop: nothing more, not even the enclosing folders' post calls.
    reset();
    events.clear();
    EXPECT_FALSE(RunWalk(kPrePost, IGNORE_ERR_NONE, false, &events, kTop + "/a", nullptr,
                         [](const std::string &p, size_t) { return p != kTop + "/a/b/c/f"; }));
    EXPECT_EQ(events.back().real, kTop + "/a/b/c/f");
    EXPECT_EQ(names(events).find("post:a/b/c "), std::string::npos) << names(events);
    EXPECT_EQ(app.Logs(), std::vector<LogLine>{});

    // Cancelled in the first call: the walk counts as finished, the folder around still gets its
    // post call, nothing inside it is visited.
    int cancel = 0;
    events.clear();
    EXPECT_TRUE(RunWalk(kPrePost, IGNORE_ERR_NONE, false, &events, kTop + "/a", &cancel, [&](const std::string &, size_t) {
        cancel = 1;
        return true;
    }));
    EXPECT_EQ(names(events), "pre:a/b post:a/b ");
    cancel = 1;
    events.clear();
    EXPECT_TRUE(RunWalk(kFirstFolder, IGNORE_ERR_NONE, false, &events, kTop, &cancel));
    EXPECT_TRUE(events.empty());

    // A relative start is a bad parameter, never a walk of the working directory's tree.
    ASSERT_EQ(chdir(kTop.c_str()), 0);
    EXPECT_FALSE(RunWalk(kTopDown, IGNORE_ERR_ALL, false, &events, "a"));
    EXPECT_EQ(app.Logs(), (std::vector<LogLine>{{LOG_ERR, "norvodir.cpp:658 Bad parameter"}}));

    // 5,000 deep with 100 descriptors; a parked folder moved away ends its branch.
    reset();
    MakeChain(kTop + "/a", 5000, "d");
    EXPECT_EQ(app.RunAs("alice", [] {
        const rlimit few{100, 100};
        setrlimit(RLIMIT_NOFILE, &few);
        std::vector<Event> all;
        return RunWalk(kTopDown, IGNORE_ERR_NONE, false, &all) && all.size() == 5001 + 6 ? 1 : 0;
    }), 1);
    const std::string tenth = kTop + "/a/d/d/d/d/d/d/d/d/d/d";
    events.clear();
    EXPECT_FALSE(RunWalk(kTopDown, IGNORE_ERR_PERMISSION, false, &events, kTop + "/a", nullptr, [&](const std::string &p, size_t) {
        if (p.size() == tenth.size() + 100 * 2) {
            EXPECT_EQ(rename((tenth + "/d").c_str(), (kTop + "/moved").c_str()), 0);
        }
        return true;
    }));
    EXPECT_EQ(app.Logs(), (std::vector<LogLine>{{LOG_ERR, "norvodir.cpp:667 Failed to open " + tenth + ", error Stale file handle"}}));
}

}  // namespace
