// norvo conditions, run as a program: the records a CGI author would see and the verdict on
// real files.
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <json/json.h>

#include "../tools/cli_runner.h"
#include "appliance.h"

namespace norvo::testing {
namespace {

Json::Value Data(const std::vector<std::string> &args, int wantStatus = 0) {
    std::vector<std::string> all{"--json", "conditions"};
    all.insert(all.end(), args.begin(), args.end());
    const CliResult result = RunNorvo(all);
    EXPECT_EQ(result.exitStatus, wantStatus) << result.err;
    Json::Value root;
    std::istringstream in(result.out);
    Json::CharReaderBuilder builder;
    std::string errors;
    EXPECT_TRUE(Json::parseFromStream(builder, in, &root, &errors)) << result.out;
    return wantStatus == 0 ? root["data"] : root["error"];
}

TEST(ConditionsCommand, ShowsTheJoinedRecordsAndJudgesFiles) {
    Appliance app;
    app.Basic();
    app.WriteFile("/volume1/public/a.txt", std::string(100, 'x'), "alice");
    app.WriteFile("/volume1/public/b.txt", std::string(100, 'x'), "bob");
    const Json::Value data = Data({"--name", "a,b", "--user", "alice", "--size", "equal:100",
                                   "/volume1/public/a.txt", "/volume1/public/b.txt", "/volume1/public/none"});
    std::vector<std::string> records;
    for (const Json::Value &r : data["records"]) {
        const auto link = [](const Json::Value &v) { return v.isNull() ? std::string("-") : std::to_string(v.asInt()); };
        records.push_back(link(r["number"]) + " " + r["type_name"].asString() + " " + r["op_name"].asString() + " " +
                          r["value"].asString() + " and " + link(r["and"]) + " or " + link(r["or"]));
    }
    const std::string alice = std::to_string(app.Uid("alice"));
    EXPECT_EQ(records, (std::vector<std::string>{
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

    EXPECT_EQ(Data({"--group", "nosuchgroup"}, 1)["code"].asInt(), 404);
    EXPECT_EQ(RunNorvo({"conditions", "--mtime", "1700000000"}).exitStatus, 2);  // OP: missing
    EXPECT_TRUE(Data({"--type", "folder", "/volume1"})["files"][0]["match"].asBool());  // no condition
}

}  // namespace
}  // namespace norvo::testing
