// QUIBGroupInfoGetgroupList: a user's group ids as text, the form the appliance's callers parse.
#include <string>
#include <vector>

#include "account_records.h"
#include "quib_user.h"
#include "text_util.h"

namespace np = norvo::platform;

extern "C" {

int QUIBGroupInfoGetgroupList(const char *user, PSZLIST *plist, int flags) {
    if (!np::IsAcceptableName(user) || plist == nullptr || *plist == nullptr || flags != 0) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::WithKnownUser(user, [&](const np::NssUser &entry) {
        // getgrouplist puts the primary group first and lists every other group once.
        std::vector<gid_t> gids;
        if (!np::ListGroupIds(entry, &gids)) {
            return -1;
        }
        for (const gid_t gid : gids) {
            if (VLIBCSzListPush(plist, std::to_string(gid).c_str()) != 0) {
                return -1;
            }
        }
        return 0;
    });
}

}  // extern "C"
