// QUIBGroupInfoGetgroupList: a user's group ids as text, the form the appliance's callers parse.
#include <string>
#include <vector>

#include "api_guard.h"
#include "nss.h"
#include "quib_user.h"
#include "text_util.h"

namespace np = norvo::platform;

extern "C" {

int QUIBGroupInfoGetgroupList(const char *user, PSZLIST *plist, int flags) {
    if (!np::IsAcceptableName(user) || plist == nullptr || *plist == nullptr || flags != 0) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        np::NssUser entry;
        int err = 0;
        switch (np::FindUserByName(user, &entry, &err)) {
        case np::NssStatus::kFound:
            break;
        case np::NssStatus::kNotFound:
            QUIB_SET_ERR(QUIB_ERR_NO_SUCH_USER);
            return -1;
        case np::NssStatus::kFailed:
            QUIB_SET_ERR(np::NssFailureCode(err));
            return -1;
        }
        // getgrouplist puts the primary group first and lists every other group once.
        std::vector<gid_t> gids;
        if (!np::GroupIdsOf(entry, &gids)) {
            QUIB_SET_ERR(QUIB_ERR_FAILED);
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
