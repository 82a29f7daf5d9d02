// The home service: per-kind switches, the homes root, and homes outside it.
#include <unistd.h>

#include <memory>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::UserSpec;

struct UserFree {
    void operator()(PQUIBUSER user) const { QUIBUserFree(user); }
};
using User = std::unique_ptr<QUIBUSER, UserFree>;

// 1/0 from the service for name, or -100 when the user can't be looked up.
int Enabled(const char *name) {
    PQUIBUSER raw = nullptr;
    if (QUIBUserGet(name, &raw) != 0) {
        return -100;
    }
    User user(raw);
    return QUIBServiceUserHomeIsEnabled(user.get());
}

std::string HomePath(int *code = nullptr) {
    char buf[256];
    VLIBCErrSetEx(0, "", 0);
    int rc = QUIBServiceHomePathGet(buf, sizeof buf);
    if (code != nullptr) {
        *code = rc == 0 ? 0 : VLIBCErrGet();
    }
    return rc == 0 ? buf : "<none>";
}

UserSpec WithHome(const std::string &name, const std::string &home) {
    UserSpec account;
    account.name = name;
    account.home = home;
    return account;
}

class HomeService : public ::testing::Test {
protected:
    void SetUp() override {
        app_.AddUser("alice").AddUser("CORP\\dave").AddUser("erin@corp.example");
        app_.AddUser(WithHome("outsider", "/var/lib/outsider"));
        app_.AddUser(WithHome("neighbour", "/volume1/homesick/neighbour"));
        app_.AddUser(WithHome("rooted", "/volume1/homes"));
        app_.AddUser(WithHome("messy", "/volume1//homes/./messy/"));
    }
    Appliance app_;
};

TEST_F(HomeService, EnabledForHomesBelowTheRoot) {
    app_.SetHomeService(true);
    EXPECT_EQ(Enabled("alice"), 1);
    EXPECT_EQ(Enabled("CORP\\dave"), 1);
    EXPECT_EQ(Enabled("erin@corp.example"), 1);
    EXPECT_EQ(Enabled("messy"), 1);
    EXPECT_EQ(Enabled("outsider"), 0);
    EXPECT_EQ(Enabled("neighbour"), 0);  // whole components: homesick is not homes
    EXPECT_EQ(Enabled("rooted"), 0);     // the root itself is nobody's home
    EXPECT_EQ(HomePath(), "/volume1/homes");
}

TEST_F(HomeService, SwitchesPerKindOfAccount) {
    app_.SetHomeService(true, "/volume1/homes", false, true);
    EXPECT_EQ(Enabled("alice"), 1);
    EXPECT_EQ(Enabled("CORP\\dave"), 0);
    EXPECT_EQ(Enabled("erin@corp.example"), 1);
    app_.SetHomeService(true, "/volume1/homes", true, false);
    EXPECT_EQ(Enabled("CORP\\dave"), 1);
    EXPECT_EQ(Enabled("erin@corp.example"), 0);
    app_.SetSetting("userHomeEnable", "no");
    EXPECT_EQ(Enabled("alice"), 0);
    EXPECT_EQ(Enabled("CORP\\dave"), 1);
    EXPECT_EQ(HomePath(), "/volume1/homes");  // on for some kind of account
}

TEST_F(HomeService, OffOrUnconfigured) {
    app_.SetHomeService(false);
    EXPECT_EQ(Enabled("alice"), 0);
    int code = 0;
    EXPECT_EQ(HomePath(&code), "<none>");
    EXPECT_EQ(code, QUIB_ERR_OPEN_FAILED);

    ASSERT_EQ(unlink(QUIB_INFO_CONF), 0);
    EXPECT_EQ(Enabled("alice"), 0);
    EXPECT_EQ(HomePath(&code), "<none>");
    EXPECT_EQ(code, QUIB_ERR_OPEN_FAILED);

    // Switched on but without a usable root.
    app_.WriteFile(QUIB_INFO_CONF, "userHomeEnable=\"yes\"\n");
    EXPECT_EQ(Enabled("alice"), 0);
    EXPECT_EQ(HomePath(&code), "<none>");
    for (const char *root : {"relative/homes", "/", ""}) {
        app_.WriteFile(QUIB_INFO_CONF,
                       std::string("userHomeEnable=\"yes\"\nuserHomeRoot=\"") + root + "\"\n");
        EXPECT_EQ(Enabled("alice"), 0) << root;
        EXPECT_EQ(HomePath(&code), "<none>") << root;
    }
}

TEST_F(HomeService, RootIsReadLeniently) {
    app_.SetHomeService(true, "/volume1/homes/");
    EXPECT_EQ(Enabled("alice"), 1);
    EXPECT_EQ(HomePath(), "/volume1/homes");
    app_.SetSetting("userHomeEnable", "YES");
    EXPECT_EQ(Enabled("alice"), 1);
    app_.SetSetting("userHomeEnable", "maybe");
    EXPECT_EQ(Enabled("alice"), 0);
}

TEST_F(HomeService, HandBuiltRecordsAndBadArguments) {
    app_.SetHomeService(true, "/volume1/homes", false, true);
    QUIBUSER record{};
    record.szName = const_cast<char *>("CORP\\carl");
    record.szHome = const_cast<char *>("/volume1/homes/carl");
    record.authType = static_cast<AUTH_TYPE>(0);  // not filled in: the name tells the kind
    EXPECT_EQ(QUIBServiceUserHomeIsEnabled(&record), 0);
    record.szName = const_cast<char *>("carl");
    EXPECT_EQ(QUIBServiceUserHomeIsEnabled(&record), 1);
    record.szHome = nullptr;
    EXPECT_EQ(QUIBServiceUserHomeIsEnabled(&record), 0);

    EXPECT_EQ(QUIBServiceUserHomeIsEnabled(nullptr), 0);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    char small[8];
    EXPECT_EQ(QUIBServiceHomePathGet(small, sizeof small), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QUIBServiceHomePathGet(nullptr, 64), -1);
    char exact[sizeof "/volume1/homes"];
    EXPECT_EQ(QUIBServiceHomePathGet(exact, sizeof exact), 0);
    EXPECT_STREQ(exact, "/volume1/homes");
    EXPECT_EQ(QUIBServiceHomePathGet(exact, 0), -1);
}

}  // namespace
