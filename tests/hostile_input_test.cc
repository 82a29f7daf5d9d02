// Every exported call, fed the inputs a hostile request can carry: each answers with its failure
// value or a sane result, never a crash (the sanitized run watches for memory faults).
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/norvo.h"
#include "vlibc_szlist.h"

namespace {

std::vector<std::string> HostilePaths() {
    return {"",
            "/",
            "////",
            "no-slash",
            "/photo/../../etc/passwd",
            "/\xff\xfe\xfd",
            "/photo/\xc3",
            "/photo/a\x01\x1b[2J",
            "/" + std::string(4095, 'a'),
            "/photo/" + std::string(4096, 'b'),
            std::string(5000, '/'),
            "/photo" + std::string(3000, '/') + "x",
            "/home/" + std::string(300, '.') + "/x",
            "/homes/" + std::string(4200, 'c')};
}

TEST(HostileInput, NoExportedCallCrashes) {
    norvo::testing::Appliance app;
    app.Basic();
    std::vector<const char *> paths{nullptr};
    const std::vector<std::string> owned = HostilePaths();
    for (const std::string &p : owned) {
        paths.push_back(p.c_str());
    }
    const char *users[] = {nullptr, "", "alice", "CORP\\x", "a@b", "\xff"};
    for (const char *path : paths) {
        SCOPED_TRACE(path != nullptr ? std::string(path).substr(0, 40) : "(null)");
        free(NvoLibGetTokOfPath(path, 1));
        free(NvoLibGetTokOfPath(path, 0));
        char out[64];
        NvoLibTransFullPath(path, out, sizeof(out));
        NvoLibRealFullPathGet(path, out, sizeof(out));
        NvoCheckPath(path, true, 0x3, nullptr);
        NvoCheckPath(path, false, 32, nullptr);
        NvoCheckReservedName(path);
        NvoCheckFileName("/volume1", path);
        NvoCheckFileName(path, "name");
        NvoLibFileSystemSupported(path);
        GetACLPrivilege(path);
        ACLAccess(path, 0x1f);
        CheckDirListPrivilege(path);
        for (const char *user : users) {
            std::string full, share, volume, sharePath;
            NvoFullPathGet(path, full, share, volume, sharePath, user != nullptr ? user : "");
            int priv = 0;
            unsigned flags = 0;
            NvoLibGetPrivilege(path, user, "sid", &priv, &flags);
            NvoLibHasPrivilege(path, user, nullptr, 2);
            CheckShareListPrivilege(user, nullptr, path);
            CheckShareDownloadPrivilege(user, nullptr, path);
            int type = 0;
            CheckShareUploadPrivilege(user, nullptr, path, &type);
            CheckShareUploadPrivilege(user, nullptr, path, nullptr);
            PathInfo info;
            PathInfoFactory::create(user, path != nullptr ? path : "", info);
            if (path != nullptr) {
                IsDirUserHome(path, user);
                bool encrypted = false;
                NvoLibCheckEncryptShare(path, &encrypted);
            }
        }
    }
    VLIBCSzListFree(NvoLibValidShareGen("\xff\xfe", 1, 0));
    SUCCEED();
}

TEST(HostileInput, StatedErrorsForBadArguments) {
    norvo::testing::Appliance app;
    app.Basic();
    const std::string longPath = "/photo/" + std::string(5000, 'x');
    std::string full, share, volume, sharePath;
    // Over-long user paths are cut to the buffer, not refused: the cut path is resolved.
    EXPECT_EQ(NvoFullPathGet(longPath.c_str(), full, share, volume, sharePath, "alice"), 1);
    EXPECT_EQ(share, "photo");
    EXPECT_EQ(NvoCheckReservedName(longPath.c_str() + 7), 1);
    EXPECT_EQ(NvoCheckFileName("/volume1/photo", longPath.c_str() + 7), 0);
    // Bytes that are not UTF-8 are names like any other.
    EXPECT_EQ(NvoCheckReservedName("\xff\xfe"), 1);
    EXPECT_EQ(NvoFullPathGet("/photo/\xff", full, share, volume, sharePath, "alice"), 1);
    EXPECT_EQ(full, "/volume1/photo/\xff");
    EXPECT_EQ(NvoFullPathGet("/\xff/x", full, share, volume, sharePath, "alice"), 0);
    EXPECT_EQ(NvoLibGetErr(), 408);
}

}  // namespace
