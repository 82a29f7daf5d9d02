// norvo ls, run as a program inside a throwaway appliance: the page of a directory and of the
// share list as JSON and as text, the options handed to the listing, two users, and names made
// to pass for others.
#include <gtest/gtest.h>
#include <json/json.h>
#include <unistd.h>

#include <algorithm>
#include <sstream>
#include <string>
#include <vector>

#include "appliance.h"
#include "cli_runner.h"

namespace norvo::testing {
namespace {

using Strings = std::vector<std::string>;

class LsCliTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_EQ(access(NorvoCliPath().c_str(), X_OK), 0)
            << NorvoCliPath() << " is missing: build the norvo-cli target (or set NORVO_CLI)";
        appliance_.Basic();
        appliance_.MakeDir("/volume1/homes/alice", "alice", 0755);
        appliance_.MakeDir("/volume1/homes/bob", "bob", 0755);
        appliance_.MakeDir("/volume1/photo/2024", "alice", 0755);
        appliance_.WriteFile("/volume1/photo/big.jpg", std::string(300, 'b'), "alice");
        appliance_.WriteFile("/volume1/photo/small.txt", std::string(100, 's'), "bob");
        appliance_.WriteFile("/volume1/photo/Mid.JPG", std::string(200, 'm'), "alice");
    }

    // Runs norvo --json ls ARGS..., checks the exit status and that the answer is one line of
    // plain ASCII JSON, and returns it parsed.
    static Json::Value Ls(Strings args, int wantStatus = 0) {
        args.insert(args.begin(), {"--json", "ls"});
        const CliResult result = RunNorvo(args);
        EXPECT_EQ(result.exitStatus, wantStatus) << result.err;
        EXPECT_EQ(std::count(result.out.begin(), result.out.end(), '\n'), 1) << result.out;
        EXPECT_TRUE(std::all_of(result.out.begin(), result.out.end(),
                                [](char c) { return static_cast<unsigned char>(c) < 0x80; }))
            << result.out;
        Json::Value root;
        std::string errors;
        std::istringstream in(result.out);
        EXPECT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &root, &errors)) << errors << result.out;
        return root;
    }

    static Strings Names(const Json::Value &root) {
        Strings names;
        for (const Json::Value &file : root["data"]["files"]) names.push_back(file["name"].asString());
        return names;
    }

    Appliance appliance_;
};

TEST_F(LsCliTest, DirectoryPageIsDumpFileInfo) {
    const Json::Value root = Ls({"--user", "alice", "--sort", "name", "/photo/"});
    EXPECT_TRUE(root["success"].asBool());
    EXPECT_EQ(root["data"]["total"].asUInt(), 4u);
    const Json::Value &file = root["data"]["files"][2];
    EXPECT_EQ(file["path"].asString(), "/photo/Mid.JPG");
    EXPECT_EQ(file["additional"]["real_path"].asString(), "/volume1/photo/Mid.JPG");
    EXPECT_EQ(file["additional"]["owner"]["user"].asString(), "alice");
    EXPECT_FALSE(file["additional"].isMember("volume_status"));

    const Json::Value some = Ls({"--user", "alice", "--info", "size,type", "/photo"});
    EXPECT_EQ(some["data"]["files"][1]["additional"].getMemberNames(), (Strings{"size", "type"}));

    const Json::Value shares = Ls({"--user", "alice", "/"});
    EXPECT_EQ(Names(shares), (Strings{"home", "public", "photo", "secret"}));
    EXPECT_GT(shares["data"]["files"][2]["additional"]["volume_status"]["totalspace"].asDouble(), 0.0);
}

TEST_F(LsCliTest, SortPageAndFiltersArePassedThrough) {
    struct Case {
        Strings args;
        Strings names;
    };
    const std::vector<Case> cases = {
        {{"--sort", "size", "/photo"}, {"2024", "small.txt", "Mid.JPG", "big.jpg"}},
        {{"--sort", "size", "--desc", "/photo"}, {"big.jpg", "Mid.JPG", "small.txt", "2024"}},
        {{"--sort=size", "--offset=1", "--limit=2", "/photo"}, {"small.txt", "Mid.JPG"}},
        {{"--offset", "9", "--limit", "2", "/photo"}, {}},
        {{"--type", "dir", "/photo"}, {"2024"}},
        {{"--name", "sma*,20*", "--sort", "size", "/photo"}, {"2024", "small.txt"}},
        {{"--sort", "name", "--offset", "1", "--limit", "2", "/"}, {"photo", "public"}},
    };
    for (const Case &c : cases) {
        Strings args = c.args;
        args.insert(args.begin(), {"--user", "alice"});
        const Json::Value root = Ls(args);
        EXPECT_EQ(Names(root), c.names) << args[3];
        EXPECT_EQ(root["data"]["total"].asUInt(), args[3] == "dir" ? 1u : args[3] == "sma*,20*" ? 2u : 4u);
    }
}

