// mounts and whois: the mount-status table and the name caches, as a listing sees them.
#include <string.h>

#include <list>
#include <string>

#include "accounts.h"
#include "exit_status.h"
#include "handlers.h"
#include "norvo/errors.h"
#include "norvo/norvoenum.h"
#include "output.h"
#include "quib_fs.h"

namespace norvo::cli {
namespace {

constexpr unsigned long long kLargestId = 4294967295ULL;

// A user or group id: decimal digits only, at most 32 bits.
bool ParseId(const std::string &text, unsigned int *id) {
    if (text.empty() || text.size() > 10) {
        return false;
    }
    unsigned long long value = 0;
    for (const char c : text) {
        if (c < '0' || c > '9') {
            return false;
        }
        value = value * 10 + static_cast<unsigned long long>(c - '0');
    }
    if (value > kLargestId) {
        return false;
    }
    *id = static_cast<unsigned int>(value);
    return true;
}

std::string TypeName(int type) {
    if (type >= 0 && type < QUIB_FSTYPE_COUNT) {
        return std::string(rgszFsType[type], strnlen(rgszFsType[type], QUIB_FSTYPE_NAME_LEN));
    }
    return type == FSTYPE_NOT_MOUNT_POINT ? "(not a mount directory)" : "(unknown)";
}

Json::Value TypeJson(int type, bool readOnly) {
    Json::Value out(Json::objectValue);
    out["type"] = type;
    out["type_name"] = TypeName(type);
    out["readonly"] = readOnly;
    return out;
}

std::string TypeText(int type, bool readOnly) {
    return std::string(readOnly ? "ro" : "rw") + "  " + std::to_string(type) + " " + TypeName(type);
}

// The groups of user, named through the cache: the primary group comes first.
int ReportUserGroups(const Invocation &inv, NvoEnum &enumeration, unsigned int uid, const std::string &user) {
    std::list<unsigned int> gids;
    if (!enumeration.EnumUserGroups(gids, user)) {
        return ReportFailure(inv, NVO_ERR_SYSTEM, "cannot list the groups of " + user);
    }
    Json::Value data(Json::objectValue);
    data["uid"] = uid;
    data["user"] = user;
    data["groups"] = Json::Value(Json::arrayValue);
    TextTable text;
    text.Row("uid", std::to_string(uid)).Row("user", user);
    bool primary = true;
    for (const unsigned int gid : gids) {
        const std::string name = enumeration.UserEnum().GetGroupNameByGID(gid);
        Json::Value group(Json::objectValue);
        group["gid"] = gid;
        group["name"] = name;
        data["groups"].append(group);
        text.Row(primary ? "groups" : "", std::to_string(gid) + " " + (name.empty() ? "(no name)" : name));
        primary = false;
    }
    if (gids.empty()) {
        text.Row("groups", "(none)");
    }
    return ReportSuccess(inv, data, text);
}

}  // namespace

int RunMounts(const Invocation &inv) {
    NvoEnum mounts;
    if (!mounts.GetMountStatus()) {
        return ReportFailure(inv, NVO_ERR_SYSTEM, "cannot read /proc/mounts");
    }
    Json::Value data(Json::objectValue);
    data["mounts"] = Json::Value(Json::arrayValue);
    TextTable text;
    for (const auto &[dir, status] : mounts.Mounts()) {
        Json::Value mount = TypeJson(status.fsType, status.readOnly);
        mount["dir"] = dir;
        data["mounts"].append(mount);
        text.Row(dir, TypeText(status.fsType, status.readOnly));
    }
    if (const std::string *path = inv.Value("path")) {
        const bool readOnly = mounts.IsReadOnly(path->c_str());
        const int type = mounts.getFSTYPE(path->c_str());
        data["path"] = TypeJson(type, readOnly);
        data["path"]["path"] = *path;
        text.Line("").Row(*path, TypeText(type, readOnly));
    }
    return ReportSuccess(inv, data, text);
}

int RunWhois(const Invocation &inv) {
    const int given = (inv.Has("uid") ? 1 : 0) + (inv.Has("gid") ? 1 : 0) + (inv.Has("user") ? 1 : 0);
    if (given != 1) {
        return ReportUsageError(inv.command, "give exactly one of --uid, --gid and --user");
    }
    NvoEnum enumeration;
    NorvoUserEnum &names = enumeration.UserEnum();
    unsigned int id = 0;
    if (const std::string *text = inv.Value("gid")) {
        if (!ParseId(*text, &id)) {
            return ReportUsageError(inv.command, "--gid takes a decimal id up to 4294967295, not " + *text);
        }
        const std::string name = names.GetGroupNameByGID(id);
        if (name.empty()) {
            return ReportFailure(inv, NVO_ERR_NO_GROUP, "no group has gid " + *text);
        }
        Json::Value data(Json::objectValue);
        data["gid"] = id;
        data["group"] = name;
        TextTable table;
        table.Row("gid", std::to_string(id)).Row("group", name);
        return ReportSuccess(inv, data, table);
    }
    if (const std::string *text = inv.Value("uid")) {
        if (!ParseId(*text, &id)) {
            return ReportUsageError(inv.command, "--uid takes a decimal id up to 4294967295, not " + *text);
        }
        const std::string name = names.GetUserNameByUID(id);
        if (name.empty()) {
            return ReportFailure(inv, NVO_ERR_NO_USER, "no account has uid " + *text);
        }
        return ReportUserGroups(inv, enumeration, id, name);
    }
    int status = kExitFailure;
    const UserRecord user = RequireUser(inv, *inv.Value("user"), &status);
    if (!user) {
        return status;
    }
    return ReportUserGroups(inv, enumeration, user->nUID, user->szName);
}

}  // namespace norvo::cli
