// The file index's result databases: condition chains select what the in-memory conditions
// accept, LIKE is the name matcher, pages are stable, and foreign or damaged files are refused.
#include <fcntl.h>
#include <pwd.h>
#include <grp.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "fileidx.h"
#include "norvo/norvomisc.h"
#include "norvo/norvosearch.h"
#include "platform_test_util.h"
#include "quib_stat.h"
#include "vlibc_exec.h"
#include "vlibc_unicode.h"

namespace {

using namespace FileSearch;
using norvo::testing::Failed;

const std::string kDb = "/volume1/public/hits.db";

FI_FILE_INFO_DATA Hit(const std::string &share, const std::string &path) {
    FI_FILE_INFO_DATA r{};
    const size_t slash = path.rfind('/');
    snprintf(r.share, sizeof r.share, "%s", share.c_str());
    snprintf(r.path, sizeof r.path, "%s", path.c_str());
    snprintf(r.name, sizeof r.name, "%s", path.substr(slash == std::string::npos ? 0 : slash + 1).c_str());
    snprintf(r.parentPath, sizeof r.parentPath, "%s", slash == std::string::npos ? "" : path.substr(0, slash).c_str());
    snprintf(r.realPath, sizeof r.realPath, "/volume1/%s", share.c_str());
    return r;
}

// A condition record; andNext and orNext are linked by the caller.
__tag_FI_SQL_COND Cond(__tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op, const std::string &value) {
    __tag_FI_SQL_COND c{};
    setSqlCond(c, type, op, value, nullptr, nullptr);
    return c;
}

// The hits of a query in the order selected, as share:path.
std::vector<std::string> Select(const FI_QUERY &query, const unsigned long long *limit = nullptr,
                                const unsigned long long *offset = nullptr) {
    std::vector<std::string> hits;
    const auto collect = [](FI_FILE_INFO_DATA *r, void *arg) {
        static_cast<std::vector<std::string> *>(arg)->push_back(std::string(r->share) + ":" + r->path);
        return 1;
    };
    EXPECT_EQ(FILEIDXDBSelect(kDb.c_str(), &query, collect, &hits, limit, offset, 0), 0) << std::hex << VLIBCErrGet();
    return hits;
}
std::vector<std::string> Where(__tag_FI_SQL_COND *where) {
    FI_QUERY query{};
    query.where = where;
    return Select(query);
}

class FileIdx : public ::testing::Test {
protected:
    void SetUp() override {
        app.Basic();
        ASSERT_EQ(FILEIDXDBCreate(kDb.c_str()), 0);
    }
    void Insert(const std::vector<FI_FILE_INFO_DATA> &hits) {
        ASSERT_EQ(FILEIDXDBInsert(kDb.c_str(), hits.data(), static_cast<int>(hits.size())), 0);
    }
    norvo::testing::Appliance app;
};

// Generated files of every kind the conditions tell apart, stored as the search walker stores
// them; then for each request field (alone and in conjunctions, joined as the walker joins
// them) the SQL selects exactly the files the in-memory tests accept.
TEST_F(FileIdx, ChainsSelectWhatTheConditionsAccept) {
    std::mt19937 random(11);
    const auto pick = [&](const auto &list) { return list[random() % list.size()]; };
    const std::vector<std::string> pieces{"a", "A", "b", "é", "É", "ß", "*", "?", "%", "_", "\\", "\n", "\xff", "\xc3", ".txt", ".PNG", "x"};
    const std::vector<std::string> owners{"root:root", "alice:staff", "bob:users", "admin:administrators", "alice:users"};
    const std::vector<long> times{-100, 0, 1000000000, 1500000000, 2000000000};
    const std::vector<size_t> sizes{0, 1, 9, 10, 11, 95, 100, 104, 105};
    std::vector<std::string> files;
    std::vector<FI_FILE_INFO_DATA> hits;
    for (int i = 0; i < 240; ++i) {
        std::string name;
        for (int n = 1 + static_cast<int>(random() % 3); n > 0; --n) {
            name += pick(pieces);
        }
        const std::string path = "/volume1/public/gen/d" + std::to_string(i % 8) + "/" + name;
        if (std::find(files.begin(), files.end(), path) != files.end()) {
            continue;
        }
        if (random() % 4 == 0) {
            app.MakeDir(path, pick(owners));
        } else {
            app.WriteFile(path, std::string(pick(sizes), 'x'), pick(owners));
        }
        const timespec stamps[2] = {{pick(times), 0}, {pick(times), 0}};
        ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), stamps, AT_SYMLINK_NOFOLLOW), 0);
        QUIBSTAT st{};
        ASSERT_EQ(VLIBCFileLStat(path.c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st), 0);
        FI_FILE_INFO_DATA hit = Hit("public", path.substr(strlen("/volume1/public/")));
        hit.isDir = S_ISDIR(st.st_mode);
        hit.size = hit.isDir ? 0 : st.st_size;  // as the in-memory test counts a directory
        hit.crtime = st.st_crtim.tv_sec, hit.ctime = st.st_ctim.tv_sec;
        hit.atime = st.st_atim.tv_sec, hit.mtime = st.st_mtim.tv_sec;
        hit.mode = st.st_mode, hit.uid = st.st_uid, hit.gid = st.st_gid;
        snprintf(hit.userName, sizeof hit.userName, "%s", getpwuid(st.st_uid)->pw_name);
        snprintf(hit.groupName, sizeof hit.groupName, "%s", getgrgid(st.st_gid)->gr_name);
        files.push_back(path);
        hits.push_back(hit);
    }
    Insert(hits);
    QUIBSTAT first{};
    ASSERT_EQ(VLIBCFileLStat(files[0].c_str(), QUIB_STAT_CRTIME, &first), 0);
    const std::string born = std::to_string(first.st_crtim.tv_sec);
    using F = FindFactory;
    const struct Field {
        F::_tag_FIND_FIELD_ field;
        std::string op, value;
    } fields[] = {
        {F::FIND_FIELD_NAME, "", "a"}, {F::FIND_FIELD_NAME, "", "A*"}, {F::FIND_FIELD_NAME, "", "*é*"},
        {F::FIND_FIELD_NAME, "", "\"ß\""}, {F::FIND_FIELD_NAME, "", "a, b"}, {F::FIND_FIELD_NAME, "", "x,\"b\",é"},
        {F::FIND_FIELD_NAME, "", "\"a\",\"b\""}, {F::FIND_FIELD_NAME, "", "?"}, {F::FIND_FIELD_NAME, "", "%"},
        {F::FIND_FIELD_NAME, "", "_"}, {F::FIND_FIELD_NAME, "", "\\\\"}, {F::FIND_FIELD_NAME, "", "a\\*"},
        {F::FIND_FIELD_NAME, "", "*\\"}, {F::FIND_FIELD_NAME, "", "*.txt"}, {F::FIND_FIELD_NAME, "", "\n"},
        {F::FIND_FIELD_NAME, "", "\xff"}, {F::FIND_FIELD_NAME, "", "?\xc3*"},
        {F::FIND_FIELD_TYPE, "dir", ""}, {F::FIND_FIELD_TYPE, "FILE", ""},
        {F::FIND_FIELD_EXT, "", "txt,png"}, {F::FIND_FIELD_EXT, "", "PNG"},
        {F::FIND_FIELD_USER, "", "alice"}, {F::FIND_FIELD_USER, "", "root"},
        {F::FIND_FIELD_GROUP, "", "staff"}, {F::FIND_FIELD_GROUP, "", "users"},
        {F::FIND_FIELD_MTIME, "before", "0"}, {F::FIND_FIELD_MTIME, "after", "1500000000"},
        {F::FIND_FIELD_MTIME, "Before", "18446744073709551517"}, {F::FIND_FIELD_ATIME, "before", "1000000000"},
        {F::FIND_FIELD_ATIME, "after", "0"}, {F::FIND_FIELD_CRTIME, "before", born},
        {F::FIND_FIELD_CRTIME, "after", born},
        {F::FIND_FIELD_SIZE, "equal", "100"}, {F::FIND_FIELD_SIZE, "equal", "10"}, {F::FIND_FIELD_SIZE, "equal", "0"},
        {F::FIND_FIELD_SIZE, "less", "10"}, {F::FIND_FIELD_SIZE, "more", "100"}, {F::FIND_FIELD_SIZE, "EQUAL", "100"},
    };
    const size_t n = std::size(fields);
    std::vector<std::vector<size_t>> queries;
    for (size_t i = 0; i < n; ++i) {
        queries.push_back({i});
        queries.push_back({i, (i + n / 2) % n});
        queries.push_back({i, (i + 11) % n, (i + 23) % n});
    }
    size_t informative = 0;  // queries that tell some files apart
    for (const auto &chosen : queries) {
        std::vector<FindComp *> conds;
        std::string label;
        for (const size_t i : chosen) {
            ASSERT_TRUE(FindFactory::createFindOp(fields[i].field, fields[i].op.c_str(), fields[i].value.c_str(), conds));
            label += "[" + fields[i].op + " " + fields[i].value + "]";
        }
        std::vector<std::string> accepted;
        for (size_t f = 0; f < files.size(); ++f) {
            QUIBSTAT st{};
            ASSERT_EQ(VLIBCFileLStat(files[f].c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st), 0);
            if (std::all_of(conds.begin(), conds.end(), [&](FindComp *c) { return (*c)(files[f].c_str(), st); })) {
                accepted.push_back(std::string("public:") + hits[f].path);
            }
        }
        for (size_t i = 1; i < conds.size(); ++i) {
            (*conds[i - 1])(conds[i]);
        }
        EXPECT_EQ(Where(conds.empty() ? nullptr : conds[0]->getFirstCond()), accepted) << label;
        informative += !accepted.empty() && accepted.size() < files.size();
        for (FindComp *c : conds) {
            delete c;
        }
    }
    EXPECT_GT(informative, queries.size() / 2);
}

