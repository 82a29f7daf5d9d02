// QUIBUserDB*: a cursor over a snapshot of every account NSS enumerates, filtered by the kind
// of account at each step.
#include "account_cursor.h"
#include "account_records.h"
#include "nss_enum.h"
#include "quib_user.h"

struct _tag_QUIBUSER_DB_ : norvo::platform::AccountSnapshot<norvo::platform::NssUser> {};

namespace np = norvo::platform;

extern "C" {

PQUIBUSER_DB QUIBUserDBOpen(void) {
    return np::OpenSnapshot<QUIBUSER_DB>(np::EnumerateUsers);
}

int QUIBUserDBGetByCursor(PQUIBUSER_DB db, PQUIBUSER *puser, AUTH_TYPE type, int blNoCache) {
    (void)blNoCache;  // each Open reads NSS afresh; there is no cache to bypass
    return np::StepSnapshot(db, puser, type, np::MakeUserRecord, QUIBUserFree);
}

void QUIBUserDBClose(PQUIBUSER_DB db) {
    delete db;
}

}  // extern "C"
