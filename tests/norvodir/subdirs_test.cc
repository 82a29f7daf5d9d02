// The sub-folders of a directory, read as alice: a generated folder against find and stat, then
// the refusals with their codes and log lines, and a network mount whose server is gone.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "../platform/platform_test_util.h"
#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/subdirs.h"
#include "vlibc_unicode.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::ReadFile;
using Fields = std::vector<std::string>;  // name, path, size, mode, mtime, uid, gid, mount point, type

const std::string kTree = "/volume1/public/tree";
const std::string kResult = "/tmp/subdirs.result";
const std::string kReference = "/tmp/subdirs.reference";

std::vector<std::string> Split(const std::string &text) {
    std::vector<std::string> parts;
    std::istringstream in(text);
    for (std::string part; std::getline(in, part, '\0');) parts.push_back(part);
    return parts;
}

Fields FieldsOf(const _tag_SUBDIR_ENTRY_INFO_ &r) {
    return {r.name, r.path, std::to_string(r.size), std::to_string(r.mode), std::to_string(r.mtime),
            std::to_string(r.uid), std::to_string(r.gid), r.isMountPoint ? "1" : "0", r.mountType};
}

struct Result {
    int rc = -1, err = -1;
    std::string cwd;
    std::vector<Fields> records;
    std::string Summary() const {  // names and mount types
        std::string text;
        for (const Fields &f : records) text += f[0] + (f[8].empty() ? "" : ":" + f[8]) + " ";
        return text;
    }
};

// NvoLibEnumSubDir as user in a child, out holding before; the answer travels through a file.
Result EnumAs(Appliance &app, const std::string &user, const std::string &path,
              const std::vector<_tag_SUBDIR_ENTRY_INFO_> &before = {}) {
    unlink(kResult.c_str());
    app.RunAs(user, [&] {
        std::vector<_tag_SUBDIR_ENTRY_INFO_> out = before;
        const int rc = NvoLibEnumSubDir(path, out);
        char cwd[4096] = "";
        std::string text = std::to_string(rc) + '\0' + std::to_string(NvoLibGetErr()) + '\0' +
                           (getcwd(cwd, sizeof cwd) ? cwd : "?") + '\0';
        for (const auto &record : out)
            for (const std::string &field : FieldsOf(record)) text += field + '\0';
        std::ofstream(kResult, std::ios::binary) << text;
        return 0;
    });
    const std::vector<std::string> parts = Split(ReadFile(kResult));
    Result r;
    if (parts.size() < 3 || (parts.size() - 3) % 9 != 0) {
        ADD_FAILURE() << "no result from " << user;
        return r;
    }
    r.rc = std::stoi(parts[0]), r.err = std::stoi(parts[1]), r.cwd = parts[2];
    for (size_t i = 3; i < parts.size(); i += 9) r.records.emplace_back(parts.begin() + i, parts.begin() + i + 9);
    return r;
}

// The type of the topmost mount on dir, from the kernel's table.
std::string MountTypeAt(const std::string &dir) {
    std::ifstream mounts("/proc/self/mounts");
    std::string type;
    for (std::string source, at, fsType, rest; mounts >> source >> at >> fsType && std::getline(mounts, rest);) {
        if (at == dir) type = fsType;
    }
    return type;
}

// What find and stat, run as user, say the listing holds: every folder but the hidden names.
std::vector<Fields> Reference(Appliance &app, const std::string &user, const std::string &dir) {
    const std::string command = "find " + dir + " -mindepth 1 -maxdepth 1 -type d -exec stat --printf "
                                "'%n\\0%s\\0%f\\0%Y\\0%u\\0%g\\0%d\\0' {} + > " + kReference;
    EXPECT_EQ(app.RunAs(user, [&] { return system(command.c_str()) == 0 ? 0 : 1; }), 0) << command;
    const std::set<std::string> hidden = {"@eaDir", "@tmp", "@sharebin", "#snapshot", ".DS_Store"};
    const std::vector<std::string> parts = Split(ReadFile(kReference));
    struct stat dirStat;
    EXPECT_EQ(stat(dir.c_str(), &dirStat), 0);  // a folder on another device is a mount point
    std::vector<Fields> folders;
    for (size_t i = 0; i + 7 <= parts.size(); i += 7) {
        const std::string &path = parts[i];
        const std::string name = path.substr(dir.size() + 1);
        if (hidden.count(name) != 0) continue;
        const bool mountPoint = parts[i + 6] != std::to_string(dirStat.st_dev);
        folders.push_back({name, path, parts[i + 1], std::to_string(std::stoul(parts[i + 2], nullptr, 16)),
                           parts[i + 3], parts[i + 4], parts[i + 5], mountPoint ? "1" : "0",
                           mountPoint ? MountTypeAt(path) : ""});
    }
    return folders;
}

