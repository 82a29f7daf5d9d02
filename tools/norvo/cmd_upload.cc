// upload and xferlog: an upload's last steps from the shell, and one transfer record.
#include <grp.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <vector>

#include "exit_status.h"
#include "handlers.h"
#include "identity.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "norvo/norvoupload.h"
#include "output.h"
#include "text_safe.h"

namespace norvo::cli {
namespace {

volatile sig_atomic_t g_interrupted = 0;

int StopWhenInterrupted() {
    return g_interrupted;
}

// The shell is the client: a record needs an address.
void DefaultClient() {
    if (getenv("REMOTE_ADDR") == nullptr) {
        setenv("REMOTE_ADDR", "127.0.0.1", 1);
    }
}

}  // namespace

int RunUpload(const Invocation &inv) {
    const std::string &user = *inv.Value("user");
    const std::string &src = inv.arguments[0];
    const std::string &dst = inv.arguments[1];
    int type = 1;
    if (inv.Has("no-overwrite")) {
        type = 0;
    }
    struct stat st;
    if (lstat(src.c_str(), &st) != 0) {
        return ReportFailure(inv, NVO_ERR_NO_PATH, "reading " + src + ": " + strerror(errno));
    }
    std::string real, share, volume, sharePath;
    if (NvoFullPathGet(dst.c_str(), real, share, volume, sharePath, user) != 1) {
        return ReportLibraryFailure(inv, "resolving " + dst);
    }
    // As the upload program: checked, then moved as the user, who owns the result.
    // CheckFile takes the user's identity for good; given back before the command exits.
    const SavedIdentity saved;
    if (const int code = CheckFile(dst, user.c_str(), inv.CStr("sid"), &type)) {
        return ReportFailure(inv, code, "checking " + dst);
    }
    signal(SIGINT, [](int) { g_interrupted = 1; });
    if (MoveFile(user.c_str(), src.c_str(), real.c_str(), StopWhenInterrupted) != 1) {
        return ReportLibraryFailure(inv, "moving " + src + " to " + real);
    }
    DefaultClient();
    const bool logged = NvoLibDoLog(user, dst, st.st_size, NORVO_ACTION_UPLOAD, false) == 1;
    Json::Value data(Json::objectValue);
    data["path"] = dst;
    data["real_path"] = real;
    data["size"] = Json::Int64(st.st_size);
    data["logged"] = logged;
    return ReportSuccess(inv, data,
                         TextTable()
                             .Row("uploaded", real)
                             .Row("size", std::to_string(st.st_size))
                             .Row("transfer log", logged ? "written" : "off (filebrowserxferlog)"));
}

int RunXferlog(const Invocation &inv) {
    static const char *const kWords[] = {"download", "upload",       "delete", "rename",       "copy",
                                         "move",     "property set", "mkdir",  "download test"};
    const std::string &word = inv.arguments[0];
    int action = 0;
    for (int i = 0; i < 9; ++i) {
        action = word == kWords[i] ? i + 1 : action;
    }
    long long size = 0;
    if (const std::string *text = inv.Value("size")) {
        char *end = nullptr;
        errno = 0;
        size = strtoll(text->c_str(), &end, 10);
        if (text->empty() || *end != '\0' || errno != 0 || size < 0) {
            return ReportUsageError(inv.command, "--size takes a byte count");
        }
    }
    if (action == 0) {
        return ReportUsageError(inv.command, "unknown action '" + TerminalSafe(word) + "'");
    }
    DefaultClient();
    const std::string &user = *inv.Value("user");
    const auto kind = static_cast<NORVO_ACTIONS>(action);
    const bool logged = inv.Has("force")
                            ? NvoLibDoFileBrowserLog(user, inv.arguments[1], size, kind, inv.Has("dir")) == 1
                            : NvoLibDoLog(user, inv.arguments[1], size, kind, inv.Has("dir")) == 1;
    std::string address;
    GetRemoteAddr(address);
    Json::Value data(Json::objectValue);
    data["logged"] = logged;
    data["address"] = address;
    return ReportSuccess(
        inv, data,
        TextTable().Row("record", logged ? "written" : "not written").Row("device address", address));
}

}  // namespace norvo::cli
