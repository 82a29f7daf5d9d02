// The norvo command, run as a program inside a throwaway appliance: its JSON answers, its
// failure output, its usage errors, and hostile arguments.
#include <gtest/gtest.h>
#include <json/json.h>
#include <unistd.h>

#include <algorithm>
#include <sstream>
#include <string>
#include <vector>

#include "appliance.h"
#include "appliance_file.h"
#include "cli_runner.h"
#include "quib_fs.h"

namespace norvo::testing {
namespace {

class NorvoCliTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_EQ(access(NorvoCliPath().c_str(), X_OK), 0)
            << NorvoCliPath() << " is missing: build the norvo-cli target (or set NORVO_CLI)";
        appliance_.Basic();
    }

    // Runs norvo with --json, checks the exit status and returns the parsed stdout.
    Json::Value RunJson(std::vector<std::string> args, int wantStatus = 0, const std::string &input = "") {
        args.insert(args.begin(), "--json");
        const CliResult result = RunNorvo(args, input);
        EXPECT_EQ(result.exitStatus, wantStatus) << result.err;
        Json::Value root;
        Json::CharReaderBuilder builder;
        std::string errors;
        std::istringstream in(result.out);
        EXPECT_TRUE(Json::parseFromStream(builder, in, &root, &errors)) << errors << "\n" << result.out;
        EXPECT_TRUE(std::all_of(result.out.begin(), result.out.end(),
                                [](char c) { return static_cast<unsigned char>(c) < 0x80; }))
            << "JSON output is not plain ASCII: " << result.out;
        return root;
    }

    // More of the appliance, in the appliance-file form the demo uses.
    void Add(const std::string &lines) {
        ApplianceFile file;
        std::string error;
        ASSERT_TRUE(ParseApplianceFile(lines, "test", &file, &error)) << error;
        BuildAppliance(appliance_, file);
    }

    Appliance appliance_;
};

std::vector<std::string> Strings(const Json::Value &array) {
    std::vector<std::string> out;
    for (const Json::Value &item : array) out.push_back(item.asString());
    return out;
}

TEST_F(NorvoCliTest, ResolveReportsShareAndHomePaths) {
    Json::Value root = RunJson({"resolve", "--user", "alice", "/photo/2024/a.jpg"});
    EXPECT_TRUE(root["success"].asBool());
    const Json::Value &data = root["data"];
    EXPECT_EQ(data["real_path"].asString(), "/volume1/photo/2024/a.jpg");
    EXPECT_EQ(data["share"].asString(), "photo");
    EXPECT_EQ(data["volume_path"].asString(), "/volume1");
    EXPECT_EQ(data["share_path"].asString(), "/volume1/photo");
    EXPECT_FALSE(data["home"].asBool());
    EXPECT_FALSE(data["encrypted"].asBool());
    EXPECT_TRUE(RunJson({"resolve", "--user", "alice", "/secret/plan.txt"})["data"]["encrypted"].asBool());

    root = RunJson({"resolve", "--user=alice", "/home/notes"});
    EXPECT_EQ(root["data"]["real_path"].asString(), "/volume1/homes/alice/notes");
    EXPECT_EQ(root["data"]["share_path"].asString(), "/volume1/homes/alice");
    EXPECT_TRUE(root["data"]["home"].asBool());
}

