#include "accounts.h"

#include <iostream>

#include "norvo/errors.h"
#include "output.h"
#include "text_safe.h"
#include "vlibc_err.h"

namespace norvo::cli {

UserRecord RequireUser(const Invocation &inv, const std::string &name, int *status) {
    UserRecord user = LookUpUser(name.c_str());
    if (!user) {
        const bool unknown = VLIBCErrGet() == QUIB_ERR_NO_SUCH_USER;
        *status = ReportFailure(inv, unknown ? NVO_ERR_NO_USER : NVO_ERR_SYSTEM,
                                (unknown ? "no account named " : "cannot look up the account ") + name);
    }
    return user;
}

std::unique_ptr<UserIdentity> ActAsUser(const Invocation &inv, const std::string &name, int refusal,
                                        int *status) {
    const UserRecord user = RequireUser(inv, name, status);
    if (!user) {
        return nullptr;
    }
    std::string error;
    std::unique_ptr<UserIdentity> identity = UserIdentity::Assume(*user, &error);
    if (!identity) {
        *status = ReportFailure(inv, refusal, error);
    }
    return identity;
}

void WarnIfUnknownUser(const std::string &name) {
    if (!LookUpUser(name.c_str()) && VLIBCErrGet() == QUIB_ERR_NO_SUCH_USER) {
        std::cerr << "norvo: warning: no account named " << TerminalSafe(name) << '\n';
    }
}

}  // namespace norvo::cli
