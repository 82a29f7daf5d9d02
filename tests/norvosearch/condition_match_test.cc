// The in-memory tests of the conditions, asked about real files of a throwaway appliance.
#include <fcntl.h>
#include <stdint.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/norvosearch.h"
#include "quib_stat.h"

namespace {

using namespace FileSearch;
using Make = std::function<FindComp *()>;

class Match : public ::testing::Test {
protected:
    void SetUp() override { app.Basic(); }

    // Whether the condition lets path through, as a walk asks it.
    static bool Asks(FindComp &condition, const std::string &path) {
        QUIBSTAT st{};
        EXPECT_EQ(VLIBCFileLStat(path.c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st), 0) << path;
        return condition(path.c_str(), st);
    }
    static bool Asks(const Make &make, const std::string &path) {
        std::unique_ptr<FindComp> condition(make());
        return Asks(*condition, path);
    }
    // Every condition the factory makes for one field must hold.
    static bool AsksAll(FindFactory::_tag_FIND_FIELD_ field, const char *op, const char *value, const std::string &path) {
        std::vector<FindComp *> list;
        EXPECT_TRUE(FindFactory::createFindOp(field, op, value, list));
        bool all = true;
        for (FindComp *c : list) {
            all = all && Asks(*c, path);
            delete c;
        }
        return all;
    }

    norvo::testing::Appliance app;
};

TEST_F(Match, SizesAtTheToleranceEdges) {
    const struct {
        const char *op;
        long long size;
        long long fileSize;
        bool match;
    } cases[] = {
        {"equal", 100, 94, false}, {"equal", 100, 95, true}, {"equal", 100, 104, true}, {"equal", 100, 105, false},
        {"equal", 10, 8, false},   {"equal", 10, 9, true},   {"equal", 10, 10, true},   {"equal", 10, 11, false},
        {"equal", 0, 0, true},     {"equal", 0, 1, false},   {"less", 5, 4, true},      {"less", 5, 5, false},
        {"more", 5, 5, false},     {"more", 5, 6, true},     {"EQUAL", 100, 101, true}, {"EQUAL", 100, 100, false},
    };
    for (const auto &c : cases) {
        const std::string path = "/volume1/public/s" + std::to_string(c.fileSize);
        app.WriteFile(path, std::string(static_cast<size_t>(c.fileSize), 'x'));
        EXPECT_EQ(Asks([&] { return new FindSizeComp(c.op, c.size); }, path), c.match)
            << c.op << " " << c.size << " on " << c.fileSize;
    }
    // A directory has a size of its own on disk, but counts as empty.
    app.WriteFile("/volume1/public/dir/inside", std::string(4096, 'x'));
    EXPECT_TRUE(Asks([] { return new FindSizeComp("equal", 0); }, "/volume1/public/dir"));
    EXPECT_FALSE(Asks([] { return new FindSizeComp("more", 0); }, "/volume1/public/dir"));
}

TEST_F(Match, TimesBeforeAndAfter) {
    const std::string path = "/volume1/public/old.txt";
    app.WriteFile(path, "x");
    const timespec times[2] = {{1000000000, 0}, {-100, 0}};  // atime, mtime (before 1970)
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW), 0);
    const long now = static_cast<long>(time(nullptr));
    const struct {
        Make make;
        bool match;
    } cases[] = {
        {[] { return new FindMTimeComp("before", -100); }, false},
        {[] { return new FindMTimeComp("before", -99); }, true},
        {[] { return new FindMTimeComp("after", -100); }, true},
        {[] { return new FindMTimeComp("after", -99); }, false},
        {[] { return new FindMTimeComp("BEFORE", 0); }, true},
        {[] { return new FindATimeComp("before", 1000000000); }, false},
        {[] { return new FindATimeComp("since", 1000000000); }, true},
        {[] { return new FindATimeComp("before", 1000000001); }, true},
        {[=] { return new FindCRTimeComp("after", now - 60); }, true},
        {[=] { return new FindCRTimeComp("before", now - 60); }, false},
        {[=] { return new FindCRTimeComp("Before", now + 3600); }, true},
    };
    for (size_t i = 0; i < std::size(cases); ++i) {
        EXPECT_EQ(Asks(cases[i].make, path), cases[i].match) << "case " << i;
    }
    EXPECT_TRUE(AsksAll(FindFactory::FIND_FIELD_MTIME, "before", "-99", path));  // read as unsigned, cut to long

    // Times beyond 32 bits saturate; they never wrap round.
    const timespec far[2] = {{-(1LL << 33), 0}, {1LL << 33, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), far, 0), 0);
    EXPECT_TRUE(Asks([] { return new FindMTimeComp("after", INT32_MAX); }, path));
    EXPECT_TRUE(Asks([] { return new FindATimeComp("before", INT32_MIN + 1); }, path));
}

