// The home service: per-kind switches, the homes root, and homes outside it.
#include <stdio.h>
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "vlibc_err.h"

namespace {

// user's home folder, or "<none 0xcode>".
std::string HomePath(const char *user) {
    char buf[256];
    VLIBCErrSetEx(0, "", 0);
    if (QUIBServiceHomePathGet(user, buf, sizeof buf) == 0) {
        return buf;
    }
    snprintf(buf, sizeof buf, "<none %#x>", VLIBCErrGet());
    return buf;
}

class HomeService : public ::testing::Test {
protected:
    norvo::testing::Appliance app_;
};

// Records as a caller may build them (the accounts' own records are HomePathOfAUser's); domain
// accounts are off.
TEST_F(HomeService, EnabledForHomesBelowTheRoot) {
    app_.SetHomeService(true, "/volume1/homes", false, true);
    const struct { const char *name, *home; int kind, expected; } rows[] = {
        {"erin@corp.example", "/volume1/homes/erin", AUTH_LDAP, 1},
        {"neighbour", "/volume1/homesick/neighbour", AUTH_LOCAL, 0},  // whole components
        {"rooted", "/volume1/homes", AUTH_LOCAL, 0},  // the root itself is nobody's home
        {"homeless", nullptr, AUTH_LOCAL, 0},
        {"CORP\\carl", "/volume1/homes/carl", AUTH_DOMAIN, 0},
        {"CORP\\carl", "/volume1/homes/carl", 0, 0},  // no kind given: the name tells it
        {"carl", "/volume1/homes/carl", 0, 1},
        {"CORP\\carl", "/volume1/homes/carl", AUTH_LOCAL, 1},  // a kind given wins over the name
    };
    for (const auto &row : rows) {
        QUIBUSER user{};
        user.szName = const_cast<char *>(row.name);
        user.szHome = const_cast<char *>(row.home);
        user.authType = static_cast<AUTH_TYPE>(row.kind);
        EXPECT_EQ(QUIBServiceUserHomeIsEnabled(&user), row.expected) << row.name << " at " << (row.home ? row.home : "(null)");
    }
    EXPECT_EQ(QUIBServiceUserHomeIsEnabled(nullptr), 0);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
}

// A user's home folder by name: the account's own home, normalised, when the service covers it.
TEST_F(HomeService, HomePathOfAUser) {
    app_.SetHomeService(true, "/volume1/homes", false, true);
    app_.AddUser("alice").AddUser(norvo::testing::UserSpec{.name = "messy", .home = "/volume1//homes/./messy/"});
    app_.AddUser(norvo::testing::UserSpec{.name = "outsider", .home = "/var/lib/outsider"}).AddUser("CORP\\carl").AddUser("erin@corp.example");
    const struct { const char *user, *path; } rows[] = {
        {"alice", "/volume1/homes/alice"},
        {"messy", "/volume1/homes/messy"}, {"erin@corp.example", "/volume1/homes/erin@corp.example"},
        {"outsider", "<none 0xbe00>"}, {"CORP\\carl", "<none 0xbe00>"},  // domain homes are off
        {"nobody-here", "<none 0x1d00>"}, {"", "<none 0xd00>"},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(HomePath(row.user), row.path) << row.user;
    }
    char exact[sizeof "/volume1/homes/alice"];
    EXPECT_EQ(QUIBServiceHomePathGet("alice", exact, sizeof exact - 1), -1);  // never cut short
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NAME_TOO_LONG);
    EXPECT_EQ(QUIBServiceHomePathGet("alice", exact, sizeof exact), 0);
    EXPECT_STREQ(exact, "/volume1/homes/alice");
}

// Each row writes the settings file (a null value leaves its line out) and expects the service
// for the accounts alice, CORP\dave and erin@corp.example, and alice's home folder.
TEST_F(HomeService, SwitchesAndRoot) {
    app_.AddUser("alice").AddUser("CORP\\dave").AddUser("erin@corp.example");
    const char *keys[] = {"userHomeEnable", "domainUserHomeEnable", "ldapUserHomeEnable", "userHomeRoot"};
    const char *const off = "<none 0xbe00>";
    const struct { const char *values[4], *enabled, *root; } rows[] = {
        {{"yes", "yes", "yes", "/volume1/homes/"}, "111", "/volume1/homes/alice"},
        {{"yes", "no", "yes", "/volume1/homes"}, "101", "/volume1/homes/alice"},
        {{"yes", "yes", "no", "/volume1/homes"}, "110", "/volume1/homes/alice"},
        {{"no", "yes", nullptr, "/volume1/homes"}, "010", off},  // on for other kinds only
        {{"YES", "maybe", nullptr, "/volume1/homes"}, "100", "/volume1/homes/alice"},
        {{"no", "no", "no", "/volume1/homes"}, "000", off},
        {{"yes", "yes", "yes", nullptr}, "000", off},
        {{"yes", "yes", "yes", "relative/homes"}, "000", off},
        {{"yes", "yes", "yes", "/"}, "000", off},
        {{"yes", "yes", "yes", ""}, "000", off},
    };
    auto enabled = [] {
        std::string out;
        for (const char *name : {"alice", "CORP\\dave", "erin@corp.example"}) {
            PQUIBUSER user = nullptr;
            out += QUIBUserGet(name, &user) == 0 ? std::to_string(QUIBServiceUserHomeIsEnabled(user)) : "?";
            QUIBUserFree(user);
        }
        return out;
    };
    for (const auto &row : rows) {
        std::string text;
        for (int i = 0; i < 4; ++i) {
            text += row.values[i] ? std::string(keys[i]) + "=\"" + row.values[i] + "\"\n" : "";
        }
        app_.WriteFile(QUIB_INFO_CONF, text);
        EXPECT_EQ(enabled(), row.enabled) << text;
        EXPECT_EQ(HomePath("alice"), row.root) << text;
    }
    ASSERT_EQ(unlink(QUIB_INFO_CONF), 0);
    EXPECT_EQ(enabled(), "000");
    EXPECT_EQ(HomePath("alice"), off);  // no settings: the service was never turned on
}

}  // namespace
