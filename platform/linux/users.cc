// QUIBUser*: accounts through NSS, so local, domain (winbind) and directory (sssd) accounts
// are all found the same way. Nothing is cached: each call asks NSS.
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include "account_records.h"
#include "api_guard.h"
#include "nss.h"
#include "quib_user.h"
#include "text_util.h"

namespace norvo::platform {
namespace {

constexpr long kSecondsPerDay = 86400;

// The one place a user lookup's outcome reaches the caller: runs find(&entry, &err) and
// returns 0 with *puser, or -1 with 0x1D00 (unknown) or the NSS failure code.
template <typename Find>
int GetUser(Find find, PQUIBUSER *puser) {
    return Guarded(-1, [&] {
        NssUser entry;
        int err = 0;
        const NssStatus status = find(&entry, &err);
        if (!Found(status, err, QUIB_ERR_NO_SUCH_USER)) {
            return -1;
        }
        UserRecord record = MakeUserRecord(entry, QUIBUserAuthTypeOf(entry.name.c_str()));
        if (!record) {
            return -1;
        }
        *puser = record.release();
        return 0;
    });
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
    return np::GetUser([name](np::NssUser *entry, int *err) { return np::FindUserByName(name, entry, err); },
                       puser);
}

int QUIBUserGetByUID(uid_t uid, PQUIBUSER *puser, int blNoCache) {
    (void)blNoCache;  // nothing is cached, so every lookup is fresh
    if (puser == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::GetUser([uid](np::NssUser *entry, int *err) { return np::FindUserById(uid, entry, err); },
                       puser);
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
    return np::WithKnownUser(name, [&](const np::NssUser &entry) {
        if (uid != nullptr) {
            *uid = entry.uid;
        }
        if (gid != nullptr) {
            *gid = entry.gid;
        }
        return 0;
    });
}

int QUIBUserIsExpired(const char *name) {
    if (!np::IsAcceptableName(name)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::WithKnownUser(name, [](const np::NssUser &entry) {
        int err = 0;
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
