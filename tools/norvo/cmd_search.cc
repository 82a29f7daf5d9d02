// search and search-results: a search as a user, run as a task of the task store, and the
// pages of its hits.
#include <signal.h>
#include <stdio.h>

#include <memory>
#include <string>
#include <vector>

#include "accounts.h"
#include "exit_status.h"
#include "handlers.h"
#include "identity.h"
#include "norvo/errors.h"
#include "norvo/norvoprogress.h"
#include "norvo/searchdb.h"
#include "norvo/searchwalker.h"
#include "obx_task.h"
#include "output.h"
#include "search_hits.h"
#include "text_safe.h"
#include "vlibc_err.h"

namespace norvo::cli {
namespace {

using FileSearch::FindFactory;

// Set from SIGINT; the walker reads it before each entry.
int g_cancel = 0;

void Cancel(int) {
    __atomic_store_n(&g_cancel, 1, __ATOMIC_RELAXED);
}

// The task store's record of a search: "Tovana_" and the search's id, so that the clean-up of
// old tasks takes it too.
std::string RecordId(const std::string &taskId) {
    return "Tovana_" + taskId;
}

int Failure(const Invocation &inv, const std::string &what) {
    char hex[16];
    snprintf(hex, sizeof hex, "0x%04X", static_cast<unsigned>(VLIBCErrGet()));
    return ReportFailure(inv, NvoLibGetErr() != 0 ? NvoLibGetErr() : 401,
                         what + " (platform " + hex + "; see the system log)");
}

struct Conditions {
    std::vector<FileSearch::FindComp *> list;
    std::vector<FileSearch::FindATimeComp *> accessTimes;
    ~Conditions() {
        for (FileSearch::FindComp *cond : list) {
            delete cond;
        }
    }
};

// "before:T" or "after:T" (times), "equal:B", "less:B" or "greater:B" (sizes) into op and value.
bool SplitOp(const std::string &text, const std::vector<std::string> &ops, std::string *op,
             std::string *value) {
    const size_t colon = text.find(':');
    if (colon == std::string::npos || text.find_first_not_of("0123456789", colon + 1) != std::string::npos ||
        colon + 1 == text.size()) {
        return false;
    }
    *op = text.substr(0, colon);
    *value = text.substr(colon + 1);
    for (const std::string &allowed : ops) {
        if (*op == allowed) {
            return true;
        }
    }
    return false;
}

// The conditions of the options, in a fixed order; false after reporting the failure.
bool BuildConditions(const Invocation &inv, Conditions *conds, int *status) {
    struct Option {
        const char *name;
        FindFactory::_tag_FIND_FIELD_ field;
        std::vector<std::string> ops;  // empty: the value is the operand as it is
    };
    const Option options[] = {
        {"name", FindFactory::FIND_FIELD_NAME, {}},
        {"ext", FindFactory::FIND_FIELD_EXT, {}},
        {"type", FindFactory::FIND_FIELD_TYPE, {}},
        {"owner", FindFactory::FIND_FIELD_USER, {}},
        {"group", FindFactory::FIND_FIELD_GROUP, {}},
        {"mtime", FindFactory::FIND_FIELD_MTIME, {"before", "after"}},
        {"size", FindFactory::FIND_FIELD_SIZE, {"equal", "less", "greater"}},
        {"atime", FindFactory::FIND_FIELD_ATIME, {"before", "after"}},
    };
    for (const Option &option : options) {
        if (!inv.Has(option.name)) {
            continue;
        }
        std::string op, value = *inv.Value(option.name);
        if (option.field == FindFactory::FIND_FIELD_TYPE) {
            if (value != "file" && value != "dir") {
                *status = ReportUsageError(inv.command, "--type wants file or dir, not " + value);
                return false;
            }
            op = value;
        } else if (!option.ops.empty() && !SplitOp(value, option.ops, &op, &value)) {
            *status = ReportUsageError(inv.command, std::string("--") + option.name +
                                                        " wants OP:NUMBER, not " + *inv.Value(option.name));
            return false;
        }
        if (!FindFactory::createFindOp(option.field, op.c_str(), value.c_str(), conds->list)) {
            *status = ReportFailure(inv, NvoLibGetErr(), std::string("--") + option.name + " " + value);
            return false;
        }
        if (option.field == FindFactory::FIND_FIELD_ATIME) {
            conds->accessTimes.push_back(static_cast<FileSearch::FindATimeComp *>(conds->list.back()));
        }
    }
    return true;
}

}  // namespace

int RunSearch(const Invocation &inv) {
    const std::string userName = *inv.Value("user");
    int status = kExitFailure;
    UserRecord user = RequireUser(inv, userName, &status);
    Conditions conds;
    if (!user || !BuildConditions(inv, &conds, &status)) {
        return status;
    }
    // Made by root, the store gets the user's folder and database when it has none yet.
    OBX::TaskMgr mgr(userName.c_str());
    std::string error;
    std::unique_ptr<UserIdentity> identity = UserIdentity::Assume(*user, &error);
    if (!identity) {
        return ReportFailure(inv, 401, error);
    }
    struct sigaction action {};
    action.sa_handler = Cancel;
    sigaction(SIGINT, &action, nullptr);
    FileSearch::NvoSearchWalker walker(userName.c_str(), inv.Has("sid") ? inv.CStr("sid") : "norvo",
                                       &g_cancel);
    walker.setSearchCurrentDir(inv.Has("current-dir-only"));
    if (!walker.init(inv.arguments, conds.list)) {
        return Failure(inv, "the search could not start");
    }
    const std::unique_ptr<OBX::Task> task(mgr.createTask(RecordId(walker.getDBTaskId()).c_str(), getpid()));
    Json::Value data(Json::objectValue);
    data["task"] = walker.getDBTaskId();
    data["volume"] = walker.getDBVol();
    if (task == nullptr || !SaveTaskData(task.get(), data, 0.0F)) {
        return Failure(inv, "no task record for the search");
    }
    const bool done = walker.Walk(conds.accessTimes);
    const bool cancelled = __atomic_load_n(&g_cancel, __ATOMIC_RELAXED) != 0;
    unsigned long long hits = 0;
    const FI_QUERY all{};
    FILEIDXCountGet(walker.getDBPath().c_str(), &all, &hits);
    data["hits"] = static_cast<Json::UInt64>(hits);
    data["cancelled"] = cancelled;
    data["done"] = done;
    const bool saved = SaveTaskData(task.get(), data, 1.0F) && task->setFinished();
    if (!done) {
        return Failure(
            inv, "the search failed after " + std::to_string(hits) + " hits of task " + walker.getDBTaskId());
    }
    if (!saved) {
        return Failure(inv, "the task record of " + walker.getDBTaskId());
    }
    TextTable text;
    text.Row("task", walker.getDBTaskId()).Row("hits", std::to_string(hits));
    if (cancelled) {
        text.Row("cancelled", "yes (the hits so far are kept)");
    }
    return ReportSuccess(inv, data, text);
}

int RunSearchResults(const Invocation &inv) {
    const std::string userName = *inv.Value("user");
    int status = kExitFailure;
    const std::unique_ptr<UserIdentity> identity = ActAsUser(inv, userName, 401, &status);
    if (!identity) {
        return status;
    }
    const std::string id = *inv.Value("task");
    OBX::TaskMgr mgr(userName.c_str());
    const std::unique_ptr<OBX::Task> record(mgr.getTask(RecordId(id).c_str()));
    const Json::Value volume = record ? record->getProperty("data")["volume"] : Json::Value();
    std::unique_ptr<NvoSearchDBTask> task(
        volume.isString() ? NvoSearchDBTaskMgr(userName.c_str()).getDBTask(volume.asCString(), id.c_str())
                          : nullptr);
    if (!task) {
        return ReportFailure(inv, 408, "no search " + id + " of " + userName);
    }
    return ListTaskHits(inv, *task);
}

}  // namespace norvo::cli
