// The JSON object of one entry, flag by flag, as the web interface receives it.
#include <string>

#include <gtest/gtest.h>
#include <json/json.h>

#include "norvo/norvoenum.h"

namespace {

std::string Compact(const Json::Value &value) {
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "";
    return Json::writeString(writer, value);
}

DIRENTRY_INFO Full() {
    DIRENTRY_INFO e;
    e.name = "a.txt";
    e.path = "/public/a.txt";
    e.real_path = "/volume1/public/a.txt";
    e.type = "txt";
    e.size = 5000000000ull;
    e.mode = 0100754;
    e.acl_privilege = 0x20D;  // exec, read, append, delete
    e.is_acl_mode = true;
    e.mtime = 1700000000;
    e.ctime = 1700000001;
    e.crtime = -1;  // shown as an unsigned number
    e.atime = 3;
    e.uid = 1026;
    e.user = "alice";
    e.gid = 100;
    e.group = "users";
    e.mount_point_type = "remote";
    e.freespace = 1ull << 40;
    e.totalspace = 3;
    e.readonly = true;
    return e;
}

// Keys print sorted; numbers written with ".0" are JSON reals.
TEST(DumpFileInfo, EachFlagAddsItsGroup) {
    const std::string base = R"("isdir":false,"name":"a.txt","path":"/public/a.txt")";
    const struct {
        int info;
        const char *additional;  // nullptr: no "additional" at all
    } table[] = {
        {0, nullptr},
        {NVO_INFO_SYNC_SHARE, nullptr},
        {NVO_INFO_REAL_PATH, R"({"real_path":"/volume1/public/a.txt"})"},
        {NVO_INFO_SIZE, R"({"size":5000000000.0})"},
        {NVO_INFO_OWNER, R"({"owner":{"gid":100,"group":"users","uid":1026,"user":"alice"}})"},
        {NVO_INFO_TIME, R"({"time":{"atime":3,"crtime":4294967295,"ctime":1700000001,"mtime":1700000000}})"},
        {NVO_INFO_PERM, R"({"perm":{"acl":{"append":true,"del":true,"exec":true,"read":true,"write":true},)"
                        R"("is_acl_mode":true,"posix":754}})"},
        {NVO_INFO_TYPE, R"({"type":"txt"})"},
        {NVO_INFO_MOUNT_POINT_TYPE, R"({"mount_point_type":"remote"})"},
        {NVO_INFO_VOLUME_STATUS, R"({"volume_status":{"freespace":1099511627776.0,"readonly":true,"totalspace":3.0}})"},
        {NVO_INFO_REAL_PATH | NVO_INFO_TYPE, R"({"real_path":"/volume1/public/a.txt","type":"txt"})"},
    };
    for (const auto &row : table) {
        Json::Value json;
        DumpFileInfo(row.info, Full(), json);
        const std::string want =
            row.additional ? "{\"additional\":" + std::string(row.additional) + "," + base + "}" : "{" + base + "}";
        EXPECT_EQ(Compact(json), want) << row.info;
    }
}

// "write" shows bit 2 (read) on purpose; the real write bit (0x2) shows nowhere.
TEST(DumpFileInfo, ReadAndWriteShareBitTwo) {
    const struct {
        uint32_t mask;
        const char *acl;
    } table[] = {
        {0x4, R"({"append":false,"del":false,"exec":false,"read":true,"write":true})"},
        {0x2, R"({"append":false,"del":false,"exec":false,"read":false,"write":false})"},
        {0x1FFF & ~0x4u, R"({"append":true,"del":true,"exec":true,"read":false,"write":false})"},
    };
    for (const auto &row : table) {
        DIRENTRY_INFO e = Full();
        e.acl_privilege = row.mask;
        Json::Value json;
        DumpFileInfo(NVO_INFO_PERM, e, json);
        EXPECT_EQ(Compact(json["additional"]["perm"]["acl"]), row.acl) << row.mask;
    }
}

TEST(DumpFileInfo, AnExistingPermIsKeptAndOtherValuesBecomeObjects) {
    Json::Value json;
    json["additional"]["perm"]["share"] = 2;
    json["additional"]["owner"]["stale"] = 1;
    DumpFileInfo(NVO_INFO_PERM | NVO_INFO_OWNER, Full(), json);
    EXPECT_EQ(json["additional"]["perm"]["share"], 2);
    EXPECT_EQ(json["additional"]["perm"]["posix"], 754);
    EXPECT_FALSE(json["additional"]["owner"].isMember("stale"));  // created afresh

    Json::Value array(Json::arrayValue);
    array.append(1);
    DumpFileInfo(NVO_INFO_SIZE, DIRENTRY_INFO(), array);
    EXPECT_EQ(Compact(array), R"({"additional":{"size":0.0},"isdir":false,"name":"","path":""})");
    Json::Value text("x");
    DumpFileInfo(0, Full(), text);
    EXPECT_EQ(text["name"], "a.txt");
}

}  // namespace
