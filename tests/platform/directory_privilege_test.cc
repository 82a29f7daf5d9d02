// Share privileges of domain and directory-service accounts: only for a configured service and
// a live login of that very account, then from the share's lists like a local account.
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "quib_login.h"
#include "vlibc_err.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::ShareSpec;

class DirectoryPrivilege : public ::testing::Test {
protected:
    DirectoryPrivilege() {
        appliance_.Basic().AddUser("CORP\\dave").AddUser("CORP\\eve").AddUser("erin@corp.example");
        appliance_.AddGroup({"corpstaff", 0, {"CORP\\eve"}});
        AddShare("docs", "CORP\\carl", "CORP\\dave,erin@corp.example", "@corpstaff");
        AddShare("both", "corp\\DAVE", "CORP\\dave", "");
        AddShare("closed", "", "", "");
        dave_ = LogIn("CORP\\dave");
        eve_ = LogIn("CORP\\eve");
        erin_ = LogIn("erin@corp.example");
        alice_ = LogIn("alice");
    }

    void AddShare(const char *name, const char *noAccess, const char *readWrite, const char *readOnly) {
        ShareSpec share;
        share.name = name;
        share.noAccess = noAccess;
        share.readWrite = readWrite;
        share.readOnly = readOnly;
        appliance_.AddShare(share);
    }

    std::string LogIn(const char *user) {
        char sid[64];
        return QUIBLoginCreate(user, "secret", "", sid, sizeof sid) == 0 ? sid : "";
    }

    Appliance appliance_;
    std::string dave_, eve_, erin_, alice_;
};

TEST_F(DirectoryPrivilege, NothingIsAnsweredWithoutAConfiguredService) {
    int priv = 7;
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", dave_.c_str(), &priv), -2);
    EXPECT_EQ(QuibCgiLDAPGetPrivilege("docs", "erin@corp.example", erin_.c_str(), &priv), -2);
    appliance_.SetSetting("workgroup", "CORP");  // named but not joined
    appliance_.SetSetting("ldap_enabled", "yes");  // enabled without a server
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", dave_.c_str(), &priv), -2);
    EXPECT_EQ(QuibCgiLDAPGetPrivilege("docs", "erin@corp.example", erin_.c_str(), &priv), -2);
    appliance_.SetSetting("domain_joined", "no");
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", dave_.c_str(), &priv), -2);
    EXPECT_EQ(priv, 7);
    appliance_.SetSetting("domain_joined", "YES");
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", dave_.c_str(), &priv), 0);
}

TEST_F(DirectoryPrivilege, TheListsDecideInTheirOrder) {
    appliance_.SetDomain("CORP").SetDirectory("ldap.corp.example");
    struct Case {
        const char *share;
        const char *user;
        const std::string &sid;
        int priv;
    } cases[] = {
        {"docs", "CORP\\dave", dave_, 2},
        {"docs", "corp\\Dave", dave_, 2},  // names compare ignoring case
        {"docs", "CORP\\eve", eve_, 1},     // through @corpstaff
        {"both", "CORP\\dave", dave_, 0},   // no access wins over read-write
        {"closed", "CORP\\dave", dave_, 0},
        {"DOCS", "CORP\\dave", dave_, 2},   // share names too
    };
    for (const Case &c : cases) {
        int priv = -9;
        EXPECT_EQ(QuibCgiDomGetPrivilege(c.share, c.user, c.sid.c_str(), &priv), 0) << c.share << " " << c.user;
        EXPECT_EQ(priv, c.priv) << c.share << " " << c.user;
    }
    int priv = -9;
    EXPECT_EQ(QuibCgiLDAPGetPrivilege("docs", "erin@corp.example", erin_.c_str(), &priv), 0);
    EXPECT_EQ(priv, 2);
    EXPECT_EQ(QuibCgiLDAPGetPrivilege("closed", "erin@corp.example", erin_.c_str(), &priv), 0);
    EXPECT_EQ(priv, 0);
}

TEST_F(DirectoryPrivilege, OnlyALiveLoginOfThatAccountCounts) {
    appliance_.SetDomain("CORP").SetDirectory("ldap.corp.example");
    int priv = 7;
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", eve_.c_str(), &priv), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", "AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA", &priv), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_ACCESS_DENIED);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", "'; DROP TABLE login_session; --", &priv), -1);
    ASSERT_EQ(QUIBLoginRemove(dave_.c_str()), 0);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", dave_.c_str(), &priv), -1);
    EXPECT_EQ(priv, 7);
    // A domain lookup is for domain names, a directory lookup for directory names.
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "alice", alice_.c_str(), &priv), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "erin@corp.example", erin_.c_str(), &priv), -1);
    EXPECT_EQ(QuibCgiLDAPGetPrivilege("docs", "CORP\\eve", eve_.c_str(), &priv), -1);
    EXPECT_EQ(priv, 7);
}

TEST_F(DirectoryPrivilege, UnknownSharesAndBadArgumentsFail) {
    appliance_.SetDomain("CORP");
    int priv = 7;
    EXPECT_EQ(QuibCgiDomGetPrivilege("nosuch", "CORP\\dave", dave_.c_str(), &priv), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_SHARE);
    EXPECT_EQ(QuibCgiDomGetPrivilege(nullptr, "CORP\\dave", dave_.c_str(), &priv), -1);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", nullptr, dave_.c_str(), &priv), -1);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", nullptr, &priv), -1);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", dave_.c_str(), nullptr), -1);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\\xff\xfe", dave_.c_str(), &priv), -1);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", ("CORP\\" + std::string(5000, 'd')).c_str(), dave_.c_str(), &priv), -1);
    EXPECT_EQ(priv, 7);
}

}  // namespace
