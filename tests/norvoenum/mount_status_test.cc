// The mount-status table over the sandbox's real mounts: read-only state by deepest prefix,
// type indexes by exact directory, first line wins, the root mount's oddity, a failed read.
#include <sys/mount.h>
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/norvoenum.h"
#include "quib_fs.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;

// A read-only volume with a read-write disk mounted below it, as on an appliance with a USB disk.
class MountStatus : public ::testing::Test {
protected:
    void SetUp() override {
        app_.AddVolume("/volume1/usb").RemountReadOnly("/volume1");
    }
    Appliance app_;
};

TEST_F(MountStatus, ReadOnlyIsTheDeepestHoldingMounts) {
    NvoEnum mounts;
    const struct {
        const char *path;
        bool readOnly;
    } table[] = {
        {"/volume1", true},       {"/volume1/", true},      {"/volume1/a/b", true},
        {"/volume1/usbx", true},  {"/volume1/usb", false},  {"/volume1/usb/a", false},
        {"/volume1/usb/", false}, {"/volume2/a", false},    {"/volume1x", false},
        {"volume1/a", false},     {"", false},              {"/volume1/\xff\xfe", true},
    };
    for (const auto &row : table) {
        EXPECT_EQ(mounts.IsReadOnly(row.path), row.readOnly) << row.path;
    }
    EXPECT_FALSE(mounts.IsReadOnly(nullptr));
    EXPECT_TRUE(mounts.IsReadOnly(("/volume1/" + std::string(100000, 'a')).c_str()));
    EXPECT_TRUE(app_.ErrorLines().empty());
}

TEST_F(MountStatus, TypeIsOnlyForTheMountDirectoryItself) {
    app_.MountFat("/volume2/fat").MountDeadRemote("/volume2/remote");
    NvoEnum mounts;
    const struct {
        const char *path;
        int type;
    } table[] = {
        {"/volume1", FSTYPE_TMPFS},
        {"/volume1///", FSTYPE_TMPFS},
        {"/volume1/usb", FSTYPE_TMPFS},
        {"/volume1/usb/a", FSTYPE_NOT_MOUNT_POINT},
        {"/volume1/usbx", FSTYPE_NOT_MOUNT_POINT},
        {"//volume1", FSTYPE_NOT_MOUNT_POINT},  // no normalisation beyond trailing slashes
        {"/volume9", FSTYPE_NOT_MOUNT_POINT},
        {"/", FSTYPE_NOT_MOUNT_POINT},  // cut to "", which no mount is
        {"", FSTYPE_NOT_MOUNT_POINT},
        {"/proc", FSTYPE_UNKNOWN},
        // Mount-table names compare exactly with the platform's table: the platform's own
        // classification would call these FAT and remote.
        {"/volume2/fat", FSTYPE_UNKNOWN},
        {"/volume2/remote", FSTYPE_UNKNOWN},
    };
    for (const auto &row : table) {
        EXPECT_EQ(mounts.getFSTYPE(row.path), row.type) << row.path;
    }
    EXPECT_EQ(mounts.getFSTYPE(nullptr), FSTYPE_NOT_MOUNT_POINT);
    EXPECT_EQ(mounts.getFSTYPE(std::string(100000, '/').c_str()), FSTYPE_NOT_MOUNT_POINT);
    EXPECT_EQ(mounts.getFSTYPE("/volume1/\xff"), FSTYPE_NOT_MOUNT_POINT);
}

TEST_F(MountStatus, FirstLineWinsForStackedMounts) {
    app_.AddVolume("/volume3").AddVolume("/volume3").RemountReadOnly("/volume3");
    ASSERT_NE(access("/volume3", W_OK), 0);  // the kernel sees the read-only top mount
    NvoEnum mounts;
    EXPECT_FALSE(mounts.IsReadOnly("/volume3/a"));
    EXPECT_FALSE(mounts.Mounts().at("/volume3").readOnly);
}

TEST_F(MountStatus, TheTableIsReadOnceAndAgainOnlyAfterAFailure) {
    NvoEnum mounts;
    ASSERT_EQ(mounts.getFSTYPE("/volume1"), FSTYPE_TMPFS);
    app_.AddVolume("/volume2/late");
    EXPECT_EQ(mounts.getFSTYPE("/volume2/late"), FSTYPE_NOT_MOUNT_POINT);  // the object's snapshot
    EXPECT_EQ(NvoEnum().getFSTYPE("/volume2/late"), FSTYPE_TMPFS);

    // Without /proc the table can't be opened: platform error 0x900 at line 812, and the next
    // question reads again.
    ASSERT_EQ(mount("none", "/proc", "tmpfs", 0, nullptr), 0);
    NvoEnum failing;
    VLIBCErrSetEx(0, "", 0);
    EXPECT_EQ(failing.getFSTYPE("/volume1"), FSTYPE_UNKNOWN);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_OPEN_FAILED);
    EXPECT_STREQ(VLIBCErrorGetFile(), "norvoenum.cpp");
    EXPECT_EQ(VLIBCErrorGetLine(), 812);
    EXPECT_FALSE(failing.IsReadOnly("/volume1"));
    EXPECT_EQ(failing.GetMountStatus(), 0);
    ASSERT_EQ(umount("/proc"), 0);
    EXPECT_TRUE(failing.IsReadOnly("/volume1"));
    EXPECT_EQ(failing.getFSTYPE("/volume1"), FSTYPE_TMPFS);
}

// Last, as a read-only root leaves nothing new to be created.
TEST_F(MountStatus, TheRootMountHoldsOnlyItselfAndDoubleSlashPaths) {
    app_.RemountReadOnly("/");
    NvoEnum mounts;
    EXPECT_TRUE(mounts.IsReadOnly("/"));
    EXPECT_TRUE(mounts.IsReadOnly("//etc"));
    EXPECT_FALSE(mounts.IsReadOnly("/.norvo-sandbox"));  // on the root, yet not held by it: intended
    EXPECT_FALSE(mounts.IsReadOnly("/volume2"));
}

}  // namespace
