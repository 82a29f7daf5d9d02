// File-system type indexes: the name table and its aliases, the mount table (including a lost
// network share, where everything but the table fails), and statfs-based lookups.
#include <dirent.h>
#include <errno.h>
#include <limits.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_fs.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;

// Open descriptors of this process, to prove every path releases what it opened.
int OpenDescriptors() {
    int count = 0;
    if (DIR *dir = opendir("/proc/self/fd")) {
        while (readdir(dir) != nullptr) {
            ++count;
        }
        closedir(dir);
    }
    return count;
}

TEST(FsTypeTable, HoldsThePlatformNamesInIndexOrder) {
    const char *expected[] = {"ext4", "vfat", "ext3", "btrfs", "tmpfs", "xfs", "exfat", "iso9660", "cifs"};
    ASSERT_EQ(QUIB_FSTYPE_COUNT, 9);
    for (int i = 0; i < QUIB_FSTYPE_COUNT; ++i) {
        EXPECT_STREQ(rgszFsType[i], expected[i]) << i;
        EXPECT_EQ(QUIBFSTypeFromName(rgszFsType[i], nullptr), i);
    }
}

TEST(FsTypeTable, AliasesJoinTheirFamilies) {
    struct Case {
        const char *type;
        const char *source;
        int index;
    } cases[] = {
        {"msdos", "/dev/sdb1", FSTYPE_FAT},
        {"fat", "", FSTYPE_FAT},
        {"fuse.fusefat", "fusefat", FSTYPE_FAT},
        {"fuse", "fusefat", FSTYPE_FAT},  // FUSE without subtype: the source names the driver
        {"fuse.exfat", "/dev/sdc1", FSTYPE_EXFAT},
        {"fuseblk.exfat", "/dev/sdc1", FSTYPE_EXFAT},
        {"udf", "/dev/sr0", FSTYPE_ISO},
        {"squashfs", "/x.img", FSTYPE_ISO},
        {"fuse.fuseiso", "fuseiso", FSTYPE_ISO},
        {"smb3", "//srv/share", FSTYPE_REMOTE},
        {"smbfs", "", FSTYPE_REMOTE},
        {"nfs", "srv:/export", FSTYPE_REMOTE},
        {"nfs4", "srv:/", FSTYPE_REMOTE},
        {"ceph", "", FSTYPE_REMOTE},
        {"9p", "", FSTYPE_REMOTE},
        {"fuse.sshfs", "me@host:", FSTYPE_REMOTE},
        {"fuse", "sshfs", FSTYPE_REMOTE},
        {"fuse.rclone", "", FSTYPE_REMOTE},
        {"fuse.s3fs", "", FSTYPE_REMOTE},
        {"fuse.davfs", "", FSTYPE_REMOTE},
        {"fuse.curlftpfs", "", FSTYPE_REMOTE},
        {"fuse.norvo-deadremote", "deadremote", FSTYPE_REMOTE},
        // Near misses and families the table has no entry for.
        {"ext2", "/dev/sda1", FSTYPE_UNKNOWN},
        {"EXT4", "", FSTYPE_UNKNOWN},
        {"ext4 ", "", FSTYPE_UNKNOWN},
        {"fuse", "", FSTYPE_UNKNOWN},
        {"fuse", "unknowndriver", FSTYPE_UNKNOWN},
        {"fuse.", "", FSTYPE_UNKNOWN},
        {"fuseblk", "/nonexistent/device", FSTYPE_UNKNOWN},
        {"overlay", "overlay", FSTYPE_UNKNOWN},
        {"proc", "proc", FSTYPE_UNKNOWN},
        {"", "", FSTYPE_UNKNOWN},
        {"\xff\xfe", "\xc3", FSTYPE_UNKNOWN},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(QUIBFSTypeFromName(c.type, c.source), c.index) << c.type << " from " << c.source;
    }
    EXPECT_EQ(QUIBFSTypeFromName("fuse.sshfs", nullptr), FSTYPE_REMOTE);
    EXPECT_EQ(QUIBFSTypeFromName(nullptr, "x"), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
}

TEST(FsTypeTable, OnlyTheRemoteAndImageIndexesAreClassed) {
    for (int index = -1; index <= 12; ++index) {
        EXPECT_EQ(QUIBFSIsRemoteFS(index), index == FSTYPE_REMOTE ? 1 : 0) << index;
        EXPECT_EQ(QUIBFSIsImageFS(index), index == FSTYPE_ISO ? 1 : 0) << index;
    }
}

// fuseblk is shared by the exFAT and NTFS drivers: the boot sector of the source decides.
TEST(FsTypeTable, FuseblkIsToldByTheBootSector) {
    Appliance appliance;
    const std::string boot = std::string("\xEB\x76\x90", 3);
    appliance.WriteFile("/tmp/exfat.img", boot + "EXFAT   " + std::string(500, '\0'));
    appliance.WriteFile("/tmp/ntfs.img", boot + "NTFS    " + std::string(500, '\0'));
    appliance.WriteFile("/tmp/short.img", boot + "EXF");
    EXPECT_EQ(QUIBFSTypeFromName("fuseblk", "/tmp/exfat.img"), FSTYPE_EXFAT);
    EXPECT_EQ(QUIBFSTypeFromName("fuseblk", "/tmp/ntfs.img"), FSTYPE_UNKNOWN);
    EXPECT_EQ(QUIBFSTypeFromName("fuseblk", "/tmp/short.img"), FSTYPE_UNKNOWN);
    EXPECT_EQ(QUIBFSTypeFromName("fuse", "/tmp/exfat.img"), FSTYPE_UNKNOWN);  // not a block mount
}

TEST(MountTable, VolumesAndTheirContentsAreHeldByTheirMount) {
    Appliance appliance;
    appliance.MakeDir("/volume1/photo/2012");
    EXPECT_EQ(QUIBGetFSType("/volume1", 1), FSTYPE_TMPFS);
    EXPECT_EQ(QUIBGetFSType("/volume1/", 1), FSTYPE_TMPFS);
    EXPECT_EQ(QUIBGetFSType("/volume1/photo", 1), FSTYPE_NOT_MOUNT_POINT);
    EXPECT_EQ(QUIBGetFSType("/volume1/photo/2012", 0), FSTYPE_TMPFS);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/photo/2012"), FSTYPE_TMPFS);
    // The table is read without touching the path: missing paths are classed too.
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/no/such/file"), FSTYPE_TMPFS);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1//photo/./x/.."), FSTYPE_TMPFS);
}