TEST(SubDirs, GeneratedFolderAsFindAndStatSeeIt) {
    Appliance app;
    app.Basic().MakeDir(kTree).AddVolume(kTree + "/vol");
    const unsigned seed = std::random_device()();
    SCOPED_TRACE("seed " + std::to_string(seed));
    std::mt19937 random(seed);
    const auto pick = [&](const auto &items) { return items[random() % std::size(items)]; };
    const char *stems[] = {"Foo", "foo", "FOO", "Straße", "STRASSE", "a\nb", "d\xff", "\xe2\x80\xaegpj.exe",
                           "tab\t", "@eaDir", "@tmp", "#snapshot", ".DS_Store", "#recycle", ".hidden", "x|y",
                           "\xc3\xbc", "\xc3\x9c", "-n", "*", "\\x41"};
    const char *owners[] = {"root", "alice", "bob"};
    const mode_t modes[] = {0755, 0700, 0711, 0500};
    std::set<std::string> made;
    for (int i = 0; i < 80; ++i) {
        const std::string name = std::string(pick(stems)) + (random() % 2 ? std::to_string(random() % 10) : "");
        if (!made.insert(name).second) continue;
        const std::string path = kTree + "/" + name;
        switch (random() % 6) {
            case 0: app.WriteFile(path, "data", pick(owners)); break;
            case 1: ASSERT_EQ(symlink(made.size() % 2 ? "vol" : "/volume1/public", path.c_str()), 0); break;
            case 2: ASSERT_EQ(mkfifo(path.c_str(), 0644), 0); break;
            default: {
                app.MakeDir(path, pick(owners), pick(modes));
                if (random() % 2) app.MakeDir(path + "/inner");
            }
        }
    }
    for (const std::string &name : made) {  // after the folders were filled
        const timespec times[2] = {{0, UTIME_OMIT}, {static_cast<time_t>(random() % 0x7fffffff), 0}};
        utimensat(AT_FDCWD, (kTree + "/" + name).c_str(), times, AT_SYMLINK_NOFOLLOW);
    }
    _tag_SUBDIR_ENTRY_INFO_ early{.name = "Mid", .path = "/x/Mid", .size = 1}, late{.name = "zzz", .mode = 2};
    std::vector<Fields> expected = Reference(app, "alice", kTree);
    expected.push_back(FieldsOf(early));
    expected.push_back(FieldsOf(late));
    const Result r = EnumAs(app, "alice", kTree, {late, early});
    ASSERT_EQ(r.rc, 1);
    EXPECT_EQ(r.err, 0);
    EXPECT_EQ(r.cwd, kTree);
    EXPECT_TRUE(std::any_of(r.records.begin(), r.records.end(), [](const Fields &f) { return f[0] == "vol"; }));
    for (size_t i = 1; i < r.records.size(); ++i) {
        EXPECT_LE(VLIBCUnicodeUTF8StrCaseCmp(r.records[i - 1][0].c_str(), r.records[i][0].c_str()), 0)
            << r.records[i - 1][0] << " before " << r.records[i][0];
    }
    std::vector<Fields> got = r.records;
    std::sort(got.begin(), got.end());
    std::sort(expected.begin(), expected.end());
    EXPECT_EQ(got, expected);
    EXPECT_EQ(app.ErrorLines(), std::vector<std::string>{});
}

TEST(SubDirs, RefusalsAndAnUnreachableMount) {
    Appliance app;
    const std::string pub = "/volume1/public";
    app.Basic().WriteFile(pub + "/file").MakeDir(pub + "/closed", "root", 0700);
    app.MakeDir(pub + "/noread", "root", 0711).MakeDir(pub + "/noenter", "root", 0744);
    app.MakeDir(pub + "/remote/a", "alice").MountDeadRemote(pub + "/remote/nas2").MakeDir(pub + "/only");
    app.WriteFile(pub + "/only/f").MakeDir(pub + "/only/Q").MakeDir(pub + "/only/q");
    ASSERT_EQ(symlink("loop", (pub + "/loop").c_str()), 0);
    ASSERT_EQ(symlink("remote", (pub + "/link").c_str()), 0);
    const std::string bad = "norvodir.cpp:# Bad parameter";
    struct Row { std::string path; int rc, err; std::string summary; std::vector<std::string> logs; } rows[] = {
        {"", 0, NVO_ERR_GENERAL, "", {bad}},
        {"volume1/public", 0, NVO_ERR_GENERAL, "", {bad}},  // relative: never against the working directory
        {pub + '\0' + "/x", 0, NVO_ERR_GENERAL, "", {bad}},
        {pub + "/missing", 0, NVO_ERR_NO_PATH, "", {}},
        {pub + "/file", 0, NVO_ERR_NO_PATH, "", {}},
        {pub + "/file/x", 0, NVO_ERR_NO_PATH, "", {}},
        {pub + "/closed", 0, NVO_ERR_PRIVILEGE, "", {}},
        {pub + "/noread", 0, NVO_ERR_PRIVILEGE, "", {}},
        {pub + "/noenter", 0, NVO_ERR_PRIVILEGE, "", {}},
        {pub + "/loop", 0, NVO_ERR_ACCESS, "", {}},
        {pub + "/remote/nas2", 0, NVO_ERR_ACCESS, "", {}},  // EIO
        {pub + "/remote", 1, 0, "a nas2:remotefail ", {}},
        {pub + "/link", 1, 0, "a ", {}},    // followed; the mount table knows nas2 by its own path only
        {pub + "/only", 1, 0, "Q q ", {}},  // either order would do: compared as a set below
    };
    for (const Row &row : rows) {
        SCOPED_TRACE(row.path);
        app.ClearLogs();
        Result r = EnumAs(app, "alice", row.path);
        EXPECT_EQ(r.rc, row.rc);
        EXPECT_EQ(r.err, row.err);
        EXPECT_EQ(app.ErrorLines(), row.logs);
        std::sort(r.records.begin(), r.records.end());
        EXPECT_EQ(r.Summary(), row.summary);
    }
    const Result r = EnumAs(app, "alice", pub + "/remote");
    ASSERT_EQ(r.records.size(), 2u);
    EXPECT_EQ(r.records[1], (Fields{"nas2", pub + "/remote/nas2", "0", "0", "0", "0", "0", "1", "remotefail"}));
    EXPECT_EQ(Fields(r.records[0].begin() + 5, r.records[0].end()),
              (Fields{std::to_string(app.Uid("alice")), std::to_string(app.Gid("users")), "0", ""}));
    EXPECT_EQ(r.cwd, pub + "/remote");
}

}  // namespace
