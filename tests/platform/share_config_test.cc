// The shared-folder configuration: smb.conf syntax as administrators write it, the sections
// that must be skipped rather than half-read, lookups by name and by path, and the cursor.
#include <errno.h>
#include <unistd.h>

#include <memory>
#include <random>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_paths.h"
#include "quib_share.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::ShareSpec;
using Strings = std::vector<std::string>;

struct ShareFree {
    void operator()(PQUIBSHARE share) const { QUIBShareFree(share); }
};
using Share = std::unique_ptr<QUIBSHARE, ShareFree>;
struct DBClose {
    void operator()(PQUIBSHARE_DB db) const { QUIBShareDBClose(db); }
};
using ShareDB = std::unique_ptr<QUIBSHARE_DB, DBClose>;

// The share QUIBShareGet returns, or null with the error code in *code.
Share Lookup(const char *name, int *code = nullptr) {
    PQUIBSHARE raw = nullptr;
    VLIBCErrSetEx(0, "", 0);
    int rc = QUIBShareGet(name, &raw);
    if (code != nullptr) {
        *code = rc == 0 ? 0 : VLIBCErrGet();
    }
    EXPECT_EQ(rc == 0, raw != nullptr);
    return Share(raw);
}

// Names of every share the cursor yields, in order.
Strings AllNames() {
    Strings names;
    ShareDB db(QUIBShareDBOpen());
    EXPECT_NE(db, nullptr);
    if (!db) {
        return names;
    }
    PQUIBSHARE record = nullptr;
    int rc;
    while ((rc = QUIBShareDBCursorGet(db.get(), &record)) == 0) {
        names.emplace_back(record->szName);
    }
    EXPECT_EQ(rc, 1);
    QUIBShareFree(record);
    return names;
}

class ShareConfig : public ::testing::Test {
protected:
    void Conf(const std::string &text) { app_.WriteFile(QUIB_SHARE_CONF, text); }
    Appliance app_;
};

TEST_F(ShareConfig, BasicPresetSharesReadBack) {
    app_.Basic();
    Share photo = Lookup("photo");
    ASSERT_NE(photo, nullptr);
    EXPECT_STREQ(photo->szName, "photo");
    EXPECT_STREQ(photo->szPath, "/volume1/photo");
    EXPECT_STREQ(photo->szRWList, "alice");
    EXPECT_STREQ(photo->szROList, "bob");
    EXPECT_STREQ(photo->szNoAccessList, "");
    EXPECT_STREQ(photo->szComment, "");
    EXPECT_EQ(photo->fStatus, 0u);
    EXPECT_EQ(photo->fRestrict, 0u);
    EXPECT_EQ(photo->blAclMode, 1);

    Share secret = Lookup("SECRET");  // names compare ignoring case
    ASSERT_NE(secret, nullptr);
    EXPECT_STREQ(secret->szName, "secret");
    EXPECT_EQ(secret->fStatus, static_cast<unsigned>(SHARE_STATUS_ENCRYPTED));
    EXPECT_STREQ(secret->szNoAccessList, "bob");
    EXPECT_EQ(AllNames(), (Strings{"public", "photo", "secret"}));
}

TEST_F(ShareConfig, ReadsEveryKey) {
    Conf("; shares of the appliance\n"
         "# written by hand\n"
         "[global]\n"
         "\tworkgroup = WORKGROUP\n"
         "\tpath = /volume1/global\n"
         "\n"
         "[Media]\n"
         "  PATH=/volume1//media/\n"
         "  Comment = Films & music = fun\n"
         "  Invalid   Users = bob,  \"@CORP\\domain guests\"  eve\n"
         "  write list=@staff alice\n"
         "  READ LIST = carol,dave,\n"
         "  browseable = No\n"
         "  encrypted = TRUE\n"
         "  disable browsing = 1\n"
         "  disable modify = off\n"
         "  Disable\tDownload = yes\n"
         "  ftp privilege = RO\n"
         "  acl = false\n"
         "  vfs objects = fruit streams_xattr\n"
         "  writelist = ignored\n");
    int code = 0;
    Share media = Lookup("media", &code);
    ASSERT_NE(media, nullptr) << std::hex << code;
    EXPECT_STREQ(media->szName, "Media");
    EXPECT_STREQ(media->szPath, "/volume1/media");
    EXPECT_STREQ(media->szComment, "Films & music = fun");
    EXPECT_STREQ(media->szNoAccessList, "bob,\"@CORP\\domain guests\",eve");
    EXPECT_STREQ(media->szRWList, "@staff,alice");
    EXPECT_STREQ(media->szROList, "carol,dave");
    EXPECT_EQ(media->fStatus, static_cast<unsigned>(SHARE_STATUS_HIDDEN | SHARE_STATUS_ENCRYPTED));
    EXPECT_EQ(media->fRestrict, static_cast<unsigned>(SHARE_RESTRICT_NO_BROWSE | SHARE_RESTRICT_NO_DOWNLOAD));
    EXPECT_EQ(media->ftpPrivilege, 1);
    EXPECT_EQ(media->blAclMode, 0);
    Lookup("global", &code);
    EXPECT_EQ(code, QUIB_ERR_NO_SUCH_SHARE);
    EXPECT_EQ(AllNames(), (Strings{"Media"}));
}

