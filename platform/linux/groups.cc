// QUIBGroup*: groups and membership through NSS; membership counts the primary group and every
// supplementary one (getgrouplist), so winbind and sssd groups count too.
#include <stdlib.h>

#include <algorithm>
#include <vector>

#include "account_records.h"
#include "api_guard.h"
#include "nss.h"
#include "quib_paths.h"
#include "quib_user.h"
#include "text_util.h"

namespace norvo::platform {
namespace {

// The one place a group lookup's outcome reaches the caller: runs find(&entry, &err) and
// returns 0 with *pgroup, or -1 with 0x1E00 (unknown) or the NSS failure code.
template <typename Find>
int GetGroup(Find find, PQUIBGROUP *pgroup) {
    return Guarded(-1, [&] {
        NssGroup entry;
        int err = 0;
        const NssStatus status = find(&entry, &err);
        if (!Found(status, err, QUIB_ERR_NO_SUCH_GROUP)) {
            return -1;
        }
        GroupRecord record = MakeGroupRecord(entry);
        if (!record) {
            return -1;
        }
        *pgroup = record.release();
        return 0;
    });
}

// 1 when user belongs to group, 0 when not, -1 with the slot set. An unknown user is 0x1D00;
// an unknown group is 0x1E00 when groupMustExist, else simply "not a member".
int Membership(const char *groupName, const char *userName, bool groupMustExist) {
    NssUser user;
    if (!FindKnownUser(userName, &user)) {
        return -1;
    }
    NssGroup group;
    int err = 0;
    const NssStatus status = FindGroupByName(groupName, &group, &err);
    if (status == NssStatus::kNotFound && !groupMustExist) {
        return 0;
    }
    if (!Found(status, err, QUIB_ERR_NO_SUCH_GROUP)) {
        return -1;
    }
    std::vector<gid_t> gids;
    if (!ListGroupIds(user, &gids)) {
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
    return np::GetGroup(
        [name](np::NssGroup *entry, int *err) { return np::FindGroupByName(name, entry, err); }, pgroup);
}

int QUIBGroupGetByGID(gid_t gid, PQUIBGROUP *pgroup, int blNoCache) {
    (void)blNoCache;  // nothing is cached, so every lookup is fresh
    if (pgroup == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::GetGroup([gid](np::NssGroup *entry, int *err) { return np::FindGroupById(gid, entry, err); },
                        pgroup);
}

int QUIBGroupGetGID(const char *name, gid_t *gid) {
    if (!np::IsAcceptableName(name) || gid == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::NssGroup entry;
        int err = 0;
        const np::NssStatus status = np::FindGroupByName(name, &entry, &err);
        if (!np::Found(status, err, QUIB_ERR_NO_SUCH_GROUP)) {
            return -1;
        }
        *gid = entry.gid;
        return 0;
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
