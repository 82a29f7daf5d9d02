// Icons of listed entries, over real icon files and real mounts; and the mount-point test.
// (Which mounts are disk images is the platform's to tell; its test covers them.)
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/norvomisc.h"
#include "quib_webutils.h"

namespace {

using norvo::testing::Appliance;

std::string Icon(const char *name, bool isDir, const std::string &realPath = "", const std::string &sharePath = "") {
    std::string out = "stale";
    GetImgFileExt(name, isDir, out, realPath, sharePath);
    return out;
}

TEST(Icons, FilesByExtensionWhereAnIconExists) {
    Appliance app;
    for (const char *icon : {"jpg", "pdf", "txt"}) {
        app.WriteFile(std::string("/volume1/web/images/files_ext/") + icon + ".png", "png");
    }
    app.WriteFile("/volume1/web/images/files_ext/Doc.png", "png");
    app.WriteFile("/volume1/web/images/secret.png", "png").MakeDir("/volume1/web/images/files_ext/a");
    app.MakeDir("/volume1/web/cgi");
    ASSERT_EQ(chdir("/volume1/web/cgi"), 0);  // the icons lie in ../images/files_ext

    struct Case {
        const char *name;
        const char *icon;
    } cases[] = {
        {"a.JPG", "jpg.png"}, {"Report.2024.Pdf", "pdf.png"}, {"notes.txt", "txt.png"}, {"x.doc", "misc.png"},
        {"x.DOC", "misc.png"},  // the extension is lowered, the icon name is not
        {"noext", "misc.png"}, {".txt", "misc.png"}, {"a.", "misc.png"}, {"t", "misc.png"}, {"", "misc.png"},
        {"x.a/../../secret", "misc.png"},  // never looks outside the icon folder
        {"x.\xC3\x89", "misc.png"},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(Icon(c.name, false), c.icon) << c.name;
    }
    EXPECT_EQ(Icon(nullptr, false), "misc.png");
    EXPECT_EQ(Icon(nullptr, true, "/volume1"), "misc.png");
    ASSERT_EQ(chdir("/volume1"), 0);  // elsewhere there are no icons
    EXPECT_EQ(Icon("a.jpg", false), "misc.png");
    EXPECT_TRUE(app.ErrorLines().empty());
}

TEST(Icons, FoldersByMountTypeAndTheShareRecycleBin) {
    Appliance app;
    app.Basic().MakeDir("/volume1/photo/2012").MakeDir("/volume1/photo/#recycle").MakeDir("/volume1/photo/a/#recycle");
    app.MountDeadRemote("/volume1/photo/nas").MountFat("/volume1/photo/usb");

    struct Case {
        const char *real;
        const char *inShare;
        const char *icon;
    } cases[] = {
        {"/volume1/photo/2012", "/2012", "folder.png"},
        {"/volume1/photo/nas", "/nas", "remotemountpoint.png"},  // its server is gone
        {"/volume1/photo/usb", "/usb", "folder.png"},            // a mount of another kind
        {"/volume1/photo/#recycle", "/#recycle", "recycle_bin.png"},
        {"/volume1/photo/#recycle", "#recycle", "recycle_bin.png"},
        {"/volume1/photo/#recycle", "", "folder.png"},  // no path within the share: no test
        {"/volume1/photo/a/#recycle", "/a/#recycle", "folder.png"},
        {"/volume1/photo/#recycle", "/#Recycle", "folder.png"},
        {"/volume1/photo/#recycle", "/#recycle/", "folder.png"},
        {"", "", "folder.png"},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(Icon("entry", true, c.real, c.inShare), c.icon) << c.real << " " << c.inShare;
    }
    EXPECT_TRUE(app.ErrorLines().empty());
}

TEST(MountPoint, KernelMarkOrMountTable) {
    Appliance app;
    app.MakeDir("/volume1/dir/sub").MakeDir("/volume1/bound").MakeDir("/volume1/web/cgi");
    app.MountDeadRemote("/volume1/dead");
    ASSERT_EQ(mount("/volume1/dir", "/volume1/bound", nullptr, MS_BIND, nullptr), 0);  // same device
    ASSERT_EQ(symlink("/volume1/bound", "/volume1/link"), 0);
    ASSERT_EQ(chdir("/volume1/web/cgi"), 0);
    struct Case {
        std::string path;
        bool mountPoint;
    } cases[] = {
        {"/", true}, {"/volume1", true}, {"/volume1/", true}, {"/volume1/dir", false}, {"/volume1/dir/sub", false},
        {"/volume1/bound", true}, {"/volume1/link", false},  // a link is never one
        {"/volume1/dead", true}, {"/volume1/dead/x", false}, {"/volume1/dir/../dead", true},
        {"../..", true}, {"..", false}, {"/volume1/missing", false},
        {"", false}, {std::string("/volume1\0/x", 11), false}, {"/" + std::string(4096, 'a'), false},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(WebUtils::IsMountPoint(c.path), c.mountPoint) << c.path.substr(0, 40);
    }
}

}  // namespace
