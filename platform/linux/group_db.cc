// QUIBGroupDB*: a cursor over a snapshot of every group NSS enumerates, filtered by the kind of
// account its name denotes.
#include <stdlib.h>

#include <algorithm>
#include <memory>
#include <vector>

#include "account_cursor.h"
#include "api_guard.h"
#include "nss_enum.h"
#include "quib_user.h"
#include "text_util.h"

struct _tag_QUIBGROUP_DB_ {
    std::vector<norvo::platform::NssGroup> groups;
    size_t next = 0;
};

namespace norvo::platform {
namespace {

struct GroupRecordFree {
    void operator()(PQUIBGROUP group) const { QUIBGroupFree(group); }
};
using GroupRecord = std::unique_ptr<QUIBGROUP, GroupRecordFree>;

// The record as QUIBGroupGet makes it; null with 0x2B00 when out of memory.
GroupRecord MakeRecord(const NssGroup &entry, AUTH_TYPE /*kind*/) {
    GroupRecord record(static_cast<PQUIBGROUP>(calloc(1, sizeof(QUIBGROUP))));
    if (record) {
        record->szName = DupCString(entry.name);
        record->nGID = entry.gid;
        record->pMembers = VLIBCSzListAlloc(static_cast<int>(std::max<size_t>(entry.members.size(), 1)));
    }
    if (!record || record->szName == nullptr || record->pMembers == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
        return GroupRecord();
    }
    for (const std::string &member : entry.members) {
        if (VLIBCSzListPush(&record->pMembers, member.c_str()) != 0) {
            return GroupRecord();
        }
    }
    return record;
}

}  // namespace
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

PQUIBGROUP_DB QUIBGroupDBOpen(void) {
    return np::Guarded<PQUIBGROUP_DB>(nullptr, [] {
        auto db = std::make_unique<QUIBGROUP_DB>();
        int err = 0;
        if (!np::EnumerateGroups(&db->groups, &err)) {
            QUIB_SET_ERR(np::NssFailureCode(err));
            return static_cast<PQUIBGROUP_DB>(nullptr);
        }
        return db.release();
    });
}

int QUIBGroupDBGetByCursor(PQUIBGROUP_DB db, PQUIBGROUP *pgroup, AUTH_TYPE type, int blNoCache) {
    (void)blNoCache;  // each Open reads NSS afresh; there is no cache to bypass
    if (db == nullptr || pgroup == nullptr || !np::SelectsAnyKind(type)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        return np::CursorStep(db->groups, &db->next, pgroup, type, np::MakeRecord, QUIBGroupFree);
    });
}

void QUIBGroupDBClose(PQUIBGROUP_DB db) {
    delete db;
}

}  // extern "C"
