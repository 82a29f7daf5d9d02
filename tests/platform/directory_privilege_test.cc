// Share privileges of domain and directory-service accounts: only for a configured service and
// a live login of that very account, then from the share's lists like a local account.
#include <map>
#include <string>
#include <utility>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_login.h"

namespace {

using namespace norvo::testing;

using Lookup = int (*)(const char *, const char *, const char *, int *);
constexpr Lookup kDom = QuibCgiDomGetPrivilege, kLdap = QuibCgiLDAPGetPrivilege;

class DirectoryPrivilege : public ::testing::Test {
protected:
    DirectoryPrivilege() {
        appliance_.Basic().AddUser("CORP\\dave").AddUser("CORP\\eve").AddUser("erin@corp.example");
        appliance_.AddGroup({"corpstaff", 0, {"CORP\\eve"}});
        appliance_.AddShare({.name = "docs", .noAccess = "CORP\\carl", .readWrite = "CORP\\dave,erin@corp.example",
                             .readOnly = "@corpstaff"});
        appliance_.AddShare({.name = "both", .noAccess = "corp\\DAVE", .readWrite = "CORP\\dave"});
        appliance_.AddShare({.name = "closed"});
        for (const char *user : {"CORP\\dave", "CORP\\eve", "erin@corp.example", "alice"}) {
            char sid[64];
            sids_[user] = QUIBLoginCreate(user, "secret", "", sid, sizeof sid) == 0 ? sid : "";
        }
    }
    // rc, then the privilege when rc is 0, else the error slot (the privilege left untouched).
    std::pair<int, int> Ask(Lookup lookup, const char *share, const char *user, const char *sid) {
        int priv = 7;
        const Outcome got = OUTCOME(lookup(share, user, sid, &priv));
        EXPECT_TRUE(got.rc == 0 || priv == 7) << "a failed lookup set the privilege";
        return {static_cast<int>(got.rc), got.rc == 0 ? priv : got.slot};
    }
    Appliance appliance_;
    std::map<std::string, std::string> sids_;
};

TEST_F(DirectoryPrivilege, NothingIsAnsweredWithoutAConfiguredService) {
    const char *dave = sids_["CORP\\dave"].c_str(), *erin = sids_["erin@corp.example"].c_str();
    const std::pair<int, int> none{-2, QUIB_ERR_OPEN_FAILED};
    EXPECT_EQ(Ask(kDom, "docs", "CORP\\dave", dave), none);
    EXPECT_EQ(Ask(kLdap, "docs", "erin@corp.example", erin), none);
    appliance_.SetSetting("workgroup", "CORP").SetSetting("ldap_enabled", "yes");  // named, not joined; no server
    EXPECT_EQ(Ask(kDom, "docs", "CORP\\dave", dave), none);
    EXPECT_EQ(Ask(kLdap, "docs", "erin@corp.example", erin), none);
    appliance_.SetSetting("domain_joined", "no");
    EXPECT_EQ(Ask(kDom, "docs", "CORP\\dave", dave), none);
    appliance_.SetSetting("domain_joined", "YES");
    EXPECT_EQ(Ask(kDom, "docs", "CORP\\dave", dave), std::pair(0, 2));
}

TEST_F(DirectoryPrivilege, TheListsDecideForALiveLoginOfThatAccountOnly) {
    appliance_.SetDomain("CORP").SetDirectory("ldap.corp.example");
    const char *dave = sids_["CORP\\dave"].c_str(), *eve = sids_["CORP\\eve"].c_str();
    const char *erin = sids_["erin@corp.example"].c_str(), *alice = sids_["alice"].c_str();
    const std::string longName = "CORP\\" + std::string(5000, 'd');
    constexpr int kDenied = QUIB_ERR_ACCESS_DENIED, kBad = QUIB_ERR_BAD_PARAMETER;
    // The plain answers through the library are its share privilege test's.
    struct Case { Lookup lookup; const char *share, *user, *sid; std::pair<int, int> want; } cases[] = {
        {kDom, "docs", "corp\\Dave", dave, {0, 2}},  // names ignore case
        {kDom, "docs", "CORP\\eve", eve, {0, 1}},  // through @corpstaff
        {kDom, "both", "CORP\\dave", dave, {0, 0}},  // no access wins over read-write
        {kLdap, "closed", "erin@corp.example", erin, {0, 0}},
        // Only a live login of that very account counts.
        {kLdap, "docs", "erin@corp.example", dave, {-1, kDenied}},
        {kDom, "docs", "CORP\\dave", "AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA", {-1, kDenied}},
        // A domain lookup is for domain names, a directory lookup for directory names.
        {kDom, "docs", "alice", alice, {-1, kBad}}, {kLdap, "docs", "CORP\\eve", eve, {-1, kBad}},
        {kDom, "nosuch", "CORP\\dave", dave, {-1, QUIB_ERR_NO_SUCH_SHARE}}, {kDom, "docs", nullptr, dave, {-1, kBad}},
        {kDom, "docs", "CORP\\\xff\xfe", dave, {-1, kBad}}, {kDom, "docs", longName.c_str(), dave, {-1, kBad}},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(Ask(c.lookup, c.share, c.user, c.sid), c.want) << (c.lookup == kDom ? "domain " : "directory ")
            << (c.share ? c.share : "null") << " " << (c.user ? c.user : "null") << " " << (c.sid ? c.sid : "null");
    }
    EXPECT_EQ(Ask(kDom, "docs", "CORP\\dave", "'; DROP TABLE login_session; --").first, -1);
    EXPECT_EQ(QuibCgiDomGetPrivilege("docs", "CORP\\dave", dave, nullptr), -1);
    ASSERT_EQ(QUIBLoginRemove(dave), 0);
    EXPECT_EQ(Ask(kDom, "docs", "CORP\\dave", dave), std::pair(-1, kDenied));
}

}  // namespace
