// resolve, check-name, check-path: where a path leads and whether a name or path may be made.
#include <string>

#include "accounts.h"
#include "exit_status.h"
#include "handlers.h"
#include "identity.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "norvo/nvoman.h"
#include "number.h"
#include "output.h"

namespace norvo::cli {
namespace {

constexpr int kNoAccessTest = 32;
constexpr int kLargestMode = 63;

}  // namespace

int RunResolve(const Invocation &inv) {
    const std::string &user = *inv.Value("user");
    const std::string &path = inv.arguments[0];
    WarnIfUnknownUser(user);
    std::string realPath;
    std::string share;
    std::string volumePath;
    std::string sharePath;
    NvoLibSetErr(NVO_ERR_NONE);
    if (!NvoFullPathGet(path.c_str(), realPath, share, volumePath, sharePath, user)) {
        return ReportLibraryFailure(inv);
    }
    const bool home = IsDirUserHome(share, nullptr) == 1;
    bool encrypted = false;
    const bool encryptionKnown = NvoLibCheckEncryptShare(share, &encrypted) == 1;

    Json::Value data(Json::objectValue);
    data["user"] = user;
    data["path"] = path;
    data["real_path"] = realPath;
    data["share"] = share;
    data["volume_path"] = volumePath;
    data["share_path"] = sharePath;
    data["home"] = home;
    data["encrypted"] = encryptionKnown ? Json::Value(encrypted) : Json::Value(Json::nullValue);
    TextTable text;
    text.Row("real path", realPath)
        .Row("share", share + (home        ? " (the user's home folder)"
                               : encrypted ? " (encrypted)"
                                           : ""))
        .Row("volume path", volumePath)
        .Row("share path", sharePath);
    return ReportSuccess(inv, data, text);
}

int RunCheckName(const Invocation &inv) {
    const std::string &dir = inv.arguments[0];
    const std::string &name = inv.arguments[1];
    NvoLibSetErr(NVO_ERR_NONE);
    if (NvoCheckFileName(dir.c_str(), name.c_str()) != 0) {
        return ReportLibraryFailure(inv);
    }
    Json::Value data(Json::objectValue);
    data["dir"] = dir;
    data["name"] = name;
    data["allowed"] = true;
    TextTable text;
    text.Line("allowed: " + name + " may be created in " + dir);
    return ReportSuccess(inv, data, text);
}

int RunCheckPath(const Invocation &inv) {
    const std::string &path = inv.arguments[0];
    const bool findExisting = inv.Has("find-existing");
    int mode = kNoAccessTest;
    if (const std::string *text = inv.Value("mode")) {
        if (!ParseNumber(*text, 1, kLargestMode, &mode)) {
            return ReportUsageError(inv.command, "--mode wants a number from 1 to 63, not " + *text);
        }
    }
    UserRecord user;
    std::unique_ptr<UserIdentity> identity;
    if (const std::string *name = inv.Value("user")) {
        int status = kExitFailure;
        user = RequireUser(inv, *name, &status);
        if (!user) {
            return status;
        }
        std::string error;
        identity = UserIdentity::Assume(*user, &error);
        if (!identity) {
            return ReportFailure(inv, NVO_ERR_SYSTEM, error);
        }
    }
    std::string existing;
    NvoLibSetErr(NVO_ERR_NONE);
    const int result = NvoCheckPath(path.c_str(), findExisting, mode, &existing);
    identity.reset();
    if (result != 0) {
        return ReportLibraryFailure(inv);
    }

    Json::Value data(Json::objectValue);
    data["path"] = path;
    data["mode"] = mode;
    data["find_existing"] = findExisting;
    data["acceptable"] = true;
    data["identity"] = user ? Json::Value(*inv.Value("user")) : Json::Value(Json::nullValue);
    TextTable text;
    text.Row("path", path).Row("verdict", "acceptable");
    if (mode != kNoAccessTest) {
        text.Row("judged as", user ? *inv.Value("user") : std::string("the invoking identity"));
    }
    if (findExisting) {
        data["existing"] = existing;
        text.Row("existing part", existing);
    }
    return ReportSuccess(inv, data, text);
}

}  // namespace norvo::cli
