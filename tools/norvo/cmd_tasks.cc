// tasks: a user's background task records, and a small worker that writes progress into one.
#include <fcntl.h>
#include <grp.h>
#include <signal.h>
#include <stdio.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <iostream>
#include <memory>
#include <string>

#include "exit_status.h"
#include "handlers.h"
#include "norvo/norvoprogress.h"
#include "number.h"
#include "output.h"
#include "quib_user.h"
#include "vlibc_err.h"

namespace norvo::cli {
namespace {

constexpr int kStepMicroseconds = 200000;

// Platform failures have no library code of their own; the platform's is shown beside 401.
int StoreFailure(const Invocation &inv, const std::string &what) {
    char hex[16];
    snprintf(hex, sizeof hex, "0x%04X", static_cast<unsigned>(VLIBCErrGet()));
    return ReportFailure(inv, 401, what + " (platform " + hex + ")");
}

Json::Value Record(OBX::Task &task) {
    Json::Value record(Json::objectValue);
    record["id"] = task.getId();
    record["pid"] = task.getPid();
    record["created"] = static_cast<Json::Int64>(task.getCreateTime());
    record["finished"] = task.isFinished();
    record["progress"] = task.getProperty("progress");
    record["data"] = task.getProperty("data");
    return record;
}

std::string Compact(const Json::Value &value) {
    return value.isNull() ? "-" : WriteJson(value);
}

// The worker of "start": becomes the user for good, then reports steps of progress into its
// own record and marks it finished. It never returns.
[[noreturn]] void Work(const std::string &user, const std::string &id, int steps, uid_t uid, gid_t gid,
                       int ready) {
    char go = 0;
    const bool told = read(ready, &go, 1) == 1;
    close(ready);
    const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
    const bool become = geteuid() != uid;  // the user's own run needs no switch
    if (!told || null < 0 || setsid() < 0 || dup2(null, 0) < 0 || dup2(null, 1) < 0 || dup2(null, 2) < 0 ||
        (become && (initgroups(user.c_str(), gid) != 0 || setresgid(gid, gid, gid) != 0 ||
                    setresuid(uid, uid, uid) != 0))) {
        _exit(1);
    }
    OBX::TaskMgr mgr(user.c_str());
    const std::unique_ptr<OBX::Task> task(mgr.getTask(id.c_str()));
    for (int step = 1; task != nullptr && step <= steps; ++step) {
        usleep(kStepMicroseconds);
        Json::Value data(Json::objectValue);
        data["step"] = step;
        data["of"] = steps;
        if (!SaveTaskData(task.get(), data, static_cast<float>(step) / static_cast<float>(steps))) {
            _exit(1);
        }
    }
    _exit(task != nullptr && task->setFinished() ? 0 : 1);
}

int Start(const Invocation &inv, OBX::TaskMgr &mgr, const std::string &user, const std::string &id) {
    int steps = 5;
    if (inv.Has("steps") && !ParseNumber(*inv.Value("steps"), 1, 1000, &steps)) {
        return ReportUsageError(inv.command, "--steps takes a number from 1 to 1000");
    }
    uid_t uid = 0;
    gid_t gid = 0;
    if (QUIBUserGetUGID(user.c_str(), &uid, &gid) != 0) {
        return StoreFailure(inv, "no such user");
    }
    int pipeFds[2];
    if (pipe2(pipeFds, O_CLOEXEC) != 0) {
        return StoreFailure(inv, "no pipe");
    }
    std::cout.flush();
    const pid_t worker = fork();
    if (worker == 0) {
        close(pipeFds[1]);
        Work(user, id, steps, uid, gid, pipeFds[0]);
    }
    close(pipeFds[0]);
    // The record exists before the worker looks for it; without one the worker just ends.
    const std::unique_ptr<OBX::Task> task(worker > 0 ? mgr.createTask(id.c_str(), worker) : nullptr);
    if (task != nullptr && write(pipeFds[1], "g", 1) != 1) {
        kill(worker, SIGKILL);
    }
    close(pipeFds[1]);
    if (task == nullptr) {
        if (worker > 0) {
            waitpid(worker, nullptr, 0);
        }
        return StoreFailure(inv, "could not start task " + id);
    }
    Json::Value data = Record(*task);
    data["steps"] = steps;
    TextTable text;
    text.Row("task", id).Row("pid", std::to_string(worker)).Row("steps", std::to_string(steps));
    return ReportSuccess(inv, data, text);
}

int Kill(const Invocation &inv, OBX::TaskMgr &mgr, const std::string &id) {
    const std::unique_ptr<OBX::Task> task(mgr.getTask(id.c_str()));
    if (task == nullptr) {
        return StoreFailure(inv, "no task " + id);
    }
    // A finished task's pid may already name another process: never signal it.
    if (task->isFinished()) {
        return ReportFailure(inv, 400, "task " + id + " is finished; nothing to stop");
    }
    if (!DoKill(task->getPid())) {
        return ReportFailure(inv, 401, "could not stop task " + id);
    }
    Json::Value data(Json::objectValue);
    data["id"] = id;
    data["pid"] = task->getPid();
    TextTable text;
    text.Row("stopped", id).Row("pid", std::to_string(task->getPid()));
    return ReportSuccess(inv, data, text);
}

int Wait(const Invocation &inv, OBX::TaskMgr &mgr, const std::string &id, const std::string &key) {
    int limit = 100;
    if (inv.Has("limit") && !ParseNumber(*inv.Value("limit"), 0, 2000000000, &limit)) {
        return ReportUsageError(inv.command, "--limit takes a number from 0 to 2000000000");
    }
    const bool ready = WaitForMgrTaskDataReady(&mgr, id.c_str(), key.c_str(), static_cast<unsigned>(limit));
    Json::Value data(Json::objectValue);
    data["id"] = id;
    data["key"] = key;
    data["ready"] = ready;
    TextTable text;
    text.Row(key, ready ? "ready" : "not ready");
    const int status = ReportSuccess(inv, data, text);
    // The wait keeps the task it read, as CGI programs expect; the process ends here with it.
    std::cout.flush();
    fflush(nullptr);
    _exit(status);
}

}  // namespace

int RunTasks(const Invocation &inv) {
    const std::string &user = *inv.Value("user");
    const std::string &action = inv.arguments[0];
    const std::vector<std::string> rest(inv.arguments.begin() + 1, inv.arguments.end());
    const size_t wanted = action == "show" || action == "kill" || action == "start" ? 1
                          : action == "wait"                                        ? 2
                                                                                    : 0;
    if (action != "list" && action != "clean" && wanted == 0) {
        return ReportUsageError(inv.command, "unknown action '" + action + "'");
    }
    if (rest.size() != wanted) {
        return ReportUsageError(inv.command, action + " takes " + std::to_string(wanted) + " argument(s)");
    }
    if (action == "clean") {
        CleanTimeOutTasks(user.c_str());
    }
    OBX::TaskMgr mgr(user.c_str());
    if (!mgr.isOpen()) {
        return StoreFailure(inv, "no task store for " + user);
    }
    if (action == "start") {
        return Start(inv, mgr, user, rest[0]);
    }
    if (action == "kill") {
        return Kill(inv, mgr, rest[0]);
    }
    if (action == "wait") {
        return Wait(inv, mgr, rest[0], rest[1]);
    }
    if (action == "show") {
        const std::unique_ptr<OBX::Task> task(mgr.getTask(rest[0].c_str()));
        if (task == nullptr) {
            return StoreFailure(inv, "no task " + rest[0]);
        }
        const Json::Value record = Record(*task);
        TextTable text;
        for (const char *key : {"id", "pid", "created", "finished", "progress", "data"}) {
            text.Row(key, record[key].isString() ? record[key].asString() : Compact(record[key]));
        }
        return ReportSuccess(inv, record, text);
    }
    Json::Value tasks(Json::arrayValue);
    TextTable text;
    for (const Json::Value &id : mgr.getAllTaskId("")) {
        const std::unique_ptr<OBX::Task> task(mgr.getTask(id.asCString()));
        if (task != nullptr) {
            const Json::Value record = Record(*task);
            text.Row(id.asString(), std::string(record["finished"].asBool() ? "finished" : "running") +
                                        "  progress " + Compact(record["progress"]));
            tasks.append(record);
        }
    }
    Json::Value data(Json::objectValue);
    data["tasks"] = tasks;
    return ReportSuccess(inv, data, text);
}

}  // namespace norvo::cli
