// Logins of the web interface: password check, sid issue, lookup with a sliding expiry.
#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include <string>

#include "account_records.h"
#include "api_guard.h"
#include "login_db.h"
#include "login_session.h"
#include "login_sid.h"
#include "password_check.h"
#include "quib_login.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "text_util.h"
#include "vlibc_file.h"

namespace norvo::platform {
namespace {

constexpr long kDefaultTimeoutMinutes = 15;
constexpr long kMaxTimeoutMinutes = 365L * 24 * 60;
constexpr size_t kMaxRemoteAddrLength = 255;

bool IsAcceptableAddress(const char *address) {
    if (address == nullptr) {
        return true;
    }
    return address[0] == '\0' ||
           (strnlen(address, kMaxRemoteAddrLength + 1) <= kMaxRemoteAddrLength && IsAcceptableName(address));
}

bool CopyOut(const std::string &text, char *buf, int size) {
    if (size <= 0 || text.size() >= static_cast<size_t>(size)) {
        return false;
    }
    memcpy(buf, text.c_str(), text.size() + 1);
    return true;
}

}  // namespace

long LoginLifetimeSeconds() {
    char value[32];
    long minutes = kDefaultTimeoutMinutes;
    if (VLIBCFileGetKeyValue(QUIB_INFO_CONF, "login_timeout_minutes", value, sizeof value, 0) > 0) {
        char *end = nullptr;
        errno = 0;
        const long parsed = strtol(value, &end, 10);
        if (value[0] >= '0' && value[0] <= '9' && errno == 0 && *end == '\0' && parsed >= 1 &&
            parsed <= kMaxTimeoutMinutes) {
            minutes = parsed;
        }
    }
    return minutes * 60;
}

LoginState FindLogin(const char *sid, std::string *user, int *code) {
    if (sid == nullptr || !IsWellFormedSid(sid)) {
        *code = QUIB_ERR_BAD_PARAMETER;
        return LoginState::kUnknown;
    }
    LoginDb db;
    *code = OpenLoginDb(false, &db);
    if (*code == QUIB_ERR_NO_SUCH_FILE) {
        *code = QUIB_ERR_ACCESS_DENIED;  // no database yet: nobody has logged in
        return LoginState::kUnknown;
    }
    if (*code == QUIB_ERR_NONE) {
        *code = TouchLogin(db.get(), sid, time(nullptr), LoginLifetimeSeconds(), user);
    }
    if (*code == QUIB_ERR_NONE) {
        return LoginState::kLive;
    }
    return *code == QUIB_ERR_ACCESS_DENIED ? LoginState::kUnknown : LoginState::kFailed;
}

bool IsLoginOf(const char *sid, const char *user, std::string *loggedIn) {
    int code = QUIB_ERR_NONE;
    if (FindLogin(sid, loggedIn, &code) != LoginState::kLive) {
        QUIB_SET_ERR(code);
        return false;
    }
    if (!EqualsIgnoreCase(*loggedIn, user)) {
        QUIB_SET_ERR(QUIB_ERR_ACCESS_DENIED);
        return false;
    }
    return true;
}

}  // namespace norvo::platform

using namespace norvo::platform;

extern "C" {

int QUIBLoginCreate(const char *user, const char *password, const char *remoteAddr, char *sidBuf,
                    int sidSize) {
    if (!IsAcceptableName(user) || password == nullptr || !IsAcceptableAddress(remoteAddr) ||
        sidBuf == nullptr || sidSize <= static_cast<int>(kSidLength)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return Guarded(-1, [&] {
        PQUIBUSER raw = nullptr;
        if (QUIBUserGet(user, &raw) != 0) {
            return -1;  // the slot holds the lookup's reason (0x1D00 for an unknown user)
        }
        const UserRecord record(raw);
        int err = 0;
        switch (CheckPassword(record->szName, password, &err)) {
            case PasswordCheck::kMatch:
                break;
            case PasswordCheck::kRefused:
                QUIB_SET_ERR(QUIB_ERR_ACCESS_DENIED);
                return -1;
            case PasswordCheck::kFailed:
                QUIB_SET_ERRNO(err);
                return -1;
        }
        const int expired = QUIBUserIsExpired(record->szName);
        if (expired != 0) {
            if (expired > 0) {
                QUIB_SET_ERR(QUIB_ERR_ACCESS_DENIED);
            }
            return -1;
        }
        LoginRecord login;
        if (const int randomErr = NewSid(&login.sid)) {
            QUIB_SET_ERRNO(randomErr);
            return -1;
        }
        login.user = record->szName;
        login.remoteAddr = remoteAddr != nullptr ? remoteAddr : "";
        login.created = time(nullptr);
        login.expires = login.created + LoginLifetimeSeconds();
        LoginDb db;
        int code = OpenLoginDb(true, &db);
        if (code == QUIB_ERR_NONE) {
            code = InsertLogin(db.get(), login, login.created);
        }
        if (code != QUIB_ERR_NONE) {
            QUIB_SET_ERR(code);
            return -1;
        }
        memcpy(sidBuf, login.sid.c_str(), login.sid.size() + 1);
        return 0;
    });
}

int QUIBLoginGet(const char *sid, char *userBuf, int userSize) {
    if (sid == nullptr || userBuf == nullptr || userSize <= 0) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return Guarded(-1, [&] {
        std::string user;
        int code = 0;
        if (FindLogin(sid, &user, &code) != LoginState::kLive) {
            QUIB_SET_ERR(code);
            return -1;
        }
        if (!CopyOut(user, userBuf, userSize)) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        return 0;
    });
}

int QUIBLoginRemove(const char *sid) {
    if (sid == nullptr || !IsWellFormedSid(sid)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return Guarded(-1, [&] {
        LoginDb db;
        int code = OpenLoginDb(false, &db);
        if (code == QUIB_ERR_NO_SUCH_FILE) {
            code = QUIB_ERR_ACCESS_DENIED;
        } else if (code == QUIB_ERR_NONE) {
            code = DeleteLogin(db.get(), sid);
        }
        if (code != QUIB_ERR_NONE) {
            QUIB_SET_ERR(code);
            return -1;
        }
        return 0;
    });
}

}  // extern "C"
