// QUIBUserDB*: a cursor over a snapshot of every account NSS enumerates, filtered by the kind
// of account at each step.
#include <stdlib.h>

#include <memory>
#include <vector>

#include "account_cursor.h"
#include "api_guard.h"
#include "nss_enum.h"
#include "quib_user.h"
#include "text_util.h"

struct _tag_QUIBUSER_DB_ {
    std::vector<norvo::platform::NssUser> users;
    size_t next = 0;
};

namespace norvo::platform {
namespace {

struct UserRecordFree {
    void operator()(PQUIBUSER user) const { QUIBUserFree(user); }
};
using UserRecord = std::unique_ptr<QUIBUSER, UserRecordFree>;

// The record as QUIBUserGet makes it; null with 0x2B00 when out of memory.
UserRecord MakeRecord(const NssUser &entry, AUTH_TYPE kind) {
    UserRecord record(static_cast<PQUIBUSER>(calloc(1, sizeof(QUIBUSER))));
    if (record) {
        record->szName = DupCString(entry.name);
        record->nUID = entry.uid;
        record->nGID = entry.gid;
        record->szGecos = DupCString(entry.gecos);
        record->szHome = DupCString(entry.home);
        record->szShell = DupCString(entry.shell);
        record->authType = kind;
    }
    if (!record || record->szName == nullptr || record->szGecos == nullptr ||
        record->szHome == nullptr || record->szShell == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
        return UserRecord();
    }
    return record;
}

}  // namespace
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

PQUIBUSER_DB QUIBUserDBOpen(void) {
    return np::Guarded<PQUIBUSER_DB>(nullptr, [] {
        auto db = std::make_unique<QUIBUSER_DB>();
        int err = 0;
        if (!np::EnumerateUsers(&db->users, &err)) {
            QUIB_SET_ERR(np::NssFailureCode(err));
            return static_cast<PQUIBUSER_DB>(nullptr);
        }
        return db.release();
    });
}

int QUIBUserDBGetByCursor(PQUIBUSER_DB db, PQUIBUSER *puser, AUTH_TYPE type, int blNoCache) {
    (void)blNoCache;  // each Open reads NSS afresh; there is no cache to bypass
    if (db == nullptr || puser == nullptr || !np::SelectsAnyKind(type)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        return np::CursorStep(db->users, &db->next, puser, type, np::MakeRecord, QUIBUserFree);
    });
}

void QUIBUserDBClose(PQUIBUSER_DB db) {
    delete db;
}

}  // extern "C"
