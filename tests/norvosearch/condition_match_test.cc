// The in-memory tests of the conditions, asked about real files as a walk reads them. What each
// condition decides on any record is the find_factory fuzzer's; here what the records of real
// files hold: birth times, times beyond 32 bits, folders and links as lstat sees them.
#include <fcntl.h>
#include <stdint.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <functional>
#include <memory>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/norvosearch.h"
#include "quib_stat.h"

namespace {

using namespace FileSearch;

// Whether the condition lets path through, as a walk asks it.
bool Asks(const std::function<FindComp *()> &make, const std::string &path) {
    std::unique_ptr<FindComp> condition(make());
    QUIBSTAT st{};
    EXPECT_EQ(VLIBCFileLStat(path.c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st), 0) << path;
    return (*condition)(path.c_str(), st);
}

TEST(Match, RealFilesAsTheWalkReadsThem) {
    norvo::testing::Appliance app;
    app.Basic();
    const std::string file = "/volume1/public/d/f.txt";
    app.WriteFile(file, "x").WriteFile("/volume1/public/d/sub/inside", std::string(4096, 'x'));
    ASSERT_EQ(symlink("/volume1/public/d", "/volume1/public/to-dir"), 0);
    const long now = static_cast<long>(time(nullptr));
    EXPECT_TRUE(Asks([=] { return new FindCRTimeComp("after", now - 60); }, file));
    EXPECT_FALSE(Asks([=] { return new FindCRTimeComp("before", now - 60); }, file));
    // A folder has a size of its own on disk, but counts as empty; a link to one is no folder.
    EXPECT_TRUE(Asks([] { return new FindSizeComp("equal", 0); }, "/volume1/public/d/sub"));
    EXPECT_TRUE(Asks([] { return new FindTypeComp(true); }, "/volume1/public/d/sub/"));
    EXPECT_FALSE(Asks([] { return new FindTypeComp(true); }, "/volume1/public/to-dir"));

    // Times beyond 32 bits saturate; they never wrap round.
    const timespec far[2] = {{-(1LL << 33), 0}, {1LL << 33, 0}};  // atime, mtime
    ASSERT_EQ(utimensat(AT_FDCWD, file.c_str(), far, 0), 0);
    EXPECT_TRUE(Asks([] { return new FindMTimeComp("after", INT32_MAX); }, file));
    EXPECT_TRUE(Asks([] { return new FindATimeComp("before", INT32_MIN + 1); }, file));
    EXPECT_FALSE(FindNameComp("abc")(nullptr, QUIBSTAT{}));
}

}  // namespace
