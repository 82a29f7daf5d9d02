// The shared-folder configuration: smb.conf syntax as administrators write it, the sections
// that must be skipped rather than half-read, lookups by name and by path, and the cursor.
#include <unistd.h>

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_paths.h"
#include "quib_share.h"
#include "vlibc_err.h"

namespace {

using Strings = std::vector<std::string>;

// A share on one line: name and path, then only what differs from the defaults.
std::string Fields(PQUIBSHARE s) {
    std::string out = std::string(s->szName) + " " + s->szPath;
    for (const auto &[label, text] : {std::pair{" comment=", s->szComment}, {" no=", s->szNoAccessList},
                                      {" rw=", s->szRWList}, {" ro=", s->szROList}}) {
        out += *text ? label + std::string(text) : "";
    }
    out += s->fStatus ? " status=" + std::to_string(s->fStatus) : "";
    out += s->fRestrict ? " restrict=" + std::to_string(s->fRestrict) : "";
    out += s->ftpPrivilege ? " ftp=" + std::to_string(s->ftpPrivilege) : "";
    return out + (s->blAclMode != 1 ? " acl=" + std::to_string(s->blAclMode) : "");
}

// What QUIBShareGet finds: Fields of the share, or "error 0x...".
std::string Find(const char *name) {
    PQUIBSHARE share = nullptr;
    VLIBCErrSetEx(0, "", 0);
    if (QUIBShareGet(name, &share) != 0) {
        EXPECT_EQ(share, nullptr);
        char text[32];
        snprintf(text, sizeof text, "error %#x", VLIBCErrGet());
        return text;
    }
    std::string out = Fields(share);
    QUIBShareFree(share);
    return out;
}

// Fields of every record the cursor yields.
Strings All(PQUIBSHARE_DB db) {
    Strings out;
    PQUIBSHARE record = nullptr;
    while (QUIBShareDBCursorGet(db, &record) == 0) {
        out.push_back(Fields(record));
    }
    EXPECT_EQ(QUIBShareDBCursorGet(db, &record), 1);  // the end stays the end
    EXPECT_EQ(record == nullptr, out.empty());          // and the last record stays the caller's
    EXPECT_EQ(record ? Fields(record) : "", out.empty() ? "" : out.back());
    QUIBShareFree(record);
    return out;
}

Strings All() {
    PQUIBSHARE_DB db = QUIBShareDBOpen();
    EXPECT_NE(db, nullptr);
    Strings out = db ? All(db) : Strings{};
    QUIBShareDBClose(db);
    return out;
}

class ShareConfig : public ::testing::Test {
protected:
    void Conf(const std::string &text) { app_.WriteFile(QUIB_SHARE_CONF, text); }
    norvo::testing::Appliance app_;
};

TEST_F(ShareConfig, ReadsEveryKey) {
    Conf("; shares of the appliance\n# written by hand\n"
         "[global]\n\tworkgroup = WORKGROUP\n\tpath = /volume1/global\n\n"
         "[Media]\n"
         "  PATH=/volume1//media/\n  Comment = Films & music = fun\n"
         "  Invalid   Users = bob,  \"@CORP\\domain guests\"  eve\n  write list=@staff alice\n  READ LIST = carol,dave,\n"
         "  browseable = No\n  encrypted = TRUE\n  disable browsing = 1\n  disable modify = off\n  Disable\tDownload = yes\n"
         "  ftp privilege = RO\n  acl = false\n  vfs objects = fruit streams_xattr\n  writelist = ignored\n"
         "[plain]\npath = /volume1/plain\n"
         "[other]\npath = /volume1/old\nbrowsable = no\nencrypted = yes\ndisable modify = True\nftp privilege = rw\n"
         "acl = 0\npath = /volume1/other\nencrypted = no\n");  // later keys win
    const Strings expected = {
        "Media /volume1/media comment=Films & music = fun no=bob,\"@CORP\\domain guests\",eve rw=@staff,alice "
        "ro=carol,dave status=3 restrict=5 ftp=1 acl=0",
        "plain /volume1/plain",
        "other /volume1/other status=1 restrict=2 ftp=2 acl=0",
    };
    EXPECT_EQ(All(), expected);
    EXPECT_EQ(Find("MEDIA"), expected[0]);  // names compare ignoring case
    EXPECT_EQ(Find("global"), "error 0x1400");
}

TEST_F(ShareConfig, ContinuationLinesCommentsAndCrlf) {
    Conf("[team]\r\n\tpath = /volume1/team\r\n\t; a comment between keys\r\n"
         "\twrite list = alice, \\\r\n\t\tbob, \\  \r\n\t\tcarol\r\n"
         "\t# another comment\r\n\tcomment = one \\\r\ntwo\r\n"
         "[next]\r\npath = /volume1/next");
    EXPECT_EQ(All(), (Strings{"team /volume1/team comment=one two rw=alice,bob,carol", "next /volume1/next"}));
}

TEST_F(ShareConfig, BrokenSectionsAreSkippedAndTheRestIsRead) {
    // Paths that are missing, relative or "/" and names given twice the shares fuzzer refuses in
    // any file; here the sections that are broken otherwise.
    Conf("path = /volume1/outside\n"  // a key before any section belongs to nothing
         "[first]\npath = /volume1/first\n"
         "[typo]\npath = /volume1/typo\ninvalid users bob\n"  // no "=": must not open up to bob
         "[badbool]\npath = /volume1/badbool\nbrowseable = maybe\n"
         "[badftp]\npath = /volume1/badftp\nftp privilege = full\n"
         "[unclosed\npath = /volume1/unclosed\n"
         "[]\npath = /volume1/empty\n"
         "[a/b]\npath = /volume1/slash\n"
         "[ spaced name ] ; trailing text\npath = /volume1/spaced\n"
         "[last]\npath = /volume1/last\n");
    EXPECT_EQ(All(), (Strings{"first /volume1/first", "spaced name /volume1/spaced", "last /volume1/last"}));
    for (const char *name : {"typo", "badbool", "badftp", "unclosed"}) {
        EXPECT_EQ(Find(name), "error 0x1400") << name;
    }
    EXPECT_EQ(Find("Spaced Name"), "spaced name /volume1/spaced");
}

// A damaged line could have lost a denial or moved the share: the section is skipped. Each row
// let carol into photo (write list @users), or made a share of "/".
TEST_F(ShareConfig, ADamagedLineSkipsItsSection) {
    const std::string nul(1, '\0');
    const std::string rows[] = {
        "invalid users = bob," + nul + "carol", "invalid users = bob,\"carol", "invalid users = carol\x1b",
        "invalid users = bob\rcarol",            "invalid users = car\xffol",  "invalid users = \"bob\",\"carol",
        "invalid\x01users = carol",             "inva\"lid users\" = carol",   "invalid users = carol\ncomment = x\x7f",
        "path = /" + nul + "junk",              "path = /volume1/\"x\"",        "comment = 12\" vinyl",
        "path = /volume1/phot\v",
    };
    for (const std::string &row : rows) {
        Conf("[photo]\npath = /volume1/photo\nwrite list = @users\n" + row +
             "\n[public]\npath = /volume1/public\n");
        EXPECT_EQ(All(), (Strings{"public /volume1/public"})) << row;
    }
    Conf("[photo" + nul + "]\npath = /volume1/photo\n[public]\npath = /volume1/public\n");
    EXPECT_EQ(All(), (Strings{"public /volume1/public"}));
    // A byte-order mark is no damage: the first share stays.
    Conf("\xEF\xBB\xBF[photo]\npath = /volume1/photo\n");
    EXPECT_EQ(All(), (Strings{"photo /volume1/photo"}));
}

// The parsed file is kept per process, yet every rewrite shows at once: one of the same size,
// in place (same inode) and within one tick of the kernel's clock (same stamps) too, and one
// made after the kept version has aged.
TEST_F(ShareConfig, EveryRewriteIsSeen) {
    const auto rewrite = [](const char *name) {
        FILE *file = fopen(QUIB_SHARE_CONF, "w");
        fprintf(file, "[%s]\npath = /volume1/x\n", name);
        fclose(file);
    };
    for (int i = 0; i < 300; ++i) {
        const char *name = i % 2 ? "odds" : "even";
        rewrite(name);
        ASSERT_EQ(Find(name), std::string(name) + " /volume1/x") << i;  // "odds": the same size
    }
    usleep(200000);
    EXPECT_EQ(Find("even"), "error 0x1400");
    rewrite("even");
    EXPECT_EQ(Find("even"), "even /volume1/x");
}

TEST_F(ShareConfig, PathsFindTheShareHoldingThem) {
    Conf("[data]\npath = /volume1/data\n[inner]\npath = /volume1/data/inner\n"
         "[photo]\npath = /volume1/photo\n[usb]\npath = /volumeUSB1/usbshare1-1\n");
    const struct { const char *path, *share; } rows[] = {
        {"/volume1/photo", "photo"},           {"/volume1/photo/", "photo"},        {"/volume1/photo/2024/a.jpg", "photo"},
        {"/volume1//photo/./x", "photo"},      {"/volume1/data/inner", "inner"},    {"/volume1/photo/../data/inner/f", "inner"},
        {"/volume1/data/innerness", "data"},   // whole components only
        {"/photo/2024/a.jpg", "photo"},        // a share named by the first component
        {"/PHOTO", "photo"},                   {"/volumeUSB1/usbshare1-1/f", "usb"},
        {"/volume1/photos/x", nullptr},        {"/volume1", nullptr},               {"/", nullptr},
        {"/nothing/here", nullptr},            {"photo/sub", nullptr},  // not a path, and no share's name
    };
    for (const auto &row : rows) {
        std::string found = Find(row.path);
        EXPECT_EQ(found.substr(0, found.find(' ')), row.share ? row.share : "error") << row.path;
        EXPECT_EQ(found, row.share ? found : "error 0x1400") << row.path;
    }
}

// The bin is "#recycle" directly in a share's folder (or a home folder, given a "homes" share),
// by the real path's text alone: never a deeper "#recycle", nor anything inside a bin.
TEST_F(ShareConfig, RecycleBinsAreTheTopFoldersNamedSo) {
    using norvo::testing::Failed;
    using norvo::testing::Outcome;
    const std::string shares = "[photo]\npath = /volume1/photo\n[media]\npath = /volume2/media\n"
                               "[docs]\npath = /volume1/documents\n[inner]\npath = /volume1/photo/inner\n";
    Conf(shares + "[homes]\npath = /volume1/homes\n");
    app_.SetHomeService(true, "/volume1/homes");
    const std::string overlong = "/" + std::string(4096, 'a');
    const Outcome yes{1}, no{0};
    struct Row { const char *path; Outcome want; } rows[] = {
        {"/volume1/photo/#recycle", yes},     {"/volume1/photo/#recycle/", yes},     {"/volume2/media/#recycle", yes},
        {"/volume1/documents/#recycle", yes}, {"/volume1//photo/./#recycle", yes},   {"/volume1/photo/a/../#recycle", yes},
        {"/volume1/photo/inner/#recycle", yes}, {"/volume1/homes/#recycle", yes},  {"/volume1/homes/alice/#recycle", yes},
        {"/volume1/docs/#recycle", no},  // the folder is not named after its share
        {"/volume1/media/#recycle", no},      {"/volume1/photo/a/#recycle", no},     {"/volume1/photo/#recycle/a", no},
        {"/volume1/photo/#Recycle", no},      {"/volume1/photo/#recycle2", no},      {"/volume1/photo", no},
        {"/volume1/photos/#recycle", no},     {"/volume1/homes/alice/a/#recycle", no}, {"/#recycle", no},
        {"/volume1/link/#recycle", no},  // links are not followed: a real path has none
        {"photo/#recycle", no},               {"#recycle", no},
        {"", Failed(QUIB_ERR_BAD_PARAMETER)}, {overlong.c_str(), Failed(QUIB_ERR_NAME_TOO_LONG)},
    };
    ASSERT_EQ(symlink("/volume1/photo", "/volume1/link"), 0);
    for (const Row &row : rows) {
        EXPECT_EQ(OUTCOME(QUIBShareIsShareRecycle(row.path)), row.want) << row.path;
    }
    EXPECT_EQ(OUTCOME(QUIBShareIsShareRecycle(nullptr)), Failed(QUIB_ERR_BAD_PARAMETER));
    // The settings are read only for a home folder's bin; without a "homes" share there is none.
    ASSERT_EQ(unlink(QUIB_INFO_CONF), 0);
    app_.MakeDir(QUIB_INFO_CONF);
    EXPECT_EQ(OUTCOME(QUIBShareIsShareRecycle("/volume1/homes/alice/#recycle")), Failed(QUIB_ERR_OPEN_FAILED));
    EXPECT_EQ(OUTCOME(QUIBShareIsShareRecycle("/volume1/photo/#recycle")), yes);
    Conf(shares);
    EXPECT_EQ(OUTCOME(QUIBShareIsShareRecycle("/volume1/homes/alice/#recycle")), no);
    ASSERT_EQ(unlink(QUIB_SHARE_CONF), 0);
    EXPECT_EQ(OUTCOME(QUIBShareIsShareRecycle("/volume1/photo/#recycle")), Failed(QUIB_ERR_OPEN_FAILED));
}

// Only a missing name is a bad argument; a name no share can carry names no share, and a
// missing configuration is not a missing share.
TEST_F(ShareConfig, BadArgumentsAndAMissingConfiguration) {
    app_.Basic();
    const std::string longPath = "/" + std::string(5000, 'p');
    for (const char *name : {"\xff\xfe", "a\nb", longPath.c_str()}) {
        EXPECT_EQ(Find(name), "error 0x1400") << name;
    }
    EXPECT_EQ(Find(nullptr), "error 0xd00");
    EXPECT_EQ(QUIBShareGet("photo", nullptr), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    ASSERT_EQ(unlink(QUIB_SHARE_CONF), 0);
    EXPECT_EQ(Find("photo"), "error 0x900");
    EXPECT_EQ(QUIBShareDBOpen(), nullptr);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);
    app_.MakeDir(QUIB_SHARE_CONF);  // unreadable as a file
    EXPECT_EQ(Find("photo"), "error 0x900");
}

// The shares AddShare writes read back in file order; the cursor walks what Open saw.
TEST_F(ShareConfig, CursorIsASnapshotInFileOrder) {
    app_.Basic();
    PQUIBSHARE_DB db = QUIBShareDBOpen();
    ASSERT_NE(db, nullptr);
    app_.AddShare({.name = "later"});
    EXPECT_EQ(All(db), (Strings{"public /volume1/public rw=@users", "photo /volume1/photo rw=alice ro=bob",
                                "secret /volume1/secret no=bob rw=alice status=2"}));
    QUIBShareDBClose(db);
    EXPECT_EQ(All().back(), "later /volume1/later");
}

}  // namespace
