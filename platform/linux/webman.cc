// The login state of one CGI request.
#include <string.h>

#include <string>

#include "account_records.h"
#include "api_guard.h"
#include "cgi_request.h"
#include "login_session.h"
#include "quib_login.h"
#include "quib_user.h"

namespace norvo::platform {
namespace {

constexpr int kMaskAdministrators = 0x8;

// Whether the account behind a live login may pass mask. 0 yes; else the platform code.
int CheckAccount(const std::string &user, int mask) {
    PQUIBUSER raw = nullptr;
    if (QUIBUserGet(user.c_str(), &raw) != 0) {
        return VLIBCErrGet();  // deleted since the login, or NSS failed
    }
    const UserRecord record(raw);
    const int expired = QUIBUserIsExpired(user.c_str());
    if (expired != 0) {
        return expired > 0 ? QUIB_ERR_ACCESS_DENIED : VLIBCErrGet();
    }
    if ((mask & QUIBUserAuthTypeOf(user.c_str())) != 0) {
        return QUIB_ERR_NONE;
    }
    if ((mask & kMaskAdministrators) != 0 && QUIBGroupIsAdminGroupMemEx(user.c_str(), 1) == 1) {
        return QUIB_ERR_NONE;
    }
    return QUIB_ERR_ACCESS_DENIED;
}

}  // namespace
}  // namespace norvo::platform

using namespace norvo::platform;

WebMan::WebMan() = default;

// text and pos are accepted for the callers' sake: nothing is logged, and the sid is taken
// from the cookie and the query string only, never from a request body (reading stdin here
// would take the body from the program that owns it).
bool WebMan::IsAuthorized(const char *text, int mask, int pos) {
    (void)text;
    (void)pos;
    return Guarded(false, [&] {
        int code = QUIB_ERR_ACCESS_DENIED;
        for (const std::string &sid : RequestSids()) {
            std::string user;
            const LoginState state = FindLogin(sid.c_str(), &user, &code);
            if (state == LoginState::kFailed) {
                break;
            }
            if (state == LoginState::kUnknown) {
                continue;  // a stale cookie may sit beside a live _sid
            }
            code = CheckAccount(user, mask);
            if (code == QUIB_ERR_NONE) {
                user_ = user;
                sid_ = sid;
                return true;
            }
            break;
        }
        QUIB_SET_ERR(code == QUIB_ERR_BAD_PARAMETER ? QUIB_ERR_ACCESS_DENIED : code);
        return false;
    });
}

std::string WebMan::GetLoginUserName() const {
    return user_;
}

std::string WebMan::GetLoginSid() const {
    return sid_;
}
