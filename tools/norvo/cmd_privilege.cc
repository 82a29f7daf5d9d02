// privilege: everything the library says one user may do at one path.
#include <sys/stat.h>

#include <string>

#include "accounts.h"
#include "bit_names.h"
#include "exit_status.h"
#include "handlers.h"
#include "identity.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "output.h"

namespace norvo::cli {
namespace {

constexpr int kUploadTypeNoExistenceTest = 1;
constexpr int kUploadTypeOverwriteRefused = 0;

// One check's answer: allowed, or refused with the code the library left (if any).
struct Verdict {
    bool allowed = false;
    int code = NVO_ERR_NONE;
};

template <typename Check>
Verdict Judge(Check check) {
    NvoLibSetErr(NVO_ERR_NONE);
    Verdict verdict;
    verdict.allowed = check() == 1;
    verdict.code = verdict.allowed ? NVO_ERR_NONE : NvoLibGetErr();
    return verdict;
}

Json::Value VerdictJson(const Verdict &verdict) {
    Json::Value out(Json::objectValue);
    out["allowed"] = verdict.allowed;
    if (verdict.code != NVO_ERR_NONE) {
        out["error"] = ErrorJson(verdict.code);
    }
    return out;
}

std::string VerdictText(const Verdict &verdict) {
    if (verdict.allowed) {
        return "allowed";
    }
    return verdict.code == NVO_ERR_NONE ? "refused" : "refused: " + ErrorText(verdict.code);
}

struct ShareAnswer {
    int privilege = 0;
    unsigned int flags = 0;
};

}  // namespace

int RunPrivilege(const Invocation &inv) {
    const std::string &userName = *inv.Value("user");
    const char *sid = inv.CStr("sid");
    const std::string &path = inv.arguments[0];
    int status = kExitFailure;
    UserRecord user = RequireUser(inv, userName, &status);
    if (!user) {
        return status;
    }

    std::string realPath;
    std::string share;
    std::string volumePath;
    std::string sharePath;
    NvoLibSetErr(NVO_ERR_NONE);
    if (!NvoFullPathGet(path.c_str(), realPath, share, volumePath, sharePath, userName)) {
        return ReportLibraryFailure(inv, "resolving " + path);
    }
    // The checks below let home folders through without a share lookup; so does this.
    const bool home = IsDirUserHome(share, nullptr) == 1;
    ShareAnswer answer;
    if (!home) {
        NvoLibSetErr(NVO_ERR_NONE);
        if (NvoLibGetPrivilege(path.c_str(), userName.c_str(), sid, &answer.privilege, &answer.flags) < 0) {
            return ReportLibraryFailure(inv, "asking the share privilege");
        }
    }

    const char *who = userName.c_str();
    const char *where = path.c_str();
    const Verdict list = Judge([&] { return CheckShareListPrivilege(who, sid, where); });
    const Verdict download = Judge([&] { return CheckShareDownloadPrivilege(who, sid, where); });
    int uploadType = kUploadTypeNoExistenceTest;
    const Verdict upload = Judge([&] { return CheckShareUploadPrivilege(who, sid, where, &uploadType); });
    int plainType = kUploadTypeOverwriteRefused;
    const Verdict uploadNew = Judge([&] { return CheckShareUploadPrivilege(who, sid, where, &plainType); });

    struct stat st;
    const bool exists = lstat(realPath.c_str(), &st) == 0;
    std::string error;
    std::unique_ptr<UserIdentity> identity = UserIdentity::Assume(*user, &error);
    if (!identity) {
        return ReportFailure(inv, NVO_ERR_SYSTEM, error);
    }
    const unsigned int aclMask = GetACLPrivilege(realPath.c_str());
    identity.reset();

    Json::Value data(Json::objectValue);
    data["user"] = userName;
    data["sid"] = sid != nullptr ? Json::Value(sid) : Json::Value(Json::nullValue);
    data["path"] = path;
    data["real_path"] = realPath;
    data["real_path_exists"] = exists;
    data["share"] = share;
    data["home"] = home;
    data["privilege"] = home ? Json::Value(Json::nullValue) : Json::Value(answer.privilege);
    data["restrict"] = home ? Json::Value(Json::nullValue) : RestrictionJson(answer.flags);
    data["acl"] = AclJson(aclMask);
    data["list"] = VerdictJson(list);
    data["download"] = VerdictJson(download);
    data["upload"] = VerdictJson(upload);
    data["upload"]["type"] = uploadType;
    data["upload_no_overwrite"] = VerdictJson(uploadNew);

    TextTable text;
    text.Row("user", userName + (sid != nullptr ? " (sid " + std::string(sid) + ")" : ""));
    text.Row("real path", realPath + (exists ? "" : " (does not exist)"));
    if (home) {
        text.Row("share", share + " (the user's home folder: no share privilege)");
    } else {
        text.Row("share", share);
        text.Row("share privilege", PrivilegeName(answer.privilege));
        text.Row("restrictions", RestrictionText(answer.flags));
    }
    text.Row("acl mask", AclText(aclMask) + ", as " + userName);
    text.Row("list", VerdictText(list));
    text.Row("download", VerdictText(download));
    text.Row("upload", VerdictText(upload) + (upload.allowed ? ", type " + std::to_string(uploadType) : ""));
    text.Row("upload, no overwrite", VerdictText(uploadNew));
    return ReportSuccess(inv, data, text);
}

}  // namespace norvo::cli
