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
    // The lists decide, for administrators and domain and directory accounts alike.
    const struct { const char *share, *user; int right; } rights[] = {
        {"photo", "alice", 2}, {"photo", "bob", 1}, {"photo", "admin", 0}, {"public", "admin", 2},
        {"secret", "bob", 0}, {"Docs", "CORP\\dave", 2}, {"Docs", "corp\\DAVE", 2}, {"Docs", "erin@corp.example", 1},
        {"closed", "CORP\\dave", 0}, {"closed", "erin@corp.example", 2}, {"Docs", "nobody", 0}, {"Docs", "", 0},
    };
    for (const auto &row : rights) {
        const Share share(SDK::Share::LoadShare(row.share));
        ASSERT_TRUE(share);
        EXPECT_EQ(share->GetAccessRight(row.user), row.right) << row.share << " " << row.user;
    }
    const Share docs(SDK::Share::LoadShare("Docs"));
    EXPECT_EQ(OUTCOME(docs->GetAccessRight(nullptr)), Failed(QUIB_ERR_BAD_PARAMETER));
    const struct { const char *name; int slot; } missing[] = {
        {"nosuch", QUIB_ERR_NO_SUCH_SHARE}, {"/volume1/Docs", QUIB_ERR_NO_SUCH_SHARE}, {"", QUIB_ERR_BAD_PARAMETER},
        {nullptr, QUIB_ERR_BAD_PARAMETER}, {"\xff\xfe", QUIB_ERR_NO_SUCH_SHARE},
    };
    for (const auto &row : missing) {
        EXPECT_EQ(OUTCOME(SDK::Share::LoadShare(row.name) == nullptr ? -1 : 0), Failed(row.slot))
            << (row.name ? row.name : "null");
    }
    SDK::Share::Release(nullptr);
}

TEST_F(SdkShare, GeneratorsNeedTheirServiceAndTheirKindOfName) {
    const std::string none = "<null 0x900>", bad = "<null 0xd00>";
    EXPECT_EQ(Names(QuibCgiDomValidShareGen("ctx", "CORP\\dave", 0, 0)), none);
    EXPECT_EQ(Names(QuibCgiLDAPValidShareGen("ctx", "erin@corp.example", 0, 0)), none);
    app_.SetDomain("CORP").SetDirectory("ldap.corp.example");
    const struct { PSZLIST (*gen)(const char *, const char *, int, int); const char *user; int sort, writable; std::string want; } rows[] = {
        {QuibCgiDomValidShareGen, "CORP\\dave", 0, 0, "public,Docs"},  // hidden and no-access shares are out
        {QuibCgiLDAPValidShareGen, "erin@corp.example", 0, 0, "public,Docs,closed"},  // public: @users
        {QuibCgiLDAPValidShareGen, "erin@corp.example", 0, 1, "public,closed"},  // read-write only
        {QuibCgiDomValidShareGen, "CORP\\x@y", 0, 0, "public,Docs"},  // the backslash makes it a domain name
        {QuibCgiLDAPValidShareGen, "CORP\\x@y", 0, 0, bad},
        {QuibCgiDomValidShareGen, "alice", 0, 0, bad}, {QuibCgiLDAPValidShareGen, "CORP\\dave", 0, 0, bad},
        {QuibCgiDomValidShareGen, nullptr, 0, 0, bad}, {QuibCgiDomValidShareGen, "CORP\\nobody", 0, 0, ""},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(Names(row.gen(nullptr, row.user, row.sort, row.writable)), row.want) << (row.user ? row.user : "null");
    }
    app_.AddShare({.name = "Zeta", .readWrite = "erin@corp.example"}).AddShare({.name = "beta", .readOnly = "erin@corp.example"});
    EXPECT_EQ(Names(QuibCgiLDAPValidShareGen("", "erin@corp.example", 1, 0)), "beta,closed,Docs,public,Zeta");
}

TEST_F(SdkShare, SyncedSharesAndTheCapabilityTable) {
    AddToSection("public", "synced = maybe");  // a bad value: the section is not trusted
    const struct { const char *name; Outcome want; } synced[] = {
        {"Docs", {1}}, {"docs", {1}}, {"plain", {0}}, {"photo", {0}},
        {"public", Failed(QUIB_ERR_NO_SUCH_SHARE)},  // its section is skipped whole
        {"nosuch", Failed(QUIB_ERR_NO_SUCH_SHARE)}, {"", Failed(QUIB_ERR_BAD_PARAMETER)},
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
        {"", Failed(QUIB_ERR_BAD_PARAMETER)}, {nullptr, Failed(QUIB_ERR_BAD_PARAMETER)},
    };
    for (const auto &row : support) {
        EXPECT_EQ(OUTCOME(VLIBCSupportGet(row.key)), row.want) << (row.key ? row.key : "null");
    }
    ASSERT_EQ(unlink(QUIB_SHARE_CONF), 0);
    EXPECT_EQ(OUTCOME(QUIBS2SIsSyncedShare("Docs")), Failed(QUIB_ERR_OPEN_FAILED));
}

}  // namespace