// The chain's shape decides, not the order of records: alternatives through orNext, and an
// andNext anywhere among them holds for the whole group. Paths match by components.
TEST_F(FileIdx, ChainShapesAndPaths) {
    std::vector<FI_FILE_INFO_DATA> hits;
    for (const char *path : {"a", "ab", "a/b", "a/b/c", "a*b/x", "*/x", "a\\b/c", "A/b"}) {
        hits.push_back(Hit("s", path));
        hits.push_back(Hit("t", path));
    }
    Insert(hits);
    // path AND share; the records live on the heap, so the link survives the return.
    auto c = [](const char *share, __tag_FI_SQL_COND_OP op, const char *path) {
        std::vector<__tag_FI_SQL_COND> r{Cond(FI_COND_PATH, op, path), Cond(FI_COND_SHARE, FI_OP_EQ, share)};
        r[0].andNext = &r[1];
        return r;
    };
    const struct {
        __tag_FI_SQL_COND_OP op;
        const char *pattern;
        std::vector<std::string> paths;
    } cases[] = {
        {FI_OP_PATH_LIKE, "a/*", {"s:a/b", "s:a/b/c"}},
        {FI_OP_PATH_LIKE, "a/*/*", {"s:a/b/c"}},
        {FI_OP_PATH_LIKE, "*/*", {"s:a/b", "s:a/b/c", "s:a*b/x", "s:*/x", "s:a\\b/c", "s:A/b"}},
        {FI_OP_PATH_LIKE, "a*b/*", {"s:a*b/x"}},
        {FI_OP_PATH_LIKE, "\\*/*", {"s:*/x"}},
        {FI_OP_PATH_LIKE, "a\\\\b/*", {"s:a\\b/c"}},
        {FI_OP_PATH_LIKE, "*/b", {"s:a/b", "s:A/b"}},
        {FI_OP_PATH_NOT_LIKE, "*/*", {"s:a", "s:ab"}},
        {FI_OP_PATH_NOT_LIKE, "a/*/*", {"s:a", "s:ab", "s:a/b", "s:a*b/x", "s:*/x", "s:a\\b/c", "s:A/b"}},
    };
    for (const auto &k : cases) {
        auto chain = c("s", k.op, k.pattern);
        EXPECT_EQ(Where(&chain[0]), k.paths) << k.pattern;
    }
    // (a or ab) and share t, with the andNext on the first alternative or on the last.
    for (int on : {0, 1}) {
        __tag_FI_SQL_COND r[3] = {Cond(FI_COND_PATH, FI_OP_EQ, "a"), Cond(FI_COND_PATH, FI_OP_EQ, "ab"),
                                  Cond(FI_COND_SHARE, FI_OP_EQ, "t")};
        r[0].orNext = &r[1];
        r[on].andNext = &r[2];
        EXPECT_EQ(Where(&r[0]), (std::vector<std::string>{"t:a", "t:ab"})) << on;
    }
    // The longest chains, of andNext or of orNext, work; one record more is refused.
    unsigned long long total = 0;
    std::vector<__tag_FI_SQL_COND> many(FILEIDX_MAX_CONDS + 1, Cond(FI_COND_SIZE, FI_OP_GE, "0"));
    for (const bool viaOr : {false, true}) {
        for (size_t i = 0; i + 1 < many.size(); ++i) {
            many[i].andNext = viaOr ? nullptr : &many[i + 1];
            many[i].orNext = viaOr ? &many[i + 1] : nullptr;
        }
        FI_QUERY longest{&many[1], 0, {}}, tooLong{&many[0], 0, {}};
        EXPECT_EQ(OUTCOME(FILEIDXCountGet(kDb.c_str(), &longest, &total)).rc, 0);
        EXPECT_EQ(total, hits.size());
        EXPECT_EQ(OUTCOME(FILEIDXCountGet(kDb.c_str(), &tooLong, &total)), Failed(QUIB_ERR_BAD_PARAMETER));
    }
    // Refused chains: a cycle, an unknown column or op, a malformed number.
    __tag_FI_SQL_COND bad[] = {Cond(FI_COND_PATH, FI_OP_EQ, "a"), Cond(static_cast<__tag_FI_SQL_COND_TYPE>(1), FI_OP_EQ, "a"),
                               Cond(FI_COND_PATH, static_cast<__tag_FI_SQL_COND_OP>(3), "a"),
                               Cond(FI_COND_SIZE, FI_OP_EQ, "-1"), Cond(FI_COND_SIZE, FI_OP_EQ, "18446744073709551616")};
    bad[0].orNext = &bad[0];
    for (__tag_FI_SQL_COND &b : bad) {
        FI_QUERY query{&b, 0, {}};
        EXPECT_EQ(OUTCOME(FILEIDXCountGet(kDb.c_str(), &query, &total)), Failed(QUIB_ERR_BAD_PARAMETER));
        EXPECT_EQ(OUTCOME(FILEIDXDBDel(kDb.c_str(), &b)), Failed(QUIB_ERR_BAD_PARAMETER));
    }
    EXPECT_EQ(OUTCOME(FILEIDXDBDel(kDb.c_str(), nullptr)), Failed(QUIB_ERR_BAD_PARAMETER));

    // Update: rename s:a/b to s:a/z; a set list that would give two hits one key changes nothing.
    auto key = c("s", FI_OP_EQ, "a/b");
    __tag_FI_SQL_COND set[2] = {Cond(FI_COND_PATH, FI_OP_EQ, "a/z"), Cond(FI_COND_SIZE, FI_OP_EQ, "18446744073709551615")};
    set[0].orNext = &set[1];
    ASSERT_EQ(FILEIDXDBUpdate(kDb.c_str(), set, &key[0]), 0);
    auto moved = c("s", FI_OP_EQ, "a/z");
    FI_QUERY bySize{&moved[0], 0, {}};
    const auto size = [](FI_FILE_INFO_DATA *r, void *arg) { return *static_cast<long long *>(arg) = r->size, 1; };
    long long found = 0;
    ASSERT_EQ(FILEIDXDBSelect(kDb.c_str(), &bySize, size, &found, nullptr, nullptr, 0), 0);
    EXPECT_EQ(found, -1);
    __tag_FI_SQL_COND clash = Cond(FI_COND_PATH, FI_OP_EQ, "ab");
    EXPECT_EQ(OUTCOME(FILEIDXDBUpdate(kDb.c_str(), &clash, &moved[0])), Failed(QUIB_ERR_FAILED));
    EXPECT_EQ(Where(&moved[0]), (std::vector<std::string>{"s:a/z"}));
    // Delete a folder and what lies below it, sparing its namesake prefix and the other share.
    auto folder = c("s", FI_OP_PATH_LIKE, "a/*");
    ASSERT_EQ(FILEIDXDBDel(kDb.c_str(), &folder[0]), 0);
    __tag_FI_SQL_COND inS = Cond(FI_COND_SHARE, FI_OP_EQ, "s");
    EXPECT_EQ(Where(&inS), (std::vector<std::string>{"s:a", "s:ab", "s:a*b/x", "s:*/x", "s:a\\b/c", "s:A/b"}));
}

