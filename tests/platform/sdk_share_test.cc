// The platform calls behind the share listing: SDK::Share, the domain and directory share-list
// generators, the per-share sync flag and the capability table, over a real appliance.
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
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
        std::string text = ReadAll(QUIB_SHARE_CONF);
        const std::string head = "[" + share + "]\n";
        text.insert(text.find(head) + head.size(), "\t" + lines + "\n");
        app_.WriteFile(QUIB_SHARE_CONF, text);
    }
    static std::string ReadAll(const char *path) {
        std::string text;
        if (FILE *f = fopen(path, "r")) {
            char buf[4096];
            size_t n;
            while ((n = fread(buf, 1, sizeof buf, f)) > 0) text.append(buf, n);
            fclose(f);
        }
        return text;
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

}  // namespace