TEST_F(LsCliTest, TwoUsersSeeDifferentThings) {
    appliance_.MakeDir("/volume1/public/mine", "alice", 0700);
    appliance_.WriteFile("/volume1/public/mine/diary.txt", "x", "alice", 0600);
    EXPECT_EQ(Names(Ls({"--user", "alice", "/public/mine"})), (Strings{"diary.txt"}));
    // bob is refused by the folder's mode, judged as bob although norvo runs as root.
    EXPECT_EQ(Ls({"--user", "bob", "/public/mine"}, 1)["error"]["code"].asInt(), 407);
    // The share list leaves out what bob may not see; a no-access share refuses him.
    EXPECT_EQ(Names(Ls({"--user", "bob", "/"})), (Strings{"home", "public", "photo"}));
    EXPECT_EQ(Ls({"--user", "bob", "/secret"}, 1)["error"]["key"].asString(), "error:error_privilege_not_enough");
    const CliResult text = RunNorvo({"ls", "--user", "bob", "/secret"});
    EXPECT_EQ(text.exitStatus, 1);
    EXPECT_EQ(text.out, "");
    EXPECT_EQ(text.err, "error 407 (error:error_privilege_not_enough): bob may not list /secret\n");
}

// The attacks on printed names: a newline against the four characters "\x0A", a right-to-left
// override, and two malformed names that U+FFFD alone would make one.
TEST_F(LsCliTest, NamesCannotPassForOthers) {
    appliance_.MakeDir("/volume1/photo/odd", "alice", 0755);
    for (const char *name : {"a\nb", "a\\x0Ab", "evil\xE2\x80\xAEgpj.exe", "\x1B[2J\x07"}) {
        appliance_.WriteFile(std::string("/volume1/photo/odd/") + name, "x", "alice");
    }
    appliance_.MakeDir("/volume1/photo/odd/d\xFF", "alice", 0755);
    appliance_.MakeDir("/volume1/photo/odd/d\xFE", "alice", 0755);
    appliance_.WriteFile("/volume1/photo/odd/d\xFF/inside.txt", "x", "alice");

    const CliResult text = RunNorvo({"ls", "--user", "alice", "--info", "perm,owner,size", "--sort", "name", "/photo/odd"});
    EXPECT_EQ(text.out, "total 6\n"
                        "posix      owner     size  name\n"
                        "rwxr-xr-x  alice        -  d\\xFE/\n"
                        "rwxr-xr-x  alice        -  d\\xFF/\n"
                        "rw-r--r--  alice  1 Bytes  \\x1B[2J\\x07\n"
                        "rw-r--r--  alice  1 Bytes  a\\x0Ab\n"
                        "rw-r--r--  alice  1 Bytes  a\\\\x0Ab\n"
                        "rw-r--r--  alice  1 Bytes  evil\\xE2\\x80\\xAEgpj.exe\n");

    const Json::Value root = Ls({"--user", "alice", "--type", "dir", "--sort", "name", "/photo/odd"});
    const Json::Value &files = root["data"]["files"];
    ASSERT_EQ(files.size(), 2u);
    EXPECT_EQ(files[0]["name"], files[1]["name"]);  // both "d\uFFFD"
    EXPECT_EQ(files[0]["name_escaped"].asString(), "d\\xFE");
    EXPECT_EQ(files[1]["path_escaped"].asString(), "/photo/odd/d\\xFF");
    EXPECT_EQ(files[1]["additional"]["real_path_escaped"].asString(), "/volume1/photo/odd/d\\xFF");
    EXPECT_FALSE(Ls({"--user", "alice", "--name", "a?b", "/photo/odd"})["data"]["files"][0].isMember("name_escaped"));

    const Json::Value inside = Ls({"--user", "alice", "--escaped", files[1]["path_escaped"].asString()});
    EXPECT_EQ(Names(inside), (Strings{"inside.txt"}));
}

}  // namespace
}  // namespace norvo::testing
