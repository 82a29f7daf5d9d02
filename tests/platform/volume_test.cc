// Volume names in paths.
#include <limits.h>

#include <string>

#include <gtest/gtest.h>

#include "platform_test_util.h"
#include "quib_fs.h"

namespace {

using namespace norvo::testing;

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
