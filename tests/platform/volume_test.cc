// Volume names in paths.
#include <limits.h>

#include <string>

#include <gtest/gtest.h>

#include "quib_fs.h"
#include "vlibc_err.h"

namespace {

TEST(VolumePathParse, RecognisesTheThreeKindsOfVolume) {
    struct Case {
        const char *path;
        const char *volume;
        int kind;
    } cases[] = {
        {"/volume1", "/volume1", VOLUME_KIND_INTERNAL},
        {"/volume1/", "/volume1", VOLUME_KIND_INTERNAL},
        {"/volume1/photo/2012/a.jpg", "/volume1", VOLUME_KIND_INTERNAL},
        {"/volume12/x", "/volume12", VOLUME_KIND_INTERNAL},
        {"/volumeUSB1", "/volumeUSB1", VOLUME_KIND_USB},
        {"/volumeUSB3/usbshare/a", "/volumeUSB3", VOLUME_KIND_USB},
        {"/volumeSATA1/satashare", "/volumeSATA1", VOLUME_KIND_ESATA},
        {"/volumeSATA20", "/volumeSATA20", VOLUME_KIND_ESATA},
    };
    for (const Case &c : cases) {
        VOLUME_INFO info{};
        EXPECT_EQ(VolumePathParse(c.path, &info), 1) << c.path;
        EXPECT_STREQ(info.szVolumePath, c.volume) << c.path;
        EXPECT_EQ(info.kind, c.kind) << c.path;
    }
}

TEST(VolumePathParse, OtherPathsLieOnNoVolume) {
    const std::string longNumber = "/volume" + std::string(80, '1');
    const char *paths[] = {
        "/volume1x",  "/volume",     "/volume/1",      "/volumeUSB",      "/volumeUSBx1",
        "/volumeusb1", "/volumeSATA", "/Volume1",      "volume1",         "//volume1",
        "/tmp",        "/",           "/volume1x/a",   "/volumeESATA1",   "/\xff\xfe",
        "/volumeSATA1x", longNumber.c_str(),
    };
    for (const char *path : paths) {
        VOLUME_INFO info{};
        EXPECT_EQ(VolumePathParse(path, &info), 0) << path;
    }
}

TEST(VolumePathParse, BadArgumentsAreRefused) {
    VOLUME_INFO info{};
    EXPECT_EQ(VolumePathParse(nullptr, &info), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(VolumePathParse("/volume1", nullptr), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(VolumePathParse("", &info), -1);
    const std::string overlong = "/volume1/" + std::string(PATH_MAX, 'a');
    EXPECT_EQ(VolumePathParse(overlong.c_str(), &info), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NAME_TOO_LONG);
}

}  // namespace