TEST_F(NorvoCliTest, PrivilegeOfTwoUsersOnOneShare) {
    appliance_.MakeDir("/volume1/photo/private", "root", 0700);
    Json::Value alice = RunJson({"privilege", "--user", "alice", "/photo/private"})["data"];
    EXPECT_EQ(alice["privilege"].asInt(), 2);
    EXPECT_EQ(alice["restrict"]["value"].asUInt(), 0u);
    EXPECT_TRUE(alice["list"]["allowed"].asBool());
    EXPECT_TRUE(alice["download"]["allowed"].asBool());
    EXPECT_TRUE(alice["upload"]["allowed"].asBool());
    EXPECT_EQ(alice["upload"]["type"].asInt(), 1);
    EXPECT_FALSE(alice["upload_no_overwrite"]["allowed"].asBool());
    EXPECT_EQ(alice["upload_no_overwrite"]["error"]["code"].asInt(), 414);
    // Asked as alice, not as root: a root-only directory lets her neither read, write nor enter.
    EXPECT_TRUE(alice["real_path_exists"].asBool());
    EXPECT_EQ(alice["acl"]["value"].asUInt() & (ACL_PERM_READ | ACL_PERM_WRITE | ACL_PERM_EXECUTE), 0u)
        << alice["acl"];

    Json::Value bob = RunJson({"privilege", "--user", "bob", "/photo"})["data"];
    EXPECT_EQ(bob["privilege"].asInt(), 1);
    EXPECT_TRUE(bob["list"]["allowed"].asBool());
    EXPECT_FALSE(bob["upload"]["allowed"].asBool());
    EXPECT_EQ(bob["upload"]["error"]["code"].asInt(), 407);
    EXPECT_EQ(bob["upload"]["error"]["key"].asString(), "error:error_privilege_not_enough");

    Json::Value denied = RunJson({"privilege", "--user", "bob", "/secret"})["data"];
    EXPECT_EQ(denied["privilege"].asInt(), 0);
    EXPECT_FALSE(denied["list"]["allowed"].asBool());
    EXPECT_FALSE(denied["download"]["allowed"].asBool());
}

TEST_F(NorvoCliTest, OnlyRootAsksForAnotherUser) {
    // Run by bob: his own ACL mask needs no switch, alice's can't be had without root.
    const int own = appliance_.RunAs("bob", [] {
        return RunNorvo({"--json", "privilege", "--user", "bob", "/photo"}).exitStatus;
    });
    EXPECT_EQ(own, 0);
    const int refused = appliance_.RunAs("bob", [] {
        const CliResult result = RunNorvo({"--json", "privilege", "--user", "alice", "/photo"});
        const bool explained = result.out.find("\"code\":401") != std::string::npos &&
                               result.out.find("cannot act as alice") != std::string::npos;
        return explained ? result.exitStatus : -1;
    });
    EXPECT_EQ(refused, 1);
}

TEST_F(NorvoCliTest, PrivilegeNamesRestrictionsAndTextIsAligned) {
    Add("share locked rw=alice restrict=nomodify,nodownload");
    const Json::Value data = RunJson({"privilege", "--user", "alice", "/locked"})["data"];
    EXPECT_EQ(data["restrict"]["value"].asUInt(), 6u);
    EXPECT_EQ(Strings(data["restrict"]["names"]), (std::vector<std::string>{"no-modify", "no-download"}));
    EXPECT_FALSE(data["download"]["allowed"].asBool());
    EXPECT_TRUE(data["upload"]["allowed"].asBool());
    EXPECT_EQ(data["upload"]["type"].asInt(), 2);

    const CliResult text = RunNorvo({"privilege", "--user", "alice", "/locked"});
    EXPECT_EQ(text.exitStatus, 0) << text.err;
    EXPECT_NE(text.out.find("share privilege       read-write\n"), std::string::npos) << text.out;
    EXPECT_NE(text.out.find("restrictions          0x6 (no-modify, no-download)\n"), std::string::npos)
        << text.out;
}

TEST_F(NorvoCliTest, SharesListsAreTheLibrarys) {
    EXPECT_EQ(Strings(RunJson({"shares", "--user", "alice"})["data"]["shares"]),
              (std::vector<std::string>{"public", "photo", "secret"}));
    EXPECT_EQ(Strings(RunJson({"shares", "--user", "alice", "--sort"})["data"]["shares"]),
              (std::vector<std::string>{"photo", "public", "secret"}));
    EXPECT_EQ(Strings(RunJson({"shares", "--user", "bob"})["data"]["shares"]),
              (std::vector<std::string>{"public", "photo"}));
    EXPECT_EQ(Strings(RunJson({"shares", "--user", "bob", "--writable"})["data"]["shares"]),
              (std::vector<std::string>{"public"}));
}