// Every sort key in both directions over many equal keys: pages of any size put together give
// the whole ordered list, each hit once, settled by storage order.
TEST_F(FileIdx, PagesNeverRepeatOrSkip) {
    std::mt19937 random(3);
    const std::vector<std::string> words{"a", "A", "b", "ä", "Ä", "", "ss", "ß"};
    const auto word = [&] { return words[random() % words.size()]; };
    std::vector<FI_FILE_INFO_DATA> hits;
    for (int i = 0; i < 90; ++i) {
        FI_FILE_INFO_DATA r = Hit(word() + "s", std::to_string(i));
        snprintf(r.name, sizeof r.name, "%s", word().c_str());
        snprintf(r.parentPath, sizeof r.parentPath, "%s", word().c_str());
        snprintf(r.type, sizeof r.type, "%s", word().c_str());
        snprintf(r.posix, sizeof r.posix, "%s", word().c_str());
        snprintf(r.userName, sizeof r.userName, "%s", word().c_str());
        snprintf(r.groupName, sizeof r.groupName, "%s", word().c_str());
        r.isDir = static_cast<int>(random() % 2);
        r.size = static_cast<long long>(random() % 3) - 1;
        r.crtime = r.ctime = r.atime = r.mtime = static_cast<long long>(random() % 3) * 1000000000000LL - 1;
        r.mode = r.uid = r.gid = static_cast<unsigned>(random() % 2) * 0x80000000u;
        hits.push_back(r);
    }
    Insert(hits);
    const auto text = [](const FI_FILE_INFO_DATA &r, int type) -> const char * {
        switch (type) {
            case FI_COND_NAME: return r.name;
            case FI_COND_REAL_PATH: return r.realPath;
            case FI_COND_PARENT_PATH: return r.parentPath;
            case FI_COND_SHARE: return r.share;
            case FI_COND_PATH: return r.path;
            case FI_COND_TYPE: return r.type;
            case FI_COND_POSIX: return r.posix;
            case FI_COND_USER_NAME: return r.userName;
            case FI_COND_GROUP_NAME: return r.groupName;
            default: return nullptr;
        }
    };
    const auto number = [](const FI_FILE_INFO_DATA &r, int type) -> long long {
        const long long values[] = {0, 0, 0, 0, 0, 0, r.isDir, r.size, 0, r.crtime, r.ctime, r.atime, r.mtime, 0, r.mode, r.uid, r.gid};
        return values[type];
    };
    std::vector<std::vector<FI_SORT_KEY>> orders;
    for (int type = 0; type <= 18; ++type) {
        if (type != 1) {
            orders.push_back({{static_cast<__tag_FI_SQL_COND_TYPE>(type), 0}});
            orders.push_back({{static_cast<__tag_FI_SQL_COND_TYPE>(type), 1}});
        }
    }
    orders.push_back({{FI_COND_SHARE, 1}, {FI_COND_PARENT_PATH, 1}});  // "ppath"
    orders.push_back({});
    for (const auto &order : orders) {
        std::vector<FI_FILE_INFO_DATA> sorted = hits;
        std::stable_sort(sorted.begin(), sorted.end(), [&](const FI_FILE_INFO_DATA &x, const FI_FILE_INFO_DATA &y) {
            for (const FI_SORT_KEY &k : order) {
                const int c = text(x, k.type) ? VLIBCUnicodeUTF8StrCaseCmp(text(x, k.type), text(y, k.type))
                                              : (number(x, k.type) > number(y, k.type)) - (number(x, k.type) < number(y, k.type));
                if (c != 0) {
                    return k.desc ? c > 0 : c < 0;
                }
            }
            return false;
        });
        std::vector<std::string> expected;
        for (const FI_FILE_INFO_DATA &r : sorted) {
            expected.push_back(std::string(r.share) + ":" + r.path);
        }
        FI_QUERY query{nullptr, static_cast<unsigned>(order.size()), {}};
        std::copy(order.begin(), order.end(), query.sort);
        const std::string label = order.empty() ? "none" : std::to_string(order[0].type) + (order[0].desc ? " desc" : "");
        for (const unsigned long long limit : {4ULL, 25ULL}) {
            std::vector<std::string> pages;
            for (unsigned long long offset = 0; offset < hits.size() + limit; offset += limit) {
                const auto page = Select(query, &limit, &offset);
                ASSERT_LE(page.size(), limit);
                pages.insert(pages.end(), page.begin(), page.end());
            }
            EXPECT_EQ(pages, expected) << label << " by " << limit;
        }
    }
    const unsigned long long zero = 0;
    FI_QUERY all{};
    EXPECT_TRUE(Select(all, &zero).empty());
    unsigned long long total = 0;
    ASSERT_EQ(FILEIDXCountGet(kDb.c_str(), &all, &total), 0);
    EXPECT_EQ(total, hits.size());
}

