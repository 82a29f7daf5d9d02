// The platform calls the conditions stand on: the extended stat record and the splitting of
// request values.
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdint.h>
#include <string.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <json/value.h>

#include "appliance.h"
#include "quib_stat.h"
#include "quib_webapi.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;

TEST(FileLStat, DescribesTheEntryItselfExactly) {
    Appliance app;
    app.Basic();
    app.WriteFile("/volume1/public/f.txt", std::string(1234, 'x'), "alice:staff", 0640);
    const timespec times[2] = {{1000000000, 5}, {1200000000, 7}};
    ASSERT_EQ(utimensat(AT_FDCWD, "/volume1/public/f.txt", times, 0), 0);
    ASSERT_EQ(symlink("f.txt", "/volume1/public/link"), 0);

    QUIBSTAT st{};
    ASSERT_EQ(VLIBCFileLStat("/volume1/public/f.txt", QUIB_STAT_BASIC, &st), 0);
    EXPECT_EQ(st.st_mode, S_IFREG | 0640u);
    EXPECT_EQ(st.st_uid, app.Uid("alice"));
    EXPECT_EQ(st.st_gid, app.Gid("staff"));
    EXPECT_EQ(st.st_size, 1234);
    EXPECT_EQ(st.st_atime, 1000000000);  // <sys/stat.h>'s macros read the record as they read struct stat
    EXPECT_EQ(st.st_atim.tv_nsec, 5u);
    EXPECT_EQ(st.st_mtime, 1200000000);
    EXPECT_GT(st.st_ctime, 1600000000);
    EXPECT_EQ(st.st_crtim.tv_sec, 0);  // not asked for

    const long now = static_cast<long>(time(nullptr));
    ASSERT_EQ(VLIBCFileLStat("/volume1/public/f.txt", QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st), 0);
    EXPECT_LE(st.st_crtim.tv_sec, now);
    EXPECT_GT(st.st_crtim.tv_sec, now - 600);

    ASSERT_EQ(VLIBCFileLStat("/volume1/public/link", 0, &st), 0);
    EXPECT_TRUE(S_ISLNK(st.st_mode));
    EXPECT_EQ(st.st_size, 5);  // the link's own text, "f.txt"
    ASSERT_EQ(VLIBCFileLStat("/dev/null", QUIB_STAT_BASIC, &st), 0);
    EXPECT_TRUE(S_ISCHR(st.st_mode));
    ASSERT_EQ(VLIBCFileLStat("/volume1/public", QUIB_STAT_BASIC, &st), 0);
    EXPECT_TRUE(S_ISDIR(st.st_mode));
}

TEST(FileLStat, TimesBeyondThirtyTwoBitsSaturate) {
    Appliance app;
    app.WriteFile("/volume1/t", "x");
    const timespec times[2] = {{-(1LL << 33), 0}, {1LL << 33, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, "/volume1/t", times, 0), 0);
    QUIBSTAT st{};
    ASSERT_EQ(VLIBCFileLStat("/volume1/t", QUIB_STAT_BASIC, &st), 0);
    EXPECT_EQ(st.st_atim.tv_sec, INT32_MIN);
    EXPECT_EQ(st.st_mtim.tv_sec, INT32_MAX);
}

TEST(FileLStat, FailuresLeaveTheRecordAndSayWhy) {
    Appliance app;
    app.WriteFile("/volume1/file", "x");
    const std::string tooLong = "/" + std::string(PATH_MAX, 'a');
    const struct {
        const char *path;
        int flags;
        bool record;
        int err;
        int slot;
    } cases[] = {
        {nullptr, 1, true, EINVAL, 0x0D00}, {"", 1, true, EINVAL, 0x0D00},
        {"/volume1/file", 1, false, EINVAL, 0x0D00}, {"/volume1/file", 2, true, EINVAL, 0x0D00},
        {"/volume1/file", -1, true, EINVAL, 0x0D00}, {tooLong.c_str(), 1, true, ENAMETOOLONG, 0xC300},
        {"/volume1/missing", 1, true, ENOENT, 0x0600}, {"/volume1/file/below", 9, true, ENOTDIR, 0x0700},
    };
    for (const auto &c : cases) {
        QUIBSTAT st;
        memset(&st, 0x5A, sizeof(st));
        const QUIBSTAT before = st;
        errno = 0;
        EXPECT_EQ(VLIBCFileLStat(c.path, c.flags, c.record ? &st : nullptr), -1);
        EXPECT_EQ(errno, c.err) << (c.path ? std::string(c.path).substr(0, 30) : "(null)");
        EXPECT_EQ(VLIBCErrGet(), c.slot);
        EXPECT_EQ(memcmp(&st, &before, sizeof(st)), 0);
    }
}

TEST(ParseToArray, SplitsAtEveryComma) {
    const struct {
        const char *value;
        std::vector<std::string> pieces;
    } cases[] = {
        {"a,b", {"a", "b"}}, {"", {""}}, {",a,,b,", {"", "a", "", "b", ""}}, {" a , b", {" a ", " b"}},
        {"\"x,y\"", {"\"x", "y\""}},  // quotes do not group
        {"\xff,\xc3", {"\xff", "\xc3"}},
    };
    for (const auto &c : cases) {
        Json::Value array(7);
        ASSERT_EQ(QUIB::WebAPIUtil::ParseToArray(c.value, array), 0);
        ASSERT_TRUE(array.isArray());
        std::vector<std::string> pieces;
        for (const Json::Value &piece : array) pieces.push_back(piece.asString());
        EXPECT_EQ(pieces, c.pieces) << c.value;
    }
    Json::Value untouched(7);
    EXPECT_EQ(QUIB::WebAPIUtil::ParseToArray(nullptr, untouched), -1);
    EXPECT_EQ(VLIBCErrGet(), 0x0D00);
    EXPECT_EQ(untouched, Json::Value(7));
}

}  // namespace