TEST_F(NorvoCliTest, FailureGivesCodeKeyAndStatusOne) {
    const Json::Value root = RunJson({"resolve", "--user", "alice", "/nowhere/x"}, 1);
    EXPECT_FALSE(root["success"].asBool());
    EXPECT_EQ(root["error"]["code"].asInt(), 408);
    EXPECT_EQ(root["error"]["key"].asString(), "error:error_no_path");
    EXPECT_FALSE(root.isMember("data"));

    const CliResult text = RunNorvo({"resolve", "--user", "alice", "/nowhere/x"});
    EXPECT_EQ(text.exitStatus, 1);
    EXPECT_EQ(text.out, "");
    EXPECT_EQ(text.err, "error 408 (error:error_no_path)\n");

    const CliResult reserved = RunNorvo({"check-name", "/volume1/photo", "._secret"});
    EXPECT_EQ(reserved.exitStatus, 1);
    EXPECT_EQ(reserved.err, "error 418 (error:error_reserved_name)\n");

    const Json::Value unknown = RunJson({"privilege", "--user", "nobody-here", "/photo"}, 1);
    EXPECT_EQ(unknown["error"]["code"].asInt(), 403);
}

TEST_F(NorvoCliTest, CheckPathShowsTheExistingPart) {
    const Json::Value data =
        RunJson({"check-path", "--find-existing", "/volume1/photo/new/deeper/file"})["data"];
    EXPECT_TRUE(data["acceptable"].asBool());
    EXPECT_EQ(data["existing"].asString(), "/volume1/photo");

    const Json::Value missing = RunJson({"check-path", "/volume1/photo/new"}, 1);
    EXPECT_EQ(missing["error"]["code"].asInt(), 408);
}

TEST_F(NorvoCliTest, LoginGivesASidThatDomainPrivilegesAccept) {
    Add("domain CORP\n"
        "user CORP\\dave password=pw-dave\n"
        "share team rw=CORP\\dave\n");

    const CliResult login = RunNorvo({"login", "--user", "CORP\\dave", "--password-stdin"}, "pw-dave\n");
    ASSERT_EQ(login.exitStatus, 0) << login.err;
    ASSERT_FALSE(login.out.empty());
    const std::string sid = login.out.substr(0, login.out.find('\n'));
    EXPECT_EQ(login.out, sid + "\n");

    const Json::Value data = RunJson({"privilege", "--user", "CORP\\dave", "--sid", sid, "/team"})["data"];
    EXPECT_EQ(data["privilege"].asInt(), 2);
    EXPECT_EQ(data["sid"].asString(), sid);

    const Json::Value forged = RunJson({"privilege", "--user", "CORP\\dave", "--sid", "forged", "/team"}, 1);
    EXPECT_EQ(forged["error"]["code"].asInt(), 402);

    const Json::Value wrong = RunJson({"login", "--user", "alice", "--password", "wrong"}, 1);
    EXPECT_FALSE(wrong["success"].asBool());
    const Json::Value stranger = RunJson({"login", "--user", "stranger", "--password", "x"}, 1);
    EXPECT_EQ(stranger["error"]["code"].asInt(), 403);
}

