// NvoEnum::EnumUserGroups: the ids of one user's groups, from the platform's text list.
#include <list>
#include <string>

#include "common/owners.h"
#include "errors/guard.h"
#include "norvo/norvoenum.h"
#include "norvoenum/group_ids.h"

namespace {

// Room the list starts with; the platform grows it (and may move it) for a user in more groups.
constexpr int kGroupListSlots = 512;

}  // namespace

int NvoEnum::EnumUserGroups(std::list<unsigned int> &gids, std::string user) {
    return norvo::Guarded(0, [&gids, &user] {
        PSZLIST raw = VLIBCSzListAlloc(kGroupListSlots);
        if (raw == nullptr) {
            return 0;
        }
        // The answer is not checked: a user the platform does not know simply has no groups.
        (void)QUIBGroupInfoGetgroupList(user.c_str(), &raw, 0);
        const norvo::SzList list(raw);
        return norvo::AppendGroupIds(list.get(), gids) ? 1 : 0;
    });
}
