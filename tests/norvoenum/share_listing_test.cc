// The listing of "/": the home folder and the shares a user may see, with share privileges and
// volume figures, for local, domain and directory accounts, ordered and paged; the failures
// with their log lines.
#include <sys/statfs.h>
#include <unistd.h>
#include <syslog.h>

#include <list>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/errors.h"
#include "norvo/norvoenum.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::LogLine;

struct Listed {
    int rc = -1;
    int err = -1;
    unsigned long total = 99;
    std::list<DIRENTRY_INFO> out;
    std::string Names() const {
        std::string names;
        for (const DIRENTRY_INFO &e : out) names += (names.empty() ? "" : " ") + e.name;
        return names;
    }
    const DIRENTRY_INFO &Entry(const std::string &name) const {
        for (const DIRENTRY_INFO &e : out) if (e.name == name) return e;
        static const DIRENTRY_INFO none;
        ADD_FAILURE() << "no entry " << name;
        return none;
    }
};

struct Query {
    const char *user;
    const char *key = nullptr;
    int info = 0;
    bool ascending = true;
    unsigned long offset = 0, limit = 0;
};

Listed List(const Query &q) {
    Listed r;
    NvoLibSetErr(0);
    NvoEnum enumeration;
    r.rc = enumeration.NvoLibShareEntryListEnum(q.user, "ctx", false, q.key, q.info, q.offset, q.limit, q.ascending,
                                                r.out, &r.total);
    r.err = NvoLibGetErr();
    return r;
}

class ShareListing : public ::testing::Test {
protected:
    void SetUp() override {
        app_.Basic().MakeDir("/volume1/homes/alice", "alice", 0700);
        app_.AddUser(norvo::testing::UserSpec{.name = "carol", .home = "/srv/carol"});  // her home lies outside the homes root
        app_.AddUser("CORP\\dave").AddUser("erin@corp.example").AddUser("CORP\\x@y");
        app_.MakeDir("/volume1/homes/erin@corp.example").MakeDir("/volume1/homes/admin");
        app_.AddShare({.name = "archive", .volume = "/volume2", .readOnly = "alice,CORP\\dave,erin@corp.example,CORP\\x@y"});
        app_.AddShare({.name = "zeta", .readWrite = "alice", .hidden = true});
    }
    Appliance app_;
};

TEST_F(ShareListing, EachAccountSeesItsHomeAndItsShares) {
    app_.SetDomain("CORP").SetHomeService(true, "/volume1/homes", false, true);  // no homes for domain accounts
    const struct { const char *user; std::string names; } rows[] = {
        {"alice", "home public photo secret archive"},  // the hidden share is left out
        {"bob", "home public photo"},  // his home is not made yet: it is listed all the same, and stays unmade
        {"carol", "public"},  // no home folder, shares only
        {"admin", "home public"},  // administrators see what the lists give them
        {"CORP\\dave", "public archive"},
        {"CORP\\x@y", "public archive"},  // a domain account although it holds an "@"
    };
    for (const auto &row : rows) {
        const Listed got = List({row.user});
        EXPECT_EQ(got.Names(), row.names) << row.user;
        EXPECT_EQ(got.rc, row.names.empty() ? 0 : 1) << row.user;
        EXPECT_EQ(got.total, row.names.empty() ? 99u : got.out.size()) << row.user;
    }
    // No directory service is configured: its account gets no share list.
    const Listed erin = List({"erin@corp.example"});
    EXPECT_EQ(std::pair(erin.rc, erin.err), std::pair(0, int(NVO_ERR_SYSTEM)));
    app_.SetDirectory("ldap.corp.example");
    EXPECT_EQ(List({"erin@corp.example"}).Names(), "home public archive");
    // A new user's first listing, as the user: the home entry is a folder with the volume's
    // figures, and opening it makes it.
    const int info = NVO_INFO_PERM | NVO_INFO_VOLUME_STATUS | NVO_INFO_SIZE;
    app_.ClearLogs();
    EXPECT_EQ(app_.RunAs("bob", [&] {
                  const Listed got = List({"bob", "name", info});
                  const DIRENTRY_INFO &home = got.Entry("home");
                  return got.rc == 1 && home.isdir && home.share_privilege == 2 && home.totalspace > 0 ? 1 : 0;
              }),
              1);
    EXPECT_NE(access("/volume1/homes/bob", F_OK), 0);
    EXPECT_TRUE(app_.ErrorLines().empty());
}