// A walk's batches: readers see each committed batch while the walk goes on; closing keeps the rest.
TEST_F(FileIdx, OutputBatchesCommitAsTheyFill) {
    FI_OUTPUT_DB *out = nullptr;
    ASSERT_EQ(FILEIDXOutputDBOpen(kDb.c_str(), &out), 0);
    const auto count = [] {
        FI_QUERY all{};
        unsigned long long total = 0;
        EXPECT_EQ(FILEIDXCountGet(kDb.c_str(), &all, &total), 0);
        return total;
    };
    for (int i = 0; i < FILEIDX_OUTPUT_BATCH + 3; ++i) {
        const FI_FILE_INFO_DATA hit = Hit("s", std::to_string(i));
        ASSERT_EQ(FILEIDXOutputDBInsert(out, &hit), 0);
    }
    EXPECT_EQ(count(), FILEIDX_OUTPUT_BATCH);
    ASSERT_EQ(FILEIDXOutputDBCommit(out), 0);
    EXPECT_EQ(count(), FILEIDX_OUTPUT_BATCH + 3);
    const FI_FILE_INFO_DATA last = Hit("s", "last");
    ASSERT_EQ(FILEIDXOutputDBInsert(out, &last), 0);
    ASSERT_EQ(FILEIDXOutputDBClose(out), 0);
    EXPECT_EQ(count(), FILEIDX_OUTPUT_BATCH + 4);
}

