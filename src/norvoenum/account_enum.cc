// NvoEnum's whole-database enumerations of users and groups.
#include <map>
#include <string>

#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "errors/guard.h"
#include "norvo/norvoenum.h"

using norvo::kNorvoEnum;

int NvoEnum::EnumAllUsers(std::map<unsigned int, _tag_USER_INFO_> &users, AUTH_TYPE type) {
    return norvo::Guarded(0, [&users, type] {
        const norvo::UserDB db(QUIBUserDBOpen());
        if (!db) {
            NVO_LOG_AT(kNorvoEnum, 558, "%s:%d Failed to open user db");
            return 0;
        }
        // The cursor's end and its failure look alike here: either ends the walk.
        norvo::UserCursorSlot user;
        while (QUIBUserDBGetByCursor(db.get(), user.Out(), type, 1) == 0) {
            _tag_USER_INFO_ &info = users[user->nUID];
            info.name = user->szName != nullptr ? user->szName : "";
            info.uid = user->nUID;
            info.gid = user->nGID;
        }
        return 1;
    });
}

int NvoEnum::EnumAllGroups(std::map<unsigned int, _tag_GROUP_INFO_> &groups, AUTH_TYPE type) {
    return norvo::Guarded(0, [&groups, type] {
        const norvo::GroupDB db(QUIBGroupDBOpen());
        if (!db) {
            NVO_LOG_AT(kNorvoEnum, 527, "%s:%d Failed to open group db");
            return 0;
        }
        norvo::GroupCursorSlot group;
        while (QUIBGroupDBGetByCursor(db.get(), group.Out(), type, 1) == 0) {
            _tag_GROUP_INFO_ &info = groups[group->nGID];
            info.name = group->szName != nullptr ? group->szName : "";
            info.gid = group->nGID;
        }
        return 1;
    });
}
