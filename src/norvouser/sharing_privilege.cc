// Who may create sharing links: administrators, the appliance's sharing setting, the per-user
// flags of norvosharing, the file manager's application privilege, an account that is valid.
#include <string.h>

#include <memory>
#include <string>

#include "common/log.h"
#include "common/modules.h"
#include "norvo/norvosharing.h"
#include "quib_user.h"
#include "vlibc_err.h"
#include "vlibc_file.h"

using norvo::kNorvoUser;

namespace {

constexpr char kSettings[] = "/etc/quibinfo.conf";
constexpr char kSharingKey[] = "FB_SHARING_SETTING";
constexpr char kFileManager[] = "QUIB.TVQ.App.Tovana3.Instance";

struct UserFree {
    void operator()(PQUIBUSER user) const { QUIBUserFree(user); }
};

}  // namespace

int NvoLibUserPrivForSharing(const char *user, int flag) try {
    if (user == nullptr) {
        return 0;
    }
    const int admin = QUIBGroupIsAdminGroupMemEx(user, flag ? 1 : 0);
    if (admin < 0) {
        NVO_LOG(kNorvoUser, "%s:%d QUIBGroupIsAdminGroupMemEx(%s) failed. [0x%04X %s:%d]", user,
                VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return 0;
    }
    char setting[64] = {};
    const int read = VLIBCFileGetKeyValue(kSettings, kSharingKey, setting, sizeof setting, 0);
    if (admin == 0) {
        if (read < 0) {
            NVO_LOG(kNorvoUser, "%s:%d VLIBCFileGetKeyValue failed");
            return 0;
        }
        if (read > 0 && strcmp(setting, "admin_only") == 0) {
            return 0;
        }
    }
    if (read > 0 && strcmp(setting, "per_user") == 0 && !NorvoSharing::SharingManager().hasPrivilege(user)) {
        return 0;
    }
    if (VLIBUserPrivilegeHas(user, kFileManager) != 1) {
        return 0;
    }
    PQUIBUSER raw = nullptr;
    if (QUIBUserGet(user, &raw) == -1) {
        NVO_LOG(kNorvoUser, "%s:%d QUIBUserGet failed");
        return 0;
    }
    std::unique_ptr<QUIBUSER, UserFree> record(raw);
    // Only a definite "not expired" lets the user share: a failed check fails closed.
    return QUIBUserIsExpired(user) == 0 ? 1 : 0;
} catch (...) {
    return 0;  // only bad_alloc: no exception leaves the library
}