// Databases are made 0600 for their creator, never through a link; files that are not ours,
// links, and damaged files are refused with a code, never a crash.
TEST_F(FileIdx, ForeignLinkedOrDamagedFilesAreRefused) {
    app.MakeDir("/volume1/public/tasks", "root", 0777);
    const char *mine = "/volume1/public/tasks/mine";
    ASSERT_EQ(app.RunAs("alice", [&] { return FILEIDXDBCreate(mine); }), 0);
    struct stat st;
    ASSERT_EQ(stat(mine, &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0600u);
    EXPECT_EQ(st.st_uid, app.Uid("alice"));
    const FI_FILE_INFO_DATA hit = Hit("s", "p");
    EXPECT_EQ(app.RunAs("alice", [&] { return FILEIDXDBInsert(mine, &hit, 1); }), 0);
    // bob may write in the folder, but not use alice's database nor slip a journal beside it.
    EXPECT_EQ(app.RunAs("bob", [&] { return FILEIDXDBInsert(mine, &hit, 1) == -1 ? VLIBCErrGet() >> 8 : 0; }), 0x03);
    ASSERT_EQ(app.RunAs("bob", [&] { return creat("/volume1/public/tasks/mine-wal", 0666) >= 0 ? 0 : 1; }), 0);
    EXPECT_EQ(app.RunAs("alice", [&] { return FILEIDXDBInsert(mine, &hit, 1) == -1 ? VLIBCErrGet() >> 8 : 0; }), 0x03);
    unlink("/volume1/public/tasks/mine-wal");
    // A journal planted before the database is made: refused, and neither file left behind
    // nor the planted one taken away.
    ASSERT_EQ(app.RunAs("bob", [&] { return creat("/volume1/public/tasks/next-wal", 0666) >= 0 ? 0 : 1; }), 0);
    EXPECT_EQ(app.RunAs("alice", [&] { return FILEIDXDBCreate("/volume1/public/tasks/next") == -1 ? VLIBCErrGet() >> 8 : 0; }), 0x03);
    EXPECT_EQ(access("/volume1/public/tasks/next-wal", F_OK), 0);
    EXPECT_NE(access("/volume1/public/tasks/next", F_OK), 0);

    ASSERT_EQ(symlink("/volume1/public/tasks", "/volume1/public/link"), 0);
    ASSERT_EQ(symlink(kDb.c_str(), "/volume1/public/tasks/db-link"), 0);
    std::ofstream("/volume1/public/tasks/junk") << std::string(8192, 'j');
    std::ofstream("/volume1/public/tasks/cut") << std::ifstream(kDb, std::ios::binary).rdbuf();
    ASSERT_EQ(truncate("/volume1/public/tasks/cut", 100), 0);
    const struct {
        const char *path;
        int create, use;
    } cases[] = {
        {"/volume1/public/link/new", QUIB_ERR_ACCESS_DENIED, QUIB_ERR_ACCESS_DENIED},
        {"/volume1/public/tasks/db-link", QUIB_ERR_ACCESS_DENIED, QUIB_ERR_ACCESS_DENIED},
        {"/volume1/public/missing/db", QUIB_ERR_NO_SUCH_FILE, QUIB_ERR_NO_SUCH_FILE},
        {"/volume1/public/tasks/junk", QUIB_ERR_ACCESS_DENIED, QUIB_ERR_FAILED},
        {"/volume1/public/tasks/cut", QUIB_ERR_ACCESS_DENIED, QUIB_ERR_FAILED},
        {"", QUIB_ERR_BAD_PARAMETER, QUIB_ERR_BAD_PARAMETER},
    };
    FI_QUERY all{};
    unsigned long long total = 0;
    for (const auto &k : cases) {
        EXPECT_EQ(OUTCOME(FILEIDXDBCreate(k.path)), Failed(k.create)) << k.path;
        EXPECT_EQ(OUTCOME(FILEIDXCountGet(k.path, &all, &total)), Failed(k.use)) << k.path;
        EXPECT_EQ(OUTCOME(FILEIDXDBInsert(k.path, &hit, 1)), Failed(k.use)) << k.path;
    }
    EXPECT_FALSE(std::ifstream("/volume1/public/tasks/new").good());
}

// A full volume: the insert that does not fit says so (0x2900) and changes nothing; what was
// stored stays readable, and a walk's handle keeps its committed batches.
TEST_F(FileIdx, AFullVolumeKeepsTheDatabase) {
    const std::string dir = "/volume1/public/small", db = dir + "/hits.db";
    app.MakeDir(dir);
    ASSERT_EQ(mount("tmpfs", dir.c_str(), "tmpfs", 0, "size=256k"), 0);
    ASSERT_EQ(FILEIDXDBCreate(db.c_str()), 0);
    FI_QUERY all{};
    unsigned long long total = 0;
    std::vector<FI_FILE_INFO_DATA> batch(8);
    int stored = 0;
    for (int code = 0; code == 0; stored += 8) {
        for (FI_FILE_INFO_DATA &hit : batch) {
            hit = Hit("s", std::to_string(stored + (&hit - batch.data())) + "/" + std::string(4000, 'x'));
        }
        code = FILEIDXDBInsert(db.c_str(), batch.data(), 8);
        if (code != 0) {
            EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SPACE);
            break;
        }
    }
    ASSERT_EQ(FILEIDXCountGet(db.c_str(), &all, &total), 0);
    EXPECT_EQ(total, static_cast<unsigned long long>(stored));
    FI_OUTPUT_DB *out = nullptr;
    ASSERT_EQ(FILEIDXOutputDBOpen(db.c_str(), &out), 0);
    const FI_FILE_INFO_DATA more = Hit("t", std::string(4000, 'y'));
    EXPECT_EQ(OUTCOME(FILEIDXOutputDBInsert(out, &more) || FILEIDXOutputDBCommit(out)).rc, 1);
    EXPECT_EQ(FILEIDXOutputDBClose(out), -1);
    ASSERT_EQ(FILEIDXCountGet(db.c_str(), &all, &total), 0);
    EXPECT_EQ(total, static_cast<unsigned long long>(stored));
    umount2(dir.c_str(), MNT_DETACH);
}

