#include <strings.h>

#include <string>

#include "common/owners.h"
#include "common/path_names.h"
#include "common/text.h"
#include "errors/guard.h"
#include "norvo/norvodir.h"
#include "quib_fs.h"

namespace {

// The part of a domain or directory account's home that a "/homes/..." path must start with.
// The home is created first, when the service is on, as resolving it would.
bool DirectoryHomeTail(const char *user, std::string &tail) {
    norvo::UserRecord record = norvo::GetUser(user);
    if (!record || record->szHome == nullptr) {
        return false;
    }
    if (QUIBServiceUserHomeIsEnabled(record.get())) {
        char stopAt[4096] = {0};
        if (QUIBFSMkdirP(record->szHome, stopAt, sizeof(stopAt), 1, record->nUID, record->nGID, 0755) < 0) {
            return false;
        }
    }
    const char *homes = strstr(record->szHome, "/homes/");
    if (homes == nullptr) {
        return false;
    }
    tail = homes;
    return true;
}

}  // namespace

int IsDirUserHome(const std::string &name, const char *user) {
    return norvo::Guarded<int>(0, [&]() -> int {
        if (name == "home" || name == "/home") {
            return 1;
        }
        // A path that climbs with "." or ".." names no home, whatever it starts with.
        if (name[0] == '/' && !norvo::IsWellFormedUserPath(name.c_str())) {
            return 0;
        }
        if (name.compare(0, 6, "/homes") == 0 && user != nullptr) {
            if (!norvo::IsPathComponent(user, strlen(user))) {
                return 0;
            }
            std::string prefix;
            if (norvo::IsDomainUser(user) || norvo::IsDirectoryUser(user)) {
                if (!DirectoryHomeTail(user, prefix)) {
                    return 0;
                }
            } else {
                prefix = std::string("/homes/") + user;
            }
            if (strncasecmp(name.c_str(), prefix.c_str(), prefix.size()) != 0) {
                return 0;
            }
            const char next = name.size() > prefix.size() ? name[prefix.size()] : '\0';
            return next == '/' || next == '\0' ? 1 : 0;
        }
        return norvo::IsOwnHomeName(name.c_str()) ? 1 : 0;
    });
}
