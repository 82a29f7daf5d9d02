#include <stdio.h>
#include <sys/acl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvomisc.h"
#include "quib_fs.h"
#include "quib_share.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using Lines = std::vector<std::string>;

void SetAcl(const char *path, const char *text) {
    acl_t acl = acl_from_text(text);
    ASSERT_NE(acl, nullptr) << text;
    ASSERT_EQ(acl_set_file(path, ACL_TYPE_ACCESS, acl), 0) << path;
    acl_free(acl);
}

TEST(ModeDigits, StringsAndModes) {
    EXPECT_EQ(GetPrivilege("rwxr-x---"), 750);
    EXPECT_EQ(GetPrivilege("rw-r--r--"), 644);
    EXPECT_EQ(GetPrivilege("---------"), 0);
    EXPECT_EQ(GetPrivilege("xwrxwrxwr"), 222);  // letters count only in their own place
    EXPECT_EQ(GetPrivilege(0100644u), 644);
    EXPECT_EQ(GetPrivilege(07777u), 777);       // set-id and sticky bits are ignored
    EXPECT_EQ(GetPrivilege(0u), 0);
    for (unsigned mode = 0; mode < 01000; ++mode) {
        const std::string s = GetPrivilegeStr(mode | 040000);
        ASSERT_EQ(s.size(), 9u);
        EXPECT_EQ(GetPrivilege(s.c_str()), GetPrivilege(mode)) << s;
    }
    EXPECT_EQ(GetPrivilegeStr(0755), "rwxr-xr-x");
    EXPECT_EQ(GetPrivilegeStr(0), "---------");
}

TEST(AclAccess, RequestBitsAreJudgedForTheCaller) {
    Appliance app;
    app.Basic();
    app.WriteFile("/volume1/public/shared.txt", "x", "alice", 0640);
    SetAcl("/volume1/public/shared.txt", "u::rw-,g::r--,o::---,u:bob:rw-,m::rw-");
    app.WriteFile("/volume1/public/private.txt", "x", "alice", 0600);

    const auto access = [&app](const char *user, const char *path, int request) {
        return app.RunAs(user, [path, request] { return ACLAccess(path, request) == 0 ? 0 : NvoLibGetErr() - 400; });
    };
    EXPECT_EQ(access("bob", "/volume1/public/shared.txt", 0x1), 0);   // read, through the ACL
    EXPECT_EQ(access("bob", "/volume1/public/shared.txt", 0x2), 0);   // write
    EXPECT_EQ(access("bob", "/volume1/public/shared.txt", 0x10), 0);  // append
    EXPECT_EQ(access("bob", "/volume1/public/shared.txt", 0x4), 7);   // execute
    EXPECT_EQ(access("bob", "/volume1/public/private.txt", 0x1), 7);
    EXPECT_EQ(access("alice", "/volume1/public/private.txt", 0x3), 0);
    // Deleting needs write access to the folder: public is open to all.
    EXPECT_EQ(access("bob", "/volume1/public/private.txt", 0x8), 0);
    EXPECT_EQ(access("bob", "/volume1/public/missing", 0x1), 8);
    EXPECT_EQ(ACLAccess(nullptr, 0x1), -1);
    EXPECT_EQ(ACLAccess("/volume1/public", 0), -1);
    EXPECT_TRUE(app.ErrorLines().empty());
}

TEST(AclAccess, FileSystemsWithoutAclsLeaveItToTheKernel) {
    Appliance app;
    app.MountFat("/volumeUSB1");
    FILE *file = fopen("/volumeUSB1/a.txt", "w");  // FAT keeps no modes to set
    ASSERT_NE(file, nullptr);
    fclose(file);
    EXPECT_EQ(ACLAccess("/volumeUSB1/a.txt", 0x1), 0);
    EXPECT_EQ(GetACLPrivilege("/volumeUSB1/a.txt"), 8191u);
    EXPECT_EQ(GetACLPrivilege("/volume1/missing"), 8191u);
    EXPECT_TRUE(app.ErrorLines().empty());
    // A parent that is not a directory is none of the quiet cases.
    app.WriteFile("/volume1/file", "x");
    EXPECT_EQ(GetACLPrivilege("/volume1/file/x"), 8191u);
    EXPECT_EQ(ACLAccess("/volume1/file/x", 0x1), -1);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvomisc.cpp:# Failed to get the ACL Privilege: file = /volume1/file/x, euid = 0, reason=[700]",
                     "norvomisc.cpp:# Failed to get the ACL Privilege: file = /volume1/file/x, reason=[700]"}));
}

