// norvo ls, run as a program inside a throwaway appliance: the page of a directory and of the
// share list as JSON and as text, the options handed to the listing, two users, usage errors
// and hostile paths.
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

    // Runs norvo --json ls ARGS..., checks the exit status and returns the parsed stdout.
    Json::Value Ls(std::vector<std::string> args, int wantStatus = 0) {
        args.insert(args.begin(), {"--json", "ls"});
        const CliResult result = RunNorvo(args);
        EXPECT_EQ(result.exitStatus, wantStatus) << result.err;
        Json::Value root;
        std::string errors;
        std::istringstream in(result.out);
        EXPECT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &root, &errors)) << errors << result.out;
        EXPECT_TRUE(std::all_of(result.out.begin(), result.out.end(),
                                [](char c) { return static_cast<unsigned char>(c) < 0x80; }))
            << result.out;
        return root;
    }

    static std::vector<std::string> Names(const Json::Value &root) {
        std::vector<std::string> names;
        for (const Json::Value &file : root["data"]["files"]) names.push_back(file["name"].asString());
        return names;
    }

    Appliance appliance_;
};

TEST_F(LsCliTest, DirectoryPageIsDumpFileInfo) {
    // Without --sort the page is in the directory reader's order; sorted here to be checked.
    const Json::Value root = Ls({"--user", "alice", "--sort", "name", "/photo"});
    EXPECT_TRUE(root["success"].asBool());
    EXPECT_EQ(root["data"]["total"].asUInt(), 4u);
    EXPECT_EQ(root["data"]["offset"].asUInt(), 0u);
    EXPECT_EQ(Names(root), (std::vector<std::string>{"2024", "big.jpg", "Mid.JPG", "small.txt"}));
    const Json::Value &dir = root["data"]["files"][0];
    EXPECT_EQ(dir["path"].asString(), "/photo/2024");
    EXPECT_TRUE(dir["isdir"].asBool());
    const Json::Value &file = root["data"]["files"][2];
    EXPECT_FALSE(file["isdir"].asBool());
    const Json::Value &more = file["additional"];
    EXPECT_EQ(more["real_path"].asString(), "/volume1/photo/Mid.JPG");
    EXPECT_EQ(more["size"].asDouble(), 200.0);
    EXPECT_EQ(more["type"].asString(), "jpg");
    EXPECT_EQ(more["owner"]["user"].asString(), "alice");
    EXPECT_EQ(more["perm"]["posix"].asInt(), 644);
    EXPECT_EQ(more["mount_point_type"].asString(), "");
    EXPECT_TRUE(more["time"].isMember("mtime"));
    EXPECT_FALSE(more.isMember("volume_status"));

    const Json::Value some = Ls({"--user", "alice", "--info", "size,type", "--sort", "name", "/photo/"});
    EXPECT_EQ(some["data"]["files"][1]["additional"].getMemberNames(), (std::vector<std::string>{"size", "type"}));
}

TEST_F(LsCliTest, RootListsHomeAndSharesWithVolumeStatus) {
    const Json::Value alice = Ls({"--user", "alice", "/"});
    EXPECT_EQ(Names(alice), (std::vector<std::string>{"home", "public", "photo", "secret"}));
    EXPECT_EQ(alice["data"]["total"].asUInt(), 4u);
    const Json::Value &photo = alice["data"]["files"][2];
    EXPECT_EQ(photo["path"].asString(), "/photo");
    EXPECT_TRUE(photo["isdir"].asBool());
    EXPECT_FALSE(photo["additional"]["volume_status"]["readonly"].asBool());
    EXPECT_GT(photo["additional"]["volume_status"]["totalspace"].asDouble(), 0.0);

    // Sorted and paged as a directory is.
    const Json::Value page = Ls({"--user", "alice", "--sort", "name", "--offset", "1", "--limit", "2", "/"});
    EXPECT_EQ(page["data"]["total"].asUInt(), 4u);
    EXPECT_EQ(Names(page), (std::vector<std::string>{"photo", "public"}));
}