TEST_F(NorvoCliTest, UsageErrorsExitTwoAndSayWhy) {
    struct Case {
        std::vector<std::string> args;
        std::string message;
    };
    const std::vector<Case> cases = {
        {{}, "norvo: no command given"},
        {{"frobnicate"}, "norvo: unknown command frobnicate"},
        {{"--verbose", "shares"}, "norvo: unknown option --verbose"},
        {{"resolve", "/photo"}, "norvo resolve: option --user is required"},
        {{"resolve", "/photo", "--user"}, "norvo resolve: option --user needs a value (USER)"},
        {{"resolve", "--user", "--json", "/photo"}, "norvo resolve: option --user needs a value (USER)"},
        {{"resolve", "--user=", "/photo"}, "norvo resolve: option --user needs a non-empty value"},
        {{"resolve", "--user", "alice"}, "norvo resolve: missing argument PATH"},
        {{"resolve", "--user", "alice", "/a", "/b"}, "norvo resolve: unexpected argument /b"},
        {{"resolve", "--user", "alice", "--user", "bob", "/a"}, "norvo resolve: option --user given twice"},
        {{"resolve", "--owner", "alice", "/a"}, "norvo resolve: unknown option --owner"},
        {{"resolve", "-u", "alice", "/a"}, "norvo resolve: unknown option -u"},
        {{"shares", "--user", "alice", "--sort=yes"}, "norvo shares: option --sort takes no value"},
        {{"check-path", "--mode", "0x40", "/volume1"}, "norvo check-path: --mode wants a number from 1 to 63"},
        {{"check-path", "--mode", "-1", "/volume1"}, "norvo check-path: --mode wants a number from 1 to 63"},
        {{"check-path", "--mode", "--find-existing", "/volume1"}, "norvo check-path: option --mode needs a value"},
        {{"check-name", "/volume1", ""}, "norvo check-name: argument NAME is empty"},
        {{"login", "--user", "alice"}, "norvo login: give exactly one of --password and --password-stdin"},
        {{"login", "--user", "alice", "--password-stdin"}, "norvo login: no password on stdin"},
    };
    for (const Case &c : cases) {
        std::vector<std::string> args = c.args;
        args.push_back("--json");  // usage errors stay text on stderr even then
        const CliResult result = RunNorvo(args);
        SCOPED_TRACE(c.message);
        EXPECT_EQ(result.exitStatus, 2);
        EXPECT_EQ(result.out, "");
        EXPECT_EQ(result.err.rfind(c.message, 0), 0u) << result.err;
    }
}

TEST_F(NorvoCliTest, HostileArgumentsKeepJsonValidAndTextInert) {
    const std::string broken = "/photo/a\xC3/b\xFF\xED\xA0\x80";
    const Json::Value data = RunJson({"resolve", "--user", "alice", broken})["data"];
    EXPECT_EQ(data["path"].asString(), "/photo/a\xEF\xBF\xBD/b\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD");
    EXPECT_EQ(data["real_path"].asString().rfind("/volume1/photo/a\xEF\xBF\xBD/b", 0), 0u);

    const std::string longPath = "/photo/" + std::string(20000, 'x') + "/y";
    for (const std::vector<std::string> &args :
         {std::vector<std::string>{"resolve", "--user", "alice", longPath},
          std::vector<std::string>{"privilege", "--user", "alice", longPath},
          std::vector<std::string>{"check-path", "--find-existing", "/volume1" + longPath},
          std::vector<std::string>{"check-name", "/volume1/photo", std::string(5000, 'n')},
          std::vector<std::string>{"shares", "--user", std::string(5000, 'u')}}) {
        const CliResult result = RunNorvo([&] {
            std::vector<std::string> withJson = args;
            withJson.insert(withJson.begin(), "--json");
            return withJson;
        }());
        SCOPED_TRACE(args[0]);
        EXPECT_EQ(result.signal, 0);
        EXPECT_TRUE(result.exitStatus == 0 || result.exitStatus == 1) << result.exitStatus;
        Json::Value root;
        std::string errors;
        std::istringstream in(result.out);
        EXPECT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &root, &errors)) << errors;
        EXPECT_TRUE(root.isMember("success"));
    }

    const CliResult text = RunNorvo({"resolve", "--user", "alice", "/photo/\x1B[2Jname\x07"});
    EXPECT_EQ(text.exitStatus, 0) << text.err;
    EXPECT_EQ(text.out.find('\x1B'), std::string::npos);
    EXPECT_NE(text.out.find("/volume1/photo/\\x1B[2Jname\\x07"), std::string::npos) << text.out;
}

TEST_F(NorvoCliTest, HelpListsEveryCommand) {
    const CliResult overview = RunNorvo({"--help"});
    EXPECT_EQ(overview.exitStatus, 0);
    for (const char *name : {"resolve", "privilege", "shares", "check-name", "check-path", "login"}) {
        SCOPED_TRACE(name);
        EXPECT_NE(overview.out.find(std::string("  ") + name + " "), std::string::npos);
        const CliResult help = RunNorvo({name, "--help"});
        EXPECT_EQ(help.exitStatus, 0);
        EXPECT_EQ(help.out.rfind(std::string("usage: norvo ") + name + " ", 0), 0u) << help.out;
        EXPECT_EQ(RunNorvo({"help", name}).out, help.out);
    }
}

}  // namespace
}  // namespace norvo::testing