TEST(DirList, EntersAndOpensOrSaysWhyNot) {
    Appliance app;
    app.Basic();
    app.MakeDir("/volume1/photo/closed", "alice", 0700);
    app.MakeDir("/volume1/photo/dropbox", "alice", 0711);
    app.WriteFile("/volume1/photo/file", "x");
    EXPECT_EQ(CheckDirListPrivilege("/volume1/photo"), 1);
    char cwd[256];
    ASSERT_NE(getcwd(cwd, sizeof(cwd)), nullptr);
    EXPECT_STREQ(cwd, "/volume1/photo");  // the listing works relative to it
    EXPECT_EQ(CheckDirListPrivilege("/volume1/photo/none"), 0);
    EXPECT_EQ(NvoLibGetErr(), 408);
    EXPECT_EQ(CheckDirListPrivilege("/volume1/photo/file"), 0);
    EXPECT_EQ(NvoLibGetErr(), 408);
    EXPECT_EQ(CheckDirListPrivilege(nullptr), 0);
    for (const char *dir : {"/volume1/photo/closed", "/volume1/photo/dropbox"}) {  // can't enter; can't read
        EXPECT_EQ(app.RunAs("bob", [dir] { return CheckDirListPrivilege(dir) ? 0 : NvoLibGetErr() - 400; }), 7);
    }
    app.MountDeadRemote("/volume1/photo/nas");
    EXPECT_EQ(CheckDirListPrivilege("/volume1/photo/nas"), 0);
    EXPECT_EQ(NvoLibGetErr(), 402);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvomisc.cpp:# Failed to chdir /volume1/photo/none. [No such file or directory]",
                     "norvomisc.cpp:# Failed to chdir /volume1/photo/file. [Not a directory]",
                     "norvomisc.cpp:# Failed to chdir /volume1/photo/closed. [Permission denied]",
                     "norvomisc.cpp:# Failed to opendir /volume1/photo/dropbox. [Permission denied]",
                     "norvomisc.cpp:# Failed to chdir /volume1/photo/nas. [Input/output error]"}));
}

TEST(ShareChecks, ListDownloadAndUpload) {
    Appliance app;
    app.Basic();
    app.AddShare({.name = "dropbox", .readWrite = "alice,admin", .readOnly = "bob", .restrict = SHARE_RESTRICT_NO_BROWSE});
    app.AddShare({.name = "nodl", .readWrite = "alice", .restrict = SHARE_RESTRICT_NO_DOWNLOAD});
    app.AddShare({.name = "nomod", .readWrite = "alice", .restrict = SHARE_RESTRICT_NO_MODIFY});
    app.WriteFile("/volume1/photo/exists.jpg");

    app.WriteFile("/volume1/homes/alice/old.txt");
    // L: list, D: download, U: upload with the overwrite type given (and what it becomes).
    const struct {
        char check;
        const char *user, *path;
        int result;
        int err = 0;  // the library code, when not 0
        int type = 0, typeAfter = -1;
    } rows[] = {
        {'L', "alice", "/photo/x", 1}, {'L', "alice", "/dropbox", 0}, {'L', "admin", "/dropbox", 1},
        {'L', "alice", "/nodl", 1}, {'L', "bob", "/secret", 0},
        {'L', "ghost", "/home/x", 1},  // homes need no lookup
        {'L', "alice", nullptr, 0},
        {'D', "alice", "/nodl/a", 0, 407}, {'D', "alice", "/dropbox/a", 0}, {'D', "alice", "/nomod/a", 1},
        {'D', "bob", "/photo/a", 1}, {'D', "alice", nullptr, 0, 400},
        {'U', "bob", "/photo/new.jpg", 0, 407},  // read-only
        {'U', "alice", "/photo/new.jpg", 1}, {'U', "alice", "/photo/exists.jpg", 0, 414},
        {'U', "alice", "/photo/exists.jpg", 1, 0, 1}, {'U', "alice", "/nomod/exists.jpg", 1, 0, 0, 2},
        // A home path skips the share but not the existence test.
        {'U', "alice", "/home/new.txt", 1}, {'U', "alice", "/home/old.txt", 0, 414},
    };
    for (const auto &row : rows) {
        NvoLibSetErr(0);
        int type = row.type;
        const int got = row.check == 'L'   ? CheckShareListPrivilege(row.user, nullptr, row.path)
                        : row.check == 'D' ? CheckShareDownloadPrivilege(row.user, nullptr, row.path)
                                           : CheckShareUploadPrivilege(row.user, nullptr, row.path, &type);
        const std::string what = std::string(1, row.check) + " " + row.user + " " + (row.path ? row.path : "(null)");
        EXPECT_EQ(got, row.result) << what;
        EXPECT_EQ(NvoLibGetErr(), row.err != 0 ? row.err : NvoLibGetErr()) << what;
        EXPECT_EQ(type, row.typeAfter >= 0 ? row.typeAfter : type) << what;
    }
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvomisc.cpp:# No privilege in path /dropbox",
                     "norvomisc.cpp:# No privilege in path /secret",
                     "norvomisc.cpp:# No privilege in path /nodl/a",
                     "norvomisc.cpp:# No privilege in path /dropbox/a",
                     "norvomisc.cpp:# Share no upload privilege, path=/photo/new.jpg",
                     "norvomisc.cpp:# Share no modify privilege, path=/photo/exists.jpg",
                     "norvomisc.cpp:# Share no modify privilege, path=/home/old.txt"}));
}

