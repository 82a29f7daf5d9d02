// The sharing privileges file: UID="true" per user who may create sharing links.
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "common/log.h"
#include "norvo/norvosharing.h"
#include "quib_user.h"
#include "vlibc_err.h"
#include "vlibc_file.h"
#include "vlibc_szlist.h"

namespace {

constexpr char kModule[] = "norvosharing";
constexpr unsigned int kNotFound = 0x0900;

// Process-wide, built at load time as the file's users expect.
const std::string kSharingFile = "/usr/quib/etc/quibsharing.conf";
const std::string kTrue = "true";

struct SzHashFree {
    void operator()(PSZHASH hash) const { VLIBCSzHashFree(hash); }
};
struct SzListFree {
    void operator()(PSZLIST list) const { VLIBCSzListFree(list); }
};

// The writers' exclusive flock on the file itself. Only a failed open is a failure; a refused
// flock lets the writer go on unlocked (kept as it always was). The platform's writer takes
// its own per-process lock inside, which this one does not block.
class FileLock {
public:
    FileLock() : fd_(open(kSharingFile.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644)) {
        if (fd_ < 0) {
            NVO_LOG(kModule, "%s:%d Failed to fdLock");
            return;
        }
        (void)flock(fd_, LOCK_EX);
    }
    ~FileLock() {
        if (fd_ >= 0) {
            (void)flock(fd_, LOCK_UN);
            close(fd_);
        }
    }
    FileLock(const FileLock &) = delete;
    FileLock &operator=(const FileLock &) = delete;
    bool Held() const { return fd_ >= 0; }

private:
    int fd_;
};

}  // namespace

namespace NorvoSharing {

bool SharingManager::hasPrivilege(const std::string &userName) try {
    uid_t uid = 0;
    gid_t gid = 0;
    if (QUIBUserGetUGID(userName.c_str(), &uid, &gid) == -1) {
        NVO_LOG(kModule, "%s:%d Failed to get GID for user=%s", userName.c_str());
        return false;
    }
    char key[128] = {};
    snprintf(key, sizeof key, "%u", static_cast<unsigned int>(uid));
    char value[8] = {};
    const int found = VLIBCFileGetKeyValue(kSharingFile.c_str(), key, value, sizeof value, 0);
    if (found < 0) {
        if (static_cast<unsigned int>(VLIBCErrGet()) != kNotFound) {
            NVO_LOG(kModule, "%s:%d VLIBCFileGetKeyValue failed");
        }
        return false;
    }
    return found > 0 && kTrue == value;
} catch (...) {
    return false;  // only bad_alloc: no exception leaves the library
}

bool SharingManager::removePrivilege(const std::string &key) try {
    FileLock lock;
    if (!lock.Held()) {
        return false;
    }
    return VLIBCFileRemoveKey(kSharingFile.c_str(), key.c_str()) != -1;
} catch (...) {
    return false;  // only bad_alloc: no exception leaves the library
}

bool SharingManager::setPrivileges(std::map<std::string, std::string> privileges) try {
    FileLock lock;
    if (!lock.Held()) {
        return false;
    }
    bool result = true;
    uid_t uid = static_cast<uid_t>(-1);
    for (const auto &[name, value] : privileges) {
        // An empty name keeps the previous entry's UID: an oddity kept on purpose.
        if (!name.empty()) {
            gid_t gid = 0;
            if (QUIBUserGetUGID(name.c_str(), &uid, &gid) == -1) {
                NVO_LOG(kModule, "%s:%d Failed to get GID for user=%s", name.c_str());
                result = false;
                continue;
            }
        }
        char key[128] = {};
        snprintf(key, sizeof key, "%u", static_cast<unsigned int>(uid));
        if (value != kTrue) {
            if (VLIBCFileRemoveKey(kSharingFile.c_str(), key) == -1) {
                result = false;
            }
            continue;
        }
        if (VLIBCFileSetKeyValue(kSharingFile.c_str(), key, kTrue.c_str(), 0) == -1) {
            NVO_LOG(kModule, "%s:%d ApplyData: Failed to set %s", name.c_str());
            result = false;
        }
    }
    if (chmod(kSharingFile.c_str(), 0644) != 0) {
        NVO_LOG(kModule, "%s:%d chmod failed. filepath:[%s]", kSharingFile.c_str());
    }
    return result;
} catch (...) {
    return false;  // only bad_alloc: no exception leaves the library
}

std::map<unsigned int, bool> SharingManager::getPrivileges() try {
    std::map<unsigned int, bool> privileges;
    std::unique_ptr<SZHASH, SzHashFree> hash(VLIBCSzHashAlloc(2048));
    if (!hash) {
        NVO_LOG(kModule, "%s(%d)Failed to VLIBCSzHashAlloc, reason=%m");
        return privileges;
    }
    std::unique_ptr<SZLIST, SzListFree> keys(VLIBCSzListAlloc(2048));
    if (!keys) {
        NVO_LOG(kModule, "%s:%d VLIBCSzListAlloc() failed!! quiberr=[0x%04X]", VLIBCErrGet());
        return privileges;
    }
    const int count = VLIBCFileGetKeys(kSharingFile.c_str(), 0, hash.get(), "=");
    if (count <= 0) {
        if (count < 0 && static_cast<unsigned int>(VLIBCErrGet()) != kNotFound) {
            NVO_LOG(kModule, "%s:%d VLIBCFileGetKeys() failed!! szFile=[%s], quiberr=[0x%04X]",
                    kSharingFile.c_str(), VLIBCErrGet());
        }
        return privileges;
    }
    PSZLIST list = keys.get();
    if (VLIBCSzHashEnumKey(hash.get(), &list) < 0) {
        NVO_LOG(kModule, "%s(%d)VLIBCSzHashEnumKey failed, reason=%m");
        return privileges;
    }
    for (int i = 0; i < VLIBCSzListCount(list); ++i) {
        const char *key = VLIBCSzListGet(list, i);
        const char *value = VLIBCSzHashGetValue(hash.get(), key);
        const auto uid = static_cast<unsigned int>(strtoul(key, nullptr, 10));
        privileges.emplace(uid, value != nullptr && kTrue == value);  // the first line of a UID wins
    }
    return privileges;
} catch (...) {
    return {};  // only bad_alloc: no exception leaves the library
}

}  // namespace NorvoSharing