TEST_F(ShareConfig, ValuesOfEachKind) {
    const struct {
        const char *line;
        unsigned status;
        unsigned restrict;
        int ftp;
        int acl;
    } cases[] = {
        {"", 0, 0, 0, 1},
        {"browseable = yes", 0, 0, 0, 1},
        {"browsable = no", SHARE_STATUS_HIDDEN, 0, 0, 1},
        {"encrypted = no", 0, 0, 0, 1},
        {"disable modify = True", 0, SHARE_RESTRICT_NO_MODIFY, 0, 1},
        {"ftp privilege = none", 0, 0, 0, 1},
        {"ftp privilege = rw", 0, 0, 2, 1},
        {"acl = YES", 0, 0, 0, 1},
        {"acl = 0", 0, 0, 0, 0},
    };
    for (const auto &c : cases) {
        Conf(std::string("[s]\npath = /volume1/s\n") + c.line + "\n");
        Share share = Lookup("s");
        ASSERT_NE(share, nullptr) << c.line;
        EXPECT_EQ(share->fStatus, c.status) << c.line;
        EXPECT_EQ(share->fRestrict, c.restrict) << c.line;
        EXPECT_EQ(share->ftpPrivilege, c.ftp) << c.line;
        EXPECT_EQ(share->blAclMode, c.acl) << c.line;
    }
}

TEST_F(ShareConfig, LaterKeysWinWithinASection) {
    Conf("[s]\npath = /volume1/old\nencrypted = yes\npath = /volume1/new\nencrypted = no\n");
    Share share = Lookup("s");
    ASSERT_NE(share, nullptr);
    EXPECT_STREQ(share->szPath, "/volume1/new");
    EXPECT_EQ(share->fStatus, 0u);
}

TEST_F(ShareConfig, ContinuationLinesCommentsAndCrlf) {
    Conf("[team]\r\n"
         "\tpath = /volume1/team\r\n"
         "\t; a comment between keys\r\n"
         "\twrite list = alice, \\\r\n"
         "\t\tbob, \\  \r\n"
         "\t\tcarol\r\n"
         "\t# another comment\r\n"
         "\tcomment = one \\\r\n"
         "two\r\n"
         "[next]\r\n"
         "path = /volume1/next");
    Share team = Lookup("team");
    ASSERT_NE(team, nullptr);
    EXPECT_STREQ(team->szRWList, "alice,bob,carol");
    EXPECT_STREQ(team->szComment, "one two");
    EXPECT_STREQ(team->szPath, "/volume1/team");
    Share next = Lookup("next");
    ASSERT_NE(next, nullptr);
    EXPECT_STREQ(next->szPath, "/volume1/next");
}