TEST_F(LsCliTest, SortOrderAndPageArePassedThrough) {
    EXPECT_EQ(Names(Ls({"--user", "alice", "--sort", "size", "/photo"})),
              (std::vector<std::string>{"2024", "small.txt", "Mid.JPG", "big.jpg"}));
    EXPECT_EQ(Names(Ls({"--user", "alice", "--sort", "size", "--desc", "/photo"})),
              (std::vector<std::string>{"big.jpg", "Mid.JPG", "small.txt", "2024"}));
    const Json::Value page = Ls({"--user", "alice", "--sort=size", "--offset=1", "--limit=2", "/photo"});
    EXPECT_EQ(page["data"]["total"].asUInt(), 4u);
    EXPECT_EQ(page["data"]["offset"].asUInt(), 1u);
    EXPECT_EQ(Names(page), (std::vector<std::string>{"small.txt", "Mid.JPG"}));
    const Json::Value past = Ls({"--user", "alice", "--offset", "9", "--limit", "2", "/photo"});
    EXPECT_EQ(past["data"]["total"].asUInt(), 4u);
    EXPECT_EQ(past["data"]["files"].size(), 0u);
    EXPECT_EQ(Names(Ls({"--user", "alice", "--type", "dir", "/photo"})), (std::vector<std::string>{"2024"}));
}

TEST_F(LsCliTest, NameTermsFilterTheListing) {
    EXPECT_EQ(Names(Ls({"--user", "alice", "--name", "jpg", "--sort", "name", "/photo"})),
              (std::vector<std::string>{"big.jpg", "Mid.JPG"}));
    EXPECT_EQ(Names(Ls({"--user", "alice", "--name", "sma*,20*", "--sort", "size", "/photo"})),
              (std::vector<std::string>{"2024", "small.txt"}));
    const Json::Value none = Ls({"--user", "alice", "--name", "nothing-like-it", "/photo"});
    EXPECT_EQ(none["data"]["total"].asUInt(), 0u);
}

TEST_F(LsCliTest, TwoUsersSeeDifferentThings) {
    appliance_.MakeDir("/volume1/public/mine", "alice", 0700);
    appliance_.WriteFile("/volume1/public/mine/diary.txt", "x", "alice", 0600);
    EXPECT_EQ(Names(Ls({"--user", "alice", "/public/mine"})), (std::vector<std::string>{"diary.txt"}));
    // bob is refused by the folder's mode, judged as bob although norvo runs as root.
    const Json::Value mode = Ls({"--user", "bob", "/public/mine"}, 1);
    EXPECT_EQ(mode["error"]["code"].asInt(), 407);

    // The share list leaves out what bob may not see; a no-access share refuses him.
    EXPECT_EQ(Names(Ls({"--user", "bob", "/"})), (std::vector<std::string>{"home", "public", "photo"}));
    const Json::Value share = Ls({"--user", "bob", "/secret"}, 1);
    EXPECT_FALSE(share["success"].asBool());
    EXPECT_EQ(share["error"]["code"].asInt(), 407);
    EXPECT_EQ(share["error"]["key"].asString(), "error:error_privilege_not_enough");
    const CliResult text = RunNorvo({"ls", "--user", "bob", "/secret"});
    EXPECT_EQ(text.exitStatus, 1);
    EXPECT_EQ(text.out, "");
    EXPECT_EQ(text.err.rfind("error 407 (error:error_privilege_not_enough)", 0), 0u) << text.err;

    EXPECT_EQ(Ls({"--user", "nobody-here", "/photo"}, 1)["error"]["code"].asInt(), 403);
    EXPECT_EQ(Ls({"--user", "alice", "/nowhere"}, 1)["error"]["code"].asInt(), 408);
}

