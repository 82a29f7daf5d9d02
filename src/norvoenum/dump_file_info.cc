// The JSON object of one listed entry, as the web interface receives it.
#include <json/value.h>

#include "norvo/norvoenum.h"
#include "norvo/norvomisc.h"

namespace {

// A member that must be an object: made one when absent or of another kind.
Json::Value &ObjectMember(Json::Value &parent, const char *name) {
    Json::Value &member = parent[name];
    if (!member.isObject()) {
        member = Json::Value(Json::objectValue);
    }
    return member;
}

// A member replaced by a fresh, empty object.
Json::Value &FreshObject(Json::Value &parent, const char *name) {
    Json::Value &member = parent[name];
    member = Json::Value(Json::objectValue);
    return member;
}

bool Bit(uint32_t mask, uint32_t bit) {
    return (mask & bit) != 0;
}

void DumpPerm(const DIRENTRY_INFO &entry, Json::Value &additional) {
    // An existing "perm" (the share listing's) keeps its other members.
    Json::Value &perm = ObjectMember(additional, "perm");
    perm["posix"] = GetPrivilege(static_cast<unsigned int>(entry.mode));
    perm["is_acl_mode"] = entry.is_acl_mode;
    Json::Value &acl = FreshObject(perm, "acl");
    acl["exec"] = Bit(entry.acl_privilege, 0x1);
    // Intended: "write" shows the read bit (0x4) as "read" does; the web interface expects it.
    acl["write"] = Bit(entry.acl_privilege, 0x4);
    acl["read"] = Bit(entry.acl_privilege, 0x4);
    acl["append"] = Bit(entry.acl_privilege, 0x8);
    acl["del"] = Bit(entry.acl_privilege, 0x200);
}

void Dump(int info, const DIRENTRY_INFO &entry, Json::Value &json) {
    if (!json.isObject()) {
        json = Json::Value(Json::objectValue);
    }
    json["name"] = entry.name;
    json["path"] = entry.path;
    json["isdir"] = entry.isdir;
    constexpr int kPrinted = NVO_INFO_REAL_PATH | NVO_INFO_SIZE | NVO_INFO_OWNER | NVO_INFO_TIME |
                             NVO_INFO_PERM | NVO_INFO_TYPE | NVO_INFO_MOUNT_POINT_TYPE |
                             NVO_INFO_VOLUME_STATUS;
    if ((info & kPrinted) == 0) {
        return;
    }
    Json::Value &additional = ObjectMember(json, "additional");
    if (info & NVO_INFO_REAL_PATH) {
        additional["real_path"] = entry.real_path;
    }
    if (info & NVO_INFO_MOUNT_POINT_TYPE) {
        additional["mount_point_type"] = entry.mount_point_type;
    }
    // 64-bit values travel as JSON reals, as the web interface has always received them.
    if (info & NVO_INFO_SIZE) {
        additional["size"] = static_cast<double>(entry.size);
    }
    if (info & NVO_INFO_TYPE) {
        additional["type"] = entry.type;
    }
    if (info & NVO_INFO_OWNER) {
        Json::Value &owner = FreshObject(additional, "owner");
        owner["uid"] = Json::UInt(entry.uid);
        owner["user"] = entry.user;
        owner["gid"] = Json::UInt(entry.gid);
        owner["group"] = entry.group;
    }
    if (info & NVO_INFO_TIME) {
        Json::Value &time = FreshObject(additional, "time");
        time["ctime"] = Json::UInt(static_cast<uint32_t>(entry.ctime));
        time["atime"] = Json::UInt(static_cast<uint32_t>(entry.atime));
        time["mtime"] = Json::UInt(static_cast<uint32_t>(entry.mtime));
        time["crtime"] = Json::UInt(static_cast<uint32_t>(entry.crtime));
    }
    if (info & NVO_INFO_PERM) {
        DumpPerm(entry, additional);
    }
    if (info & NVO_INFO_VOLUME_STATUS) {
        Json::Value &volume = FreshObject(additional, "volume_status");
        volume["readonly"] = entry.readonly;
        volume["freespace"] = static_cast<double>(entry.freespace);
        volume["totalspace"] = static_cast<double>(entry.totalspace);
    }
}

}  // namespace

void DumpFileInfo(int info, const DIRENTRY_INFO &entry, Json::Value &json) {
    // A void C entry point: should memory run out, json keeps what was filled so far.
    try {
        Dump(info, entry, json);
    } catch (...) {
    }
}
