// privilege: everything the library says one user may do at one path.
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "accounts.h"
#include "bit_names.h"
#include "common/beneath.h"
#include "exit_status.h"
#include "handlers.h"
#include "identity.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "output.h"
#include "text_safe.h"

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

// What the real path is, seen from the share's folder as the file manager sees it: links are
// never followed, so a path through one reaches nothing, and one that ends in a link names the
// link itself.
enum class Reach { kPlain, kLink, kThroughLink };

Reach ReachOf(const std::string &path, const std::string &realPath, std::string *target) {
    std::string top;
    if (!TopOf(path, realPath, &top)) {
        return Reach::kPlain;  // the resolution's own answer stands
    }
    const OwnedFd opened = OpenBeneath(top, realPath, O_PATH);
    if (opened.IsOpen() || errno != ELOOP) {
        return Reach::kPlain;
    }
    const size_t slash = realPath.find_last_of('/');
    const std::string parent = realPath.substr(0, slash);
    const OwnedFd folder = OpenBeneath(top, parent, O_PATH | O_DIRECTORY);
    char link[PATH_MAX];
    const ssize_t size =
        folder.IsOpen() ? readlinkat(folder.Get(), realPath.c_str() + slash + 1, link, sizeof link) : -1;
    if (size < 0) {
        return Reach::kThroughLink;
    }
    target->assign(link, static_cast<size_t>(size));
    return Reach::kLink;
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
    std::string linkTarget;
    const Reach reach = ReachOf(path, realPath, &linkTarget);
    if (reach == Reach::kThroughLink) {
        return ReportFailure(inv, NVO_ERR_PRIVILEGE,
                             path + " passes through a symbolic link, which is not followed");
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
    data["link"] = reach == Reach::kLink ? Json::Value(linkTarget) : Json::Value(Json::nullValue);
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
    if (reach == Reach::kLink) {
        text.Row("type", "symbolic link to " + TerminalSafe(linkTarget) + " (not followed)");
    }
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