TEST(MountTable, TheDeepestMountWinsByWholeComponents) {
    Appliance appliance;
    appliance.MountFat("/volume1/usb");
    appliance.MakeDir("/volume1/usbx");
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/usb"), FSTYPE_FAT);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/usb/a/b"), FSTYPE_FAT);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/usbx"), FSTYPE_TMPFS);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/usb/../usbx"), FSTYPE_TMPFS);
    EXPECT_EQ(QUIBGetFSType("/volume1/usb", 1), FSTYPE_FAT);
    EXPECT_EQ(QUIBGetFSType("/volume1/usbx", 1), FSTYPE_NOT_MOUNT_POINT);
}

// The kernel writes space, tab, newline, backslash and '#' of mount paths as octal escapes.
TEST(MountTable, EscapedMountDirectoriesAreFound) {
    Appliance appliance;
    const std::string odd = "/volume1/odd name#1\\x\ty";
    appliance.MountFat(odd);
    EXPECT_EQ(QUIBFSIsInMountTable((odd + "/inside").c_str()), FSTYPE_FAT);
    EXPECT_EQ(QUIBGetFSType(odd.c_str(), 1), FSTYPE_FAT);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/odd name#1"), FSTYPE_TMPFS);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/odd name#1\\x"), FSTYPE_TMPFS);
}

TEST(MountTable, RelativePathsStartAtTheWorkingDirectory) {
    Appliance appliance;
    appliance.MountFat("/volume1/usb");
    ASSERT_EQ(mkdir("/volume1/usb/sub", 0755), 0);  // FAT takes no chmod, so not MakeDir
    ASSERT_EQ(chdir("/volume1/usb"), 0);
    EXPECT_EQ(QUIBFSIsInMountTable("sub/x"), FSTYPE_FAT);
    EXPECT_EQ(QUIBFSIsInMountTable("../other"), FSTYPE_TMPFS);
    EXPECT_EQ(QUIBGetFSType(".", 1), FSTYPE_FAT);
    EXPECT_EQ(QUIBGetFSType("sub", 1), FSTYPE_NOT_MOUNT_POINT);
    EXPECT_EQ(QUIBGetFSType("sub", 0), FSTYPE_FAT);
}

// statfs follows links, so the type is that of where the link leads; the table lookup is
// lexical and never follows anything.
TEST(MountTable, GetFSTypeJudgesWhereALinkLeads) {
    Appliance appliance;
    appliance.MountFat("/volume2/usb");
    ASSERT_EQ(symlink("/volume2/usb", "/volume1/link"), 0);
    EXPECT_EQ(QUIBGetFSType("/volume1/link", 0), FSTYPE_FAT);
    EXPECT_EQ(QUIBGetFSType("/volume1/link", 1), FSTYPE_FAT);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/link"), FSTYPE_TMPFS);
}

