// One shared folder as the web programs see it: loaded by name, asked for its status, paths,
// lists and flags, and released. Backed by QUIBShareGet (QUIB_SHARE_CONF).
#pragma once
#include <string>

#include "platform_export.h"
#include "quib_share.h"

namespace SDK {

class QUIB_API Share {
public:
    // The share named name (case-insensitive). A new object, freed with Release; null when
    // there is no such share (0x1400, also for a name starting with "/": paths are not names),
    // the configuration can't be read (0x0900), name is null or empty (0x0D00), or memory runs
    // out (0x2B00).
    static Share *LoadShare(const char *name);
    // Frees a share from LoadShare; null is ignored.
    static void Release(Share *share);

    // SHARE_STATUS_* bits: 0x1 hidden ("browseable = no"), 0x2 encrypted.
    unsigned int GetStatus() const;
    // The name as configured (its case may differ from the one asked for).
    std::string GetName() const;
    // The share's real path, normalised and absolute (e.g. "/volume1/photo").
    std::string GetFullPath() const;
    // user's privilege from the share's own lists: 0 when in the no-access list (or when that
    // list can't be checked), else 2 when in the read-write list, else 1 when in the read-only
    // list, else 0. Administrators get no override and domain or directory accounts are matched
    // by their NSS names like local ones, exactly as NvoLibGetPrivilege's list rule answers.
    // -1 with 0x0D00 for a null user.
    int GetAccessRight(const char *user) const;
    // The FTP privilege: 0 none, 1 read-only, 2 read-write ("ftp privilege = none|ro|rw").
    int GetFTPPrivilege() const;
    // true when the share uses ACL permissions ("acl = yes", the default).
    bool GetACLEnable() const;

    Share(const Share &) = delete;
    Share &operator=(const Share &) = delete;

private:
    explicit Share(PQUIBSHARE record);
    ~Share();
    PQUIBSHARE record_;  // owned
};

}  // namespace SDK
