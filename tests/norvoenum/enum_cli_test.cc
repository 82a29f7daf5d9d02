// norvo mounts and norvo whois, run as programs in the appliance: the library's view in JSON,
// failures with their codes, usage errors.
#include <unistd.h>

#include <string>

#include <gtest/gtest.h>
#include <json/json.h>

#include "../tools/cli_runner.h"
#include "appliance.h"
#include "quib_fs.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::CliResult;
using norvo::testing::RunNorvo;

Json::Value Data(const CliResult &result) {
    Json::Value root;
    EXPECT_TRUE(Json::Reader().parse(result.out, root)) << result.out << result.err;
    return root["data"];
}

TEST(EnumCli, MountsShowTheLibrarysTableAndAnswers) {
    Appliance app;
    app.AddVolume("/volume1/usb").RemountReadOnly("/volume1");
    const CliResult result = RunNorvo({"--json", "mounts", "--path", "/volume1/usbx/a"});
    ASSERT_EQ(result.exitStatus, 0) << result.err;
    const Json::Value data = Data(result);
    bool seen = false;
    for (const Json::Value &mount : data["mounts"]) {
        if (mount["dir"].asString() == "/volume1") {
            seen = true;
            EXPECT_EQ(mount["type"].asInt(), FSTYPE_TMPFS);
            EXPECT_EQ(mount["type_name"].asString(), "tmpfs");
            EXPECT_TRUE(mount["readonly"].asBool());
        }
    }
    EXPECT_TRUE(seen) << data;
    EXPECT_TRUE(data["path"]["readonly"].asBool());
    EXPECT_EQ(data["path"]["type"].asInt(), FSTYPE_NOT_MOUNT_POINT);
}

TEST(EnumCli, WhoisNamesIdsThroughTheCaches) {
    Appliance app;
    app.Basic();
    using Args = std::vector<std::string>;
    for (const Args &args : {Args{"--json", "whois", "--uid", std::to_string(app.Uid("alice"))},
                             Args{"--json", "whois", "--user", "alice"}}) {
        const Json::Value data = Data(RunNorvo(args));
        EXPECT_EQ(data["user"].asString(), "alice");
        EXPECT_EQ(data["uid"].asUInt(), app.Uid("alice"));
        ASSERT_EQ(data["groups"].size(), 2u) << data;
        EXPECT_EQ(data["groups"][0]["gid"].asUInt(), app.Gid("users"));
        EXPECT_EQ(data["groups"][1]["name"].asString(), "staff");
    }
    EXPECT_EQ(Data(RunNorvo({"--json", "whois", "--gid", std::to_string(app.Gid("staff"))}))["group"].asString(), "staff");

    const CliResult unknown = RunNorvo({"--json", "whois", "--uid", "4242"});
    EXPECT_EQ(unknown.exitStatus, 1);
    EXPECT_NE(unknown.out.find("\"code\":403"), std::string::npos) << unknown.out;
    EXPECT_EQ(RunNorvo({"whois", "--gid", "4242"}).exitStatus, 1);
}

// carol's link inside public is described as the link it is, with a link's rights, and never
// followed; a path through it is refused, as a listing would refuse it.
TEST(EnumCli, PrivilegeDescribesALinkAndRefusesAPathThroughIt) {
    Appliance app;
    app.Basic().AddUser("carol").WriteFile("/volume1/photo/x.jpg");
    ASSERT_EQ(app.RunAs("carol", [] { return symlink("/volume1/photo", "/volume1/public/photo"); }), 0);
    const CliResult link = RunNorvo({"--json", "privilege", "--user", "carol", "/public/photo"});
    ASSERT_EQ(link.exitStatus, 0) << link.err;
    EXPECT_EQ(Data(link)["link"].asString(), "/volume1/photo");
    EXPECT_EQ(Data(link)["acl"]["value"].asUInt(), unsigned{ACL_PERM_READ_ATTR | ACL_PERM_READ_ACL | ACL_PERM_DELETE});
    const CliResult through = RunNorvo({"--json", "privilege", "--user", "carol", "/public/photo/x.jpg"});
    EXPECT_EQ(through.exitStatus, 1);
    EXPECT_NE(through.out.find("\"code\":407"), std::string::npos) << through.out;
    EXPECT_TRUE(Data(RunNorvo({"--json", "privilege", "--user", "carol", "/public"}))["link"].isNull());
}

}  // namespace