// The sqlite3 shell reads what we wrote; VLIBCExec passes arguments untouched, with a clean
// environment and no stray descriptors, and reports how the program ended.
TEST_F(FileIdx, ShellReadsTheDatabaseThroughExec) {
    FI_FILE_INFO_DATA hit = Hit("photo", "2013/a'; DROP TABLE fileinfo; --.jpg");
    hit.size = 42;
    Insert({hit});
    const char *shell[] = {"sqlite3", "-readonly", kDb.c_str(), ".output /volume1/public/out",
                           "SELECT share, name, size FROM fileinfo;", nullptr};
    ASSERT_EQ(VLIBCExec("/usr/bin/sqlite3", shell), 0);
    EXPECT_EQ(norvo::testing::ReadFile("/volume1/public/out"), "photo|a'; DROP TABLE fileinfo; --.jpg|42\n");

    setenv("HTTP_X", "() { :; }; echo owned", 1);
    ASSERT_EQ(dup2(2, 50), 50);
    const char *env[] = {"sh", "-c", "test -z \"$HTTP_X\" && test \"$PATH\" = /usr/sbin:/usr/bin:/sbin:/bin && test ! -e /proc/self/fd/50", nullptr};
    EXPECT_EQ(VLIBCExec("/bin/sh", env), 0);
    close(50);
    const char *seven[] = {"sh", "-c", "exit 7", nullptr};
    EXPECT_EQ(VLIBCExec("/bin/sh", seven), 7);
    const char *killed[] = {"sh", "-c", "kill -9 $$", nullptr};
    EXPECT_EQ(OUTCOME(VLIBCExec("/bin/sh", killed)), Failed(QUIB_ERR_FAILED));
    EXPECT_EQ(OUTCOME(VLIBCExec("/bin/no-such", seven)), Failed(QUIB_ERR_NO_SUCH_FILE));
    EXPECT_EQ(OUTCOME(VLIBCExec("sh", seven)), Failed(QUIB_ERR_BAD_PARAMETER));
}

}  // namespace
