#include "listable.h"

#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvomisc.h"
#include "output.h"

namespace norvo::cli {

std::string ListableRealPath(const Invocation &inv, const std::string &user, const std::string &userPath,
                             int *status) {
    std::string realPath;
    std::string share;
    std::string volumePath;
    std::string sharePath;
    NvoLibSetErr(NVO_ERR_NONE);
    if (!NvoFullPathGet(userPath.c_str(), realPath, share, volumePath, sharePath, user)) {
        *status = ReportLibraryFailure(inv, "resolving " + userPath);
        return "";
    }
    NvoLibSetErr(NVO_ERR_NONE);
    if (CheckShareListPrivilege(user.c_str(), nullptr, userPath.c_str()) != 1) {
        // The check refuses without a code of its own; the web interface shows 407 then.
        const int code = NvoLibGetErr();
        *status = ReportFailure(inv, code != NVO_ERR_NONE ? code : NVO_ERR_PRIVILEGE,
                                user + " may not list " + userPath);
        return "";
    }
    return realPath;
}

}  // namespace norvo::cli