TEST_F(LsCliTest, TextIsAnAlignedTable) {
    const CliResult text = RunNorvo({"ls", "--user", "alice", "--sort", "size", "/photo"});
    ASSERT_EQ(text.exitStatus, 0) << text.err;
    std::vector<std::string> lines;
    std::istringstream in(text.out);
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    ASSERT_EQ(lines.size(), 6u) << text.out;
    EXPECT_EQ(lines[0], "total 4");
    EXPECT_EQ(lines[1].rfind("posix", 0), 0u) << lines[1];
    EXPECT_EQ(lines[2].rfind("rwxr-xr-x  alice", 0), 0u) << lines[2];
    EXPECT_EQ(lines[2].substr(lines[2].size() - 6), " 2024/");
    EXPECT_NE(lines[3].find("100 Bytes"), std::string::npos) << lines[3];
    const size_t nameColumn = lines[1].find("name");
    for (size_t i = 2; i < lines.size(); ++i) {
        EXPECT_EQ(lines[i].find_last_of(' ') + 1, nameColumn) << lines[i];
    }
}

TEST_F(LsCliTest, UsageErrorsExitTwo) {
    struct Case {
        std::vector<std::string> args;
        std::string message;
    };
    const std::vector<Case> cases = {
        {{"ls", "/photo"}, "norvo ls: option --user is required"},
        {{"ls", "--user", "alice"}, "norvo ls: missing argument PATH"},
        {{"ls", "--user", "alice", "--info", "size,colour", "/photo"}, "norvo ls: --info does not know \"colour\""},
        {{"ls", "--user", "alice", "--info", "size,", "/photo"}, "norvo ls: --info does not know \"\""},
        {{"ls", "--user", "alice", "--type", "link", "/photo"}, "norvo ls: --type wants dir, file or all"},
        {{"ls", "--user", "alice", "--offset", "-1", "/photo"}, "norvo ls: --offset wants a number"},
        {{"ls", "--user", "alice", "--limit", "99999999999", "/photo"}, "norvo ls: --limit wants a number"},
        {{"ls", "--user", "alice", "--desc=yes", "/photo"}, "norvo ls: option --desc takes no value"},
        {{"ls", "--user", "alice", "--name", "x", "/"}, "norvo ls: --type and --name filter a directory"},
        {{"ls", "--user", "bob", "/photo/../secret"}, "norvo ls: PATH may not hold . or .. components"},
        {{"ls", "--user", "bob", "/photo/2024/."}, "norvo ls: PATH may not hold . or .. components"},
    };
    for (const Case &c : cases) {
        std::vector<std::string> args = c.args;
        args.push_back("--json");
        const CliResult result = RunNorvo(args);
        SCOPED_TRACE(c.message);
        EXPECT_EQ(result.exitStatus, 2);
        EXPECT_EQ(result.out, "");
        EXPECT_EQ(result.err.rfind(c.message, 0), 0u) << result.err;
    }
}

TEST_F(LsCliTest, HostilePathsAndNames) {
    appliance_.WriteFile("/volume1/photo/bad\xC3\xFF\x1B[2J\x07.txt", "x", "alice");
    const Json::Value root = Ls({"--user", "alice", "--name", "bad", "/photo"});
    ASSERT_EQ(root["data"]["files"].size(), 1u);
    EXPECT_EQ(root["data"]["files"][0]["name"].asString(), "bad\xEF\xBF\xBD\xEF\xBF\xBD\x1B[2J\x07.txt");
    const CliResult text = RunNorvo({"ls", "--user", "alice", "--name", "bad", "/photo"});
    EXPECT_EQ(text.exitStatus, 0) << text.err;
    EXPECT_EQ(text.out.find('\x1B'), std::string::npos);
    EXPECT_NE(text.out.find("bad\\xC3\\xFF\\x1B[2J\\x07.txt"), std::string::npos) << text.out;

    for (const std::string &path : {"/photo/" + std::string(20000, 'x'), std::string("photo"),
                                    std::string("//"), std::string("/photo/\xFF\xFE")}) {
        SCOPED_TRACE(path.substr(0, 40));
        const CliResult result = RunNorvo({"--json", "ls", "--user", "bob", path});
        EXPECT_EQ(result.signal, 0);
        EXPECT_TRUE(result.exitStatus == 0 || result.exitStatus == 1) << result.exitStatus << result.err;
        Json::Value parsed;
        std::string errors;
        std::istringstream in(result.out);
        EXPECT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &parsed, &errors)) << errors;
        EXPECT_TRUE(parsed.isMember("success"));
    }
}

}  // namespace
}  // namespace norvo::testing
