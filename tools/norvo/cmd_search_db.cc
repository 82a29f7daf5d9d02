// search-db: a search task's result database, built and paged by hand as a user.
#include <stdio.h>
#include <sys/stat.h>

#include <iostream>
#include <memory>
#include <string>

#include "accounts.h"
#include "exit_status.h"
#include "handlers.h"
#include "identity.h"
#include "norvo/norvoenum.h"
#include "norvo/searchdb.h"
#include "number.h"
#include "output.h"
#include "search_hits.h"
#include "text_safe.h"
#include "vlibc_err.h"

namespace norvo::cli {
namespace {

// Task failures are the platform's or the log's; the platform's code is shown beside 401.
int TaskFailure(const Invocation &inv, const std::string &what) {
    char hex[16];
    snprintf(hex, sizeof hex, "0x%04X", static_cast<unsigned>(VLIBCErrGet()));
    return ReportFailure(inv, 401, what + " (platform " + hex + "; see the system log)");
}

// The share of a real path: the name of its second component (/volume1/photo/... is photo).
std::string ShareOf(const std::string &path) {
    const size_t start = path.find('/', 1);
    const size_t end = start == std::string::npos ? start : path.find('/', start + 1);
    return start == std::string::npos ? std::string() : path.substr(start + 1, end - start - 1);
}

Json::Value HitJson(const FI_FILE_INFO_DATA &r) {
    Json::Value hit(Json::objectValue);
    hit["share"] = r.share;
    hit["path"] = r.path;
    hit["name"] = r.name;
    hit["is_dir"] = r.isDir != 0;
    hit["size"] = static_cast<Json::Int64>(r.size);
    hit["mtime"] = static_cast<Json::Int64>(r.mtime);
    hit["type"] = r.type;
    hit["owner"] = r.userName;
    hit["posix"] = r.posix;
    return hit;
}

struct Listing {
    bool json;
    Json::Value hits{Json::arrayValue};
};

int PrintHit(FI_FILE_INFO_DATA *r, void *arg) {
    Listing &listing = *static_cast<Listing *>(arg);
    if (listing.json) {
        listing.hits.append(HitJson(*r));
    } else {
        std::cout << (r->isDir ? 'd' : 'f') << ' ' << r->size << ' ' << TerminalSafe(r->share) << ':'
                  << TerminalSafe(r->path) << '\n';
    }
    return 1;
}

}  // namespace

int ListTaskHits(const Invocation &inv, const NvoSearchDBTask &task) {
    int offset = 0, limit = 50;
    if ((inv.Has("offset") && !ParseNumber(*inv.Value("offset"), 0, 1 << 30, &offset)) ||
        (inv.Has("limit") && !ParseNumber(*inv.Value("limit"), 0, 1 << 30, &limit))) {
        return ReportUsageError(inv.command, "--offset and --limit want a number");
    }
    const std::string typeWord = inv.Has("type") ? *inv.Value("type") : "all";
    if (typeWord != "file" && typeWord != "dir" && typeWord != "all") {
        return ReportUsageError(inv.command, "--type wants file, dir or all, not " + typeWord);
    }
    const _tag_dir_entry_type_ type = typeWord == "file"  ? DIR_ENTRY_TYPE_FILE
                                      : typeWord == "dir" ? DIR_ENTRY_TYPE_DIR
                                                          : DIR_ENTRY_TYPE_ALL;
    const bool desc = inv.Has("desc");
    Listing listing{inv.json};
    unsigned long long total = 0;
    if (!task.queryResult(static_cast<unsigned long>(offset), static_cast<unsigned long>(limit),
                          inv.CStr("sort"), inv.Has("sort") ? &desc : nullptr, &type, inv.CStr("pattern"),
                          PrintHit, &listing, &total)) {
        return limit == 0 ? ReportFailure(inv, 400, "a page of no hits")
                          : TaskFailure(inv, "the task's hits");
    }
    Json::Value data(Json::objectValue);
    data["total"] = static_cast<Json::UInt64>(total);
    data["offset"] = offset;
    data["hits"] = listing.hits;
    TextTable text;
    text.Row("total", std::to_string(total));
    return ReportSuccess(inv, data, text);
}

int RunSearchDb(const Invocation &inv) {
    const std::string &action = inv.arguments[0];
    const std::vector<std::string> paths(inv.arguments.begin() + 1, inv.arguments.end());
    const bool wantsPaths = action == "insert" || action == "delete";
    if (action != "create" && action != "insert" && action != "list" && action != "delete" &&
        action != "remove") {
        return ReportUsageError(inv.command,
                                "ACTION is create, insert, list, delete or remove, not " + action);
    }
    if (wantsPaths ? paths.empty() || (action == "delete" && paths.size() != 1) : !paths.empty()) {
        return ReportUsageError(inv.command, action + (wantsPaths ? " wants PATH" : " takes no PATH"));
    }
    if (action != "create" && !inv.Has("task")) {
        return ReportUsageError(inv.command, action + " wants --task ID");
    }
    const std::string userName = *inv.Value("user");
    int status = kExitFailure;
    const std::unique_ptr<UserIdentity> identity = ActAsUser(inv, userName, 401, &status);
    if (!identity) {
        return status;
    }
    NvoSearchDBTaskMgr mgr(userName.c_str());
    const char *volume = inv.CStr("volume");
    if (action == "create") {
        std::unique_ptr<NvoSearchDBTask> task(mgr.createDBTask(volume, inv.CStr("task")));
        if (!task || FILEIDXDBCreate(task->getDBTaskFilePath().c_str()) != 0) {
            return TaskFailure(inv, "a new task");
        }
        Json::Value data(Json::objectValue);
        data["task"] = task->getDBTaskId();
        data["db"] = task->getDBTaskFilePath();
        TextTable text;
        text.Row("task", task->getDBTaskId()).Row("database", TerminalSafe(task->getDBTaskFilePath()));
        return ReportSuccess(inv, data, text);
    }
    std::unique_ptr<NvoSearchDBTask> task(mgr.getDBTask(volume, inv.CStr("task")));
    if (!task) {
        return ReportFailure(inv, 408, "no such task of " + userName + " on that volume");
    }
    if (action == "list") {
        return ListTaskHits(inv, *task);
    }
    bool ok = true;
    if (action == "remove") {
        ok = task->remove();
    } else if (action == "delete") {
        ok = task->delRecs(ShareOf(paths[0]), paths[0]);
    }
    for (size_t i = 0; action == "insert" && ok && i < paths.size(); ++i) {
        _tag_QUIBSTAT_ st{};
        ok = VLIBCFileLStat(paths[i].c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st) == 0 &&
             task->insertFile(ShareOf(paths[i]), paths[i], ShareOf(paths[i]), paths[i], st);
    }
    if (!ok) {
        return TaskFailure(inv, action + " in task " + task->getDBTaskId());
    }
    return ReportSuccess(inv, Json::Value(Json::objectValue), TextTable().Line(action + ": done"));
}

}  // namespace norvo::cli