TEST_F(ShareListing, FailuresAndTheirLogLines) {
    app_.SetSetting("domain_joined", "no").WriteFile("/volume1/homes/f");
    app_.AddUser(norvo::testing::UserSpec{.name = "frank", .home = "/volume1/homes/f/frank"});  // not a folder
    const struct { const char *user; int err; std::vector<std::string> lines; } rows[] = {
        {nullptr, NVO_ERR_NO_USER, {"norvoenum.cpp:402 Failed to get user ((null))"}},
        {"CORP\\dave", NVO_ERR_SYSTEM, {"norvoenum.cpp:407 Failed to enum valid shares"}},
        {"frank", NVO_ERR_SYSTEM, {"norvoenum.cpp:415 Failed to get real path (/volume1/homes/f/frank)"}},
    };
    for (const auto &row : rows) {
        app_.ClearLogs();
        const Listed got = List({row.user});
        EXPECT_EQ(std::pair(got.rc, got.err), std::pair(0, row.err)) << (row.user ? row.user : "null");
        std::vector<std::string> enumLines;
        for (const LogLine &line : app_.Logs()) {
            EXPECT_EQ(line.priority, LOG_ERR) << line.text;
            if (line.text.rfind("norvoenum.cpp", 0) == 0) enumLines.push_back(line.text);
        }
        EXPECT_EQ(enumLines, row.lines);
    }
}

TEST_F(ShareListing, ShareFieldsAndVolumeFigures) {
    app_.AddShare({.name = "remote", .readWrite = "alice"}).MountDeadRemote("/volume1/remote");
    app_.RemountReadOnly("/volume2");
    struct statfs64 v1, v2;
    ASSERT_EQ(statfs64("/volume1", &v1), 0);
    ASSERT_EQ(statfs64("/volume2", &v2), 0);
    const int info = NVO_INFO_PERM | NVO_INFO_VOLUME_STATUS | NVO_INFO_MOUNT_POINT_TYPE;
    const Listed got = List({"alice", nullptr, info});
    ASSERT_EQ(got.rc, 1);
    EXPECT_EQ(got.Names(), "home public photo secret archive remote");
    const struct { const char *name; int priv; bool acl; const struct statfs64 *volume; bool readonly; std::string type; } rows[] = {
        {"home", 2, false, &v1, false, ""}, {"photo", 2, true, &v1, false, ""},
        {"archive", 1, true, &v2, true, ""}, {"remote", 2, true, nullptr, false, "remotefail"},
    };
    for (const auto &row : rows) {
        const DIRENTRY_INFO &e = got.Entry(row.name);
        const uint64_t bsize = row.volume ? row.volume->f_bsize : 0;
        EXPECT_EQ(std::tuple(e.isdir, e.share_privilege, e.acl_enabled, e.ftp_privilege, e.mount_point_type, e.readonly,
                             e.freespace, e.totalspace),
                  std::tuple(true, row.priv, row.acl, 0, row.type, row.readonly,
                             row.volume ? row.volume->f_bavail * bsize : 0, row.volume ? row.volume->f_blocks * bsize : 0))
            << row.name;
    }
    EXPECT_EQ(std::tuple(got.Entry("home").real_path, got.Entry("home").path, got.Entry("photo").path),
              std::tuple("", "/home", "/photo"));  // the real path was not asked for
    // Without the flags nothing share-level is filled.
    const Listed bare = List({"alice"});
    const DIRENTRY_INFO &plain = bare.Entry("archive");
    EXPECT_EQ(std::tuple(plain.share_privilege, plain.totalspace, plain.readonly), std::tuple(4, uint64_t{0}, false));
}

TEST_F(ShareListing, SyncedSharesNeedTheFlagAndTheCapability) {
    app_.WriteFile("/usr/quib/etc/shares.conf", "[photo]\n\tpath = /volume1/photo\n\twrite list = alice\n\tsynced = yes\n"
                                                "[public]\n\tpath = /volume1/public\n\twrite list = @users\n");
    auto synced = [&](int info) {
        std::string out;
        for (const DIRENTRY_INFO &e : List({"alice", nullptr, info}).out) out += e.synced_share ? "1" : "0";
        return out;
    };
    EXPECT_EQ(synced(NVO_INFO_SYNC_SHARE), "000");  // home, photo, public: no capability
    app_.SetDefaultSetting("support_s2s", "yes");
    EXPECT_EQ(synced(NVO_INFO_SYNC_SHARE), "010");
    EXPECT_EQ(synced(NVO_INFO_PERM), "000");
}

TEST_F(ShareListing, OrderAndPagesAsADirectoryListing) {
    const struct { Query q; std::string names; unsigned long total; } rows[] = {
        {{"alice", "name"}, "archive home photo public secret", 5},  // home among the folders by name
        {{"alice", "name", 0, false}, "secret public photo home archive", 5},
        {{"alice", nullptr, 0, false}, "archive secret photo public home", 5},  // reversed list order
        {{"alice", "name", 0, true, 1, 2}, "home photo", 5},
        {{"alice", "name", 0, true, 3, 0}, "archive home photo public secret", 5},  // limit 0: all, offset ignored
        {{"carol", "size", 0, true, 0, 1}, "public", 1},
    };
    for (const auto &row : rows) {
        const Listed got = List(row.q);
        EXPECT_EQ(got.Names(), row.names) << row.q.user << " " << (row.q.key ? row.q.key : "null");
        EXPECT_EQ(got.total, row.total);
    }
    // Sorting by size fills the size, as in a directory listing.
    EXPECT_NE(List({"alice", "size"}).Entry("home").size, 0u);
}

}  // namespace
