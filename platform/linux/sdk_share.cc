// SDK::Share: a share record from QUIBShareGet behind the web programs' object interface.
#include <string>

#include "api_guard.h"
#include "quib_sdk_share.h"
#include "quib_share.h"

namespace {

enum { kNoAccess = 0, kReadOnly = 1, kReadWrite = 2 };

// The no-access list also keeps the user out when it can't be checked (NSS failed).
int ListPrivilege(const char *user, const QUIBSHARE &share) {
    if (BlSDKUserIsInList(user, share.szNoAccessList) != 0) {
        return kNoAccess;
    }
    if (BlSDKUserIsInList(user, share.szRWList) == 1) {
        return kReadWrite;
    }
    return BlSDKUserIsInList(user, share.szROList) == 1 ? kReadOnly : kNoAccess;
}

}  // namespace

namespace SDK {

Share::Share(PQUIBSHARE record) : record_(record) {}

Share::~Share() {
    QUIBShareFree(record_);
}

Share *Share::LoadShare(const char *name) {
    if (name == nullptr || name[0] == '\0') {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return nullptr;
    }
    // QUIBShareGet reads a leading "/" as a path; a share name never holds a "/".
    if (name[0] == '/') {
        QUIB_SET_ERR(QUIB_ERR_NO_SUCH_SHARE);
        return nullptr;
    }
    return norvo::platform::Guarded<Share *>(nullptr, [&]() -> Share * {
        PQUIBSHARE raw = nullptr;
        if (QUIBShareGet(name, &raw) != 0) {
            return nullptr;
        }
        norvo::platform::ScopeExit freeRecord([raw] { QUIBShareFree(raw); });
        Share *share = new Share(raw);
        freeRecord.Dismiss();
        return share;
    });
}

void Share::Release(Share *share) {
    delete share;
}

unsigned int Share::GetStatus() const {
    return record_->fStatus;
}

std::string Share::GetName() const {
    return record_->szName;
}

std::string Share::GetFullPath() const {
    return record_->szPath;
}

int Share::GetAccessRight(const char *user) const {
    if (user == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return ListPrivilege(user, *record_);
}

int Share::GetFTPPrivilege() const {
    return record_->ftpPrivilege;
}

bool Share::GetACLEnable() const {
    return record_->blAclMode != 0;
}

}  // namespace SDK
