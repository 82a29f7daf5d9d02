// Who may create public sharing links: one yes/no flag per local user, kept as UID="true"
// lines in /usr/quib/etc/quibsharing.conf. These report through their results and the log
// only; the library's error slot is left alone.
#pragma once
#include <map>
#include <string>

#include "norvo/export.h"

namespace NorvoSharing {

class NORVO_API SharingManager {
public:
    // true when the user's UID has a line whose value is exactly "true". Reads without a lock.
    bool hasPrivilege(const std::string &userName);
    // Removes the line of key (a decimal UID; no name is looked up). true unless the removal
    // failed (a missing line is no failure).
    bool removePrivilege(const std::string &key);
    // For each user name in ascending order: "true" grants, anything else revokes. An empty
    // name reuses the previous entry's UID (4294967295 first), on purpose. Leaves the file
    // 0644. true when every entry was applied; the others are applied after a failed one.
    bool setPrivileges(std::map<std::string, std::string> privileges);
    // Every line as UID (the key read as strtoul reads it) to flag; the first line of a UID
    // wins. Empty when the file is missing, empty or can't be read.
    std::map<unsigned int, bool> getPrivileges();
};

}  // namespace NorvoSharing

NORVO_BEGIN_C

// 1 when user may create sharing links, 0 otherwise: administrators (with domain ones when
// flag is non-zero) unless "FB_SHARING_SETTING" of /etc/quibinfo.conf is "per_user" without
// the user's flag; other users also not when it is "admin_only" or can't be read. Everyone
// needs the file manager's application privilege and an account that has not expired.
NORVO_API int NvoLibUserPrivForSharing(const char *user, int flag);

NORVO_END_C