TEST(ShareChecks, LookupFailuresAreLogged) {
    Appliance app;
    app.Basic();
    int type = 0;
    EXPECT_EQ(CheckShareListPrivilege("alice", nullptr, "/gone"), 0);
    EXPECT_EQ(CheckShareUploadPrivilege("alice", nullptr, "/gone/x", &type), 0);
    EXPECT_EQ(CheckShareUploadPrivilege("ghost", nullptr, "/home/x", &type), 0);
    EXPECT_EQ(app.ErrorLines(),
              (Lines{"norvodir.cpp(#): QUIBShareGet gone fail",
                     "norvomisc.cpp:# Gailed to check privilege of path /gone, reason=[408] ",
                     "norvodir.cpp(#): QUIBShareGet gone fail",
                     "norvomisc.cpp:# Failed to get privilege, path= /gone/x, reason=[408] ",
                     "norvodir.cpp:# Failed to get user (ghost)", "norvodir.cpp:# NvoUserHomeFullPathGet fail",
                     "norvoenum.cpp:# Fail to get the Full Path, /home/x",
                     "norvomisc.cpp:# Failed to get path info:/home/x, reason=[8000]"}));
    // This line is known by its number.
    bool numbered = false;
    for (const auto &line : app.Logs()) {
        numbered = numbered || line.text == "norvoenum.cpp:784 Fail to get the Full Path, /home/x";
    }
    EXPECT_TRUE(numbered);
}

TEST(FileSystems, ExternalDisksMustCarryANativeFileSystem) {
    Appliance app;
    app.MountFat("/volumeUSB1");
    app.MountDeadRemote("/volumeUSB2");
    mkdir("/volumeSATA1", 0755);
    ASSERT_EQ(mount("ramfs", "/volumeSATA1", "ramfs", 0, nullptr), 0);
    EXPECT_EQ(NvoLibFileSystemSupported("/volume1/anything"), 1);
    EXPECT_EQ(NvoLibFileSystemSupported("/volumeUSB1"), 1);
    EXPECT_EQ(NvoLibFileSystemSupported("/volumeUSB2/a"), 0);
    EXPECT_EQ(NvoLibFileSystemSupported("/volumeSATA1"), 0);
    EXPECT_EQ(NvoLibFileSystemSupported("/srv/x"), 1);
    EXPECT_EQ(NvoLibFileSystemSupported(nullptr), 1);
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvomisc.cpp:# QUIBGetFSType got error", "norvomisc.cpp:# Bad parameters: /srv/x",
                                       "norvomisc.cpp:# Bad parameters: (null)"}));
}

TEST(Encryption, SharesHomesAndMissingShares) {
    Appliance app;
    app.Basic();
    bool encrypted = true;
    EXPECT_EQ(NvoLibCheckEncryptShare("secret", &encrypted), 1);
    EXPECT_TRUE(encrypted);
    EXPECT_EQ(NvoLibCheckEncryptShare("photo", &encrypted), 1);
    EXPECT_FALSE(encrypted);
    encrypted = true;
    EXPECT_EQ(NvoLibCheckEncryptShare("home", &encrypted), 1);
    EXPECT_FALSE(encrypted);
    EXPECT_EQ(NvoLibCheckEncryptShare("none", &encrypted), 0);
    EXPECT_EQ(NvoLibGetErr(), 408);
    EXPECT_EQ(app.ErrorLines(), (Lines{"norvomisc.cpp:# QUIBShareGet fail none"}));
}

}  // namespace
