// The platform calls behind the share listing: SDK::Share, the domain and directory share-list
// generators, the per-share sync flag and the capability table, over a real appliance; and the
// share privileges of domain and directory-service accounts: only for a configured service and
// a live login of that very account, then from the share's lists like a local account.
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_login.h"
#include "quib_paths.h"
#include "quib_s2s.h"
#include "quib_sdk_share.h"
#include "quib_share_list.h"
#include "vlibc_support.h"

namespace {

using namespace norvo::testing;

struct Release {
    void operator()(SDK::Share *share) const { SDK::Share::Release(share); }
};
using Share = std::unique_ptr<SDK::Share, Release>;

// The names of a generated list joined by ",", or "<null 0xcode>".
std::string Names(PSZLIST list) {
    if (list == nullptr) {
        char text[32];
        snprintf(text, sizeof text, "<null %#x>", VLIBCErrGet());
        return text;
    }
    std::string out;
    for (int i = 0; i < VLIBCSzListCount(list); ++i) {
        out += (i ? "," : "") + std::string(VLIBCSzListGet(list, i));
    }
    VLIBCSzListFree(list);
    return out;
}

class SdkShare : public ::testing::Test {
protected:
    SdkShare() {
        app_.Basic().AddUser("CORP\\dave").AddUser("erin@corp.example").AddUser("CORP\\x@y");
        app_.AddShare({.name = "Docs", .readWrite = "CORP\\dave", .readOnly = "erin@corp.example,CORP\\x@y,alice"});
        app_.AddShare({.name = "hidden", .readWrite = "CORP\\dave,erin@corp.example", .hidden = true});
        app_.AddShare({.name = "closed", .noAccess = "CORP\\dave", .readWrite = "CORP\\dave,erin@corp.example"});
        app_.AddShare({.name = "plain", .volume = "/volume2", .aclMode = false});
        // Keys the sandbox does not write: ftp privilege and synchronisation.
        AddToSection("Docs", "ftp privilege = rw\n\tsynced = yes");
        AddToSection("plain", "ftp privilege = ro\n\tsynced = no");
    }
    void AddToSection(const std::string &share, const std::string &lines) {
        std::string text = ReadFile(QUIB_SHARE_CONF);
        const std::string head = "[" + share + "]\n";
        text.insert(text.find(head) + head.size(), "\t" + lines + "\n");
        app_.WriteFile(QUIB_SHARE_CONF, text);
    }
    Appliance app_;
};

TEST_F(SdkShare, RecordsAndAccessRights) {
    const struct { const char *asked, *name, *path; unsigned status; int ftp; bool acl; } shares[] = {
        {"docs", "Docs", "/volume1/Docs", 0, 2, true},
        {"hidden", "hidden", "/volume1/hidden", SHARE_STATUS_HIDDEN, 0, true},
        {"secret", "secret", "/volume1/secret", SHARE_STATUS_ENCRYPTED, 0, true},
        {"plain", "plain", "/volume2/plain", 0, 1, false},
    };
    for (const auto &row : shares) {
        const Share share(SDK::Share::LoadShare(row.asked));
        ASSERT_TRUE(share) << row.asked;
        EXPECT_EQ(share->GetName(), row.name);
        EXPECT_EQ(share->GetFullPath(), row.path);
        EXPECT_EQ(share->GetStatus(), row.status) << row.asked;
        EXPECT_EQ(share->GetFTPPrivilege(), row.ftp) << row.asked;
        EXPECT_EQ(share->GetACLEnable(), row.acl) << row.asked;
    }
    // The lists decide as the listing's tests show; what only this call meets: an administrator
    // is not special, and domain names ignore case.
    const struct { const char *share, *user; int right; } rights[] = {
        {"photo", "admin", 0}, {"Docs", "corp\\DAVE", 2}, {"closed", "CORP\\dave", 0}, {"Docs", "", 0},
    };
    for (const auto &row : rights) {
        const Share share(SDK::Share::LoadShare(row.share));
        ASSERT_TRUE(share);
        EXPECT_EQ(share->GetAccessRight(row.user), row.right) << row.share << " " << row.user;
    }
    const Share docs(SDK::Share::LoadShare("Docs"));
    EXPECT_EQ(OUTCOME(docs->GetAccessRight(nullptr)), Failed(QUIB_ERR_BAD_PARAMETER));
    const struct { const char *name; int slot; } missing[] = {
        {"nosuch", QUIB_ERR_NO_SUCH_SHARE}, {"/volume1/Docs", QUIB_ERR_NO_SUCH_SHARE}, {nullptr, QUIB_ERR_BAD_PARAMETER},
    };
    for (const auto &row : missing) {
        EXPECT_EQ(OUTCOME(SDK::Share::LoadShare(row.name) == nullptr ? -1 : 0), Failed(row.slot))
            << (row.name ? row.name : "null");
    }
    SDK::Share::Release(nullptr);
}

// Which accounts get a list at all is the share listing's test; here the writable and sorted
// forms, and names of the wrong kind.
TEST_F(SdkShare, GeneratorsTakeOnlyTheirKindOfName) {
    const std::string bad = "<null 0xd00>";
    app_.SetDomain("CORP").SetDirectory("ldap.corp.example");
    using Generator = PSZLIST (*)(const char *, const char *, int, int);
    const struct { Generator gen; const char *user; int writable; std::string want; } rows[] = {
        {QuibCgiDomValidShareGen, "CORP\\dave", 0, "public,Docs"},  // hidden and no-access shares are out
        {QuibCgiLDAPValidShareGen, "erin@corp.example", 1, "public,closed"},  // read-write only
        {QuibCgiLDAPValidShareGen, "CORP\\x@y", 0, bad}, {QuibCgiDomValidShareGen, "alice", 0, bad},
        {QuibCgiLDAPValidShareGen, "CORP\\dave", 0, bad}, {QuibCgiDomValidShareGen, nullptr, 0, bad},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(Names(row.gen(nullptr, row.user, 0, row.writable)), row.want) << (row.user ? row.user : "null");
    }
    app_.AddShare({.name = "Zeta", .readWrite = "erin@corp.example"}).AddShare({.name = "beta", .readOnly = "erin@corp.example"});
    EXPECT_EQ(Names(QuibCgiLDAPValidShareGen("", "erin@corp.example", 1, 0)), "beta,closed,Docs,public,Zeta");
}

TEST_F(SdkShare, SyncedSharesAndTheCapabilityTable) {
    AddToSection("public", "synced = maybe");  // a bad value: the section is not trusted
    const struct { const char *name; Outcome want; } synced[] = {
        {"docs", {1}}, {"plain", {0}}, {"photo", {0}},
        {"public", Failed(QUIB_ERR_NO_SUCH_SHARE)},  // its section is skipped whole
        {nullptr, Failed(QUIB_ERR_BAD_PARAMETER)},
    };
    for (const auto &row : synced) {
        EXPECT_EQ(OUTCOME(QUIBS2SIsSyncedShare(row.name)), row.want) << (row.name ? row.name : "null");
    }
    EXPECT_EQ(OUTCOME(VLIBCSupportGet("support_s2s")), Outcome{0});  // no table yet
    app_.SetDefaultSetting("support_s2s", "yes").SetDefaultSetting("support_x", "no").SetSetting("support_y", "yes");
    const struct { const char *key; Outcome want; } support[] = {
        {"support_s2s", {1}}, {"SUPPORT_S2S", {0}}, {"support_x", {0}},
        {"support_y", {0}},  // only the factory table counts
        {nullptr, Failed(QUIB_ERR_BAD_PARAMETER)},
    };
    for (const auto &row : support) {
        EXPECT_EQ(OUTCOME(VLIBCSupportGet(row.key)), row.want) << (row.key ? row.key : "null");
    }
    ASSERT_EQ(unlink(QUIB_SHARE_CONF), 0);
    EXPECT_EQ(OUTCOME(QUIBS2SIsSyncedShare("Docs")), Failed(QUIB_ERR_OPEN_FAILED));
}

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