TEST(MountTable, ALostNetworkShareIsStillClassedRemote) {
    Appliance appliance;
    appliance.MountDeadRemote("/volume1/remote");
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/remote"), FSTYPE_REMOTE);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/remote/a/b.txt"), FSTYPE_REMOTE);
    EXPECT_EQ(QUIBFSIsRemoteFS(QUIBFSIsInMountTable("/volume1/remote/a")), 1);

    errno = 0;
    EXPECT_EQ(QUIBGetFSType("/volume1/remote/a", 0), -1);
    EXPECT_EQ(errno, EIO);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_FAILED);
    // The mount root itself needs no lookup: statfs reaches the server, which answers it
    // (and realpath, which fails with EIO there, is not needed to find the mount).
    EXPECT_EQ(QUIBGetFSType("/volume1/remote", 1), FSTYPE_REMOTE);
}

TEST(MountTable, GetFSTypeKeepsTheErrnoOfStatfs) {
    Appliance appliance;
    appliance.WriteFile("/volume1/file");
    appliance.MakeDir("/volume1/closed", "root", 0700);
    appliance.AddUser("alice");
    errno = 0;
    EXPECT_EQ(QUIBGetFSType("/volume1/missing", 0), -1);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_FILE);
    errno = 0;
    EXPECT_EQ(QUIBGetFSType("/volume1/file/x", 0), -1);
    EXPECT_EQ(errno, ENOTDIR);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_PATH);
    const int denied = appliance.RunAs("alice", [] {
        errno = 0;
        return QUIBGetFSType("/volume1/closed/x", 0) == -1 && errno == EACCES &&
                       VLIBCErrGet() == QUIB_ERR_ACCESS_DENIED
                   ? 1
                   : 0;
    });
    EXPECT_EQ(denied, 1);
}

TEST(MountTable, BadArgumentsAreRefused) {
    const std::string overlong = "/" + std::string(PATH_MAX, 'a');
    errno = 0;
    EXPECT_EQ(QUIBGetFSType(nullptr, 0), -1);
    EXPECT_EQ(errno, EINVAL);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QUIBGetFSType("", 0), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QUIBGetFSType("/", 2), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    errno = 0;
    EXPECT_EQ(QUIBGetFSType(overlong.c_str(), 0), -1);
    EXPECT_EQ(errno, ENAMETOOLONG);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NAME_TOO_LONG);

    EXPECT_EQ(QUIBFSIsInMountTable(nullptr), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QUIBFSIsInMountTable(""), -1);
    EXPECT_EQ(QUIBFSIsInMountTable(overlong.c_str()), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NAME_TOO_LONG);
}

// Only data mounts count: the system disk and whatever else is mounted outside the volumes
// (here the host directories the sandbox binds in) are not in the table.
TEST(MountTable, OnlyMountsOnVolumesAreDataMounts) {
    Appliance appliance;
    appliance.AddVolume("/volumeUSB1");
    appliance.AddVolume("/mnt/elsewhere");
    EXPECT_EQ(QUIBFSIsInMountTable("/volumeUSB1/share/a"), FSTYPE_TMPFS);
    EXPECT_EQ(QUIBFSIsInMountTable("/mnt/elsewhere/x"), -1);
    EXPECT_EQ(QUIBFSIsInMountTable("/srv/x"), -1);
    EXPECT_EQ(QUIBFSIsInMountTable("/"), -1);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1x"), -1);
    EXPECT_EQ(QUIBFSIsInMountTable("/volume3/a"), -1) << "a volume that is not mounted";
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/../srv"), -1);
    // Not UTF-8, but a path all the same: the kernel takes bytes.
    EXPECT_EQ(QUIBFSIsInMountTable("/volume1/\xff\xfe/x"), FSTYPE_TMPFS);
    // statfs-based lookups see every mount.
    EXPECT_EQ(QUIBGetFSType("/mnt/elsewhere", 1), FSTYPE_TMPFS);
    EXPECT_NE(QUIBGetFSType("/srv", 0), -1);
}

TEST(MountTable, EveryPathReleasesItsDescriptors) {
    Appliance appliance;
    appliance.MountDeadRemote("/volume1/remote");
    appliance.WriteFile("/tmp/exfat.img", std::string("\xEB\x76\x90" "EXFAT   ", 11));
    const int before = OpenDescriptors();
    for (int i = 0; i < 20; ++i) {
        (void)QUIBFSIsInMountTable("/volume1/remote/x");
        (void)QUIBFSIsInMountTable("relative");
        (void)QUIBGetFSType("/volume1", 1);
        (void)QUIBGetFSType("/volume1/remote/x", 0);
        (void)QUIBGetFSType("/volume1/missing", 0);
        (void)QUIBFSTypeFromName("fuseblk", "/tmp/exfat.img");
        (void)QUIBFSTypeFromName("fuseblk", "/tmp/missing.img");
    }
    EXPECT_EQ(OpenDescriptors(), before);
}

}  // namespace