TEST_F(Match, OwnersAndGroupsOfRealUsers) {
    app.WriteFile("/volume1/public/a.txt", "x", "alice:staff");
    app.WriteFile("/volume1/public/r.txt", "x", "root");
    const unsigned alice = app.Uid("alice"), bob = app.Uid("bob");
    const unsigned staff = app.Gid("staff"), users = app.Gid("users");
    EXPECT_TRUE(Asks([=] { return new FindUserComp("alice", alice); }, "/volume1/public/a.txt"));
    EXPECT_FALSE(Asks([=] { return new FindUserComp("bob", bob); }, "/volume1/public/a.txt"));
    EXPECT_TRUE(Asks([] { return new FindUserComp("root", 0); }, "/volume1/public/r.txt"));
    EXPECT_TRUE(Asks([=] { return new FindGroupComp("staff", staff); }, "/volume1/public/a.txt"));
    EXPECT_FALSE(Asks([=] { return new FindGroupComp("users", users); }, "/volume1/public/a.txt"));
    EXPECT_TRUE(AsksAll(FindFactory::FIND_FIELD_USER, nullptr, "alice", "/volume1/public/a.txt"));
    EXPECT_FALSE(AsksAll(FindFactory::FIND_FIELD_GROUP, nullptr, "users", "/volume1/public/a.txt"));

    // The id a failed lookup leaves never matches, not even a file that carries it.
    QUIBSTAT st{};
    st.st_uid = 0xFFFFFFFFu;
    st.st_gid = 0xFFFFFFFFu;
    EXPECT_FALSE(FindUserComp("x", 0xFFFFFFFFu)("/x", st));
    EXPECT_FALSE(FindGroupComp("x", 0xFFFFFFFFu)("/x", st));
}

TEST_F(Match, TypesOfDirectoriesLinksAndDevices) {
    app.WriteFile("/volume1/public/d/f.txt", "x");
    ASSERT_EQ(symlink("f.txt", "/volume1/public/d/to-file"), 0);
    ASSERT_EQ(symlink("/volume1/public/d", "/volume1/public/to-dir"), 0);
    ASSERT_EQ(mkfifo("/volume1/public/d/fifo", 0644), 0);
    const struct {
        std::string path;
        bool dir;
        bool file;
    } cases[] = {
        {"/volume1/public/d", true, false},           {"/volume1/public/d/", true, false},
        {"/volume1/public/d/f.txt", false, true},     {"/volume1/public/d/to-file", false, false},
        {"/volume1/public/to-dir", false, false},     {"/volume1/public/d/fifo", false, false},
        {"/dev/null", false, false},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(Asks([] { return FindTypeCompFactory::createFindTypeOpt("dir"); }, c.path), c.dir) << c.path;
        EXPECT_EQ(Asks([] { return FindTypeCompFactory::createFindTypeOpt("FILE"); }, c.path), c.file) << c.path;
    }
    EXPECT_EQ(FindTypeCompFactory::createFindTypeOpt("directory"), nullptr);
    EXPECT_EQ(FindTypeCompFactory::createFindTypeOpt(nullptr), nullptr);
}

TEST_F(Match, NamesByTheirLastComponent) {
    app.WriteFile("/volume1/public/abc/xABCx", "x");
    app.WriteFile("/volume1/public/abc/a*c", "x");
    app.WriteFile("/volume1/public/abc/na\xff", "x");
    const std::string longTerm(10000, 'n');
    const std::string longName(492, 'n');
    const struct {
        const char *term;
        std::string path;
        bool match;
    } cases[] = {
        {"abc", "/volume1/public/abc/xABCx", true},
        {"abc", "/volume1/public/abc/a*c", false},
        {"abc", "/volume1/public/abc/", true},  // a trailing slash: the folder's own name
        {"abc", "/volume1/public/abc//", true},
        {"abc", "abc", true},
        {"a*c", "/volume1/public/abc", true},
        {"a*c", "/volume1/public/abc/xABCx", false},
        {"a\\*c", "/volume1/public/abc/a*c", true},
        {"a\\*c", "/volume1/public/abc", false},
        {"a\\\\*", "/volume1/public/abc/a*c", true},  // doubled backslash: an escaped star again
        {"a\\\\*", "/volume1/public/abc", false},
        {"\xff", "/volume1/public/abc/na\xff", true},
        {"", "/", true},  // no pattern: only an empty name fits
        {"", "/volume1/public/abc", false},
        // The in-memory pattern keeps 493 bytes: "*" and 492 of the term's.
        {longTerm.c_str(), "/x/" + longName, true},
        {longTerm.c_str(), "/x/" + longName.substr(1), false},
    };
    const QUIBSTAT unread{};
    for (const auto &c : cases) {
        FindNameComp condition(c.term);
        EXPECT_EQ(condition(c.path.c_str(), unread), c.match) << c.term << " on " << c.path;
    }
    EXPECT_FALSE(FindNameComp("abc")(nullptr, unread));
}

}  // namespace
