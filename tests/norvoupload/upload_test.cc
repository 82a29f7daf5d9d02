#include <fcntl.h>
#include <stdio.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvoupload.h"
#include "quib_file_copy.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using Lines = std::vector<std::string>;
namespace fs = std::filesystem;

std::vector<std::string> Names(const std::string &dir) {
    std::vector<std::string> names;
    for (const auto &entry : fs::directory_iterator(dir)) {
        names.push_back(entry.path().filename());
    }
    std::sort(names.begin(), names.end());
    return names;
}

TEST(Upload, ErrorNumbers) {
    const std::map<int, int> reference = {{-14, 1803}, {-11, 415}, {-10, 412}, {-8, 1802}, {-7, 1801}, {-6, 1800},
                                          {-5, 1800},  {-4, 408},  {-3, 411},  {-2, 416},  {-1, 407}};
    for (int e = -20; e <= 5; ++e) {
        EXPECT_EQ(ConvUploadErrnoToAPIErr(e), reference.count(e) ? reference.at(e) : 401) << e;
    }
}

TEST(Upload, CheckFileJudgesTheTargetAsTheUser) {
    Appliance app;
    app.Basic().MakeDir("/volume1/public/closed", "alice", 0700).WriteFile("/volume1/photo/old.jpg", "x", "alice");
    struct Row {
        const char *user, *path;
        int type, code, typeAfter;
        bool switched;
        Lines lines;
    } rows[] = {
        {"alice", "/photo/new.jpg", 0, 0, 0, true, {}},
        {"alice", "/photo/old.jpg", 1, 0, 1, true, {}},
        {"alice", "/photo/old.jpg", 0, 414, 0, false,
         {"norvomisc.cpp:# Share no modify privilege, path=/photo/old.jpg",
          "norvoupload.cpp:# No upload privilege to path /photo/old.jpg"}},
        {"bob", "/photo/new.jpg", 1, 407, 1, false,
         {"norvomisc.cpp:# Share no upload privilege, path=/photo/new.jpg",
          "norvoupload.cpp:# No upload privilege to path /photo/new.jpg"}},
        {"bob", "/public/closed/new", 1, 407, 1, true,
         {"norvoupload.cpp:# Invalid path:/volume1/public/closed/new, reason=[197]"}},
        {"alice", "/gone/x", 1, 408, 1, false, {"norvoupload.cpp:# Failed to get fullpath of: /gone/x"}},
    };
    for (const Row &row : rows) {
        app.ClearLogs();
        const int got = app.RunAs("root", [&] {
            int type = row.type;
            const int code = CheckFile(row.path, row.user, nullptr, &type);
            return code != row.code ? 1 : type != row.typeAfter ? 2 : (geteuid() != 0) != row.switched ? 3 : 0;
        });
        EXPECT_EQ(got, 0) << row.user << " " << row.path;
        Lines lines = app.ErrorLines();
        lines.erase(std::remove_if(lines.begin(), lines.end(),
                                   [](const std::string &l) { return l.rfind("norvodir", 0) == 0 || l.rfind("nvoman", 0) == 0; }),
                    lines.end());
        EXPECT_EQ(lines, row.lines) << row.user << " " << row.path;
    }
    app.ClearLogs();  // a process that can't become the user
    EXPECT_EQ(app.RunAs("bob", [] { return CheckFile("/public/x", "alice", nullptr, nullptr) - 400; }), 1);
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvouser.cpp:# Failed to set UID for user=alice, sid=(null)",
                                       "norvoupload.cpp:# Failed to set UGID for user=alice, sid=(null)"}));
}

class Move : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().MountFat("/volumeUSB1").MakeDir("/volume1/@tmp").MakeDir("/volume2/up");
        app_.MakeDir("/volume3").MakeDir("/volume4");
        ASSERT_EQ(mount("tmpfs", "/volume3", "tmpfs", 0, "size=1m"), 0);  // a volume soon full
        ASSERT_EQ(mount("tmpfs", "/volume4", "tmpfs", MS_RDONLY, nullptr), 0);
    }
    // An upload's temporary of size bytes (sparse past the first) at path.
    static void Upload(const std::string &path, off_t size, const std::string &head = "data") {
        std::ofstream(path) << head;
        ASSERT_EQ(truncate(path.c_str(), std::max<off_t>(size, off_t(head.size()))), 0);
    }
    Appliance app_;
};

int g_calls = 0;
int CancelAtSecond() {
    return ++g_calls >= 2;
}
int CancelAtFirst() {
    return 1;
}

