// QUIBGroupDB*: a cursor over a snapshot of every group NSS enumerates, filtered by the kind of
// account its name denotes.
#include "account_cursor.h"
#include "account_records.h"
#include "nss_enum.h"
#include "quib_user.h"

struct _tag_QUIBGROUP_DB_ : norvo::platform::AccountSnapshot<norvo::platform::NssGroup> {};

namespace np = norvo::platform;

extern "C" {

PQUIBGROUP_DB QUIBGroupDBOpen(void) {
    return np::OpenSnapshot<QUIBGROUP_DB>(np::EnumerateGroups);
}

int QUIBGroupDBGetByCursor(PQUIBGROUP_DB db, PQUIBGROUP *pgroup, AUTH_TYPE type, int blNoCache) {
    (void)blNoCache;  // each Open reads NSS afresh; there is no cache to bypass
    // A group record has no kind of its own to fill in.
    auto make = [](const np::NssGroup &entry, AUTH_TYPE /*kind*/) { return np::MakeGroupRecord(entry); };
    return np::StepSnapshot(db, pgroup, type, make, QUIBGroupFree);
}

void QUIBGroupDBClose(PQUIBGROUP_DB db) {
    delete db;
}

}  // extern "C"
