// The norvo command, run as a program inside a throwaway appliance: its JSON answers, its
// failure output, its usage errors, hostile arguments, the pages of norvo ls; and, linked in,
// its command table and the escaped form of names.
#include <gtest/gtest.h>
#include <json/json.h>
#include <unicode/uchar.h>
#include <unicode/utf8.h>
#include <unistd.h>

#include <string.h>

#include <algorithm>
#include <functional>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "appliance.h"
#include "appliance_file.h"
#include "cli_runner.h"
#include "command.h"
#include "json_text.h"
#include "quib_fs.h"
#include "text_safe.h"

namespace norvo::testing {
namespace {

using Strings = std::vector<std::string>;

class NorvoCliTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_EQ(access(NorvoCliPath().c_str(), X_OK), 0)
            << NorvoCliPath() << " is missing: build the norvo-cli target (or set NORVO_CLI)";
        appliance_.Basic();
    }

    // Runs norvo with --json, checks the exit status and that the answer is one line of plain
    // ASCII JSON, and returns it parsed.
    static Json::Value RunJson(Strings args, int wantStatus = 0, const std::string &input = "") {
        args.insert(args.begin(), "--json");
        const CliResult result = RunNorvo(args, input);
        EXPECT_EQ(result.exitStatus, wantStatus) << result.err;
        EXPECT_EQ(std::count(result.out.begin(), result.out.end(), '\n'), 1) << result.out;
        Json::Value root;
        std::string errors;
        std::istringstream in(result.out);
        EXPECT_TRUE(Json::parseFromStream(Json::CharReaderBuilder(), in, &root, &errors)) << errors << result.out;
        EXPECT_TRUE(std::all_of(result.out.begin(), result.out.end(),
                                [](char c) { return static_cast<unsigned char>(c) < 0x80; }))
            << result.out;
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

Strings Items(const Json::Value &array) {
    Strings out;
    for (const Json::Value &item : array) out.push_back(item.asString());
    return out;
}

TEST_F(NorvoCliTest, ResolveReportsShareAndHomePaths) {
    const Json::Value data = RunJson({"resolve", "--user", "alice", "/photo/2024/a.jpg"})["data"];
    EXPECT_EQ(data["real_path"].asString(), "/volume1/photo/2024/a.jpg");
    EXPECT_EQ(data["share_path"].asString(), "/volume1/photo");
    EXPECT_FALSE(data["home"].asBool());
    EXPECT_TRUE(RunJson({"resolve", "--user", "alice", "/secret/plan.txt"})["data"]["encrypted"].asBool());
    const Json::Value home = RunJson({"resolve", "--user=alice", "/home/notes"})["data"];
    EXPECT_EQ(home["real_path"].asString(), "/volume1/homes/alice/notes");
    EXPECT_TRUE(home["home"].asBool());
}

TEST_F(NorvoCliTest, PrivilegeOfTwoUsersOnOneShare) {
    appliance_.MakeDir("/volume1/photo/private", "root", 0700);
    const Json::Value alice = RunJson({"privilege", "--user", "alice", "/photo/private"})["data"];
    EXPECT_EQ(alice["privilege"].asInt(), 2);
    EXPECT_TRUE(alice["upload"]["allowed"].asBool());
    EXPECT_EQ(alice["upload_no_overwrite"]["error"]["code"].asInt(), 414);
    // Asked as alice, not as root: a root-only directory lets her neither read, write nor enter.
    EXPECT_TRUE(alice["real_path_exists"].asBool());
    EXPECT_EQ(alice["acl"]["value"].asUInt() & (ACL_PERM_READ | ACL_PERM_WRITE | ACL_PERM_EXECUTE), 0u)
        << alice["acl"];

    const Json::Value bob = RunJson({"privilege", "--user", "bob", "/photo"})["data"];
    EXPECT_EQ(bob["privilege"].asInt(), 1);
    EXPECT_TRUE(bob["list"]["allowed"].asBool());
    EXPECT_EQ(bob["upload"]["error"]["key"].asString(), "error:error_privilege_not_enough");
    EXPECT_FALSE(RunJson({"privilege", "--user", "bob", "/secret"})["data"]["download"]["allowed"].asBool());

    Add("share locked rw=alice restrict=nomodify,nodownload");
    const Json::Value locked = RunJson({"privilege", "--user", "alice", "/locked"})["data"];
    EXPECT_EQ(Items(locked["restrict"]["names"]), (Strings{"no-modify", "no-download"}));
    EXPECT_EQ(locked["upload"]["type"].asInt(), 2);
    const CliResult text = RunNorvo({"privilege", "--user", "alice", "/locked"});
    EXPECT_NE(text.out.find("restrictions          0x6 (no-modify, no-download)\n"), std::string::npos)
        << text.out;
}

// carol's link inside public is described as the link it is, with a link's rights, and never
// followed; a path through it is refused, as a listing would refuse it.
TEST_F(NorvoCliTest, PrivilegeDescribesALinkAndRefusesAPathThroughIt) {
    appliance_.AddUser("carol").WriteFile("/volume1/photo/x.jpg");
    ASSERT_EQ(appliance_.RunAs("carol", [] { return symlink("/volume1/photo", "/volume1/public/photo"); }), 0);
    const Json::Value link = RunJson({"privilege", "--user", "carol", "/public/photo"})["data"];
    EXPECT_EQ(link["link"].asString(), "/volume1/photo");
    EXPECT_EQ(link["acl"]["value"].asUInt(), unsigned{ACL_PERM_READ_ATTR | ACL_PERM_READ_ACL | ACL_PERM_DELETE});
    EXPECT_EQ(RunJson({"privilege", "--user", "carol", "/public/photo/x.jpg"}, 1)["error"]["code"].asInt(), 407);
    EXPECT_TRUE(RunJson({"privilege", "--user", "carol", "/public"})["data"]["link"].isNull());
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

TEST_F(NorvoCliTest, SharesCheckPathAndFailures) {
    EXPECT_EQ(Items(RunJson({"shares", "--user", "alice", "--sort"})["data"]["shares"]),
              (Strings{"photo", "public", "secret"}));
    EXPECT_EQ(Items(RunJson({"shares", "--user", "bob", "--writable"})["data"]["shares"]), (Strings{"public"}));
    EXPECT_EQ(RunJson({"check-path", "--find-existing", "/volume1/photo/new/deeper"})["data"]["existing"].asString(),
              "/volume1/photo");

    const Json::Value failed = RunJson({"resolve", "--user", "alice", "/nowhere/x"}, 1);
    EXPECT_EQ(failed["error"]["key"].asString(), "error:error_no_path");
    EXPECT_FALSE(failed.isMember("data"));
    EXPECT_EQ(RunJson({"check-path", "/volume1/photo/new"}, 1)["error"]["code"].asInt(), 408);
    EXPECT_EQ(RunJson({"privilege", "--user", "nobody-here", "/photo"}, 1)["error"]["code"].asInt(), 403);
    const CliResult text = RunNorvo({"check-name", "/volume1/photo", "._secret"});
    EXPECT_EQ(text.exitStatus, 1);
    EXPECT_EQ(text.out, "");
    EXPECT_EQ(text.err, "error 418 (error:error_reserved_name)\n");
}

TEST_F(NorvoCliTest, UploadMovesACheckedFileInAndLogsIt) {
    appliance_.MakeDir("/volume2/up", "alice").WriteFile("/volume2/up/a", "sand", "alice").WriteFile("/volume2/up/b");
    appliance_.SetSetting("filebrowserxferlog", "yes");
    const Json::Value done = RunJson({"upload", "--user", "alice", "/volume2/up/a", "/photo/a.txt"})["data"];
    EXPECT_EQ(done["real_path"].asString(), "/volume1/photo/a.txt");
    EXPECT_TRUE(done["logged"].asBool());
    EXPECT_EQ(RunJson({"upload", "--user", "bob", "/volume2/up/b", "/photo/b"}, 1)["error"]["code"].asInt(), 407);
    EXPECT_TRUE(RunJson({"xferlog", "--user", "bob", "download test", "/photo/a.txt"})["data"]["logged"].asBool());
    EXPECT_EQ(RunNorvo({"xferlog", "--user", "bob", "fly", "/photo/a.txt"}).exitStatus, 2);
}

TEST_F(NorvoCliTest, SubdirsListsFoldersAsTheUser) {
    appliance_.MakeDir("/volume1/photo/d\xFF", "alice").MakeDir("/volume1/photo/B", "bob", 0700).WriteFile("/volume1/photo/c");
    const Json::Value folders = RunJson({"subdirs", "--user", "alice", "/volume1/photo"})["data"]["folders"];
    ASSERT_EQ(folders.size(), 2u);
    EXPECT_EQ(folders[0]["uid"].asUInt(), appliance_.Uid("bob"));
    EXPECT_EQ(folders[1]["path_escaped"].asString(), "/volume1/photo/d\\xFF");
    EXPECT_EQ(RunJson({"subdirs", "--user", "alice", "/volume1/photo/B"}, 1)["error"]["code"].asInt(), 407);
}

// The records of the conditions joined as a CLI author would see them, and the verdict on real
// files.
TEST_F(NorvoCliTest, ConditionsShowTheJoinedRecordsAndJudgeFiles) {
    appliance_.WriteFile("/volume1/public/a.txt", std::string(100, 'x'), "alice");
    appliance_.WriteFile("/volume1/public/b.txt", std::string(100, 'x'), "bob");
    const Json::Value data = RunJson({"conditions", "--name", "a,b", "--user", "alice", "--size", "equal:100",
                                      "/volume1/public/a.txt", "/volume1/public/b.txt", "/volume1/public/none"})["data"];
    Strings records;
    for (const Json::Value &r : data["records"]) {
        const auto link = [](const Json::Value &v) { return v.isNull() ? std::string("-") : std::to_string(v.asInt()); };
        records.push_back(link(r["number"]) + " " + r["type_name"].asString() + " " + r["op_name"].asString() + " " +
                          r["value"].asString() + " and " + link(r["and"]) + " or " + link(r["or"]));
    }
    const std::string alice = std::to_string(appliance_.Uid("alice"));
    EXPECT_EQ(records, (Strings{
                           "1 FI_COND_NAME FI_OP_LIKE *b* and 3 or 2",
                           "2 FI_COND_NAME FI_OP_LIKE *a* and - or -",
                           "3 FI_COND_UID FI_OP_EQ " + alice + " and - or 4",
                           "4 FI_COND_USER_NAME FI_OP_LIKE alice and 5 or -",
                           "5 FI_COND_SIZE FI_OP_LT 105 and 6 or -",
                           "6 FI_COND_SIZE FI_OP_GE 95 and - or -",
                       }));
    EXPECT_EQ(data["first"].asInt(), 1);
    EXPECT_TRUE(data["files"][0]["match"].asBool());
    EXPECT_EQ(data["files"][1]["failed_condition"].asInt(), 2);  // bob's
    EXPECT_EQ(data["files"][2]["error"].asString(), "No such file or directory");

    EXPECT_EQ(RunJson({"conditions", "--group", "nosuchgroup"}, 1)["error"]["code"].asInt(), 404);
    EXPECT_EQ(RunNorvo({"conditions", "--mtime", "1700000000"}).exitStatus, 2);  // OP: missing
    EXPECT_TRUE(RunJson({"conditions", "--type", "folder", "/volume1"})["data"]["files"][0]["match"].asBool());
}

TEST_F(NorvoCliTest, LoginGivesASidThatDomainPrivilegesAccept) {
    Add("domain CORP\n"
        "user CORP\\dave password=pw-dave\n"
        "share team rw=CORP\\dave\n");
    const CliResult login = RunNorvo({"login", "--user", "CORP\\dave", "--password-stdin"}, "pw-dave\n");
    ASSERT_EQ(login.exitStatus, 0) << login.err;
    const std::string sid = login.out.substr(0, login.out.find('\n'));
    EXPECT_EQ(login.out, sid + "\n");
    EXPECT_EQ(RunJson({"privilege", "--user", "CORP\\dave", "--sid", sid, "/team"})["data"]["privilege"].asInt(), 2);
    EXPECT_EQ(RunJson({"privilege", "--user", "CORP\\dave", "--sid", "forged", "/team"}, 1)["error"]["code"].asInt(),
              402);
    EXPECT_FALSE(RunJson({"login", "--user", "alice", "--password", "wrong"}, 1)["success"].asBool());
}

TEST_F(NorvoCliTest, TasksStartWaitKillAndList) {
    const auto finished = [&](const std::string &id) {
        for (int tries = 0; tries < 400; ++tries, usleep(25000))
            if (RunJson({"tasks", "--user", "alice", "show", id})["data"]["finished"].asBool()) return true;
        return false;
    };
    EXPECT_GT(RunJson({"tasks", "--user", "alice", "start", "Tovana_1", "--steps", "2"})["data"]["pid"].asInt(), 0);
    EXPECT_TRUE(RunJson({"tasks", "--user", "alice", "wait", "Tovana_1", "progress", "--limit", "3000"})["data"]["ready"].asBool());
    ASSERT_TRUE(finished("Tovana_1"));
    EXPECT_EQ(RunJson({"tasks", "--user", "alice", "show", "Tovana_1"})["data"]["progress"].asDouble(), 1.0);
    EXPECT_EQ(RunNorvo({"tasks", "--user", "alice", "kill", "Tovana_1"}).exitStatus, 1) << "finished: never signalled";
    RunJson({"tasks", "--user", "alice", "start", "Tovana_2", "--steps", "1000"});
    EXPECT_EQ(RunNorvo({"tasks", "--user", "alice", "kill", "Tovana_2"}).exitStatus, 0);
    EXPECT_TRUE(finished("Tovana_2")) << "its worker is gone";
    EXPECT_EQ(RunJson({"tasks", "--user", "alice", "clean"})["data"]["tasks"].size(), 2u) << "both too young";
    EXPECT_EQ(RunNorvo({"tasks", "--user", "../alice", "list"}).exitStatus, 1);
    EXPECT_EQ(RunNorvo({"tasks", "--user", "alice", "frob"}).exitStatus, 2);
}

// norvo search: a task of the store that ends with its hit count; search-results pages the
// hits for their owner only.
TEST_F(NorvoCliTest, SearchIsATaskWhoseHitsPageForTheirOwner) {
    appliance_.WriteFile("/volume1/photo/report-a.txt", "12345", "alice").WriteFile("/volume1/public/Report.pdf");
    appliance_.WriteFile("/volume1/public/old/report-b.txt", "1234", "bob");
    const Json::Value search = RunJson({"search", "--user", "bob", "--name", "report", "--size", "greater:2", "/photo",
                                        "/public", "/secret"})["data"];
    EXPECT_EQ(search["hits"].asUInt64(), 2u);
    const std::string id = search["task"].asString();
    const Json::Value record = RunJson({"tasks", "--user", "bob", "show", "Tovana_" + id})["data"];
    EXPECT_EQ(record["progress"].asDouble(), 1.0);
    EXPECT_TRUE(record["finished"].asBool());
    EXPECT_EQ(record["data"]["volume"].asString(), "/volume1");
    Strings paths;
    const Json::Value page = RunJson({"search-results", "--user", "bob", "--task", id, "--sort", "size"});
    for (const Json::Value &hit : page["data"]["hits"])
        paths.push_back(hit["share"].asString() + ":" + hit["path"].asString());
    EXPECT_EQ(paths, (Strings{"public:old/report-b.txt", "photo:report-a.txt"}));
    EXPECT_EQ(RunNorvo({"search-results", "--user", "alice", "--task", id}).exitStatus, 1);
}

TEST_F(NorvoCliTest, UsageErrorsExitTwoAndSayWhy) {
    const std::vector<std::pair<Strings, std::string>> cases = {
        {{}, "norvo: no command given"},
        {{"frobnicate"}, "norvo: unknown command frobnicate"},
        {{"--verbose", "shares"}, "norvo: unknown option --verbose"},
        {{"resolve", "/photo"}, "norvo resolve: option --user is required"},
        {{"resolve", "--user", "--json", "/photo"}, "norvo resolve: option --user needs a value (USER)"},
        {{"resolve", "--user=", "/photo"}, "norvo resolve: option --user needs a non-empty value"},
        {{"resolve", "--user", "alice"}, "norvo resolve: missing argument PATH"},
        {{"resolve", "--user", "alice", "/a", "/b"}, "norvo resolve: unexpected argument /b"},
        {{"resolve", "--user", "alice", "--user", "bob", "/a"}, "norvo resolve: option --user given twice"},
        {{"resolve", "-u", "alice", "/a"}, "norvo resolve: unknown option -u"},
        {{"shares", "--user", "alice", "--sort=yes"}, "norvo shares: option --sort takes no value"},
        {{"shares", "--user", "alice", "--escaped"}, "norvo shares: unknown option --escaped"},
        {{"check-path", "--mode", "0x40", "/volume1"}, "norvo check-path: --mode wants a number from 1 to 63"},
        {{"check-name", "/volume1", ""}, "norvo check-name: argument NAME is empty"},
        {{"login", "--user", "alice"}, "norvo login: give exactly one of --password and --password-stdin"},
        {{"login", "--user", "alice", "--password-stdin"}, "norvo login: no password on stdin"},
        {{"ls", "--user", "alice", "--info", "size,colour", "/photo"}, "norvo ls: --info does not know \"colour\""},
        {{"ls", "--user", "alice", "--type", "link", "/photo"}, "norvo ls: --type wants dir, file or all"},
        {{"ls", "--user", "alice", "--limit", "99999999999", "/photo"}, "norvo ls: --limit wants a number"},
        {{"ls", "--user", "alice", "--name", "x", "/"}, "norvo ls: --type and --name filter a directory"},
        {{"ls", "--user", "bob", "/photo/../secret"}, "norvo ls: PATH may not hold . or .. components"},
        {{"ls", "--escaped", "--user", "bob", "/photo/\\x2E\\x2E/secret"}, "norvo ls: PATH may not hold . or"},
        {{"ls", "--escaped", "--user", "bob", "/photo\\x00/x"}, "norvo ls: argument PATH is not in the escaped"},
        {{"mounts", "--escaped", "--path", "/\\xq1"}, "norvo mounts: option --path is not in the escaped form"},
        {{"whois", "--uid", "1", "--gid", "1"}, "norvo whois: give exactly one of --uid, --gid and --user"},
        {{"whois", "--uid", "4294967296"}, "norvo whois: --uid takes a decimal id up to 4294967295"},
        {{"walk", "--user", "alice", "--order", "sideways", "/photo"}, "norvo walk: --order wants top-down, pre"},
        {{"walk", "--user", "alice", "--first-only", "/photo"}, "norvo walk: --first-only goes with --order"},
        {{"walk", "--user", "alice", "--ignore", "some", "/photo"}, "norvo walk: --ignore wants permission"},
        {{"walk", "--user", "alice", "/"}, "norvo walk: PATH must be a folder's user-visible path"},
        {{"search", "--user", "alice", "--name", "a", "--size", "big", "/photo"}, "norvo search: --size wants OP:NUMBER"},
        {{"search", "--user", "alice", "--name", "a", "--type", "link", "/photo"}, "norvo search: --type wants file or dir"},
    };
    for (const auto &[args, message] : cases) {
        Strings withJson = args;
        withJson.push_back("--json");  // usage errors stay text on stderr even then
        const CliResult result = RunNorvo(withJson);
        SCOPED_TRACE(message);
        EXPECT_EQ(result.exitStatus, 2);
        EXPECT_EQ(result.out, "");
        EXPECT_EQ(result.err.rfind(message, 0), 0u) << result.err;
    }
}

// Ctrl-C sets the walker's cancel flag: the walk stops before the next entry, says so, exits 1.
TEST_F(NorvoCliTest, WalkStopsCleanlyOnInterrupt) {
    for (int i = 0; i < 20000; ++i) {
        close(open(("/volume1/photo/file" + std::to_string(i)).c_str(), O_CREAT | O_WRONLY, 0644));
    }
    int out[2], err[2];
    ASSERT_EQ(pipe(out), 0);
    ASSERT_EQ(pipe(err), 0);
    const pid_t pid = fork();
    if (pid == 0) {
        dup2(out[1], 1);
        dup2(err[1], 2);
        execl(NorvoCliPath().c_str(), "norvo", "walk", "--user", "alice", "/photo", nullptr);
        _exit(127);
    }
    close(out[1]);
    close(err[1]);
    char buf[65536];
    ASSERT_GT(read(out[0], buf, 1), 0);  // walking; soon blocked on the full pipe
    kill(pid, SIGINT);
    size_t lines = 0;
    for (ssize_t got; (got = read(out[0], buf, sizeof buf)) > 0;) {
        lines += std::count(buf, buf + got, '\n');
    }
    const ssize_t said = read(err[0], buf, sizeof buf - 1);
    int status = 0;
    waitpid(pid, &status, 0);
    EXPECT_EQ(WEXITSTATUS(status), 1);
    EXPECT_LT(lines, 20000u);
    EXPECT_EQ(std::string(buf, said > 0 ? static_cast<size_t>(said) : 0).rfind("norvo walk: cancelled after ", 0), 0u);
}

TEST_F(NorvoCliTest, HostileArgumentsKeepJsonValidAndLossless) {
    const Json::Value data = RunJson({"resolve", "--user", "alice", "/photo/a\xC3/b\xFF"})["data"];
    EXPECT_EQ(data["path"].asString(), "/photo/a\xEF\xBF\xBD/b\xEF\xBF\xBD");
    EXPECT_EQ(data["real_path_escaped"].asString(), "/volume1/photo/a\\xC3/b\\xFF");
    EXPECT_EQ(RunJson({"resolve", "--escaped", "--user", "alice", "/photo/a\\xc3/b\\xFF"})["data"], data);

    const std::string longPath = "/photo/" + std::string(20000, 'x') + "/y";
    for (const Strings &args : {Strings{"--json", "resolve", "--user", "alice", longPath},
                                Strings{"--json", "privilege", "--user", "alice", longPath},
                                Strings{"--json", "ls", "--user", "alice", longPath},
                                Strings{"--json", "check-path", "--find-existing", "/volume1" + longPath},
                                Strings{"--json", "check-name", "/volume1/photo", std::string(5000, 'n')},
                                Strings{"--json", "shares", "--user", std::string(5000, 'u')}}) {
        const CliResult result = RunNorvo(args);
        EXPECT_TRUE(result.exitStatus == 0 || result.exitStatus == 1) << args[1] << result.signal;
        EXPECT_EQ(result.out.rfind("{\"", 0), 0u) << args[1] << result.out.substr(0, 80);
    }
}

TEST_F(NorvoCliTest, HelpCoversEveryCommandOfTheTable) {
    const std::string overview = RunNorvo({"--help"}).out;
    for (const cli::CommandDef &command : cli::Commands()) {
        const std::string name = command.name;
        SCOPED_TRACE(name);
        EXPECT_NE(overview.find("\n  " + name + "  "), std::string::npos) << overview;
        const CliResult help = RunNorvo({name, "--help"});
        EXPECT_EQ(help.exitStatus, 0);
        EXPECT_EQ(help.out.rfind("usage: norvo " + name + " ", 0), 0u) << help.out;
        EXPECT_NE(help.out.find(std::string("\n") + command.summary + "\n\n" + command.details), std::string::npos);
        EXPECT_GT(std::string(command.details).size(), 40u);
        for (const cli::OptionDef &option : command.options) {
            EXPECT_GT(std::string(option.help).size(), 3u) << option.name;
            EXPECT_NE(help.out.find(std::string("  --") + option.name), std::string::npos) << option.name;
        }
        EXPECT_EQ(RunNorvo({"help", name}).out, help.out);
    }
}

// norvo ls: the page of a directory and of the share list as JSON and as text, the options
// handed to the listing, two users, and names made to pass for others.
class LsCliTest : public NorvoCliTest {
protected:
    void SetUp() override {
        NorvoCliTest::SetUp();
        appliance_.MakeDir("/volume1/homes/alice", "alice", 0755);
        appliance_.MakeDir("/volume1/homes/bob", "bob", 0755);
        appliance_.MakeDir("/volume1/photo/2024", "alice", 0755);
        appliance_.WriteFile("/volume1/photo/big.jpg", std::string(300, 'b'), "alice");
        appliance_.WriteFile("/volume1/photo/small.txt", std::string(100, 's'), "bob");
        appliance_.WriteFile("/volume1/photo/Mid.JPG", std::string(200, 'm'), "alice");
    }

    static Json::Value Ls(Strings args, int wantStatus = 0) {
        args.insert(args.begin(), "ls");
        return RunJson(args, wantStatus);
    }

    static Strings Names(const Json::Value &root) {
        Strings names;
        for (const Json::Value &file : root["data"]["files"]) names.push_back(file["name"].asString());
        return names;
    }
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

// Generated byte strings, rich in what must be escaped, against a reference that decodes with
// ICU: the form is lossless, holds no character that moves or reorders the line, and leaves an
// ordinary name as it is.
TEST(EscapedForm, IsLosslessInertAndLeavesOrdinaryNames) {
    const Strings pieces = {"a", " ", "\\", "x", "F", "\\x41", "\n", "\x1B", "\x7F", "\xC2\x85", "\xC3\xA9",
                            "\xE2\x80\xAE", "\xE2\x81\xA6", "\xE2\x80\x8B", "\xEF\xBB\xBF", "\xE2\x80\xA8",
                            "\xF0\x9F\x98\x80", "\xF3\xA0\x80\x81", "\xFF", "\xC3", "\xED\xA0\x80", "\xE2\x80"};
    const auto hidden = [](UChar32 c) {
        const int type = u_charType(c);
        return type == U_CONTROL_CHAR || type == U_FORMAT_CHAR || type == U_LINE_SEPARATOR ||
               type == U_PARAGRAPH_SEPARATOR;
    };
    // Valid UTF-8 of visible characters, and no backslash: what must print unchanged.
    const auto ordinary = [&](const std::string &text) {
        for (int32_t i = 0; i < static_cast<int32_t>(text.size());) {
            UChar32 c;
            U8_NEXT(text.data(), i, static_cast<int32_t>(text.size()), c);
            if (c < 0 || c == '\\' || hidden(c)) return false;
        }
        return true;
    };
    std::mt19937 random(20261123);
    for (int n = 0; n < 20000; ++n) {
        std::string bytes;
        for (int k = static_cast<int>(random() % 6); k > 0; --k) bytes += pieces[random() % pieces.size()];
        const std::string form = cli::TerminalSafe(bytes);
        std::string back;
        ASSERT_TRUE(cli::Unescape(form, &back)) << form;
        ASSERT_EQ(back, bytes) << form;
        std::string unslashed = form;
        unslashed.erase(std::remove(unslashed.begin(), unslashed.end(), '\\'), unslashed.end());
        ASSERT_TRUE(ordinary(unslashed)) << form;
        if (ordinary(bytes)) {
            ASSERT_EQ(form, bytes);
        }
    }
    std::string out;
    for (const char *bad : {"a\\x4", "\\xG1", "\\x00"}) {
        EXPECT_FALSE(cli::Unescape(bad, &out)) << bad;
    }
    const std::vector<std::pair<std::string, std::string>> forms = {
        {"CORP\\dave", "CORP\\dave"}, {"C:\\", "C:\\"}, {"\\x41", "\\\\x41"}, {"a\\\x1B", "a\\\\\\x1B"}};
    for (const auto &[bytes, form] : forms) {
        EXPECT_EQ(cli::TerminalSafe(bytes), form);
    }
}

// Random trees against jsoncpp's own writer: the fast one must write the same bytes.
TEST(JsonText, MatchesJsoncppByteForByte) {
    std::mt19937_64 random(1123);
    const Strings strings = {"", "a/b", "\"q\"", "back\\slash", "\x01\x1F\x7F\b\f\n\r\t", "\xC3\xA9", "\xE2\x80\xAE",
                             "\xF0\x9F\x98\x80"};
    const auto pick = [&] { return strings[random() % strings.size()] + strings[random() % strings.size()]; };
    std::function<Json::Value(int)> make = [&](int depth) {
        uint64_t bits = random();
        double real;
        memcpy(&real, &bits, sizeof real);  // NaN, infinities and subnormals included
        switch (random() % (depth > 3 ? 6 : 8)) {
        case 0: return Json::Value();
        case 1: return Json::Value(static_cast<Json::Int64>(bits));
        case 2: return Json::Value(static_cast<Json::UInt64>(bits));
        case 3: return Json::Value(bits % 2 ? real : static_cast<double>(bits % 100000) / (bits % 7 + 1));
        case 4: return Json::Value(bits % 2 == 0);
        case 5: return Json::Value(pick());
        case 6: {
            Json::Value array(Json::arrayValue);
            for (uint64_t n = bits % 4; n > 0; --n) array.append(make(depth + 1));
            return array;
        }
        default: {
            Json::Value object(Json::objectValue);
            for (uint64_t n = bits % 4; n > 0; --n) object[pick()] = make(depth + 1);
            return object;
        }
        }
    };
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["emitUTF8"] = false;
    for (int n = 0; n < 5000; ++n) {
        const Json::Value value = make(0);
        std::string fast;
        cli::AppendJson(fast, value);
        ASSERT_EQ(fast, Json::writeString(builder, value));
    }
}

}  // namespace
}  // namespace norvo::testing
