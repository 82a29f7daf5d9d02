// Owning handles for the platform records the command holds, so each is freed on every path.
#pragma once
#include <memory>

#include "quib_user.h"
#include "vlibc_szlist.h"

namespace norvo::cli {

struct UserFree {
    void operator()(PQUIBUSER user) const { QUIBUserFree(user); }
};
struct SzListFree {
    void operator()(PSZLIST list) const { VLIBCSzListFree(list); }
};

using UserRecord = std::unique_ptr<QUIBUSER, UserFree>;
using SzList = std::unique_ptr<SZLIST, SzListFree>;

// The account's record, or null with the platform error set (0x1D00 when unknown).
inline UserRecord LookUpUser(const char *name) {
    PQUIBUSER raw = nullptr;
    if (QUIBUserGet(name, &raw) < 0) {
        return UserRecord(nullptr);
    }
    return UserRecord(raw);
}

}  // namespace norvo::cli
