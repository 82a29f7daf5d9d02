// QUIBGroup*: groups and membership through NSS; membership counts the primary group and every
// supplementary one (getgrouplist), so winbind and sssd groups count too.
#include <stdlib.h>

#include <algorithm>
#include <memory>
#include <vector>

#include "api_guard.h"
#include "nss.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "text_util.h"

namespace norvo::platform {
namespace {

struct GroupRecordFree {
    void operator()(PQUIBGROUP group) const { QUIBGroupFree(group); }
};
using GroupRecord = std::unique_ptr<QUIBGROUP, GroupRecordFree>;

GroupRecord MakeRecord(const NssGroup &entry) {
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

// The one place a group lookup's outcome reaches the caller.
int Deliver(NssStatus status, const NssGroup &entry, int err, PQUIBGROUP *pgroup) {
    switch (status) {
    case NssStatus::kFound: {
        GroupRecord record = MakeRecord(entry);
        if (!record) {
            return -1;
        }
        *pgroup = record.release();
        return 0;
    }
    case NssStatus::kNotFound:
        QUIB_SET_ERR(QUIB_ERR_NO_SUCH_GROUP);
        return -1;
    case NssStatus::kFailed:
        break;
    }
    QUIB_SET_ERR(NssFailureCode(err));
    return -1;
}

// 1 when user belongs to group, 0 when not, -1 with the slot set. An unknown user is 0x1D00;
// an unknown group is 0x1E00 when groupMustExist, else simply "not a member".
int Membership(const char *groupName, const char *userName, bool groupMustExist) {
    NssUser user;
    int err = 0;
    switch (FindUserByName(userName, &user, &err)) {
    case NssStatus::kFound:
        break;
    case NssStatus::kNotFound:
        QUIB_SET_ERR(QUIB_ERR_NO_SUCH_USER);
        return -1;
    case NssStatus::kFailed:
        QUIB_SET_ERR(NssFailureCode(err));
        return -1;
    }
    NssGroup group;
    switch (FindGroupByName(groupName, &group, &err)) {
    case NssStatus::kFound:
        break;
    case NssStatus::kNotFound:
        if (!groupMustExist) {
            return 0;
        }
        QUIB_SET_ERR(QUIB_ERR_NO_SUCH_GROUP);
        return -1;
    case NssStatus::kFailed:
        QUIB_SET_ERR(NssFailureCode(err));
        return -1;
    }
    std::vector<gid_t> gids;
    if (!GroupIdsOf(user, &gids)) {
        QUIB_SET_ERR(QUIB_ERR_FAILED);
        return -1;
    }
    return std::find(gids.begin(), gids.end(), group.gid) != gids.end() ? 1 : 0;
}

}  // namespace
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

int QUIBGroupGet(const char *name, PQUIBGROUP *pgroup) {
    if (!np::IsAcceptableName(name) || pgroup == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::NssGroup entry;
        int err = 0;
        np::NssStatus status = np::FindGroupByName(name, &entry, &err);
        return np::Deliver(status, entry, err, pgroup);
    });
}

int QUIBGroupGetByGID(gid_t gid, PQUIBGROUP *pgroup, int blNoCache) {
    (void)blNoCache;  // nothing is cached, so every lookup is fresh
    if (pgroup == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::NssGroup entry;
        int err = 0;
        np::NssStatus status = np::FindGroupById(gid, &entry, &err);
        return np::Deliver(status, entry, err, pgroup);
    });
}

int QUIBGroupGetGID(const char *name, gid_t *gid) {
    if (!np::IsAcceptableName(name) || gid == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::NssGroup entry;
        int err = 0;
        switch (np::FindGroupByName(name, &entry, &err)) {
        case np::NssStatus::kFound:
            *gid = entry.gid;
            return 0;
        case np::NssStatus::kNotFound:
            QUIB_SET_ERR(QUIB_ERR_NO_SUCH_GROUP);
            return -1;
        case np::NssStatus::kFailed:
            break;
        }
        QUIB_SET_ERR(np::NssFailureCode(err));
        return -1;
    });
}

void QUIBGroupFree(PQUIBGROUP group) {
    if (group == nullptr) {
        return;
    }
    free(group->szName);
    VLIBCSzListFree(group->pMembers);
    free(group);
}

int QUIBGroupIsMember(const char *group, const char *user) {
    if (!np::IsAcceptableName(group) || !np::IsAcceptableName(user)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] { return np::Membership(group, user, true); });
}

int QUIBGroupIsAdminGroupMem(const char *user) {
    return QUIBGroupIsAdminGroupMemEx(user, 1);
}

int QUIBGroupIsAdminGroupMemEx(const char *user, int blWithDomain) {
    if (!np::IsAcceptableName(user)) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    if (blWithDomain == 0 && QUIBUserAuthTypeOf(user) != AUTH_LOCAL) {
        return 0;  // decided by the name alone, without asking NSS
    }
    // A missing administrators group just means nobody is an administrator.
    return np::Guarded(-1, [&] { return np::Membership(QUIB_ADMIN_GROUP, user, false); });
}

}  // extern "C"