TEST_F(ShareConfig, BrokenSectionsAreSkippedAndTheRestIsRead) {
    Conf("path = /volume1/outside\n"   // a key before any section belongs to nothing
         "[first]\n"
         "path = /volume1/first\n"
         "[nopath]\n"
         "comment = forgot the path\n"
         "[relative]\n"
         "path = volume1/relative\n"
         "[root]\n"
         "path = /\n"
         "[typo]\n"
         "path = /volume1/typo\n"
         "invalid users bob\n"            // no "=": this share must not open up to bob
         "[badbool]\n"
         "path = /volume1/badbool\n"
         "browseable = maybe\n"
         "[badftp]\n"
         "path = /volume1/badftp\n"
         "ftp privilege = full\n"
         "[unclosed\n"
         "path = /volume1/unclosed\n"
         "[]\n"
         "path = /volume1/empty\n"
         "[a/b]\n"
         "path = /volume1/slash\n"
         "[twice]\n"
         "path = /volume1/twice1\n"
         "[TWICE]\n"
         "path = /volume1/twice2\n"
         "[ spaced name ] ; trailing text\n"
         "path = /volume1/spaced\n"
         "[last]\n"
         "path = /volume1/last\n");
    EXPECT_EQ(AllNames(), (Strings{"first", "spaced name", "last"}));
    for (const char *name :
         {"nopath", "relative", "root", "typo", "badbool", "badftp", "unclosed", "twice"}) {
        int code = 0;
        EXPECT_EQ(Lookup(name, &code), nullptr) << name;
        EXPECT_EQ(code, QUIB_ERR_NO_SUCH_SHARE) << name;
    }
    Share spaced = Lookup("Spaced Name");
    ASSERT_NE(spaced, nullptr);
    EXPECT_STREQ(spaced->szPath, "/volume1/spaced");
}

TEST_F(ShareConfig, PathsFindTheShareHoldingThem) {
    Conf("[data]\npath = /volume1/data\n"
         "[inner]\npath = /volume1/data/inner\n"
         "[photo]\npath = /volume1/photo\nencrypted = yes\n"
         "[usb]\npath = /volumeUSB1/usbshare1-1\n");
    const struct {
        const char *path;
        const char *share;  // null: none
    } cases[] = {
        {"/volume1/photo", "photo"},
        {"/volume1/photo/", "photo"},
        {"/volume1/photo/2024/a.jpg", "photo"},
        {"/volume1//photo/./x", "photo"},
        {"/volume1/data/x", "data"},
        {"/volume1/data/inner", "inner"},
        {"/volume1/data/inner/deep/file", "inner"},
        {"/volume1/data/innerness", "data"},  // whole components only
        {"/volume1/photo/../data/inner/f", "inner"},
        {"/volume1/photos/x", nullptr},
        {"/photo/2024/a.jpg", "photo"},        // a share named by the first component
        {"/PHOTO", "photo"},
        {"/volumeUSB1/usbshare1-1/f", "usb"},
        {"/volume1", nullptr},
        {"/", nullptr},
        {"/nothing/here", nullptr},
    };
    for (const auto &c : cases) {
        int code = 0;
        Share share = Lookup(c.path, &code);
        if (c.share == nullptr) {
            EXPECT_EQ(share, nullptr) << c.path;
            EXPECT_EQ(code, QUIB_ERR_NO_SUCH_SHARE) << c.path;
        } else {
            ASSERT_NE(share, nullptr) << c.path;
            EXPECT_STREQ(share->szName, c.share) << c.path;
        }
    }
    Share file = Lookup("/volume1/photo/holiday/beach.jpg");
    ASSERT_NE(file, nullptr);
    EXPECT_TRUE(file->fStatus & SHARE_STATUS_ENCRYPTED);
}

TEST_F(ShareConfig, MissingConfigurationIsNotAMissingShare) {
    ASSERT_EQ(unlink(QUIB_SHARE_CONF) == 0 || errno == ENOENT, true);
    int code = 0;
    EXPECT_EQ(Lookup("photo", &code), nullptr);
    EXPECT_EQ(code, QUIB_ERR_OPEN_FAILED);
    EXPECT_EQ(QUIBShareDBOpen(), nullptr);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);
    app_.MakeDir(QUIB_SHARE_CONF);  // unreadable as a file
    EXPECT_EQ(Lookup("photo", &code), nullptr);
    EXPECT_EQ(code, QUIB_ERR_OPEN_FAILED);
}

