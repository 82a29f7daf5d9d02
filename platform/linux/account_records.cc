#include "account_records.h"

#include <stdlib.h>

#include <algorithm>
#include <string>

#include "text_util.h"
#include "vlibc_err.h"

namespace norvo::platform {

UserRecord MakeUserRecord(const NssUser &entry, AUTH_TYPE kind) {
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
    if (!record || record->szName == nullptr || record->szGecos == nullptr || record->szHome == nullptr ||
        record->szShell == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
        return UserRecord();
    }
    return record;
}

GroupRecord MakeGroupRecord(const NssGroup &entry) {
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

bool Found(NssStatus status, int err, int notFoundCode) {
    switch (status) {
        case NssStatus::kFound:
            return true;
        case NssStatus::kNotFound:
            QUIB_SET_ERR(notFoundCode);
            return false;
        case NssStatus::kFailed:
            break;
    }
    QUIB_SET_ERR(NssFailureCode(err));
    return false;
}

bool FindKnownUser(const char *name, NssUser *user) {
    int err = 0;
    const NssStatus status = FindUserByName(name, user, &err);
    return Found(status, err, QUIB_ERR_NO_SUCH_USER);
}

bool ListGroupIds(const NssUser &user, std::vector<gid_t> *gids) {
    if (!GroupIdsOf(user, gids)) {
        QUIB_SET_ERR(QUIB_ERR_FAILED);
        return false;
    }
    return true;
}

}  // namespace norvo::platform