TEST_F(Move, IntoPlaceOwnedByTheUserOrNotAtAll) {
    struct stat st, moved;
    Upload("/volume1/@tmp/same", 4);
    ASSERT_EQ(stat("/volume1/@tmp/same", &st), 0);
    EXPECT_EQ(MoveFile("alice", "/volume1/@tmp/same", "/volume1/public/a", nullptr), 1);
    ASSERT_EQ(stat("/volume1/public/a", &moved), 0);
    EXPECT_EQ(moved.st_ino, st.st_ino);  // on one volume: a rename
    EXPECT_EQ(moved.st_uid, app_.Uid("alice"));
    EXPECT_EQ(moved.st_gid, app_.Gid("users"));
    EXPECT_EQ(moved.st_mode & 07777, 0644u);
    Upload("/volume2/up/f", 70 << 20, "across");
    EXPECT_EQ(MoveFile("alice", "/volume2/up/f", "/volume1/public/a", nullptr), 1);  // replaces
    ASSERT_EQ(stat("/volume1/public/a", &moved), 0);
    EXPECT_EQ(moved.st_size, 70 << 20);
    EXPECT_EQ(moved.st_uid, app_.Uid("alice"));
    std::string head(6, '\0');
    std::ifstream("/volume1/public/a").read(&head[0], 6);
    EXPECT_EQ(head, "across");
    EXPECT_FALSE(fs::exists("/volume2/up/f"));

    // Failures: the target as it was, no temporary, the source kept.
    NvoLibSetErr(77);
    EXPECT_EQ(MoveFile("alice", "/volume2/up/f", nullptr, nullptr), 0);
    EXPECT_EQ(MoveFile("ghost", "/volume2/up/f", "/volume1/public/b", nullptr), 0);
    EXPECT_EQ(NvoLibGetErr(), 77);
    struct Row {
        const char *src, *dst;
        off_t size;
        int (*progress)();
        int code;
        const char *dir;
    } rows[] = {
        {"/volume2/up/big", "/volume3/big", 4 << 20, nullptr, 416, "/volume3"},
        {"/volume2/up/huge", "/volumeUSB1/huge", 5LL << 30, nullptr, 1804, "/volumeUSB1"},
        {"/volume2/up/c", "/volume1/public/c", 130 << 20, CancelAtSecond, 1805, "/volume1/public"},
        {"/volume1/@tmp/c", "/volume1/public/c", 10, CancelAtFirst, 1805, "/volume1/public"},
        {"/volume2/up/ro", "/volume4/ro", 10, nullptr, 411, "/volume4"},
        {"/volume2/up/d", "/volume1/public", 10, nullptr, 414, "/volume1"},
        {"/volume2/up/n", "/volume1/none/n", 10, nullptr, 408, "/volume1"},
    };
    for (const Row &row : rows) {
        Upload(row.src, row.size);
        const auto before = Names(row.dir);
        g_calls = 0;
        app_.ClearLogs();
        EXPECT_EQ(MoveFile("alice", row.src, row.dst, row.progress), 0) << row.dst;
        EXPECT_EQ(NvoLibGetErr(), row.code) << row.dst;
        EXPECT_EQ(Names(row.dir), before) << row.dst;
        EXPECT_TRUE(fs::exists(row.src)) << row.src;
        char line[256];
        snprintf(line, sizeof line, "norvoupload.cpp:# Failed to copy %s to %s, reason=[%X]", row.src, row.dst,
                 VLIBCErrGet());
        EXPECT_EQ(app_.ErrorLines(), Lines{line});
    }
    app_.ClearLogs();
    EXPECT_EQ(MoveFile("ghost", "/volume2/up/d", "/volume1/public/d", nullptr), 0);
    EXPECT_EQ(app_.ErrorLines(), Lines{"norvoupload.cpp (#) Failed to get user data"});
}

TEST_F(Move, NeverWritesThroughALinkOrOverAFileUnasked) {
    QUIB_FILECOPY_OPT keep{};
    keep.blRemoveSource = 1;
    Upload("/volume2/up/k", 10);
    app_.WriteFile("/volume1/public/k", "old");
    EXPECT_EQ(QUIBFileCopy("/volume2/up/k", "/volume1/public/k", &keep), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_FILE_EXISTS);
    ASSERT_EQ(symlink("/etc/passwd", "/volume1/public/to-passwd"), 0);
    keep.blOverwrite = 1;
    EXPECT_EQ(QUIBFileCopy("/volume2/up/k", "/volume1/public/to-passwd", &keep), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_TARGET_IS_DIR);

    // The target folder swapped for a link to /etc while uploads land in it.
    app_.MakeDir("/volume1/public/d").MakeDir("/volume1/public/e");
    ASSERT_EQ(symlink("/etc", "/volume1/public/e/d"), 0);
    const auto etc = Names("/etc");
    std::atomic<bool> stop{false};
    std::thread swapper([&] {
        while (!stop) {
            renameat2(AT_FDCWD, "/volume1/public/d", AT_FDCWD, "/volume1/public/e/d", RENAME_EXCHANGE);
        }
    });
    int moved = 0;
    for (int i = 0; i < 300; ++i) {
        const std::string src = (i % 2 ? "/volume2/up/" : "/volume1/@tmp/") + std::to_string(i);
        Upload(src, 10);
        moved += MoveFile("alice", src.c_str(), ("/volume1/public/d/" + std::to_string(i)).c_str(), nullptr);
        EXPECT_TRUE(moved == i + 1 || NvoLibGetErr() == 407 || NvoLibGetErr() == 408) << NvoLibGetErr();
    }
    stop = true;
    swapper.join();
    EXPECT_EQ(Names("/etc"), etc);
    EXPECT_GT(moved, 0);
}

}  // namespace