TEST_F(ShareConfig, BadArguments) {
    app_.Basic();
    std::string longName(300, 'n');
    std::string longPath = "/" + std::string(5000, 'p');
    for (const char *name : {static_cast<const char *>(nullptr), "", longName.c_str(), "\xff\xfe", "a\nb",
                             longPath.c_str(), "/volume1/\xc3"}) {
        int code = 0;
        EXPECT_EQ(Lookup(name, &code), nullptr);
        // Only a missing name is a bad argument; a name no share can carry names no share.
        EXPECT_EQ(code, name == nullptr || name[0] == '\0' ? QUIB_ERR_BAD_PARAMETER : QUIB_ERR_NO_SUCH_SHARE);
    }
    EXPECT_EQ(QUIBShareGet("photo", nullptr), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    PQUIBSHARE record = nullptr;
    EXPECT_EQ(QUIBShareDBCursorGet(nullptr, &record), -1);
    QUIBShareFree(nullptr);
    QUIBShareDBClose(nullptr);
    int code = 0;
    EXPECT_EQ(Lookup("photo/sub", &code), nullptr);
    EXPECT_EQ(code, QUIB_ERR_NO_SUCH_SHARE);
}

TEST_F(ShareConfig, CursorIsASnapshotInFileOrder) {
    app_.Basic();
    ShareDB db(QUIBShareDBOpen());
    ASSERT_NE(db, nullptr);
    ShareSpec later;
    later.name = "later";
    app_.AddShare(later);  // after the snapshot
    PQUIBSHARE record = nullptr;
    Strings names;
    Strings paths;
    while (QUIBShareDBCursorGet(db.get(), &record) == 0) {
        names.emplace_back(record->szName);
        paths.emplace_back(record->szPath);
    }
    EXPECT_EQ(names, (Strings{"public", "photo", "secret"}));
    EXPECT_EQ(paths, (Strings{"/volume1/public", "/volume1/photo", "/volume1/secret"}));
    ASSERT_NE(record, nullptr);  // the last record stays the caller's
    EXPECT_STREQ(record->szName, "secret");
    EXPECT_EQ(QUIBShareDBCursorGet(db.get(), &record), 1);
    QUIBShareFree(record);
    EXPECT_EQ(AllNames(), (Strings{"public", "photo", "secret", "later"}));
}

TEST_F(ShareConfig, EmptyConfigurationHasNoShares) {
    Conf("");
    EXPECT_EQ(AllNames(), Strings{});
    Conf("; nothing but comments\n\n[global]\nworkgroup = X\n");
    EXPECT_EQ(AllNames(), Strings{});
}

// Random configurations from a vocabulary of good and broken lines: never a crash, and every
// share returned is sound (absolute path, a name, no duplicate names).
TEST_F(ShareConfig, GeneratedConfigurationsYieldOnlySoundShares) {
    const char *vocabulary[] = {
        "[a]", "[B]", "[global]", "[c d]", "[bad", "[]", "[x/y]", "path = /volume1/a", "path = rel",
        "path = /", "path=/volume2/b/../c", "comment = \\", "write list = alice \\", "browseable = no",
        "browseable = perhaps", "ftp privilege = rw", "ftp privilege = x", "acl = no", "no equals sign",
        "; comment", "# comment", "", "   ", "\\", "= value", "invalid users = \"@g h", "\xff\xfe = \x80",
        "[\xc3]", "path = /volume1/\xff",
    };
    std::mt19937 rng(7);
    for (int round = 0; round < 200; ++round) {
        std::string text;
        size_t lines = rng() % 30;
        for (size_t i = 0; i < lines; ++i) {
            text += vocabulary[rng() % (sizeof vocabulary / sizeof *vocabulary)];
            text += rng() % 5 == 0 ? "\r\n" : "\n";
        }
        Conf(text);
        ShareDB db(QUIBShareDBOpen());
        ASSERT_NE(db, nullptr);
        PQUIBSHARE record = nullptr;
        std::set<std::string> seen;
        while (QUIBShareDBCursorGet(db.get(), &record) == 0) {
            std::string lower = record->szName;
            for (char &ch : lower) {
                ch = static_cast<char>(tolower(static_cast<unsigned char>(ch)));
            }
            EXPECT_TRUE(seen.insert(lower).second) << text;
            EXPECT_EQ(record->szPath[0], '/') << text;
            EXPECT_STRNE(record->szPath, "/") << text;
            EXPECT_STRNE(record->szName, "") << text;
            EXPECT_STRCASENE(record->szName, "global") << text;
        }
        QUIBShareFree(record);
    }
}

}  // namespace
