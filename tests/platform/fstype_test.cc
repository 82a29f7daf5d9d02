// File-system type indexes: the name table and its aliases, the mount table (including a lost
// network share, where everything but the table fails), statfs-based lookups, mount points, and
// volume names in paths.
#include <errno.h>
#include <limits.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_fs.h"
#include "quib_webutils.h"

namespace {

using namespace norvo::testing;

TEST(FsType, NamesAndAliasesJoinTheirFamilies) {
    Appliance appliance;
    // fuseblk is shared by the exFAT and NTFS drivers: the boot sector of the source decides.
    const std::string boot("\xEB\x76\x90", 3);
    appliance.WriteFile("/tmp/exfat.img", boot + "EXFAT   " + std::string(500, '\0'));
    appliance.WriteFile("/tmp/ntfs.img", boot + "NTFS    " + std::string(500, '\0'));
    appliance.WriteFile("/tmp/short.img", boot + "EXF");
    const char *names[] = {"ext4", "vfat", "ext3", "btrfs", "tmpfs", "xfs", "exfat", "iso9660", "cifs"};
    ASSERT_EQ(QUIB_FSTYPE_COUNT, 9);
    for (int i = 0; i < QUIB_FSTYPE_COUNT; ++i) {
        EXPECT_STREQ(rgszFsType[i], names[i]) << i;
        EXPECT_EQ(QUIBFSTypeFromName(names[i], nullptr), i) << names[i];
    }
    constexpr int kFat = FSTYPE_FAT, kExfat = FSTYPE_EXFAT, kIso = FSTYPE_ISO, kRemote = FSTYPE_REMOTE;
    constexpr int kUnknown = FSTYPE_UNKNOWN;
    struct Case { const char *type, *source; int index; } cases[] = {
        {"msdos", "/dev/sdb1", kFat}, {"fat", "", kFat}, {"fuse.fusefat", "fusefat", kFat},
        {"fuse", "fusefat", kFat},  // FUSE without subtype: the source names the driver
        {"fuse.exfat", "/dev/sdc1", kExfat}, {"fuseblk.exfat", "/dev/sdc1", kExfat}, {"udf", "/dev/sr0", kIso},
        {"squashfs", "/x.img", kIso}, {"fuse.fuseiso", "fuseiso", kIso}, {"smb3", "//srv/share", kRemote},
        {"nfs4", "srv:/", kRemote}, {"fuse.sshfs", nullptr, kRemote}, {"fuse", "sshfs", kRemote},
        {"fuse.norvo-deadremote", "deadremote", kRemote},
        {"fuseblk", "/tmp/exfat.img", kExfat}, {"fuseblk", "/tmp/ntfs.img", kUnknown},
        {"fuseblk", "/tmp/short.img", kUnknown}, {"fuseblk", "/tmp/missing.img", kUnknown},
        {"fuse", "/tmp/exfat.img", kUnknown},  // not a block mount
        // Near misses and families the table has no entry for.
        {"ext2", "/dev/sda1", kUnknown}, {"EXT4", "", kUnknown}, {"ext4 ", "", kUnknown}, {"fuse", "", kUnknown},
        {"fuse", "unknowndriver", kUnknown}, {"fuse.", "", kUnknown}, {"overlay", "overlay", kUnknown},
        {"proc", "proc", kUnknown}, {"", "", kUnknown}, {"\xff\xfe", "\xc3", kUnknown},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(QUIBFSTypeFromName(c.type, c.source), c.index)
            << c.type << " from " << (c.source ? c.source : "null");
    }
    EXPECT_EQ(OUTCOME(QUIBFSTypeFromName(nullptr, "x")), Failed(QUIB_ERR_BAD_PARAMETER));
}

TEST(MountTable, EachPathIsHeldByItsDeepestDataMount) {
    Appliance appliance;
    appliance.AddUser("alice").MakeDir("/volume1/photo/2012").MakeDir("/volume1/usbx").WriteFile("/volume1/file");
    appliance.MakeDir("/volume1/closed", "root", 0700).AddVolume("/volumeUSB1").AddVolume("/mnt/elsewhere");
    appliance.MountFat("/volume1/usb").MountFat("/volume2/usb").MountDeadRemote("/volume1/remote");
    appliance.AddVolume("/volumeSATA1").MountFat("/volumeSATA1");  // stacked: the last mount is the one seen
    ASSERT_EQ(symlink("/volume2/usb", "/volume1/link"), 0);
    // The kernel writes space, tab, newline, backslash and '#' of mount paths as octal escapes;
    // a backslash that precedes digits must be decoded once only.
    const std::string odd[] = {"/volume1/odd name#1\\x\ty", "/volume1/new\nline", "/volume1/a\\040b"};
    appliance.MountFat(odd[0]).MountFat(odd[1]).MountFat(odd[2]);
    ASSERT_EQ(mkdir("/volume1/usb/sub", 0755), 0);  // FAT takes no chmod, so not MakeDir
    ASSERT_EQ(chdir("/volume1/usb"), 0);            // relative paths start here
    const std::string overlong = "/" + std::string(PATH_MAX, 'a');

    // The table is read lexically, without touching the path: missing paths are classed too.
    constexpr int kTmp = FSTYPE_TMPFS, kFat = FSTYPE_FAT, kRemote = FSTYPE_REMOTE, kNotMount = FSTYPE_NOT_MOUNT_POINT;
    struct Held { std::string path; int index; } held[] = {
        {"/volume1/photo/2012", kTmp}, {"/volume1/no/such/file", kTmp}, {"/volume1//photo/./x/..", kTmp},
        {"/volume1/usb", kFat}, {"/volume1/usb/a/b", kFat}, {"/volume1/usbx", kTmp}, {"/volume1/usb/../usbx", kTmp},
        {"sub/x", kFat}, {"../other", kTmp}, {"/volume1/link", kTmp}, {odd[0] + "/inside", kFat},
        {odd[1] + "/inside", kFat}, {odd[2] + "/inside", kFat}, {"/volume1/odd name#1", kTmp},
        {"/volume1/odd name#1\\x", kTmp}, {"/volume1/a b", kTmp}, {"/volume1/remote", kRemote},
        {"/volume1/remote/a/b.txt", kRemote}, {"/volumeUSB1/share/a", kTmp}, {"/volumeSATA1/a", kFat},
        {"/volume1/\xff\xfe/x", kTmp},  // bytes, not UTF-8
        // Only data mounts count, not the system disk nor what lies outside the volumes.
        {"/mnt/elsewhere/x", -1}, {"/srv/x", -1}, {"/", -1}, {"/volume1x", -1}, {"/volume1/../srv", -1},
        {"/volume3/a", -1},  // a volume that is not mounted
    };
    for (const Held &h : held) {
        EXPECT_EQ(QUIBFSIsInMountTable(h.path.c_str()), h.index) << h.path;
    }
    EXPECT_EQ(OUTCOME(QUIBFSIsInMountTable(nullptr)), Failed(QUIB_ERR_BAD_PARAMETER));
    EXPECT_EQ(OUTCOME(QUIBFSIsInMountTable("")), Failed(QUIB_ERR_BAD_PARAMETER));
    EXPECT_EQ(OUTCOME(QUIBFSIsInMountTable(overlong.c_str())), Failed(QUIB_ERR_NAME_TOO_LONG));

    // statfs-based: any mount, links followed, and errno kept from statfs.
    struct Typed { std::string path; int flags; Outcome want; } typed[] = {
        {"/volume1", 1, {kTmp}}, {"/volume1/", 1, {kTmp}}, {"/volume1/photo", 1, {kNotMount}},
        {"/volume1/photo/2012", 0, {kTmp}}, {"/volume1/usb", 1, {kFat}}, {"/volume1/usbx", 1, {kNotMount}},
        {".", 1, {kFat}}, {"sub", 1, {kNotMount}}, {"sub", 0, {kFat}}, {"/volume1/link", 0, {kFat}},
        {"/volume1/link", 1, {kFat}}, {odd[0], 1, {kFat}}, {odd[2], 1, {kFat}}, {"/mnt/elsewhere", 1, {kTmp}},
        {"/volumeSATA1", 1, {kFat}},
        // The root of a lost share needs no lookup: statfs reaches the server, which answers it.
        {"/volume1/remote", 1, {kRemote}}, {"/volume1/remote/a", 0, Failed(QUIB_ERR_FAILED, EIO)},
        {"/volume1/missing", 0, Failed(QUIB_ERR_NO_SUCH_FILE, ENOENT)},
        {"/volume1/file/x", 0, Failed(QUIB_ERR_NO_SUCH_PATH, ENOTDIR)}, {"", 0, Failed(QUIB_ERR_BAD_PARAMETER, EINVAL)},
        {"/", 2, Failed(QUIB_ERR_BAD_PARAMETER, EINVAL)}, {overlong, 0, Failed(QUIB_ERR_NAME_TOO_LONG, ENAMETOOLONG)},
    };
    for (const Typed &t : typed) {
        EXPECT_EQ(OUTCOME(QUIBGetFSType(t.path.c_str(), t.flags)), t.want) << t.path << " " << t.flags;
    }
    EXPECT_EQ(OUTCOME(QUIBGetFSType(nullptr, 0)), Failed(QUIB_ERR_BAD_PARAMETER, EINVAL));
    EXPECT_NE(QUIBGetFSType("/srv", 0), -1);
    EXPECT_TRUE(appliance.RunAs("alice", [] {
        return OUTCOME(QUIBGetFSType("/volume1/closed/x", 0)) == Failed(QUIB_ERR_ACCESS_DENIED, EACCES);
    }));
}

TEST(MountPoint, KernelMarkOrMountTable) {
    Appliance app;
    app.MakeDir("/volume1/dir/sub").MakeDir("/volume1/bound").MakeDir("/volume1/web/cgi");
    app.MountDeadRemote("/volume1/dead").AddVolume("/volume2/stack").MountFat("/volume2/stack");
    ASSERT_EQ(mount("/volume1/dir", "/volume1/bound", nullptr, MS_BIND, nullptr), 0);  // same device
    ASSERT_EQ(symlink("/volume1/bound", "/volume1/link"), 0);
    ASSERT_EQ(chdir("/volume1/web/cgi"), 0);
    const std::string fat = "fuse.fusefat", dead = "fuse.norvo-deadremote";
    // The type comes from the table alone ("*": the host's root, any type): the lost share answers it, a link names no mount.
    struct Case {
        std::string path;
        bool mountPoint;
        std::string type;
        int slot = 0;
    } cases[] = {
        {"/", true, "*"}, {"/volume1", true, "tmpfs"}, {"/volume1/", true, "tmpfs"}, {"/volume1/dir", false, ""},
        {"/volume1/dir/sub", false, ""}, {"/volume1/bound", true, "tmpfs"}, {"/volume1/link", false, ""},
        {"/volume1/dead", true, dead}, {"/volume1/dead/x", false, ""}, {"/volume1/dir/../dead", true, dead},
        {"/volume2/stack", true, fat},  // a FAT mount over a tmpfs one: the topmost
        {"/volume2/stack/", true, fat}, {"../..", true, "tmpfs"}, {"..", false, ""}, {"/volume1/missing", false, ""},
        {"", false, "", QUIB_ERR_BAD_PARAMETER}, {std::string("/volume1\0/x", 11), false, "", QUIB_ERR_BAD_PARAMETER},
        {"/" + std::string(4096, 'a'), false, "", QUIB_ERR_NAME_TOO_LONG},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(WebUtils::IsMountPoint(c.path), c.mountPoint) << c.path.substr(0, 40);
        VLIBCErrSetEx(QUIB_ERR_NONE, "", 0);
        const std::string type = WebUtils::getMountType(c.path);
        EXPECT_EQ(c.type == "*" && !type.empty() ? "*" : type, c.type) << c.path.substr(0, 40);
        EXPECT_EQ(VLIBCErrGet(), c.slot) << c.path.substr(0, 40);
    }
}

TEST(VolumePathParse, RecognisesTheThreeKindsOfVolumeAndNothingElse) {
    constexpr int kIn = VOLUME_KIND_INTERNAL, kUsb = VOLUME_KIND_USB, kSata = VOLUME_KIND_ESATA;
    struct Case { const char *path, *volume; int kind; } cases[] = {
        {"/volume1", "/volume1", kIn}, {"/volume1/", "/volume1", kIn}, {"/volume1/photo/2012/a.jpg", "/volume1", kIn},
        {"/volume12/x", "/volume12", kIn}, {"/volumeUSB1", "/volumeUSB1", kUsb},
        {"/volumeUSB3/usbshare/a", "/volumeUSB3", kUsb}, {"/volumeSATA1/satashare", "/volumeSATA1", kSata},
        {"/volumeSATA20", "/volumeSATA20", kSata},
    };
    for (const Case &c : cases) {
        VOLUME_INFO info{};
        EXPECT_EQ(VolumePathParse(c.path, &info), 1) << c.path;
        EXPECT_STREQ(info.szVolumePath, c.volume) << c.path;
        EXPECT_EQ(info.kind, c.kind) << c.path;
    }
    const std::string longNumber = "/volume" + std::string(80, '1');
    for (const char *path : {"/volume1x", "/volume", "/volume/1", "/volumeUSB", "/volumeUSBx1", "/volumeusb1",
                             "/volumeSATA", "/Volume1", "volume1", "//volume1", "/tmp", "/", "/volume1x/a",
                             "/volumeESATA1", "/\xff\xfe", "/volumeSATA1x", longNumber.c_str()}) {
        VOLUME_INFO info{};
        EXPECT_EQ(VolumePathParse(path, &info), 0) << path;
    }
    VOLUME_INFO info{};
    const std::string overlong = "/volume1/" + std::string(PATH_MAX, 'a');
    EXPECT_EQ(OUTCOME(VolumePathParse(nullptr, &info)), Failed(QUIB_ERR_BAD_PARAMETER));
    EXPECT_EQ(OUTCOME(VolumePathParse("", &info)), Failed(QUIB_ERR_BAD_PARAMETER));
    EXPECT_EQ(OUTCOME(VolumePathParse("/volume1", nullptr)), Failed(QUIB_ERR_BAD_PARAMETER));
    EXPECT_EQ(OUTCOME(VolumePathParse(overlong.c_str(), &info)), Failed(QUIB_ERR_NAME_TOO_LONG));
}

}  // namespace
