// NorvoUserEnum: owner and group names of listed entries, one platform lookup per distinct id.
#include <string>

#include "common/owners.h"
#include "errors/guard.h"
#include "norvo/norvoenum.h"

namespace {

// Records always carry a name; a null one is kept as "" rather than trusted.
std::string NameOf(const char *name) {
    return name != nullptr ? name : std::string();
}

}  // namespace

std::string NorvoUserEnum::GetUserNameByUID(unsigned int uid) {
    return norvo::Guarded(std::string(), [this, uid] {
        auto found = users_.find(uid);
        if (found == users_.end()) {
            UpdateUserInfoMap(uid, true);
            found = users_.find(uid);
        }
        // A failed lookup leaves no entry, so the next entry owned by this id asks again.
        return found != users_.end() ? found->second.name : std::string();
    });
}

std::string NorvoUserEnum::GetGroupNameByGID(unsigned int gid) {
    return norvo::Guarded(std::string(), [this, gid] {
        auto found = groups_.find(gid);
        if (found == groups_.end()) {
            UpdateGroupInfoMap(gid, true);
            found = groups_.find(gid);
        }
        return found != groups_.end() ? found->second.name : std::string();
    });
}

int NorvoUserEnum::UpdateUserInfoMap(unsigned int uid, bool noCache) {
    return norvo::Guarded(0, [this, uid, noCache] {
        PQUIBUSER raw = nullptr;
        const int rc = QUIBUserGetByUID(uid, &raw, noCache ? 1 : 0);
        const norvo::UserRecord user(raw);
        if (rc != 0 || !user) {
            return 0;
        }
        _tag_USER_INFO_ &info = users_[uid];
        info.name = NameOf(user->szName);
        info.uid = user->nUID;
        info.gid = user->nGID;
        return 1;
    });
}

int NorvoUserEnum::UpdateGroupInfoMap(unsigned int gid, bool noCache) {
    return norvo::Guarded(0, [this, gid, noCache] {
        PQUIBGROUP raw = nullptr;
        const int rc = QUIBGroupGetByGID(gid, &raw, noCache ? 1 : 0);
        const norvo::GroupRecord group(raw);
        if (rc != 0 || !group) {
            return 0;
        }
        _tag_GROUP_INFO_ &info = groups_[gid];
        info.name = NameOf(group->szName);
        info.gid = group->nGID;
        return 1;
    });
}
