// QUIBUser*: accounts through NSS, so local, domain (winbind) and directory (sssd) accounts
// are all found the same way. Nothing is cached: each call asks NSS.
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include <memory>

#include "api_guard.h"
#include "nss.h"
#include "quib_user.h"
#include "text_util.h"

namespace norvo::platform {
namespace {

struct UserRecordFree {
    void operator()(PQUIBUSER user) const { QUIBUserFree(user); }
};
using UserRecord = std::unique_ptr<QUIBUSER, UserRecordFree>;

constexpr long kSecondsPerDay = 86400;

UserRecord MakeRecord(const NssUser &entry) {
    UserRecord record(static_cast<PQUIBUSER>(calloc(1, sizeof(QUIBUSER))));
    if (record) {
        record->szName = DupCString(entry.name);
        record->nUID = entry.uid;
        record->nGID = entry.gid;
        record->szGecos = DupCString(entry.gecos);
        record->szHome = DupCString(entry.home);
        record->szShell = DupCString(entry.shell);
        record->authType = QUIBUserAuthTypeOf(entry.name.c_str());
    }
    if (!record || record->szName == nullptr || record->szGecos == nullptr ||
        record->szHome == nullptr || record->szShell == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
        return UserRecord();
    }
    return record;
}

// The one place a user lookup's outcome reaches the caller: 0 with *puser, or -1 with 0x1D00
// (unknown) or the NSS failure code.
int Deliver(NssStatus status, const NssUser &entry, int err, PQUIBUSER *puser) {
    switch (status) {
    case NssStatus::kFound: {
        UserRecord record = MakeRecord(entry);
        if (!record) {
            return -1;
        }
        *puser = record.release();
        return 0;
    }
    case NssStatus::kNotFound:
        QUIB_SET_ERR(QUIB_ERR_NO_SUCH_USER);
        return -1;
    case NssStatus::kFailed:
        break;
    }
    QUIB_SET_ERR(NssFailureCode(err));
    return -1;
}

}  // namespace
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

AUTH_TYPE QUIBUserAuthTypeOf(const char *name) {
    if (name == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return AUTH_LOCAL;
    }
    if (strchr(name, '\\') != nullptr) {
        return AUTH_DOMAIN;
    }
    if (strchr(name, '@') != nullptr) {
        return AUTH_LDAP;
    }
    return AUTH_LOCAL;
}

int QUIBUserGet(const char *name, PQUIBUSER *puser) {
    if (!np::IsAcceptableName(name) || puser == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::NssUser entry;
        int err = 0;
        np::NssStatus status = np::FindUserByName(name, &entry, &err);
        return np::Deliver(status, entry, err, puser);
    });
}

int QUIBUserGetByUID(uid_t uid, PQUIBUSER *puser, int blNoCache) {
    (void)blNoCache;  // nothing is cached, so every lookup is fresh
    if (puser == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::NssUser entry;
        int err = 0;
        np::NssStatus status = np::FindUserById(uid, &entry, &err);
        return np::Deliver(status, entry, err, puser);
    });
}

void QUIBUserFree(PQUIBUSER user) {
    if (user == nullptr) {
        return;
    }
    free(user->szName);
    free(user->szGecos);
    free(user->szHome);
    free(user->szShell);
    free(user);
}

int QUIBUserGetUGID(const char *name, uid_t *uid, gid_t *gid) {
    if (!np::IsAcceptableName(name) || (uid == nullptr && gid == nullptr)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::NssUser entry;
        int err = 0;
        switch (np::FindUserByName(name, &entry, &err)) {
        case np::NssStatus::kFound:
            if (uid != nullptr) {
                *uid = entry.uid;
            }
            if (gid != nullptr) {
                *gid = entry.gid;
            }
            return 0;
        case np::NssStatus::kNotFound:
            QUIB_SET_ERR(QUIB_ERR_NO_SUCH_USER);
            return -1;
        case np::NssStatus::kFailed:
            break;
        }
        QUIB_SET_ERR(np::NssFailureCode(err));
        return -1;
    });
}

int QUIBUserIsExpired(const char *name) {
    if (!np::IsAcceptableName(name)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::NssUser entry;
        int err = 0;
        switch (np::FindUserByName(name, &entry, &err)) {
        case np::NssStatus::kFound:
            break;
        case np::NssStatus::kNotFound:
            QUIB_SET_ERR(QUIB_ERR_NO_SUCH_USER);
            return -1;
        case np::NssStatus::kFailed:
            QUIB_SET_ERR(np::NssFailureCode(err));
            return -1;
        }
        long expireDay = -1;
        switch (np::FindShadowExpiry(entry.name, &expireDay, &err)) {
        case np::NssStatus::kFound:
            break;
        case np::NssStatus::kNotFound:
            return 0;  // domain and directory accounts have no shadow entry
        case np::NssStatus::kFailed:
            QUIB_SET_ERR(np::NssFailureCode(err));
            return -1;
        }
        if (expireDay < 0) {
            return 0;
        }
        // Day 0 counts as a real date (expired since 1970), as pam_unix reads it.
        long today = static_cast<long>(time(nullptr) / np::kSecondsPerDay);
        return today >= expireDay ? 1 : 0;
    });
}

}  // extern "C"
