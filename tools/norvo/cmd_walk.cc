// walk: every entry below a folder as the walker hands it to its callback, walked as the user.
#include <signal.h>
#include <sys/stat.h>

#include <iostream>
#include <memory>
#include <string>

#include "accounts.h"
#include "common/path_names.h"
#include "exit_status.h"
#include "handlers.h"
#include "identity.h"
#include "listable.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "output.h"
#include "text_safe.h"

namespace norvo::cli {
namespace {

// Set from SIGINT; the walker reads it before each entry.
int g_cancel = 0;

void Cancel(int) {
    __atomic_store_n(&g_cancel, 1, __ATOMIC_RELAXED);
}

char TypeLetter(mode_t mode) {
    return S_ISDIR(mode) ? 'd' : S_ISLNK(mode) ? 'l' : S_ISREG(mode) ? 'f' : '?';
}

class Printer : public NvoDirectoryWalkerCallBack {
public:
    Printer(bool json, const char *phase) : json_(json), phase_(phase) {}

    bool operator()(const std::string &userPath, const std::string &, const std::string &realPath,
                    const std::string &name, _tag_QUIBSTAT_ &st, const std::string *) override {
        ++count_;
        if (json_) {
            Json::Value line(Json::objectValue);
            if (phase_ != nullptr) {
                line["phase"] = phase_;
            }
            line["user_path"] = ValidUtf8(userPath);
            line["real_path"] = ValidUtf8(realPath);
            line["name"] = ValidUtf8(name);
            line["type"] = std::string(1, TypeLetter(st.st_mode));
            line["size"] = static_cast<Json::Int64>(st.st_size);
            std::cout << Json::writeString(compact_, line) << '\n';
        } else {
            std::cout << (phase_ != nullptr ? std::string(phase_) + " " : std::string())
                      << TypeLetter(st.st_mode) << ' ' << st.st_size << ' ' << TerminalSafe(userPath) << "  "
                      << TerminalSafe(realPath) << '\n';
        }
        return static_cast<bool>(std::cout);
    }

    unsigned long Count() const { return count_; }

private:
    bool json_;
    const char *phase_;
    unsigned long count_ = 0;
    Json::StreamWriterBuilder compact_ = [] {
        Json::StreamWriterBuilder builder;
        builder["indentation"] = "";
        return builder;
    }();
};

struct Order {
    const char *word;
    bool pre;
    bool post;
};
constexpr Order kOrders[] = {{"top-down", true, false},
                             {"pre", true, false},
                             {"post", false, true},
                             {"both", true, true},
                             {"first-folder", true, false}};

}  // namespace

int RunWalk(const Invocation &inv) {
    const std::string &userName = *inv.Value("user");
    std::string path = inv.arguments[0];
    while (path.size() > 1 && path.back() == '/') {
        path.pop_back();
    }
    if (path == "/" || !IsWellFormedUserPath(path.c_str()) || HasDotComponent(path)) {
        return ReportUsageError(inv.command,
                                "PATH must be a folder's user-visible path (/share/dir), not " + path);
    }
    const std::string orderWord = inv.Value("order") ? *inv.Value("order") : "top-down";
    const Order *order = nullptr;
    for (const Order &known : kOrders) {
        order = orderWord == known.word ? &known : order;
    }
    if (order == nullptr) {
        return ReportUsageError(inv.command,
                                "--order wants top-down, pre, post, both or first-folder, not " + orderWord);
    }
    const bool firstFolder = orderWord == "first-folder";
    if (inv.Has("first-only") && !firstFolder) {
        return ReportUsageError(inv.command, "--first-only goes with --order first-folder");
    }
    _enum_ignore_err_ mode = IGNORE_ERR_PERMISSION;
    if (const std::string *word = inv.Value("ignore")) {
        if (*word == "all") {
            mode = IGNORE_ERR_ALL;
        } else if (*word == "none") {
            mode = IGNORE_ERR_NONE;
        } else if (*word != "permission") {
            return ReportUsageError(inv.command, "--ignore wants permission, all or none, not " + *word);
        }
    }

    int status = kExitFailure;
    UserRecord user = RequireUser(inv, userName, &status);
    if (!user) {
        return status;
    }
    const std::string realPath = ListableRealPath(inv, userName, path, &status);
    if (realPath.empty()) {
        return status;
    }

    std::string error;
    std::unique_ptr<UserIdentity> identity = UserIdentity::Assume(*user, &error);
    if (!identity) {
        return ReportFailure(inv, NVO_ERR_SYSTEM, error);
    }
    const bool both = order->pre && order->post;
    Printer pre(inv.json, both ? "pre" : nullptr);
    Printer post(inv.json, both ? "post" : nullptr);
    struct sigaction action {};
    action.sa_handler = Cancel;
    sigaction(SIGINT, &action, nullptr);
    NvoDirectoryWalker walker(mode, &g_cancel);
    const bool skipRecycle = inv.Has("skip-recycle");
    bool finished = false;
    if (firstFolder) {
        finished = walker.Walk_FirstFolder_First(path, path, realPath, pre, nullptr, skipRecycle,
                                                 inv.Has("first-only"));
    } else if (orderWord == "top-down") {
        finished = walker.Walk_TopDown(path, path, realPath, pre, nullptr, skipRecycle);
    } else {
        finished = walker.Walk(path, path, realPath, order->pre ? &pre : nullptr,
                               order->post ? &post : nullptr, nullptr, skipRecycle);
    }
    identity.reset();
    std::cout.flush();
    const unsigned long reported = pre.Count() + post.Count();
    if (__atomic_load_n(&g_cancel, __ATOMIC_RELAXED) == 1) {
        std::cerr << "norvo walk: cancelled after " << reported << " callbacks\n";
        return kExitFailure;
    }
    if (!finished) {
        std::cerr << "norvo walk: the walk ended early after " << reported
                  << " callbacks (a failure that is not ignored; see the system log)\n";
        return kExitFailure;
    }
    return kExitOk;
}

}  // namespace norvo::cli
