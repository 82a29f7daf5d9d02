#include "errors/guard.h"
#include "norvo/nvoman.h"
#include "quib_login.h"
#include "quib_user.h"

namespace {
constexpr int kAnyAccount = 15;
constexpr int kRequestDataPosition = 1;
constexpr char kFileManagerPrivilege[] = "QUIB.TVQ.App.Tovana3.Instance";
}  // namespace

bool IsAuthorized(WebMan &webman, const char *text) {
    return norvo::Guarded<bool>(false, [&]() -> bool {
        if (!webman.IsAuthorized(text, kAnyAccount, kRequestDataPosition)) {
            return false;
        }
        const std::string user = webman.GetLoginUserName();
        return VLIBUserPrivilegeHas(user.c_str(), kFileManagerPrivilege) != 0;
    });
}
